#include "tools/kovabackup/frame/complete.h"

#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/command_line.h"

#include <algorithm>
#include <cctype>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct Answer {
  std::string kind = "words";
  std::vector<Candidate> words = {};
};

/// Answers for one command line: the words before the one that is being typed.
class Completer {
public:
  Completer(const Declaration &root, const std::vector<std::string> &before)
      : line_(readCommandLine(root, before)), count_(before.size()) {}

  Answer answer(const std::string &typed) const {
    const Declaration &at = *line_.command;
    if (line_.unknownCommand) {
      return {};
    }
    if (line_.unfinished != nullptr) {
      return answerFrom(line_.unfinished->completion);
    }
    if (!line_.onlyArguments && !typed.empty() && typed[0] == '-') {
      return typed.find('=') == std::string::npos ? optionsOf(at) : valueOf(at, typed);
    }
    if (at.isGroup()) {
      return childrenOf(at);
    }
    const Argument *argument = argumentAt(at, line_.arguments.size());
    return argument == nullptr ? Answer{} : answerFrom(argument->completion);
  }

private:
  Answer answerFrom(const Completion &completion) const {
    switch (completion.kind) {
    case Completes::Words:
      return {"words", completion.words(line_.arguments)};
    case Completes::Files:
      return {"files"};
    case Completes::CommandLine:
      return {fmt::format("command {}", count_ - line_.arguments.size())};
    case Completes::Nothing:
      break;
    }
    return {};
  }

  // "--lock=ta": the shells replace the entire word, so each candidate repeats the name.
  Answer valueOf(const Declaration &at, const std::string &typed) const {
    const std::string name = typed.substr(0, typed.find('='));
    const Option *option = findOption(at, name);
    Answer answer =
        option == nullptr || !option->takesValue() ? Answer{} : answerFrom(option->completion);
    for (Candidate &candidate : answer.words) {
      candidate.word.insert(0, name + "=");
    }
    return answer;
  }

  static Answer optionsOf(const Declaration &at) {
    Answer answer;
    const auto add = [&answer](const Option &option) {
      if (option.letter != '\0') {
        answer.words.push_back({std::string("-") + option.letter, option.help});
      }
      answer.words.push_back({option.name, option.help});
    };
    for (const Option *option : commonOptions(at)) {
      add(*option);
    }
    if (at.parent != nullptr) { // those of the root are the common ones
      std::for_each(at.options.begin(), at.options.end(), add);
    }
    return answer;
  }

  static Answer childrenOf(const Declaration &group) {
    Answer answer;
    for (const Declaration *child : visibleChildren(group)) {
      answer.words.push_back({child->name, child->help});
    }
    return answer;
  }

  CommandLine line_;
  std::size_t count_;
};

// Lines cannot carry such a word, and shells would type it as keys.
bool hasControlBytes(const std::string &word) {
  return std::any_of(word.begin(), word.end(),
                     [](unsigned char byte) { return std::iscntrl(byte) != 0; });
}

int complete(Context &context, const Declaration &root, std::vector<std::string> words) {
  const std::string typed = words.empty() ? "" : words.back();
  words.resize(words.empty() ? 0 : words.size() - 1);
  Answer answer;
  try {
    answer = Completer(root, words).answer(typed);
  } catch (const Failure &) { // nothing to offer; a message would disturb the line being typed
  }
  context.out.line(answer.kind);
  for (const Candidate &candidate : answer.words) {
    if (!hasControlBytes(candidate.word)) {
      context.out.line(candidate.word + "\t" + candidate.help);
    }
  }
  return kDone;
}

} // namespace

void declareComplete(Declaration &root) {
  auto words = std::make_shared<std::vector<std::string>>();
  CommandGroup(root)
      .command("__complete", "List what the last word can become, for the completions of shells")
      .hidden()
      .arguments(*words, "WORD", "the words typed so far, after --", true)
      .action([words, &root](Context &context) { return complete(context, root, *words); });
}

} // namespace KOVA::Backup::Tool
