#ifndef KOVABACKUP_TOOLS_CLI_H
#define KOVABACKUP_TOOLS_CLI_H

/// @file How groups and commands are declared.
///
/// A command is declared with its arguments, its options and an action. The action runs only when
/// every word of the command line has been understood. It puts its results into the context's
/// document, writes them to the context's output unless JSON was asked for, and returns an exit
/// code. When it cannot go on it throws a Failure.
///
///     auto options = std::make_shared<ShowOptions>();
///     group.command("show", "Show one session")
///         .argument(options->id, "ID", "the session's id")
///         .example("kovabackup session show sess.a1B2c3")
///         .action([options](Context &context) { return show(context, *options); });

#include "tools/kovabackup/frame/context.h"
#include "tools/kovabackup/frame/declaration.h"

#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// One command while it is being declared. The targets must live as long as the declaration: keep
/// them in what the action holds. A target is written only when the user gave a value for it.
class Command {
public:
  explicit Command(Declaration &declaration) : declaration_(&declaration) {}

  Command &argument(std::string &target, const std::string &name, const std::string &help);
  Command &optionalArgument(std::optional<std::string> &target, const std::string &name,
                            const std::string &help);
  /// One or more arguments, or any number of them with optional. Must be declared last.
  Command &arguments(std::vector<std::string> &target, const std::string &name,
                     const std::string &help, bool optional = false);
  Command &flag(bool &target, const std::string &name, const std::string &help);
  /// A flag that also has a letter: 'h' for -h.
  Command &flag(bool &target, char letter, const std::string &name, const std::string &help);
  /// An option with a value, which the help calls by the name value. The last one given counts.
  Command &option(std::optional<std::string> &target, const std::string &name,
                  const std::string &value, const std::string &help);
  Command &required(std::string &target, const std::string &name, const std::string &value,
                    const std::string &help);
  /// An option that may be given several times.
  Command &repeated(std::vector<std::string> &target, const std::string &name,
                    const std::string &value, const std::string &help);
  Command &nullFlag(bool &target, const std::string &help);
  /// What shells complete for the argument or the option's value that was declared last.
  Command &completes(Completes kind);
  /// A word that begins with pathPrefix is completed as a path from there on.
  Command &completes(Candidates candidates, const std::string &pathPrefix = "");
  /// What a user can do who gave more arguments than the command takes: a clause.
  Command &surplusAdvice(const std::string &text);
  /// Leaves the command out of help, suggestions and completion.
  Command &hidden();
  /// A paragraph of the help, between options and examples.
  Command &note(const std::string &text);
  Command &example(const std::string &text);
  void action(std::function<int(Context &)> action);

private:
  Argument &addArgument(const std::string &name, const std::string &help);
  Option &addOption(const std::string &name, const std::string &value, const std::string &help);

  Declaration *declaration_;
  Completion *completion_ = nullptr; ///< of what was declared last
};

/// The commands on one subject.
class CommandGroup {
public:
  explicit CommandGroup(Declaration &declaration) : declaration_(&declaration) {}

  Command command(const std::string &name, const std::string &help);
  CommandGroup group(const std::string &name, const std::string &help);
  CommandGroup &example(const std::string &text);

private:
  Declaration &addChild(const std::string &name, const std::string &help);

  Declaration *declaration_;
};

/// Declares the command kovabackup with the options that are common to all commands, but without
/// any group. The context must live as long as the declaration.
std::unique_ptr<Declaration> declareRoot(Context &context);

} // namespace KOVA::Backup::Tool

#endif
