#ifndef KOVABACKUP_TOOLS_COMMAND_LINE_H
#define KOVABACKUP_TOOLS_COMMAND_LINE_H

/// @file How words reach the argument parser unharmed.
///
/// CLI11 reads meaning into data: a word like "[a,b]" becomes two, "++" ends a verb, "--opt=" takes
/// the next word, and a name that happens to be a verb may start it. So every word that is data is
/// wrapped before it goes in, and unwrapped when it comes out.

#include <string>

namespace KOVA::Backup::Tool {

constexpr char kWrapper = '\x01';

std::string wrapWord(const std::string &word);
std::string unwrapWord(const std::string &word);

} // namespace KOVA::Backup::Tool

#endif
