#ifndef KOVABACKUP_TOOLS_CLI_H
#define KOVABACKUP_TOOLS_CLI_H

/// @file The frame of the command: families, verbs, options, exit codes, and the context in which
/// a verb runs.
///
/// A verb is declared with its options and an action; the action runs once the whole command line
/// has been understood. It puts its results into the context's document, writes them to the
/// context's output unless JSON was asked for, and returns an exit code. What it cannot do it
/// throws as a Failure.
///
///     auto options = std::make_shared<ShowOptions>();
///     family.command("show", "Show one session")
///         .argument(options->id, "ID", "the session's id")
///         .example("kovabackup session show sess.a1B2c3")
///         .action([options](Context &context) { return show(context, *options); });

#include "tools/kovabackup/frame/output.h"

#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

namespace CLI {
class App;
class Option;
} // namespace CLI

namespace KOVA::Backup::Tool {

constexpr int kDone = 0;
constexpr int kFailed = 1;
constexpr int kUsage = 2;
constexpr int kNegative = 3; ///< not found, or the answer is no
constexpr int kTimedOut = 4;

/// Version of the layout of every JSON document. Members may be added without a new number.
constexpr int kSchemaVersion = 1;

/// Why a verb cannot go on: the exit code and a sentence for the user.
class Failure : public std::runtime_error {
public:
  Failure(int exitCode, const std::string &message)
      : std::runtime_error(message), exitCode_(exitCode) {}
  int exitCode() const { return exitCode_; }

private:
  int exitCode_;
};

/// What a verb finds around it.
struct Context {
  bool json = false;    ///< results and errors as one JSON document
  bool noColor = false; ///< --no-color was given
  Output out{1};        ///< results
  Output messages{2};   ///< everything else
  Json::Value document; ///< results, with --json
  std::function<int(Context &)> action;
  /// Called when the results could not be written, to take back what nobody will know of.
  std::function<void()> undo;
  std::string command; ///< the words that called the verb: "kovabackup session list"

  Context();

  /// Tells the user of a failure that does not end the command: on the messages' stream, or in the
  /// document's "errors".
  void reportError(int exitCode, const std::string &message);

  /// Tells of a failure that ends the command; after wrong usage, where to find help.
  void fail(const Failure &failure);

  /// A remark on the messages' stream. None of it goes into the document.
  void remark(const std::string &message);

  /// Begins the document with a list that is written while it grows, for what is too much to be
  /// held. What the document holds besides follows at its end.
  void beginList(const std::string &name);
  /// An entry of that list, as JSON text.
  void listEntry(std::string_view entry);

  /// Writes the document, or what is left of it.
  void writeDocument();

private:
  bool listing_ = false;
  bool firstEntry_ = true;
};

/// One verb while it is being declared. The targets must live as long as the verb: keep them in
/// what the action holds.
class Command {
public:
  Command(CLI::App &app, Context &context) : app_(&app), context_(&context) {}

  Command &argument(std::string &target, const std::string &name, const std::string &help);
  Command &argument(std::optional<std::string> &target, const std::string &name,
                    const std::string &help);
  /// One or more arguments; or any number with optional.
  Command &arguments(std::vector<std::string> &target, const std::string &name,
                     const std::string &help, bool optional = false);
  Command &flag(bool &target, const std::string &names, const std::string &help);
  /// An option with a value. value is how the help names it.
  Command &option(std::optional<std::string> &target, const std::string &names,
                  const std::string &value, const std::string &help);
  Command &required(std::string &target, const std::string &names, const std::string &value,
                    const std::string &help);
  /// An option that may be given several times.
  Command &repeated(std::vector<std::string> &target, const std::string &names,
                    const std::string &value, const std::string &help);
  Command &nullFlag(bool &target, const std::string &help);
  /// Paragraphs between options and examples.
  Command &note(const std::string &text);
  Command &example(const std::string &text);
  void action(std::function<int(Context &)> action);

private:
  CLI::App *app_;
  Context *context_;
};

/// The verbs on one subject.
class CommandGroup {
public:
  CommandGroup(CLI::App &app, Context &context) : app_(&app), context_(&context) {}
  Command command(const std::string &name, const std::string &help);
  CommandGroup &example(const std::string &text);

private:
  CLI::App *app_;
  Context *context_;
};

CommandGroup addCommandGroup(CLI::App &app, Context &context, const std::string &name,
                             const std::string &help);

/// A command of one word, such as `kovabackup doctor`.
Command addCommand(CLI::App &app, Context &context, const std::string &name,
                   const std::string &help);

/// Makes the command itself, without families.
std::unique_ptr<CLI::App> makeApp(Context &context);

/// Understands the command line. Returns: nothing when context.action is to be run, else the exit
/// code with which to end; help and complaints have been written.
std::optional<int> parse(CLI::App &app, Context &context, int argc, const char *const *argv);

} // namespace KOVA::Backup::Tool

#endif
