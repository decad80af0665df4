#ifndef KOVABACKUP_TOOLS_PATTERN_WARNINGS_H
#define KOVABACKUP_TOOLS_PATTERN_WARNINGS_H

/// @file What is suspicious about a pattern of the path filter.

#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// The filter refuses no pattern, so a mistake shows only in what is backed up. This finds patterns
/// that match nothing that their author can have meant, and syntax of other tools that has no
/// meaning here.
/// Returns: one phrase for each finding, with the remedy; none for an ordinary pattern.
std::vector<std::string> warningsAbout(const std::string &pattern);

} // namespace KOVA::Backup::Tool

#endif
