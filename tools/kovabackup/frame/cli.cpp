#include "tools/kovabackup/frame/cli.h"

namespace KOVA::Backup::Tool {
namespace {

// How a value reaches its target: it replaces the previous one or is appended.
std::function<void(const std::string &)> into(std::string &target) {
  return [&target](const std::string &word) { target = word; };
}

std::function<void(const std::string &)> into(std::optional<std::string> &target) {
  return [&target](const std::string &word) { target = word; };
}

std::function<void(const std::string &)> into(std::vector<std::string> &target) {
  return [&target](const std::string &word) { target.push_back(word); };
}

} // namespace

Argument &Command::addArgument(const std::string &name, const std::string &help) {
  Argument &argument = declaration_->arguments.emplace_back();
  argument.name = name;
  argument.help = help;
  completion_ = &argument.completion;
  return argument;
}

Option &Command::addOption(const std::string &name, const std::string &value,
                           const std::string &help) {
  Option &option = declaration_->options.emplace_back();
  option.name = name;
  option.value = value;
  option.help = help;
  completion_ = &option.completion;
  return option;
}

Command &Command::argument(std::string &target, const std::string &name, const std::string &help) {
  addArgument(name, help).store = into(target);
  return *this;
}

Command &Command::optionalArgument(std::optional<std::string> &target, const std::string &name,
                                   const std::string &help) {
  Argument &argument = addArgument(name, help);
  argument.required = false;
  argument.store = into(target);
  return *this;
}

Command &Command::arguments(std::vector<std::string> &target, const std::string &name,
                            const std::string &help, bool optional) {
  Argument &argument = addArgument(name, help);
  argument.required = !optional;
  argument.repeats = true;
  argument.store = into(target);
  return *this;
}

Command &Command::flag(bool &target, const std::string &name, const std::string &help) {
  return flag(target, '\0', name, help);
}

Command &Command::flag(bool &target, char letter, const std::string &name,
                       const std::string &help) {
  Option &option = addOption(name, "", help);
  option.letter = letter;
  option.store = [&target](const std::string &) { target = true; };
  return *this;
}

Command &Command::option(std::optional<std::string> &target, const std::string &name,
                         const std::string &value, const std::string &help) {
  addOption(name, value, help).store = into(target);
  return *this;
}

Command &Command::required(std::string &target, const std::string &name, const std::string &value,
                           const std::string &help) {
  Option &option = addOption(name, value, help);
  option.required = true;
  option.store = into(target);
  return *this;
}

Command &Command::repeated(std::vector<std::string> &target, const std::string &name,
                           const std::string &value, const std::string &help) {
  addOption(name, value, help).store = into(target);
  return *this;
}

Command &Command::nullFlag(bool &target, const std::string &help) {
  return flag(target, '0', "--null", help);
}

Command &Command::completes(Completes kind) {
  completion_->kind = kind;
  return *this;
}

Command &Command::completes(Candidates candidates, const std::string &pathPrefix) {
  *completion_ = {Completes::Words, std::move(candidates), pathPrefix};
  return *this;
}

Command &Command::surplusAdvice(const std::string &text) {
  declaration_->surplusAdvice = text;
  return *this;
}

Command &Command::hidden() {
  declaration_->hidden = true;
  return *this;
}

Command &Command::note(const std::string &text) {
  declaration_->notes.push_back(text);
  return *this;
}

Command &Command::example(const std::string &text) {
  declaration_->examples.push_back(text);
  return *this;
}

void Command::action(std::function<int(Context &)> action) {
  declaration_->action = std::move(action);
}

Declaration &CommandGroup::addChild(const std::string &name, const std::string &help) {
  Declaration &child = *declaration_->children.emplace_back(std::make_unique<Declaration>());
  child.name = name;
  child.help = help;
  child.parent = declaration_;
  return child;
}

Command CommandGroup::command(const std::string &name, const std::string &help) {
  return Command(addChild(name, help));
}

CommandGroup CommandGroup::group(const std::string &name, const std::string &help) {
  return CommandGroup(addChild(name, help));
}

CommandGroup &CommandGroup::example(const std::string &text) {
  declaration_->examples.push_back(text);
  return *this;
}

std::unique_ptr<Declaration> declareRoot(Context &context) {
  auto root = std::make_unique<Declaration>();
  root->name = "kovabackup";
  root->help =
      "Inspects and manages what the backup services use: sessions, options, volumes, locks.";
  Command(*root)
      .flag(context.help, 'h', "--help", "show this help")
      .flag(context.version, "--version", "show the version")
      .flag(context.json, "--json", "print one JSON document, errors included")
      .flag(context.noColor, "--no-color", "no colours, also on a terminal")
      .flag(context.quiet, 'q', "--quiet", "no remarks and warnings, only failures")
      .flag(context.verbose, 'v', "--verbose",
            "also print on standard error what the libraries log")
      .note("Each command has its own --help. Exit codes: 0 done, 1 failed, 2 wrong usage, 3 not "
            "found or the answer is no, 4 timed out.")
      .example("kovabackup doctor")
      .example("kovabackup session list")
      .example("kovabackup help option set");
  return root;
}

} // namespace KOVA::Backup::Tool
