#ifndef KOVABACKUP_TOOLS_KEPT_EDITS_H
#define KOVABACKUP_TOOLS_KEPT_EDITS_H

/// @file The edited texts of sections that earlier calls of 'kovabackup option edit' could not
/// save.

#include <chrono>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

struct KeptEdit {
  std::string file;         ///< the text
  std::string folder;       ///< holds the text and nothing else that is of use
  std::string subject;      ///< what was edited, as textSubject says it; "" when it cannot be read
  std::chrono::seconds age; ///< since the text was last changed
};

/// What an edited text is about: "section 'task1' of /etc/backup/task.conf".
std::string textSubject(const std::string &file, const std::string &section);

/// The texts that this user may read, oldest first, without those that are being edited now.
std::vector<KeptEdit> keptEdits();

} // namespace KOVA::Backup::Tool

#endif
