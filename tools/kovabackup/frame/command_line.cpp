#include "tools/kovabackup/frame/command_line.h"

#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/help.h"
#include "tools/kovabackup/frame/text.h"

#include <CLI/CLI.hpp>
#include <algorithm>
#include <fmt/format.h>

#ifndef KOVA_TOOL_VERSION
#error "the build names the version"
#endif

namespace KOVA::Backup::Tool {
namespace {

bool looksLikeOption(const std::string &word) {
  return word.size() > 1 && word[0] == '-';
}

std::vector<std::string> childNames(const CLI::App &app) {
  std::vector<std::string> names;
  for (const CLI::App *child : app.get_subcommands([](const CLI::App *) { return true; })) {
    names.push_back(child->get_name());
  }
  return names;
}

// Walks the words as the parser will, as far as needed to tell names of commands from data.
class Words {
public:
  Words(const CLI::App &app, Context &context) : root_(&app), app_(&app), context_(&context) {}

  void add(const std::string &word) {
    if (word == "--" && !noOptions_) {
      noOptions_ = true;
    } else if (looksLikeOption(word) && !noOptions_) {
      addOption(word);
    } else {
      addName(word);
    }
  }

  /// As CLI11 wants them: last word first.
  std::vector<std::string> reversed() const { return {words_.rbegin(), words_.rend()}; }

  /// The word that stands where a command should and names none. Told even when help is asked for:
  /// there is none on it, and the help of what stands before it would look like a yes.
  const std::optional<std::string> &unknownCommand() const { return unknownCommand_; }
  const CLI::App &deepest() const { return *app_; }

private:
  void addOption(const std::string &word) {
    const std::size_t equals = word.rfind("--", 0) == 0 ? word.find('=') : std::string::npos;
    words_.push_back(equals == std::string::npos
                         ? word
                         : word.substr(0, equals + 1) + wrapWord(word.substr(equals + 1)));
    // A complaint about the rest of the line must already come in the form that was asked for.
    if (app_ == root_ || app_->get_option_no_throw(word) == nullptr) {
      context_->json = context_->json || word == "--json";
      context_->noColor = context_->noColor || word == "--no-color";
    }
    lost_ = lost_ || !known(word.substr(0, equals));
  }

  // Short options may stand together: "-0h".
  bool known(const std::string &name) const {
    const std::string first = name[1] == '-' ? name : name.substr(0, 2);
    return app_->get_option_no_throw(first) != nullptr ||
           root_->get_option_no_throw(first) != nullptr;
  }

  void addName(const std::string &word) {
    const auto children = app_->get_subcommands([](const CLI::App *) { return true; });
    const auto child = std::find_if(children.begin(), children.end(), [&word](const CLI::App *app) {
      return app->get_name() == word;
    });
    words_.push_back(child == children.end() ? wrapWord(word) : word);
    if (child != children.end()) {
      app_ = *child;
    } else if (!children.empty() && !lost_ && !unknownCommand_) {
      unknownCommand_ = word;
    }
  }

