#ifndef KOVABACKUP_OPTION_SECTION_LIST_H
#define KOVABACKUP_OPTION_SECTION_LIST_H

/// @file The sections of a file, as the platform lists them.
///
///     SectionList sections(kListId);                 // the numbers under which its caller logs
///     if (!sections.allocate() || !sections.read(path)) return false;
///     for (int index = 0; index < sections.count(); ++index) {
///       int id = 0;
///       if (sectionId(sections.name(index), "task", id)) ids.push_back(id);
///     }

#include "kovaplatform/kovacore.h"

#include <string>

namespace KOVA::Backup {

/// The message numbers and the word with which one operation reports failures of its list. The
/// operations have messages of their own, although the steps are the same.
struct SectionListReport {
  int allocFailed;
  int noFile; ///< place that is recorded when the platform's last error code is restored
  int enumFailed;
  const char *enumFailedWord;
};

/// The names of a file's sections. The object notes the platform's last error code when it is made
/// and restores it when the file does not exist, so that a missing file leaves no trace there.
class SectionList {
public:
  /// report must outlive this object.
  explicit SectionList(const SectionListReport &report);
  ~SectionList();
  SectionList(const SectionList &) = delete;
  SectionList &operator=(const SectionList &) = delete;

  /// Allocates the list. This is a step of its own because callers empty their output between it
  /// and read.
  /// Returns: false on failure, which is logged.
  bool allocate();

  /// Reads the file's sections; a file that does not exist has none.
  /// Returns: false on failure, which is logged.
  bool read(const std::string &path);

  int count() const;

  /// The name of a section. Returns: null when the platform fails.
  const char *name(int index) const;

private:
  const SectionListReport &report_;
  int errorBefore_;
  KLIBCSzList *list_ = nullptr;
  bool listed_ = false;
};

/// The id of a section: the number with which its name goes on after prefix, or 0 when no number
/// follows. Text after the number is deliberately ignored.
/// Returns: whether name, which may be null, begins with prefix; on false id is unchanged.
bool sectionId(const char *name, const std::string &prefix, int &id);

} // namespace KOVA::Backup

#endif
