// Any text, read as a configuration. A refusal names a line of the text and changes nothing. A
// configuration that is read is the same after it is written in the same form and read again.

#include "platform/config/config.h"

#include "fuzz/support.h"

#include <json/json.h>

using namespace KovaPlatform;
using KovaFuzz::require;

namespace {

std::string written(const Json::Value &value) {
  Json::StreamWriterBuilder builder;
  builder["indentation"] = "";
  builder["emitUTF8"] = true;
  return Json::writeString(builder, value);
}

std::string written(const Config &config) {
  std::string text;
  for (const NamedVolume &volume : config.volumes) {
    text += "[volume " + volume.name + "]\npath=" + written(volume.path) + "\n";
    text += volume.fsType ? "fsType=" + std::to_string(*volume.fsType) + "\n" : "";
    text += volume.size ? "size=" + std::to_string(*volume.size) + "\n" : "";
    text += volume.removable
                ? std::string("removable=") + (*volume.removable ? "true" : "false") + "\n"
                : "";
  }
  Json::Value exclude(Json::arrayValue);
  for (const std::string &path : config.mountExcludes) {
    exclude.append(path);
  }
  text += "[mounts]\nexclude=" + written(exclude) + "\n[secret]\n";
  return text + (config.secretKeyFile.empty() ? "" : "keyFile=" + written(config.secretKeyFile));
}

void requirePath(const std::string &path) {
  require(path == "/" || (path.size() > 1 && path.front() == '/' && path.back() != '/'));
  require(path.find('\0') == std::string::npos);
}

void requireSound(const Config &config) {
  for (const NamedVolume &volume : config.volumes) {
    require(!volume.name.empty());
    requirePath(volume.path);
    require(volume.fsType.value_or(0) >= 0);
  }
  std::for_each(config.mountExcludes.begin(), config.mountExcludes.end(), requirePath);
  if (!config.secretKeyFile.empty()) {
    requirePath(config.secretKeyFile);
  }
}

bool isAscii(const std::string &text) {
  return std::all_of(text.begin(), text.end(), [](char byte) { return byte >= 0; });
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  const std::string text = KovaFuzz::Input(data, size).rest();
  Config config;
  ConfigError error;
  if (!parseConfig(text, config, error)) {
    const auto lines = std::count(text.begin(), text.end(), '\n') + 1;
    require(error.code != 0 && error.line >= 1 && error.line <= lines && !error.what.empty());
    require(config.volumes.empty() && config.mountExcludes.empty() && config.secretKeyFile.empty());
    return 0;
  }
  requireSound(config);
  // The writer used here replaces bytes that are not UTF-8; the reader keeps them.
  const std::string again = written(config);
  if (isAscii(text)) {
    Config second;
    require(parseConfig(again, second, error));
    require(written(second) == again);
  }
  return 0;
}
