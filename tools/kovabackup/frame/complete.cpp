#include "tools/kovabackup/frame/complete.h"

#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/command_line.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
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
      return answerFrom(line_.unfinished->completion, typed);
    }
    if (!line_.onlyArguments && !typed.empty() && typed[0] == '-') {
      return typed.find('=') == std::string::npos ? optionsOf(at) : valueOf(at, typed);
    }
    if (at.isGroup()) {
      return childrenOf(at);
    }
    const Argument *argument = argumentAt(at, line_.arguments.size());
    return argument == nullptr || line_.help ? Answer{} : answerFrom(argument->completion, typed);
  }

private:
  // typed: the value as far as it has been typed. skipped: how many bytes of its word precede it.
  Answer answerFrom(const Completion &completion, const std::string &typed,
                    std::size_t skipped = 0) const {
    const std::string &prefix = completion.pathPrefix;
    switch (completion.kind) {
    case Completes::Words:
      return !prefix.empty() && typed.rfind(prefix, 0) == 0
                 ? files(skipped + prefix.size())
                 : Answer{"words", completion.words(line_.arguments)};
    case Completes::Files:
      return files(skipped);
    case Completes::CommandLine:
      return {fmt::format("command {}", count_ - line_.arguments.size())};
    case Completes::Nothing:
      break;
    }
    return {};
  }

  static Answer files(std::size_t skipped) {
    return {skipped == 0 ? "files" : fmt::format("files {}", skipped)};
  }

  // "--lock=ta": the shells replace the entire word, so each candidate repeats the name.
  Answer valueOf(const Declaration &at, const std::string &typed) const {
    const std::size_t begin = typed.find('=') + 1;
    const Option *option = findOption(at, typed.substr(0, begin - 1));
    Answer answer = option == nullptr || !option->takesValue()
                        ? Answer{}
                        : answerFrom(option->completion, typed.substr(begin), begin);
    for (Candidate &candidate : answer.words) {
      candidate.word.insert(0, typed.substr(0, begin));
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

// Lines cannot carry such a word, and shells would type it as keys or show it reversed.
bool hasControls(const std::string &word) {
  for (std::size_t i = 0; i < word.size();) {
    const std::size_t length = std::max<std::size_t>(utf8Length(word, i), 1);
    if (isControl(word, i, length)) {
      return true;
    }
    i += length;
  }
  return false;
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
    if (!hasControls(candidate.word)) {
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
