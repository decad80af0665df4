#ifndef KOVABACKUP_TOOLS_DECLARATION_H
#define KOVABACKUP_TOOLS_DECLARATION_H

/// @file The table of everything that can be typed: groups, commands, options and arguments.
///
/// The table is the only source of what the command understands (command_line.h), of its help
/// (help.h) and of what the shells complete (complete.h). It is built with the classes of cli.h.

#include <functional>
#include <memory>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

struct Context;

/// A word that a shell may complete, and an explanation for shells that show one.
struct Candidate {
  std::string word;
  std::string help;
};

/// Makes candidates, given the arguments before the word that is completed.
using Candidates = std::function<std::vector<Candidate>(const std::vector<std::string> &arguments)>;

/// What shells complete for an argument or for the value of an option.
enum class Completes {
  Nothing,
  Words,      ///< candidates
  Files,      ///< paths
  CommandLine ///< a command and its arguments, as the shell completes them elsewhere
};

struct Completion {
  Completes kind = Completes::Nothing;
  Candidates words = {};       ///< of Completes::Words only
  std::string pathPrefix = {}; ///< of Completes::Words only: what may precede a path, as in "same:"
};

/// A flag such as --null, perhaps with a letter (-0), or an option with a value such as --lock.
struct Option {
  std::string name;   ///< with its dashes: "--null"
  char letter = '\0'; ///< '0' for -0. Only flags have letters.
  std::string value;  ///< the name of the value in the help; "" for a flag
  std::string help;
  bool required = false;
  std::function<void(const std::string &)> store; ///< takes the value; "" for a flag
  Completion completion;                          ///< of the value

  bool takesValue() const { return !value.empty(); }
};

struct Argument {
  std::string name; ///< in the help
  std::string help;
  bool required = true;
  bool repeats = false; ///< takes all words that are left; only the last argument may
  std::function<void(const std::string &)> store;
  Completion completion = {};
};

/// A command, or a group: the command kovabackup itself is the group that has no parent.
struct Declaration {
  std::string name;
  std::string help;
  const Declaration *parent = nullptr;
  bool hidden = false; ///< for programs only: understood, but shown nowhere
  std::vector<Option> options;
  std::vector<Argument> arguments;
  std::string surplusAdvice;      ///< what to do instead of giving more arguments; "" for nothing
  std::vector<std::string> notes; ///< paragraphs of the help
  std::vector<std::string> examples;                  ///< lines of the help
  std::function<int(Context &)> action;               ///< of commands only
  std::vector<std::unique_ptr<Declaration>> children; ///< of groups only

  bool isGroup() const { return !children.empty(); }
};

/// The words that call it: "kovabackup session list".
std::string commandName(const Declaration &at);

/// Returns: the group or command of that name in a group; null when there is none.
const Declaration *findChild(const Declaration &group, const std::string &name);

/// The groups and commands of a group that help, suggestions and completion show.
std::vector<const Declaration *> visibleChildren(const Declaration &group);

/// The declaration of argument number index, counted from 0; null when so many are not taken.
const Argument *argumentAt(const Declaration &command, std::size_t index);

/// Finds an option by its name or letter: among those of the command first, because it may give a
/// common option another meaning, then among those that are common to all commands.
/// Returns: null when there is none.
const Option *findOption(const Declaration &at, const std::string &name);
const Option *findOption(const Declaration &at, char letter);

/// The options that the help of a command shows as common: those of the root without those that the
/// command replaces. The version is shown at the root only, though it is understood everywhere.
std::vector<const Option *> commonOptions(const Declaration &at);

} // namespace KOVA::Backup::Tool

#endif
