#ifndef KOVABACKUP_TOOLS_PROGRAM_H
#define KOVABACKUP_TOOLS_PROGRAM_H

/// @file Where programs are, as the user's shell finds them.

#include <string>

namespace KOVA::Backup::Tool {

/// Whether path is a regular file that the caller may execute.
bool isProgram(const std::string &path);

/// The first program of that name in the directories of PATH, as an absolute path; "" when there is
/// none. Without PATH those of a POSIX system are searched.
std::string findProgram(const std::string &name);

} // namespace KOVA::Backup::Tool

#endif
