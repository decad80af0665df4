#ifndef KOVABACKUP_OPTION_SECTION_LIST_H
#define KOVABACKUP_OPTION_SECTION_LIST_H

/// @file The sections of a file, as the platform lists them. section_list.cpp also defines
/// OptionMap::optSectionListId and optSectionListName.
///
///     SectionList sections(kListId);                 // the message numbers of this operation
///     if (!sections.allocate() || !sections.read(path)) return false;
///     for (int index = 0; index < sections.count(); ++index) {
///       int id = 0;
///       if (parseSectionId(sections.name(index), "task", id)) ids.push_back(id);
///     }

#include "kovaplatform/kovacore.h"

#include <string>

namespace KOVA::Backup {

/// How one operation reports the failures of its SectionList. Each operation has message numbers
/// and words of its own, which must not change, although all take the same steps.
struct SectionListReport {
  int allocFailed;
  int noFile; ///< line recorded with the platform's last error code when that code is restored
  int enumFailed;
  const char *enumFailedSuffix; ///< "" or " failed", appended to a word of the message
};

/// The names of a file's sections. A missing file is not an error: the platform's last error code
/// is saved at construction and restored in that case. The recorded file and line are not restored.
class SectionList {
public:
  /// report must outlive this object.
  explicit SectionList(const SectionListReport &report);
  ~SectionList();
  SectionList(const SectionList &) = delete;
  SectionList &operator=(const SectionList &) = delete;

  /// Allocates the list. Separate from read, because a caller's output stays unchanged if this
  /// fails, but is emptied before read.
  /// Returns: false on failure, which is logged.
  bool allocate();

  /// Reads the names of the file's sections. A file that does not exist counts as one without
  /// sections.
  /// Returns: false on failure, which is logged.
  bool read(const std::string &path);

  /// The number of sections; 0 before read, and for a missing file.
  int count() const;

  /// The name of the section at an index from 0, valid while this object exists.
  /// Returns: null if the platform returns none.
  const char *name(int index) const;

private:
  const SectionListReport &report_;
  int errorBefore_;
  KLIBCSzList *list_ = nullptr;
  bool listed_ = false;
};

/// Reads a section's id: the decimal number that follows prefix in its name, or 0 if none does.
/// Text after the number is deliberately ignored: for the prefix "task", "task12x" has the id 12
/// and "taskforce" the id 0. Returns: true if name begins with prefix. On false, also for a null
/// name, id is unchanged.
bool parseSectionId(const char *name, const std::string &prefix, int &id);

} // namespace KOVA::Backup

#endif
