#ifndef KOVABACKUP_OPTION_OPTION_MAP_PRIVATE_H
#define KOVABACKUP_OPTION_OPTION_MAP_PRIVATE_H

/// @file The state of an option map, and what the sources of the option store share about sections.

#include "base/errno_guard.h"
#include "base/json_memory.h"

#include <cstdio>
#include <json/value.h>
#include <memory>
#include <string>
#include <utility>

namespace KOVA::Backup {

/// The module path of every line that the option store logs.
inline constexpr const char *kOptionModule = "option_map";

/// The code with which the platform reports that a file does not exist.
inline constexpr int kNoSuchFile = 0x0900;

/// The section of a file to which a map is bound.
struct SectionInfo {
  bool loaded = false;
  std::string path;
  std::string name; ///< full: the prefix, then the id in decimal when there is one
  int id = -1;      ///< -1: named without an id
};

/// State of one OptionMap.
class OptionMapPrivate {
public:
  Json::Value values;
  SectionInfo section;
  std::string lockToken;
  int lockFd = -1; ///< negative while no lock is held

  bool isBound() const { return !section.path.empty() && !section.name.empty(); }

  /// Changes the binding, but not whether the map is loaded. On bad_alloc the binding is unchanged:
  /// half of a new one would name a section of another file, which the next save would replace.
  void bind(const std::string &path, const std::string &prefix, int id);

  /// The option of that name, or null. A top-level value that is not an object has no options.
  const Json::Value *find(const std::string &key) const;

  /// Stores an option of any type from which a Json::Value can be made. values becomes a new object
  /// first when it is not one. On bad_alloc the option is unchanged.
  template <typename Value>
  void store(const std::string &key, Value &&value) {
    Base::JsonMemory::withBadAlloc([&] {
      Json::Value made(std::forward<Value>(value)); // before a new key has an empty value
      member(key) = std::move(made);
    });
  }

  /// Empties values. The JSON library's clear takes lists and objects only.
  void clearValues();

private:
  Json::Value &member(const std::string &key);
};

/// The prefix, followed by the id in decimal when it is 0 or more.
std::string sectionName(const std::string &prefix, int id);

/// Whether the platform's C strings can carry a key or section name. A NUL byte in it would make
/// another name of it; the code is then recorded as the platform's last error at that place.
bool platformCanCarry(const std::string &name, int code, int place);

/// Closes a file whose close need not be checked: nothing was written, or writing has failed
/// already.
struct CloseFile {
  void operator()(std::FILE *file) const {
    const Base::ErrnoGuard guard;
    (void)std::fclose(file);
  }
};
using FilePtr = std::unique_ptr<std::FILE, CloseFile>;

} // namespace KOVA::Backup

#endif
