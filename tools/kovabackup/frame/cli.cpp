#include "tools/kovabackup/frame/cli.h"

#include "tools/kovabackup/frame/command_line.h"
#include "tools/kovabackup/frame/help.h"
#include "tools/kovabackup/frame/text.h"

#include <CLI/CLI.hpp>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

// What CLI11 hands over: the words that belong to an option, still wrapped (see command_line.h).
using Words = CLI::results_t;

CLI::callback_t intoText(std::string &target) {
  return [&target](const Words &words) {
    target = unwrapWord(words.back());
    return true;
  };
}

CLI::callback_t intoOptional(std::optional<std::string> &target) {
  return [&target](const Words &words) {
    target = unwrapWord(words.back());
    return true;
  };
}

CLI::callback_t intoList(std::vector<std::string> &target) {
  return [&target](const Words &words) {
    target.clear();
    for (const std::string &word : words) {
      target.push_back(unwrapWord(word));
    }
    return true;
  };
}

CLI::Option &lastWins(CLI::Option *option, const std::string &value) {
  option->type_name(value)->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
  return *option;
}

void appendFooter(CLI::App &app, const std::string &text) {
  app.footer(app.get_footer() + text);
}

void appendExample(CLI::App &app, const std::string &text) {
  static const std::string kHeading = "Examples:\n";
  if (app.get_footer().find(kHeading) == std::string::npos) {
    appendFooter(app, "\n" + kHeading);
  }
  appendFooter(app, "  " + text + "\n");
}

CLI::App *addSubcommand(CLI::App &app, const std::string &name, const std::string &help) {
  CLI::App *child = app.add_subcommand(name, help);
  child->footer(""); // CLI11 hands the parent's examples down
  return child;
}

} // namespace

Context::Context() : document(Json::objectValue) {
  document["schemaVersion"] = kSchemaVersion;
}

void Context::reportError(int exitCode, const std::string &message) {
  if (json) {
    Json::Value error(Json::objectValue);
    error["exitCode"] = exitCode;
    error["message"] = jsonName(message);
    document["errors"].append(error);
    return;
  }
  messages.line(
      fmt::format("{} {}", messages.style().bad("kovabackup:"), messages.name(shortened(message))));
  (void)messages.flush(); // nowhere is left to tell of a failure
}

void Context::fail(const Failure &failure) {
  reportError(failure.exitCode(), failure.what());
  if (failure.exitCode() == kUsage && !json) {
    messages.line(fmt::format("Try '{} --help'.", command));
  }
}

void Context::remark(const std::string &message) {
  messages.line("kovabackup: " + messages.name(shortened(message)));
  (void)messages.flush();
}

void Context::beginList(const std::string &name) {
  out.write(fmt::format("{{\"{}\":[", name));
  listing_ = true;
}

void Context::listEntry(std::string_view entry) {
  const std::string_view apart = out.terminal() ? ",\n" : ",";
  out.write(firstEntry_ ? apart.substr(1) : apart);
  out.write(entry);
  firstEntry_ = false;
}

void Context::writeDocument() {
  const std::string text = jsonText(document, out.terminal());
  if (listing_) { // "{" stands there already
    out.write("],");
    out.write(std::string_view(text).substr(1));
  } else {
    out.write(text);
  }
}

Command &Command::argument(std::string &target, const std::string &name, const std::string &help) {
  lastWins(app_->add_option(name, intoText(target), help), name).required();
  return *this;
}

Command &Command::argument(std::optional<std::string> &target, const std::string &name,
                           const std::string &help) {
  lastWins(app_->add_option(name, intoOptional(target), help), name);
  return *this;
}

Command &Command::arguments(std::vector<std::string> &target, const std::string &name,
                            const std::string &help, bool optional) {
  CLI::Option *option = app_->add_option(name, intoList(target), help)->type_name(name);
  option->expected(1, -1)->allow_extra_args()->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
  option->required(!optional);
  return *this;
}

Command &Command::flag(bool &target, const std::string &names, const std::string &help) {
  app_->add_flag_callback(
      names, [&target] { target = true; }, help);
  return *this;
}

Command &Command::option(std::optional<std::string> &target, const std::string &names,
                         const std::string &value, const std::string &help) {
  lastWins(app_->add_option(names, intoOptional(target), help), value);
  return *this;
}

Command &Command::required(std::string &target, const std::string &names, const std::string &value,
                           const std::string &help) {
  lastWins(app_->add_option(names, intoText(target), help), value).required();
  return *this;
}

Command &Command::repeated(std::vector<std::string> &target, const std::string &names,
                           const std::string &value, const std::string &help) {
  app_->add_option(names, intoList(target), help)
      ->type_name(value)
      ->multi_option_policy(CLI::MultiOptionPolicy::TakeAll);
  return *this;
}

Command &Command::nullFlag(bool &target, const std::string &help) {
  return flag(target, "-0,--null", help);
}

Command &Command::note(const std::string &text) {
  appendFooter(*app_, "\n" + wrapText(text, 0) + "\n");
  return *this;
}

Command &Command::example(const std::string &text) {
  appendExample(*app_, text);
  return *this;
}

void Command::action(std::function<int(Context &)> action) {
  app_->callback([context = context_, action = std::move(action)] { context->action = action; });
}

Command CommandGroup::command(const std::string &name, const std::string &help) {
  return addCommand(*app_, *context_, name, help);
}

CommandGroup &CommandGroup::example(const std::string &text) {
  appendExample(*app_, text);
  return *this;
}

CommandGroup addCommandGroup(CLI::App &app, Context &context, const std::string &name,
                             const std::string &help) {
  CLI::App *family = addSubcommand(app, name, help);
  family->require_subcommand(0, 1);
  return {*family, context};
}

Command addCommand(CLI::App &app, Context &context, const std::string &name,
                   const std::string &help) {
  return {*addSubcommand(app, name, help), context};
}

} // namespace KOVA::Backup::Tool
