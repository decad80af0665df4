#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/catalogue.h"
#include "tools/kovabackup/facts/platform_error.h"
#include "tools/kovabackup/frame/input.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <fmt/format.h>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup::Tool {
namespace {

struct ExplainOptions {
  std::vector<std::string> messages;
};

// What lines or arguments name, each once and in their order.
struct Named {
  std::vector<std::string> ids;
  std::vector<int> codes; ///< of the platform
  std::vector<std::string> others;
};

template <typename Value>
void addOnce(std::vector<Value> &values, const Value &value) {
  if (std::find(values.begin(), values.end(), value) == values.end()) {
    values.push_back(value);
  }
}

void addLine(Named &named, const std::string &line) {
  const std::string id = messageIdIn(line);
  const int code = platformCodeIn(line);
  if (id.empty()) {
    addOnce(named.others, line);
    return;
  }
  addOnce(named.ids, id);
  if (code >= 0) {
    addOnce(named.codes, code);
  }
}

// A code alone counts only as an argument: log lines of other programs have such numbers, too.
void addArgument(Named &named, const std::string &text) {
  const int code = platformCodeIn(text);
  if (messageIdIn(text).empty() && code >= 0) {
    addOnce(named.codes, code);
  } else {
    addLine(named, text);
  }
}

Named readLines(Context &context) {
  if (::isatty(STDIN_FILENO) == 1) {
    context.remark("reading log lines from standard input");
  }
  Named named;
  RecordReader lines("-", /*null=*/false);
  for (std::string line; lines.next(line);) {
    addLine(named, line);
  }
  if (named.ids.empty()) {
    throw Failure(kNegative, "no line names a message of the libraries: expected MODULE:NUMBER, as "
                             "in session:126");
  }
  named.others.clear(); // a system log has lines of other programs
  return named;
}

std::string aboutUnknownId(const std::string &id) {
  const std::string module = id.substr(0, id.find(':') + 1);
  std::string numbers;
  for (const LogMessage &message : allMessages()) {
    if (message.id.rfind(module, 0) == 0) {
      numbers += (numbers.empty() ? "" : ", ") + message.id.substr(module.size());
    }
  }
  return fmt::format("there is no message {}; those of {} are {}", id,
                     module.substr(0, module.size() - 1), numbers);
}

std::string aboutUnknownWord(const std::string &word) {
  std::vector<std::string> ids;
  for (const LogMessage &message : allMessages()) {
    ids.push_back(message.id);
  }
  const std::string near = nearest(word, ids);
  return fmt::format("'{}' names no message{}", word,
                     near.empty() ? ": expected MODULE:NUMBER, as in session:126, a complete log "
                                    "line, or a platform error code, as in 0x0900"
                                  : fmt::format("; did you mean '{}'?", near));
}

Json::Value jsonMessage(const LogMessage &message) {
  Json::Value entry(Json::objectValue);
  entry["id"] = message.id;
  entry["priority"] = message.priority;
  entry["plain"] = message.plain;
  entry["text"] = message.text;
  entry["writtenBy"] = message.from;
  entry["meaning"] = message.meaning;
  entry["action"] = message.action;
  return entry;
}

void print(Output &out, const LogMessage &message, bool first) {
  out.line(fmt::format("{}{} ({}{})", first ? "" : "\n", out.style().bold(message.id),
                       message.priority, message.plain ? ", plain" : ""));
  out.line("    " + message.text);
  for (const auto &[label, text] :
       {std::pair{"Written by", &message.from}, std::pair{"Meaning", &message.meaning},
        std::pair{"What to do", &message.action}}) {
    out.line("  " + wrapped(fmt::format("{}: {}", label, *text), 2, out.width()));
  }
}

Json::Value jsonCode(int code, const std::string &words) {
  Json::Value entry(Json::objectValue);
  entry["code"] = fmt::format("0x{:04x}", code);
  entry["meaning"] = words.empty() ? Json::Value() : Json::Value(words);
  return entry;
}

void explainCodes(Context &context, const std::vector<int> &codes) {
  bool first = context.document["messages"].empty();
  context.document["codes"] = Json::Value(Json::arrayValue);
  for (const int code : codes) {
    const std::string words = platformErrorWords(code);
    context.document["codes"].append(jsonCode(code, words));
    if (!context.json) {
      context.out.line(wrapped(
          fmt::format("{}Platform error 0x{:04x}: {}", std::exchange(first, false) ? "" : "\n",
                      code, words.empty() ? "the platform's documents explain it" : words),
          2, context.out.width()));
    }
  }
}

// What cannot be explained is reported, and does not keep the rest from being explained.
int reportUnknown(Context &context, const std::string &text) {
  context.reportError(kNegative, text);
  return kNegative;
}

int explainMessages(Context &context, const std::vector<std::string> &ids) {
  int exitCode = kDone;
  bool first = true;
  context.document["messages"] = Json::Value(Json::arrayValue);
  for (const std::string &id : ids) {
    const LogMessage *message = findMessage(id);
    if (message == nullptr) {
      exitCode = reportUnknown(context, aboutUnknownId(id));
      continue;
    }
    context.document["messages"].append(jsonMessage(*message));
    if (!context.json) {
      print(context.out, *message, std::exchange(first, false));
    }
  }
  return exitCode;
}

int explain(Context &context, const ExplainOptions &options) {
  Named named;
  for (const std::string &text : options.messages) {
    addArgument(named, text);
  }
  if (options.messages.empty()) {
    named = readLines(context);
  }
  int exitCode = explainMessages(context, named.ids);
  explainCodes(context, named.codes);
  for (const std::string &word : named.others) {
    exitCode = reportUnknown(context, aboutUnknownWord(word));
  }
  return exitCode;
}

} // namespace

void registerExplain(CommandGroup &root) {
  auto options = std::make_shared<ExplainOptions>();
  root.command("explain", "Explain lines that the libraries wrote to the system log")
      .arguments(options->messages, "MESSAGE",
                 "MODULE:NUMBER, as in session:126, a complete line in quotes, or a platform error "
                 "code, as in 0x0900; without any, log lines are read from standard input",
                 true)
      .completes(messageIds)
      .note(
          "Prints the text of each message, the functions that write it, what it means and what "
          "to do. In a text, %m is the system's reason and any other % is a value. The catalogue "
          "is part of the command. Lines of the platform's stand-ins, which begin with kovasdk: or "
          "kovaplatform:, have no number: pass the line. Ends with 3 when a message is unknown, or "
          "when no line of the input has one; lines of other programs are skipped.")
      .example("kovabackup explain session:126")
      .example("kovabackup explain 'kovasdk: the mount table cannot be read'")
      .example("journalctl -t backupd -n 20 | kovabackup explain")
      .action([options](Context &c) { return explain(c, *options); });
}

} // namespace KOVA::Backup::Tool
