#include "tools/kovabackup/facts/section_editor.h"

#include "base/json_text.h"
#include "base/section_grammar.h"
#include "base/unique_fd.h"
#include "tools/kovabackup/facts/lock_holders.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/facts/space.h"
#include "tools/kovabackup/frame/input.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <fmt/format.h>
#include <list>
#include <sys/stat.h>
#include <system_error>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

namespace Grammar = Base::SectionGrammar;

std::list<std::string> listSections(const std::string &file) {
  std::list<std::string> names;
  clearPlatformError();
  if (!OptionMap::optSectionListName(file, names)) {
    throw Failure(kFailed,
                  fmt::format("cannot list the sections of {}: {}", file, platformError()));
  }
  return names;
}

bool meansAbsent(int error) {
  return error == ENOENT || error == ENOTDIR;
}

// Anything but "not there" counts, also what cannot be examined: it would be in the way.
bool exists(const std::string &file) {
  struct stat info;
  return ::stat(file.c_str(), &info) == 0 || !meansAbsent(errno);
}

bool hasSection(const std::string &file, const std::string &section) {
  const std::list<std::string> names = listSections(file);
  return std::find(names.begin(), names.end(), section) != names.end();
}

// Only the loader takes a broken header. A section is absent when neither loader nor list has it.
bool isAbsent(const std::string &file, const std::string &section) {
  if (!exists(file)) {
    return true;
  }
  requireSectionFile(file); // of a device or a socket nothing may be read
  return !OptionMap().optSectionLoad(file, section, -1) && !hasSection(file, section);
}

// A message names the file already.
std::string obstacle(const std::string &file, const std::string &where, int error) {
  return where == file ? reason(error) : fmt::format("{}: {}", where, reason(error));
}

// Why a change would fail, as far as permissions show it: "" when nothing is known. A file is
// replaced by a new one beside it; a link is followed first.
std::string whyNotWritable(const std::string &file) {
  std::error_code unknown;
  const std::filesystem::path real = std::filesystem::canonical(file, unknown);
  if (unknown) {
    return "";
  }
  for (const std::string &needed : {real.string(), real.parent_path().string()}) {
    if (::access(needed.c_str(), W_OK) != 0) {
      return obstacle(file, needed, errno);
    }
  }
  return "";
}

// The platform reports which step failed, and may leave errno, 0 here if it did not. A full disk
// explains a failure but does not foretell one: a small change may still fit, and what is free may
// be reserved by the file system.
std::string whyNotWritten(const std::string &file, int error) {
  std::string failed = platformError();
  std::string why = whyNotWritable(file);
  if (!why.empty()) {
    return why;
  }
  std::error_code unknown;
  const std::string folder = std::filesystem::canonical(file, unknown).parent_path().string();
  const bool isFull = error == ENOSPC || error == EDQUOT;
  if (unknown || !(isFull || isFullForThisUser(folder))) {
    return failed;
  }
  return obstacle(file, folder, isFull ? error : ENOSPC);
}

// The library creates a missing file too, but the platform's error names another operation when
// that fails: that the file was not found.
void createFile(const std::string &file) {
  const Base::UniqueFd fd(::open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644));
  if (!fd) {
    throw Failure(kFailed, fmt::format("cannot create {}: {}", shownFile(file), reason(errno)));
  }
}

void announceWait(Context &context, const std::string &token, const std::string &beforeWait) {
  bool waits = false;
  for (const LockUser &user : lockUsersOf(token)) {
    if (!user.waits) {
      context.remark(
          fmt::format("waiting for the lock '{}', which process {} holds", token, describe(user)));
      waits = true;
    }
  }
  if (waits && !beforeWait.empty()) {
    context.remark(beforeWait);
  }
}

} // namespace

void requireSectionFile(const std::string &file) {
  struct stat info;
  const bool found = ::stat(file.c_str(), &info) == 0;
  if (!found || ::access(file.c_str(), R_OK) != 0) {
    const int error = errno;
    throw Failure(meansAbsent(error) ? kNegative : kFailed,
                  fmt::format("cannot read {}: {}", shownFile(file), reason(error)));
  }
  if (!S_ISREG(info.st_mode)) {
    throw Failure(kFailed, fmt::format("{} is not a regular file", file));
  }
}

void requireWritable(const std::string &file) {
  const std::string why = whyNotWritable(file);
  if (!why.empty()) {
    throw Failure(kFailed, fmt::format("cannot write {}: {}", file, why));
  }
}

std::list<std::string> sectionsOf(const std::string &file) {
  requireSectionFile(file);
  return listSections(file);
}

// Found as the loader finds them.
std::vector<std::string> sectionLines(const std::string &file, const std::string &section) {
  std::vector<std::string> found;
  RecordReader lines(file, false);
  std::string text;
  bool inside = false;
  while (lines.next(text)) {
    const Grammar::Line line = Grammar::parse(text);
    if (!inside) {
      inside = Grammar::isTakenForHeaderOf(line, section);
    } else if (line.endsSection()) {
      break;
    } else {
      found.push_back(text);
    }
  }
  return found;
}

