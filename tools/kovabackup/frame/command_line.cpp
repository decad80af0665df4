#include "tools/kovabackup/frame/command_line.h"

namespace KOVA::Backup::Tool {
namespace {

bool isDigit(char letter) {
  return letter >= '0' && letter <= '9';
}

class Reader {
public:
  explicit Reader(const Declaration &root) { line_.command = &root; }

  void read(const std::string &word) {
    if (line_.unfinished != nullptr) {
      line_.options.emplace_back(line_.unfinished, word);
      line_.unfinished = nullptr;
    } else if (line_.onlyArguments || !looksLikeOption(word)) {
      readPlain(word);
    } else if (word == "--") {
      line_.onlyArguments = true;
    } else if (word[1] == '-') {
      readLong(word);
    } else {
      readLetters(word);
    }
  }

  const CommandLine &line() const { return line_; }

private:
  bool looksLikeOption(const std::string &word) const {
    return word.size() > 1 && word[0] == '-' && !isNegativeNumber(word);
  }

  bool isNegativeNumber(const std::string &word) const {
    return isDigit(word[1]) && !line_.command->arguments.empty() &&
           findOption(*line_.command, word[1]) == nullptr;
  }

  void readLong(const std::string &word) {
    const std::size_t equals = word.find('=');
    const std::string name = word.substr(0, equals);
    const Option *option = findOption(*line_.command, name);
    if (option == nullptr) {
      note(Problem::Kind::UnknownOption, name);
    } else if (!option->takesValue() && equals != std::string::npos) {
      note(Problem::Kind::ValueForFlag, name);
    } else if (option->takesValue() && equals == std::string::npos) {
      line_.unfinished = option;
    } else {
      line_.options.emplace_back(option,
                                 equals == std::string::npos ? "" : word.substr(equals + 1));
    }
  }

  void readLetters(const std::string &word) {
    for (std::size_t i = 1; i < word.size(); ++i) {
      const Option *option = findOption(*line_.command, word[i]);
      if (option == nullptr) {
        note(Problem::Kind::UnknownOption, "-" + word.substr(i));
        return;
      }
      line_.options.emplace_back(option, "");
    }
  }

  void readPlain(const std::string &word) {
    if (line_.command->isGroup()) {
      readName(word);
    } else if (argumentAt(*line_.command, line_.arguments.size()) != nullptr) {
      line_.arguments.push_back(word);
    } else {
      note(Problem::Kind::UnexpectedArgument, word);
    }
  }

  void readName(const std::string &word) {
    // After an unknown option the word may have been meant as its value.
    const bool perhapsValue = line_.problem && line_.problem->kind == Problem::Kind::UnknownOption;
    const bool first = line_.command->parent == nullptr && !line_.help && !line_.onlyArguments;
    const Declaration *child = findChild(*line_.command, word);
    if (line_.unknownCommand) {
      return;
    }
    if (child != nullptr) {
      line_.command = child;
    } else if (first && word == "help") {
      line_.help = true;
    } else if (!perhapsValue) {
      line_.unknownCommand = word;
    }
  }

  void note(Problem::Kind kind, const std::string &word) {
    if (!line_.problem) {
      line_.problem = Problem{kind, word};
    }
  }

  CommandLine line_;
};

} // namespace

CommandLine readCommandLine(const Declaration &root, const std::vector<std::string> &words) {
  Reader reader(root);
  for (const std::string &word : words) {
    reader.read(word);
  }
  return reader.line();
}

} // namespace KOVA::Backup::Tool
