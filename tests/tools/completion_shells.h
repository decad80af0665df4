#ifndef KOVABACKUP_TESTS_COMPLETION_SHELLS_H
#define KOVABACKUP_TESTS_COMPLETION_SHELLS_H

/// @file What the shells offer while a command line of kovabackup is typed. The shells are real,
/// and so are the completions and the command that they ask.

#include <map>
#include <set>
#include <string>
#include <vector>

namespace KovaTest {

/// A command line: the words of the command after kovabackup, and the word being typed.
struct Typed {
  std::string words; ///< separated by spaces
  std::string last;
};

/// What was offered, by the words of the command. bash and fish offer complete words; zsh leaves
/// out the folders of paths.
using Offered = std::map<std::string, std::set<std::string>>;

/// False when the machine lacks it.
bool hasShell(const std::string &shell);

/// Asks bash, fish or zsh. Offers for the same words are collected.
Offered askShell(const std::string &shell, const std::vector<Typed> &lines);

} // namespace KovaTest

#endif
