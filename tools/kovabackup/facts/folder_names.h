#ifndef KOVABACKUP_TOOLS_FOLDER_NAMES_H
#define KOVABACKUP_TOOLS_FOLDER_NAMES_H

/// @file What is in a directory. The iterators of std::filesystem end the program when memory runs
/// out between two entries.

#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// Appends the names in a directory to names, without "." and "..", in the directory's order.
/// Returns: 0, or the errno of the call that failed; names then holds what was read until then.
int addNamesIn(const std::string &folder, std::vector<std::string> &names);

} // namespace KOVA::Backup::Tool

#endif
