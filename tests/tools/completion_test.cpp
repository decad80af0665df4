// The completions offer every command and option that --help shows and no others; the manual page
// has all of them.
#include "tests/tools/completion_shells.h"
#include "tests/tools/run_tool.h"

#include <algorithm>
#include <cctype>
#include <gmock/gmock.h>
#include <map>
#include <regex>
#include <set>
#include <sstream>

namespace {

using namespace KovaTest;

using Words = std::set<std::string>;

// What can follow a command, and its examples. The key of the tree is the words of the command,
// such as "session list".
struct Followers {
  Words commands;
  Words options;
  std::vector<std::string> examples;
};
using Tree = std::map<std::string, Followers>;

std::vector<std::string> split(const std::string &text) {
  std::istringstream in(text);
  return {std::istream_iterator<std::string>(in), {}};
}

// Reads one help: "  name  words" below "Commands:", "  -s, --long VALUE  words" below options.
Followers readHelp(const std::string &help) {
  static const std::regex kOption("^ {2,6}(-[-a-zA-Z0-9]+)(, (--[-a-z0-9]+))?.*");
  static const std::regex kCommand("^  ([a-z]+) .*");
  Followers found;
  std::istringstream lines(help);
  std::string heading;
  std::string line;
  std::smatch match;
  while (std::getline(lines, line)) {
    if (!line.empty() && line[0] != ' ') {
      heading = line;
    } else if (heading == "Commands:" && std::regex_match(line, match, kCommand)) {
      found.commands.insert(match[1]);
    } else if ((heading == "Options:" || heading == "Common options:") &&
               std::regex_match(line, match, kOption)) {
      found.options.insert(match[1]);
      if (match[3].matched) {
        found.options.insert(match[3]);
      }
    } else if (heading == "Examples:" && !line.empty()) {
      found.examples.push_back(line);
    }
  }
  return found;
}

std::string joined(std::string command, const std::string &word) {
  return command.append(command.empty() ? "" : " ").append(word);
}

void readTree(const std::string &command, Tree &tree) {
  std::vector<std::string> words = split(command);
  words.emplace_back("--help");
  const ToolResult result = runTool(words);
  ASSERT_EQ(0, result.exitCode) << result;
  tree[command] = readHelp(result.out);
  ASSERT_FALSE(tree[command].options.empty()) << result;
  for (const std::string &child : tree[command].commands) {
    readTree(joined(command, child), tree);
  }
}

class ToolCompletion : public testing::Test {
protected:
  static void SetUpTestSuite() { readTree("", expected()); }
  static void TearDownTestSuite() { expected().clear(); }

  static Tree &expected() {
    static Tree tree;
    return tree;
  }

