// The completions know every verb and option that --help shows, and none besides; the manual page
// knows them all.
#include "tests/tools/run_tool.h"

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <filesystem>
#include <gmock/gmock.h>
#include <map>
#include <regex>
#include <set>
#include <sstream>
#include <unistd.h>

namespace {

using namespace KovaTest;

using Words = std::set<std::string>;

// What can follow a command: by the command's words, such as "session list"; and its examples.
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

void readTree(const std::string &command, Tree &tree) {
  std::vector<std::string> words = split(command);
  words.emplace_back("--help");
  const ToolResult result = runTool(words);
  ASSERT_EQ(0, result.exitCode) << result;
  tree[command] = readHelp(result.out);
  ASSERT_FALSE(tree[command].options.empty()) << result;
  for (const std::string &child : tree[command].commands) {
    readTree(command.empty() ? child : command + " " + child, tree);
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

  // Runs a script that prints "== COMMAND" and then what it offers after that command, one word a
  // line; once for commands and once for options.
  static Tree offered(const std::string &shell, const std::string &script) {
    const TestFolder folder;
    writeFile(folder / "script", script);
    const std::string path = // some ask the command itself, for ids and sections
        "PATH='" + std::filesystem::path(KOVA_TOOL_PATH).parent_path().string() + "':\"$PATH\" ";
    FILE *pipe = ::popen((path + shell + " " + (folder / "script") + " 2>&1").c_str(), "re");
    std::string output;
    char buffer[4096];
    for (std::size_t got = 0; (got = std::fread(buffer, 1, sizeof buffer, pipe)) > 0;) {
      output.append(buffer, got);
    }
    EXPECT_EQ(0, ::pclose(pipe)) << output;
    Tree tree;
    std::string command;
    std::istringstream lines(output);
    for (std::string line; std::getline(lines, line);) {
      if (line.compare(0, 2, "==") == 0) {
        command = line.size() > 3 ? line.substr(3) : "";
      } else if (!line.empty()) {
        (line[0] == '-' ? tree[command].options : tree[command].commands).insert(line);
      }
    }
    return tree;
  }

  // One call of the script's function ask for each command: `ask COMMAND... -- WORD`.
  static std::string askings() {
    std::string text;
    for (const auto &[command, followers] : expected()) {
      text += "ask '" + command + "' -\n";
      if (!followers.commands.empty()) {
        text += "ask '" + command + "' ''\n";
      }
    }
    return text;
  }

  static void compare(const Tree &offered) {
    ASSERT_EQ(expected().size(), offered.size());
    for (const auto &[command, followers] : expected()) {
      const auto found = offered.find(command);
      ASSERT_NE(offered.end(), found) << command;
      EXPECT_EQ(followers.commands, found->second.commands) << "after: kovabackup " << command;
      EXPECT_EQ(followers.options, found->second.options) << "after: kovabackup " << command;
    }
  }

  static std::string source(const std::string &file) {
    return std::string(KOVA_COMPLETION_DIR) + "/" + file;
  }
};

bool has(const std::string &shell) {
  return std::filesystem::exists("/usr/bin/" + shell) || std::filesystem::exists("/bin/" + shell);
}

TEST_F(ToolCompletion, HelpShowsAllFamilies) {
  EXPECT_GE(expected().size(), 20U);
  EXPECT_EQ(1U, expected()["session prune"].options.count("--older-than"));
  EXPECT_EQ(1U, expected()["session list"].options.count("-0"));
}

// The words with which an example calls the command, up to where another begins.
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

TEST_F(ToolCompletion, EveryHelpHasExamplesOfVerbsAndOptionsThatAre) {
  for (const auto &[shown, followers] : expected()) {
    EXPECT_FALSE(followers.examples.empty()) << "kovabackup " << shown << " --help has none";
    for (const std::string &example : followers.examples) {
      std::string command;
      Words options;
      for (const std::string &word : callIn(example)) {
        const std::string longer = command.empty() ? word : command + " " + word;
        if (word[0] == '-' && word.size() > 1) {
          options.insert(word.substr(0, word.find('=')));
        } else if (expected().count(longer) == 1) {
          command = longer;
        }
      }
      EXPECT_NE("", command) << example;
      EXPECT_EQ(0U, command.find(shown)) << "in another command's help: " << example;
      EXPECT_TRUE(expected()[command].commands.empty()) << "no verb: " << example;
      for (const std::string &option : options) {
        const bool first = option == "--json"; // of any command when it stands before it
        EXPECT_TRUE(first || expected()[command].options.count(option) == 1)
            << option << ": " << example;
      }
    }
  }
}

TEST_F(ToolCompletion, BashKnowsEveryVerbAndOption) {
  if (!has("bash")) {
    GTEST_SKIP() << "skipped: there is no bash";
  }
  compare(offered("bash --norc", "source '" + source("kovabackup.bash") + R"sh('
ask() {
  echo "== $1"
  COMP_WORDS=(kovabackup $1 "$2")
  COMP_CWORD=$((${#COMP_WORDS[@]} - 1))
  _kovabackup kovabackup "$2" "${COMP_WORDS[COMP_CWORD - 1]}"
  printf '%s\n' "${COMPREPLY[@]}"
}
)sh" + askings() + "exit 0\n"));
}

TEST_F(ToolCompletion, FishKnowsEveryVerbAndOption) {
  if (!has("fish")) {
    GTEST_SKIP() << "skipped: there is no fish";
  }
  compare(offered("HOME=/tmp/kovabackup fish --no-config", "source '" + source("kovabackup.fish") +
                                                               R"sh('
function ask
  echo "== $argv[1]"
  complete -C (string join ' ' (string match -v '' kovabackup $argv[1]))" $argv[2]" |
      string replace -r '\t.*' ''
end
)sh" + askings() + "exit 0\n"));
}

TEST_F(ToolCompletion, ZshKnowsEveryVerbAndOption) {
  if (!has("zsh")) {
    GTEST_SKIP() << "skipped: there is no zsh";
  }
  // What is given to the shell's own functions is printed: an option's name stands before "[",
  // after those that it excludes.
  compare(offered("zsh -f", R"sh(
_arguments() {
  local spec
  for spec; do
    spec=${spec#\(*\)}
    spec=${spec#\*}
    [[ $spec == -* ]] && print -r -- ${spec%%\[*}
  done
}
_describe() {
  local -a list=("${(@P)2}")
  print -rl -- ${list%%:*}
}
source ')sh" + source("_kovabackup") +
                                R"sh(' >/dev/null 2>&1 # completes once, for nobody
ask() {
  local -a words=(kovabackup ${=1} "$2")
  integer CURRENT=$#words
  print -r -- "== $1"
  _kovabackup
}
)sh" + askings() + "exit 0\n"));
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

TEST_F(ToolCompletion, TheManualPageKnowsEveryVerbAndOption) {
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

// Exit codes are what scripts rely on: help and page must tell the same.
TEST_F(ToolCompletion, HelpAndManualPageTellTheSameExitCodes) {
  const std::string page = readFile(std::string(KOVA_COMPLETION_DIR) + "/../man/kovabackup.1.scd");
  const std::size_t begin = page.find("# EXIT STATUS");
  const std::string status = page.substr(begin, page.find("# ENVIRONMENT") - begin);
  std::string help = runTool({"--help"}).out;
  std::replace(help.begin(), help.end(), '\n', ' ');
  for (const std::string text :
       {"0 done", "1 failed", "2 wrong usage", "3 not found", "4 timed out"}) {
    EXPECT_NE(std::string::npos, help.find(text)) << text;
    std::string told = "*" + text.substr(0, 1) + "*\n\t" + text.substr(2);
    told[5] = static_cast<char>(std::toupper(told[5])); // a sentence of its own
    EXPECT_NE(std::string::npos, status.find(told)) << told;
  }
}

} // namespace
