// The words of a command line, one on each line. What the command makes of them is compared with
// the grammar of command_line.h, written down here, on a table with every kind of option and
// argument. A line that is understood stores the same values when its options come first and "--"
// follows.

#include "tools/kovabackup/frame/command_line.h"

#include "fuzz/support.h"

#include <algorithm>
#include <map>
#include <memory>
#include <vector>

namespace {

using namespace KOVA::Backup::Tool;
using KovaFuzz::require;
using Words = std::vector<std::string>;

Option flag(const std::string &name, char letter = '\0') {
  Option option;
  option.name = name;
  option.letter = letter;
  return option;
}

Option valued(const std::string &name) {
  Option option;
  option.name = name;
  option.value = "VALUE";
  return option;
}

Argument argument(bool repeats = false) {
  Argument one;
  one.name = "ARGUMENT";
  one.repeats = repeats;
  return one;
}

Declaration &child(Declaration &parent, const std::string &name) {
  parent.children.push_back(std::make_unique<Declaration>());
  parent.children.back()->name = name;
  parent.children.back()->parent = &parent;
  return *parent.children.back();
}

// A group in a group, commands without, with and with any number of arguments, a common option with
// another meaning, and a digit as a letter.
std::unique_ptr<Declaration> makeTable() {
  auto root = std::make_unique<Declaration>();
  root->name = "kovabackup";
  root->options = {flag("--help", 'h'), flag("--json"), flag("--quiet", 'q')};
  Declaration &group = child(*root, "option");
  Declaration &get = child(group, "get");
  get.options = {valued("--lock"), flag("--null", '0'), valued("--quiet")};
  get.arguments = {argument(), argument()};
  Declaration &inner = child(group, "inner");
  Declaration &set = child(inner, "set");
  set.options = {valued("--set"), flag("--extra", 'x')};
  set.arguments = {argument(), argument(true)};
  child(*root, "doctor");
  return root;
}

const Declaration &table() {
  static const std::unique_ptr<Declaration> root = makeTable();
  return *root;
}

// The options of the command, then the common ones.
std::vector<const Option *> optionsOf(const Declaration &command) {
  std::vector<const Option *> options;
  for (const Declaration *at : {&command, &table()}) {
    for (const Option &option : at->options) {
      options.push_back(&option);
    }
  }
  return options;
}

template <typename Matches>
const Option *pick(const Declaration &command, Matches matches) {
  for (const Option *option : optionsOf(command)) {
    if (matches(*option)) {
      return option;
    }
  }
  return nullptr;
}

const Option *byName(const Declaration &command, const std::string &name) {
  return pick(command, [&](const Option &option) { return option.name == name; });
}

const Option *byLetter(const Declaration &command, char letter) {
  return pick(command, [&](const Option &option) { return option.letter == letter; });
}

// The grammar, one word after the other.
class Plain {
public:
  explicit Plain(const Words &words) {
    line.command = &table();
    for (const std::string &word : words) {
      take(word);
    }
  }

  CommandLine line;

private:
  void take(const std::string &word) {
    if (line.unfinished != nullptr) {
      line.options.emplace_back(line.unfinished, word);
      line.unfinished = nullptr;
      return;
    }
    const bool isWord = line.onlyArguments || word.empty() || word[0] != '-' || word == "-";
    const bool isNumber = !isWord && word[1] >= '0' && word[1] <= '9' &&
                          !line.command->arguments.empty() &&
                          byLetter(*line.command, word[1]) == nullptr;
    if (isWord || isNumber) {
      takeNameOrArgument(word);
    } else if (word == "--") {
      line.onlyArguments = true;
    } else if (word.substr(0, 2) == "--") {
      takeLong(word);
    } else {
      takeLetters(word.substr(1));
    }
  }

  void takeLong(const std::string &word) {
    const std::size_t equals = word.find('=');
    const Option *option = byName(*line.command, word.substr(0, equals));
    if (option == nullptr) {
      note(Problem::Kind::UnknownOption, word.substr(0, equals));
    } else if (equals == std::string::npos && option->takesValue()) {
      line.unfinished = option;
    } else if (equals == std::string::npos) {
      line.options.emplace_back(option, "");
    } else if (option->takesValue()) {
      line.options.emplace_back(option, word.substr(equals + 1));
    } else {
      note(Problem::Kind::ValueForFlag, word.substr(0, equals));
    }
  }