  // What the shell offers must be exactly what the help shows.
  static void compare(const std::string &shell) {
    if (!hasShell(shell)) {
      GTEST_SKIP() << "skipped: there is no " << shell;
    }
    std::vector<Typed> lines;
    for (const auto &[command, followers] : expected()) {
      lines.push_back({command, "-"});
      if (!followers.commands.empty()) {
        lines.push_back({command, ""});
      }
    }
    const Offered offered = askShell(shell, lines);
    ASSERT_EQ(expected().size(), offered.size());
    for (const auto &[command, followers] : expected()) {
      Words shown = followers.commands;
      shown.insert(followers.options.begin(), followers.options.end());
      const auto found = offered.find(command);
      ASSERT_NE(offered.end(), found) << command;
      EXPECT_EQ(shown, found->second) << "after: kovabackup " << command;
    }
  }
};

TEST_F(ToolCompletion, HelpShowsAllGroups) {
  EXPECT_GE(expected().size(), 20U);
  EXPECT_EQ(1U, expected()["session prune"].options.count("--older-than"));
  EXPECT_EQ(1U, expected()["session list"].options.count("-0"));
}

// The words with which an example calls the command, up to where another command begins.
std::vector<std::string> callIn(const std::string &example) {
  static const std::string kName = "kovabackup ";
  const std::size_t begin = example.find(kName);
  if (begin == std::string::npos) {
    return {};
  }
  static const std::regex kEnd(" -- | \\||\\)");
  std::string call = example.substr(begin + kName.size());
  std::smatch end;
  if (std::regex_search(call, end, kEnd)) {
    call.erase(static_cast<std::size_t>(end.position()));
  }
  std::vector<std::string> words = split(call);
  if (!words.empty() && words[0] == "help") {
    words.erase(words.begin());
  }
  return words;
}

TEST_F(ToolCompletion, EveryHelpHasExamplesOfExistingCommandsAndOptions) {
  for (const auto &[shown, followers] : expected()) {
    EXPECT_FALSE(followers.examples.empty()) << "kovabackup " << shown << " --help has no examples";
    for (const std::string &example : followers.examples) {
      std::string command;
      Words options;
      for (const std::string &word : callIn(example)) {
        const std::string longer = joined(command, word);
        if (word[0] == '-' && word.size() > 1) {
          options.insert(word.substr(0, word.find('=')));
        } else if (expected().count(longer) == 1) {
          command = longer;
        }
      }
      EXPECT_NE("", command) << example;
      EXPECT_EQ(0U, command.find(shown)) << "in another command's help: " << example;
      EXPECT_TRUE(expected()[command].commands.empty()) << "not a command: " << example;
      for (const std::string &option : options) {
        const bool common = option == "--json"; // before the command it is always the common one
        EXPECT_TRUE(common || expected()[command].options.count(option) == 1)
            << option << ": " << example;
      }
    }
  }
}

TEST_F(ToolCompletion, BashKnowsEveryCommandAndOption) {
  compare("bash");
}

TEST_F(ToolCompletion, FishKnowsEveryCommandAndOption) {
  compare("fish");
}

TEST_F(ToolCompletion, ZshKnowsEveryCommandAndOption) {
  compare("zsh");
}

// The part of the manual page on one command: from the line that begins with its name to the next
// such line or heading.
std::string partOfPage(const std::string &page, const std::string &command) {
  const std::size_t begin = page.find("\n*" + command + "*");
  if (begin == std::string::npos) {
    return "";
  }
  static const std::regex kNext("\n(\\*[a-z]|#)");
  std::smatch next;
  const std::string rest = page.substr(begin + 1);
  return std::regex_search(rest, next, kNext)
             ? rest.substr(0, static_cast<std::size_t>(next.position()))
             : rest;
}

// The options that a part of the manual page says a command takes.
Words optionsIn(const std::string &part) {
  static const std::regex kOption("\\*(--?[a-z0-9][-a-z0-9]*)\\*");
  const std::string synopsis = part.substr(0, part.find('\n'));
  Words found;
  for (std::sregex_iterator it(synopsis.begin(), synopsis.end(), kOption), end; it != end; ++it) {
    found.insert((*it)[1]);
  }
  return found;
}

TEST_F(ToolCompletion, TheManualPageKnowsEveryCommandAndOption) {
  const std::string page = readFile(std::string(KOVA_COMPLETION_DIR) + "/../man/kovabackup.1.scd");
  const std::string common = page.substr(0, page.find("# SESSIONS"));
  for (const auto &[command, followers] : expected()) {
    if (!followers.commands.empty()) {
      continue;
    }
    const std::string part = partOfPage(page, command);
    EXPECT_NE("", part) << command;
    for (const std::string &option : followers.options) {
      EXPECT_TRUE((common + part).find("*" + option + "*") != std::string::npos)
          << command << " " << option;
    }
    for (const std::string &option : optionsIn(part)) {
      EXPECT_EQ(1U, followers.options.count(option)) << command << " has no " << option;
    }
  }
}

// Scripts rely on exit codes, so help and page must agree.
TEST_F(ToolCompletion, HelpAndManualPageAgreeOnExitCodes) {
  const std::string page = readFile(std::string(KOVA_COMPLETION_DIR) + "/../man/kovabackup.1.scd");
  const std::size_t begin = page.find("# EXIT STATUS");
  const std::string status = page.substr(begin, page.find("# ENVIRONMENT") - begin);
  std::string help = runTool({"--help"}).out;
  std::replace(help.begin(), help.end(), '\n', ' ');
  for (const std::string text :
       {"0 done", "1 failed", "2 wrong usage", "3 not found", "4 timed out"}) {
    EXPECT_NE(std::string::npos, help.find(text)) << text;
    std::string entry = "*" + text.substr(0, 1) + "*\n\t" + text.substr(2);
    entry[5] = static_cast<char>(std::toupper(entry[5])); // the page begins it with a capital
    EXPECT_NE(std::string::npos, status.find(entry)) << entry;
  }
}

} // namespace
