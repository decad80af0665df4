#ifndef KOVABACKUP_TOOLS_COMMAND_LINE_H
#define KOVABACKUP_TOOLS_COMMAND_LINE_H

/// @file The grammar of the command line.
///
///     kovabackup [OPTION...] GROUP [OPTION...] COMMAND [OPTION | ARGUMENT]...
///
/// - A word that begins with - is an option; a lone - and the empty word are not. Options may
///   follow arguments. "--" ends them: every later word is a name or an argument.
/// - Names are taken exactly, never by their first letters, so that new options break no script.
/// - The value of an option is the next word, whatever it looks like, or follows after "=".
/// - Letters of flags may share a dash: -0h.
/// - Where a command takes arguments, a negative number such as -5 is one, unless its first digit
/// is
///   the letter of a flag.
/// - "help" in place of the first name asks for help, as --help does.
///
/// Words are data: any bytes but NUL, never split, expanded or interpreted.

#include "tools/kovabackup/frame/declaration.h"

#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace KOVA::Backup::Tool {

/// What is wrong with a word.
struct Problem {
  enum class Kind { UnknownOption, ValueForFlag, UnexpectedArgument };
  Kind kind;
  std::string word; ///< the name of the option, without its value, or the argument
};

/// A command line taken apart. Nothing has been stored into the targets of the declarations yet:
/// completion reads lines that must have no effect.
struct CommandLine {
  const Declaration *command; ///< the command that was named, or the last group
  std::vector<std::pair<const Option *, std::string>> options; ///< with their values
  std::vector<std::string> arguments;
  bool help = false;                  ///< begins with the word help
  bool onlyArguments = false;         ///< past "--"
  const Option *unfinished = nullptr; ///< the last word is this option; its value is missing
  std::optional<Problem> problem;     ///< the first one

  /// The word in the place of a command that does not name one. It counts even when help is asked
  /// for: the help of the group would look as if the command existed.
  std::optional<std::string> unknownCommand;
};

CommandLine readCommandLine(const Declaration &root, const std::vector<std::string> &words);

} // namespace KOVA::Backup::Tool

#endif
