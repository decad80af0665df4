#include "tools/kovabackup/frame/invocation.h"

#include "base/json_memory.h"
#include "tools/kovabackup/frame/command_line.h"
#include "tools/kovabackup/frame/help.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <exception>
#include <fmt/format.h>
#include <new>
#include <syslog.h>

#ifndef KOVA_TOOL_VERSION
#error "the build names the version"
#endif

namespace KOVA::Backup::Tool {
namespace {

void storeAll(const CommandLine &line) {
  for (const auto &[option, value] : line.options) {
    option->store(value);
  }
  for (std::size_t i = 0; i < line.arguments.size(); ++i) {
    argumentAt(*line.command, i)->store(line.arguments[i]); // the reader takes no more than these
  }
}

void applyStyle(Context &context) {
  const bool allowed = !context.noColor && environmentAllowsColour();
  context.out.setStyle(Style(allowed && context.out.terminal()));
  context.messages.setStyle(Style(allowed && context.messages.terminal()));
}

std::vector<std::string> optionNames(const Declaration &at) {
  std::vector<std::string> names;
  for (const Option *option : commonOptions(at)) {
    names.push_back(option->name);
  }
  for (const Option &option : at.options) {
    names.push_back(option.name);
  }
  return names;
}

std::vector<std::string> childNames(const Declaration &group) {
  std::vector<std::string> names;
  for (const Declaration *child : visibleChildren(group)) {
    names.push_back(child->name);
  }
  return names;
}

std::string suggestion(const std::string &word, const std::vector<std::string> &candidates) {
  const std::string near = nearest(word, candidates);
  return near.empty() ? "" : fmt::format("; did you mean '{}'?", near);
}

std::string aboutUnknownCommand(const Declaration &group, const std::string &word) {
  return fmt::format("unknown command '{}'{}", word, suggestion(word, childNames(group)));
}

std::string aboutUnknownOption(const Declaration &at, const std::string &name) {
  if (findOption(at, name) != nullptr) { // an option of the command, but given before its name
    return fmt::format("option '{}' must follow '{}'", name, commandName(at));
  }
  const std::string near = suggestion(name, optionNames(at));
  const char *advice = ""; // data may look like an option
  if (near.empty() && !at.arguments.empty()) {
    advice = at.arguments.back().completion.kind == Completes::CommandLine
                 ? "; put -- before the command"
                 : "; put -- before arguments that begin with -";
  }
  return fmt::format("unknown option '{}'{}{}", name, near, advice);
}

std::string aboutProblem(const Declaration &at, const Problem &problem) {
  switch (problem.kind) {
  case Problem::Kind::UnknownOption:
    return aboutUnknownOption(at, problem.word);
  case Problem::Kind::ValueForFlag:
    return fmt::format("{} takes no value", problem.word);
  case Problem::Kind::UnexpectedArgument:
    break;
  }
  return fmt::format("unexpected argument '{}'{}{}", problem.word,
                     at.surplusAdvice.empty() ? "" : "; ", at.surplusAdvice);
}

// What is missing from a line whose words are all understood; "" when it is complete.
std::string aboutMissing(const CommandLine &line) {
  if (line.unfinished != nullptr) {
    return fmt::format("{0} needs a value: {0} {1}", line.unfinished->name, line.unfinished->value);
  }
  for (const Option &option : line.command->options) {
    const bool given = std::any_of(line.options.begin(), line.options.end(),
                                   [&option](const auto &entry) { return entry.first == &option; });
    if (option.required && !given) {
      return option.name + " is required";
    }
  }
  const std::vector<Argument> &declared = line.command->arguments;
  const std::size_t given = line.arguments.size();
  return given < declared.size() && declared[given].required ? declared[given].name + " is required"
                                                             : "";
}

int wrongUsage(Context &context, const std::string &text) {
  context.fail(Failure(kUsage, text));
  return kUsage;
}

int showVersion(Context &context) {
  if (context.json) {
    context.document["version"] = KOVA_TOOL_VERSION;
  } else {
    context.out.line(std::string("kovabackup ") + KOVA_TOOL_VERSION);
  }
  return kDone;
}

// A group without a command. The help answers best what can follow, yet nothing was done.
int missingCommand(const Declaration &group, Context &context) {
  if (context.json) {
    return wrongUsage(context, fmt::format("'{}' needs a command", commandName(group)));
  }
  context.messages.write(helpText(group, context.messages));
  return kUsage;
}

int runAction(const Declaration &command, Context &context) {
  if (context.verbose) { // the name must live as long as the log is open
    ::openlog("kovabackup", LOG_PERROR, LOG_USER);
  }
  try {
    return Base::JsonMemory::withBadAlloc([&] { return command.action(context); });
  } catch (const Failure &failure) {
    context.fail(failure);
    return failure.exitCode();
  } catch (const std::bad_alloc &) {
    context.reportError(kFailed, "memory ran out");
    return kFailed;
  } catch (const std::exception &exception) {
    context.reportError(kFailed, fmt::format("unexpected failure: {}", exception.what()));
    return kFailed;
  }
}

int answer(const CommandLine &line, Context &context) {
  const Declaration &at = *line.command;
  if (line.unknownCommand) {
    return wrongUsage(context, aboutUnknownCommand(at, *line.unknownCommand));
  }
  if (context.version) {
    return showVersion(context);
  }
  if (line.problem) {
    return wrongUsage(context, aboutProblem(at, *line.problem));
  }
  const std::string missing = aboutMissing(line);
  if (!missing.empty()) {
    return wrongUsage(context, missing);
  }
  return at.isGroup() ? missingCommand(at, context) : runAction(at, context);
}

} // namespace

int invoke(const Declaration &root, const std::vector<std::string> &words, Context &context) {
  const CommandLine line = readCommandLine(root, words);
  storeAll(line);
  applyStyle(context); // before anything is written, complaints about the line included
  context.command = commandName(*line.command);
  const bool help = context.help || line.help;
  if (help && !context.version && !line.unknownCommand) {
    context.out.write(helpText(*line.command, context.out)); // also with --json
    return kDone;
  }
  const int exitCode = answer(line, context);
  if (context.json) {
    context.writeDocument();
  }
  return exitCode;
}

} // namespace KOVA::Backup::Tool
