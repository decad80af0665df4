#ifndef KOVABACKUP_OPTION_OPTION_MAP_PRIVATE_H
#define KOVABACKUP_OPTION_OPTION_MAP_PRIVATE_H

/// @file What the files of the option store share and no caller sees.

#include "base/errno_guard.h"
#include "kovaplatform/kovacore.h"

#include <cstdio>
#include <json/value.h>
#include <memory>
#include <string>

namespace KOVA::Backup {

/// The module path of every line that the option store logs.
inline constexpr const char *kOptionModule = "option_map";

/// The code with which the platform says that a file does not exist.
inline constexpr int kNoSuchFile = 0x0900;

/// The section of a file to which a map is bound.
struct SectionInfo {
  bool loaded = false;
  std::string path;
  std::string name; ///< full: prefix, and the id in decimal when there is one
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

  /// Changes the binding whole, or not at all when memory runs out: half of it would name a section
  /// of another file, which the next save would replace. Whether the map is loaded stays.
  void bind(const std::string &path, const std::string &prefix, int id);

  /// The option of that name, or null. A top-level value that is no object has no options.
  const Json::Value *find(const std::string &key) const;

  /// Stores an option, beginning a fresh object when values is none.
  void store(const std::string &key, Json::Value value);

  /// Empties values. The JSON library's clear takes lists and objects only.
  void clearValues();
};

/// prefix, followed by the id in decimal when it is 0 or more.
std::string sectionName(const std::string &prefix, int id);

/// Whether the platform's C strings can carry a key or section name. One with a NUL byte in it they
/// would cut to another name; then that code is recorded as the platform's last error, at that
/// place.
bool platformCanCarry(const std::string &name, int code, int place);

/// Closes a file whose end is not written, or whose writing has failed already.
struct CloseFile {
  void operator()(std::FILE *file) const {
    const Base::ErrnoGuard guard;
    (void)std::fclose(file);
  }
};
using FilePtr = std::unique_ptr<std::FILE, CloseFile>;

/// Cipher text of a clear text, and back; "" when that fails, which is logged.
std::string secretEncrypt(const std::string &clear);
std::string secretDecrypt(const std::string &cipher);

/// A secret in clear, overwritten before its memory is given back.
struct ClearText {
  std::string text;

  ~ClearText();
};

/// The message numbers and words in which one operation reports about its list of sections.
struct SectionListReport {
  int allocFailed;
  int noFile; ///< place recorded when the platform's last error code is put back
  int enumFailed;
  const char *enumFailedWord;
};

/// The names of a file's sections, as the platform lists them. Remembers the platform's last error
/// code when it is made, so that a missing file leaves no trace there.
class SectionList {
public:
  explicit SectionList(const SectionListReport &report);
  ~SectionList();
  SectionList(const SectionList &) = delete;
  SectionList &operator=(const SectionList &) = delete;

  /// Returns: false on failure, which is logged.
  bool allocate();

  /// Reads the file's sections; an absent file has none.
  /// Returns: false on failure, which is logged.
  bool read(const std::string &path);

  int count() const;

  /// May be null when the platform fails.
  const char *name(int index) const;

private:
  const SectionListReport &report_;
  int errorBefore_;
  KLIBCSzList *list_ = nullptr;
  bool listed_ = false;
};

/// Whether name begins with prefix; id is then the number with which its rest begins, else 0.
bool sectionId(const char *name, const std::string &prefix, int &id);

/// Adds the header of a section at the end of a file, which is made when absent.
/// Returns: false on failure, which is logged; the file then holds what it held.
bool appendSectionHeader(const std::string &path, const std::string &name);

} // namespace KOVA::Backup

#endif