  const CLI::App *root_;
  const CLI::App *app_;
  Context *context_;
  bool noOptions_ = false;
  bool lost_ = false; ///< past an unknown option; the next word may be its value
  std::optional<std::string> unknownCommand_;
  std::vector<std::string> words_;
};

// `kovabackup help session list` is `kovabackup session list --help`; options before a family take
// no values.
std::vector<std::string> withoutHelpWord(int argc, const char *const *argv) {
  std::vector<std::string> words(argv + 1, argv + argc);
  const auto first = std::find_if_not(words.begin(), words.end(), [](const std::string &word) {
    return looksLikeOption(word) && word != "--";
  });
  if (first != words.end() && *first == "help") {
    words.erase(first);
    words.emplace_back("--help");
  }
  return words;
}

const CLI::App &deepest(const CLI::App &app) {
  const CLI::App *found = &app;
  while (!found->get_subcommands().empty()) {
    found = found->get_subcommands().back();
  }
  return *found;
}

std::vector<std::string> optionNames(const CLI::App &app) {
  std::vector<std::string> names;
  for (const CLI::App *level = &app; level != nullptr; level = level->get_parent()) {
    for (const CLI::Option *option : level->get_options()) {
      for (const std::string &name : option->get_lnames()) {
        names.push_back("--" + name);
      }
    }
  }
  return names;
}

std::string suggestion(const std::string &word, const std::vector<std::string> &candidates) {
  const std::string near = nearest(word, candidates);
  return near.empty() ? "" : fmt::format("; did you mean '{}'?", near);
}

bool takesArguments(const CLI::App &app) {
  const std::vector<const CLI::Option *> options = app.get_options();
  return std::any_of(options.begin(), options.end(),
                     [](const CLI::Option *option) { return option->get_positional(); });
}

std::string complaintAboutCommand(const CLI::App &at, const std::string &word) {
  return fmt::format("unknown command '{}'{}", word, suggestion(word, childNames(at)));
}

std::string complaintAboutOption(const CLI::App &at, const std::string &word) {
  const std::string name = word.substr(0, word.find('='));
  const std::string near = suggestion(name, optionNames(at));
  const char *advice = ""; // data may look like an option
  if (near.empty() && takesArguments(at)) {
    advice = at.get_name() == "run" ? "; put -- before the command"
                                    : "; put -- before arguments that begin with -";
  }
  return fmt::format("unknown option '{}'{}{}", name, near, advice);
}

std::string complaintAboutWord(const CLI::App &at, const std::string &word) {
  return word.front() == kWrapper ? fmt::format("unexpected argument '{}'", unwrapWord(word))
                                  : complaintAboutOption(at, word);
}

std::string complaint(const CLI::App &app, const CLI::ParseError &error) {
  const std::vector<std::string> leftOver = app.remaining(true);
  if (!leftOver.empty() && !leftOver.front().empty()) {
    return complaintAboutWord(deepest(app), leftOver.front());
  }
  std::string text = error.what();
  if (error.get_name() == "ArgumentMismatch") {
    const std::string name = text.substr(0, text.find(':'));
    const CLI::Option *option = deepest(app).get_option_no_throw(name);
    return fmt::format("{} needs a value{}", name,
                       option == nullptr ? "" : ": " + name + " " + option->get_type_name());
  }
  if (error.get_name() == "ConversionError") { // only flags convert: "... : --json = x"
    const std::size_t name = text.find("--");
    return text.substr(name, text.find(' ', name) - name) + " takes no value";
  }
  text.erase(std::remove(text.begin(), text.end(), kWrapper), text.end());
  return text;
}

int wrongUsage(const CLI::App &at, Context &context, const std::string &text) {
  context.command = commandName(at);
  context.fail(Failure(kUsage, text));
  return kUsage;
}

// A family without a verb, or nothing at all: the help is the answer, but nothing was done.
int missingVerb(const CLI::App &app, Context &context) {
  const CLI::App &at = deepest(app);
  if (context.json) {
    return wrongUsage(at, context, fmt::format("'{}' needs a command", commandName(at)));
  }
  context.messages.write(helpText(at, context.messages.style()));
  return kUsage;
}

void applyStyle(Context &context) {
  const bool allowed = !context.noColor && environmentAllowsColour();
  context.out.setStyle(Style(allowed && context.out.terminal()));
  context.messages.setStyle(Style(allowed && context.messages.terminal()));
}

void writeVersion(Context &context, const std::string &text) {
  if (!context.json) {
    context.out.line(text);
    return;
  }
  context.document["version"] = KOVA_TOOL_VERSION;
  context.writeDocument();
}

} // namespace

std::string wrapWord(const std::string &word) {
  return kWrapper + word;
}

std::string unwrapWord(const std::string &word) {
  return !word.empty() && word.front() == kWrapper ? word.substr(1) : word;
}

std::unique_ptr<CLI::App> makeApp(Context &context) {
  auto app = std::make_unique<CLI::App>(
      "Looks after what the backup services use: sessions, options, filters, volumes, locks.",
      "kovabackup");
  app->set_help_flag("-h,--help", "show this help");
  app->set_version_flag("--version", std::string("kovabackup ") + KOVA_TOOL_VERSION,
                        "show the version");
  app->add_flag_callback(
      "--json", [&context] { context.json = true; }, "print one JSON document, errors included");
  app->add_flag_callback(
      "--no-color", [&context] { context.noColor = true; }, "no colours, also on a terminal");
  app->require_subcommand(0, 1);
  app->footer("\n" +
              wrapText("Each command has its own --help. Exit codes: 0 done, 1 failed, 2 wrong "
                       "usage, 3 not found or the answer is no, 4 timed out.",
                       0) +
              "\n\nExamples:\n  kovabackup doctor\n  kovabackup session list\n"
              "  kovabackup help option set\n");
  app->fallthrough(); // --json and --no-color are understood after the verb, too
  return app;
}

std::optional<int> parse(CLI::App &app, Context &context, int argc, const char *const *argv) {
  Words words(app, context);
  for (const std::string &word : withoutHelpWord(argc, argv)) {
    words.add(word);
  }
  applyStyle(context);
  if (words.unknownCommand()) {
    const CLI::App &at = words.deepest();
    return wrongUsage(at, context, complaintAboutCommand(at, *words.unknownCommand()));
  }
  try {
    std::vector<std::string> list = words.reversed();
    app.parse(list);
  } catch (const CLI::CallForHelp &) {
    context.out.write(helpText(deepest(app), context.out.style()));
    return kDone;
  } catch (const CLI::CallForVersion &version) {
    writeVersion(context, version.what());
    return kDone;
  } catch (const CLI::ParseError &error) {
    return wrongUsage(deepest(app), context, complaint(app, error));
  }
  if (!context.action) {
    return missingVerb(app, context);
  }
  context.command = commandName(deepest(app));
  return std::nullopt;
}

} // namespace KOVA::Backup::Tool