  void takeLetters(const std::string &letters) {
    for (std::size_t i = 0; i < letters.size(); ++i) {
      const Option *option = byLetter(*line.command, letters[i]);
      if (option == nullptr) {
        note(Problem::Kind::UnknownOption, "-" + letters.substr(i));
        return;
      }
      line.options.emplace_back(option, "");
    }
  }

  void takeNameOrArgument(const std::string &word) {
    if (!line.command->children.empty()) {
      takeName(word);
      return;
    }
    const std::vector<Argument> &declared = line.command->arguments;
    const bool fits =
        line.arguments.size() < declared.size() || (!declared.empty() && declared.back().repeats);
    if (fits) {
      line.arguments.push_back(word);
    } else {
      note(Problem::Kind::UnexpectedArgument, word);
    }
  }

  void takeName(const std::string &word) {
    const auto &children = line.command->children;
    const auto named = std::find_if(children.begin(), children.end(),
                                    [&](const auto &declared) { return declared->name == word; });
    const bool mayAskForHelp = line.command == &table() && !line.help && !line.onlyArguments;
    const bool maybeValue = line.problem && line.problem->kind == Problem::Kind::UnknownOption;
    if (line.unknownCommand) {
      return;
    }
    if (named != children.end()) {
      line.command = named->get();
    } else if (word == "help" && mayAskForHelp) {
      line.help = true;
    } else if (!maybeValue) { // of the unknown option
      line.unknownCommand = word;
    }
  }

  void note(Problem::Kind kind, const std::string &word) {
    if (!line.problem) {
      line.problem = Problem{kind, word};
    }
  }
};

void requireEqual(const CommandLine &line, const CommandLine &expected) {
  require(line.command == expected.command && line.options == expected.options);
  require(line.arguments == expected.arguments && line.help == expected.help);
  require(line.onlyArguments == expected.onlyArguments && line.unfinished == expected.unfinished);
  require(line.unknownCommand == expected.unknownCommand);
  require(line.problem.has_value() == expected.problem.has_value());
  require(!line.problem || (line.problem->kind == expected.problem->kind &&
                            line.problem->word == expected.problem->word));
}

bool isCommon(const Option *option) {
  const std::vector<Option> &common = table().options;
  return option >= common.data() && option < common.data() + common.size();
}

void addOptions(const CommandLine &line, bool common, Words &words) {
  for (const auto &[option, value] : line.options) {
    if (isCommon(option) == common) {
      words.push_back(option->takesValue() ? option->name + "=" + value : option->name);
    }
  }
}

void addNames(const Declaration &command, Words &words) {
  if (command.parent != nullptr) {
    addNames(*command.parent, words);
    words.push_back(command.name);
  }
}

// The values of each option, in their order.
std::map<const Option *, Words> valuesIn(const CommandLine &line) {
  std::map<const Option *, Words> values;
  for (const auto &[option, value] : line.options) {
    values[option].push_back(value);
  }
  return values;
}

// Writes an understood line in another form: common options, names, options, "--" and arguments.
Words rewritten(const CommandLine &line) {
  Words words;
  addOptions(line, true, words);
  if (line.help) {
    words.emplace_back("help");
  }
  addNames(*line.command, words);
  addOptions(line, false, words);
  words.emplace_back("--");
  words.insert(words.end(), line.arguments.begin(), line.arguments.end());
  return words;
}

void checkRewritten(const CommandLine &line) {
  const CommandLine again = readCommandLine(table(), rewritten(line));
  require(again.command == line.command && again.arguments == line.arguments);
  require(again.help == line.help && !again.problem && !again.unknownCommand);
  require(valuesIn(again) == valuesIn(line));
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  Words words;
  while (!input.empty()) {
    words.emplace_back(input.until('\n').c_str()); // a word ends at its NUL
  }
  const CommandLine line = readCommandLine(table(), words);
  requireEqual(line, Plain(words).line);
  if (!line.problem && !line.unknownCommand && line.unfinished == nullptr) {
    checkRewritten(line);
  }
  return 0;
}
