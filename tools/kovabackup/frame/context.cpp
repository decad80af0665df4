#include "tools/kovabackup/frame/context.h"

#include "tools/kovabackup/frame/text.h"

#include <cstring>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {

namespace {

constexpr const char *kName = "kovabackup:";

} // namespace

// The text of a message behind the name of the command, broken into lines on a terminal.
std::string Context::bodyOf(const std::string &message) const {
  const std::size_t name = std::strlen(kName) + 1;
  return wrapped(std::string(name, ' ') + messages.name(shortened(message)), 0, messages.width())
      .substr(name);
}

Context::Context() : document(Json::objectValue) {
  document["schemaVersion"] = kSchemaVersion;
}

void Context::reportError(int exitCode, const std::string &message) {
  if (json) {
    Json::Value error(Json::objectValue);
    error["exitCode"] = exitCode;
    error["message"] = jsonName(message);
    document["errors"].append(error);
    return;
  }
  messages.line(fmt::format("{} {}", messages.style().bad(kName), bodyOf(message)));
  (void)messages.flush(); // when standard error fails, there is nowhere left to report it
}

void Context::fail(const Failure &failure) {
  reportError(failure.exitCode(), failure.what());
  if (failure.exitCode() == kUsage && !json) {
    messages.line(fmt::format("Try '{} --help'.", command));
  }
}

void Context::remark(const std::string &message) {
  if (quiet) {
    return;
  }
  messages.line(fmt::format("{} {}", kName, bodyOf(message)));
  (void)messages.flush(); // as in reportError
}

void Context::beginList(const std::string &name) {
  out.write(fmt::format("{{\"{}\":[", name));
  listing_ = true;
}

void Context::listEntry(std::string_view entry) {
  const std::string_view separator = out.terminal() ? ",\n" : ",";
  out.write(firstEntry_ ? separator.substr(1) : separator);
  out.write(entry);
  firstEntry_ = false;
}

void Context::writeDocument() {
  const std::string text = jsonText(document, out.terminal());
  if (listing_) { // the opening brace has been written by beginList
    out.write("],");
    out.write(std::string_view(text).substr(1));
  } else {
    out.write(text);
  }
}

} // namespace KOVA::Backup::Tool