// The last of several with one name counts.
std::map<std::string, std::string> writtenOptions(const std::string &file,
                                                  const std::string &section) {
  std::map<std::string, std::string> options;
  for (const std::string &text : sectionLines(file, section)) {
    const Grammar::Line line = Grammar::parse(text);
    if (line.kind == Grammar::LineKind::Option) {
      options[std::string(line.key)] = line.value;
    }
  }
  return options;
}

void loadSection(OptionMap &map, const std::string &file, const std::string &section) {
  requireSectionFile(file);
  if (map.optSectionLoad(file, section, -1)) {
    return;
  }
  if (!hasSection(file, section)) {
    throw Failure(kNegative, fmt::format("{} has no section '{}'", file, section));
  }
  throw Failure(kFailed, fmt::format("cannot read section '{}' of {}; the system log says why",
                                     section, file));
}

Json::Value valuesOf(const OptionMap &map) {
  Json::Value value;
  (void)Base::JsonText::fromText(map.optToJsonString(), value); // the map wrote it
  return value.isObject() ? value : Json::Value(Json::objectValue);
}

std::set<std::string> unreadNames(const std::string &file, const std::string &section,
                                  const Json::Value &values) {
  std::set<std::string> names;
  for (const auto &[name, text] : writtenOptions(file, section)) {
    if (!values.isMember(name)) {
      names.insert(name);
    }
  }
  return names;
}

void requireOptionName(const std::string &name) {
  if (!Grammar::isStorableKey(name)) {
    throw Failure(kUsage, fmt::format("'{}' cannot name an option in a section file", name));
  }
}

void requireSectionName(const std::string &name) {
  if (!Grammar::isStorableSectionName(name)) {
    throw Failure(kUsage, fmt::format("'{}' cannot name a section", name));
  }
}

bool canBeWritten(const Json::Value &value) {
  return value.isString() || value.isBool() || value.isInt() || value.isUInt() || value.isArray();
}

Json::Value asWritten(const Json::Value &value) {
  if (value.type() != Json::realValue) {
    return value;
  }
  return value.isInt()    ? Json::Value(value.asInt())
         : value.isUInt() ? Json::Value(value.asUInt())
                          : value;
}

SectionEditor::SectionEditor(Context &context, const std::string &file, const std::string &section,
                             const LockRequest &request, Missing missing)
    : file_(file), section_(section) {
  if (request.token) {
    lock(context, request);
  }
  isNew_ = missing == Missing::Make && isAbsent(file, section);
  if (!isNew_) {
    loadSection(map_, file, section);
  }
}

void SectionEditor::lock(Context &context, const LockRequest &request) {
  const std::string &token = *request.token;
  announceWait(context, token, request.beforeWait);
  lock_.emplace(token);
  Service::Error error;
  if (!lock_->take(error, request.limit)) {
    if (error.code == EWOULDBLOCK) {
      throw Failure(kTimedOut, fmt::format("the lock '{}' was not free within {} s", token,
                                           request.limit.count() / 1000));
    }
    // A slash names a folder, which no service creates.
    const bool needsFolder = error.code == ENOENT && token.find('/') != std::string::npos;
    throw Failure(kFailed, fmt::format("cannot take the lock '{}': {}: {}{}", token, error.path,
                                       reason(error.code),
                                       needsFolder ? "; a lock token usually has no slash" : ""));
  }
}

// Saving replaces all options of the section. One whose value is not JSON was not loaded and would
// be lost; one of a type that sections cannot hold would fail the export, which does not name it.
void SectionEditor::requireNothingLost() const {
  const Json::Value values = valuesOf(map_);
  for (const std::string &name : values.getMemberNames()) {
    if (!canBeWritten(values[name])) {
      throw Failure(kFailed, fmt::format("option '{}' has a value of a type that a section cannot "
                                         "hold: correct it with 'kovabackup option edit "
                                         "{} {}' first",
                                         name, file_, section_));
    }
  }
  if (isNew_) {
    return;
  }
  for (const std::string &name : unreadNames(file_, section_, values)) {
    if (removed_.count(name) == 0) {
      throw Failure(kFailed, fmt::format("the value of option '{}' is not JSON and would be lost: "
                                         "correct it with 'kovabackup option edit {} {}' "
                                         "first",
                                         name, file_, section_));
    }
  }
}

bool SectionEditor::remove(const std::string &name) {
  if (writtenOptions(file_, section_).count(name) == 0) {
    return false;
  }
  (void)map_.optRemove(name); // false for a null value, which is removed nevertheless
  removed_.insert(name);
  return true;
}

void SectionEditor::replaceAll(const Json::Value &values) {
  for (const auto &[name, text] : writtenOptions(file_, section_)) {
    removed_.insert(name);
  }
  if (!map_.optLoadJsonString(Base::JsonText::toText(values))) {
    throw Failure(kFailed, fmt::format("section '{}' would nest its lists too deeply", section_));
  }
}

void SectionEditor::save() {
  requireNothingLost();
  if (isNew_ && !exists(file_)) {
    createFile(file_);
  }
  clearPlatformError();
  errno = 0;
  if (!map_.optSectionExport(file_, section_, isNew_)) {
    const std::string why = whyNotWritten(file_, errno);
    throw Failure(kFailed,
                  fmt::format("cannot write section '{}' of {}: {}", section_, file_, why));
  }
}

} // namespace KOVA::Backup::Tool
