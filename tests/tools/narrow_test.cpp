// What the command shows on a terminal of 60 columns: nothing is broken within a word, and what is
// to be pasted can be pasted.
#include "tests/tools/option_support.h"
#include "tests/tools/run_tool.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"

#include <gmock/gmock.h>
#include <regex>
#include <sstream>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Session;
using testing::HasSubstr;

std::string shown(const std::vector<std::string> &arguments, unsigned short columns) {
  ToolSetup setup{"", {{"NO_COLOR", "1"}}};
  setup.columns = columns;
  TerminalTool tool(arguments, setup);
  return std::regex_replace(tool.wait().out, std::regex("\r\n"), "\n");
}

std::string examplesOf(const std::vector<std::string> &command, unsigned short columns) {
  const std::string help = shown(command, columns);
  const std::size_t at = help.find("Examples:\n");
  return at == std::string::npos ? "" : help.substr(at);
}

// As a shell joins them.
std::string joined(const std::string &lines) {
  return std::regex_replace(lines, std::regex(" \\\\\n +"), " ");
}

TEST(ToolNarrow, ContinuesExamplesOfTheHelp) {
  for (const std::vector<std::string> &command : std::vector<std::vector<std::string>>{
           {"session", "list"}, {"option", "edit"}, {"filter", "test"}, {"run"}, {"doctor"}}) {
    std::vector<std::string> words = command;
    words.emplace_back("--help");
    const std::string narrow = examplesOf(words, 60);
    std::istringstream lines(narrow);
    for (std::string line; std::getline(lines, line);) {
      EXPECT_LE(line.size(), 60U) << line;
    }
    EXPECT_EQ(examplesOf(words, 200), joined(narrow));
  }
}

TEST(ToolNarrow, BreaksNoExampleWithinQuotes) {
  EXPECT_THAT(examplesOf({"session", "list", "--help"}, 60),
              HasSubstr("\n  kovabackup session list | awk -F'\\t' \\\n"
                        "    '$3 == \"dangling\" {print $1}'\n"));
}

TEST(ToolNarrow, EndsAnExampleAtTheLastColumn) {
  EXPECT_THAT(examplesOf({"session", "prune", "--help"}, 29),
              HasSubstr("\n  kovabackup session prune \\\n    --older-than 7d --dry-run\n"));
}

TEST(ToolNarrow, LeavesExamplesThatFitAsTheyAre) {
  EXPECT_THAT(examplesOf({"session", "list", "--help"}, 80), testing::Not(HasSubstr(" \\\n")));
  EXPECT_THAT(runTool({"filter", "test", "--help"}).out, testing::Not(HasSubstr(" \\\n")));
}

TEST(ToolNarrow, PutsACellThatDoesNotFitOnALineOfItsOwn) {
  Session session;
  ASSERT_TRUE(session.create());
  const std::string row = session.getId() + "  local  whole      0    0 B   [0-9]s";
  EXPECT_THAT(shown({"session", "list"}, 60),
              testing::MatchesRegex("ID           KIND   STATE  FILES  BYTES  AGE  PATH\n" + row +
                                    "\n  " + session.getPath() + "\n"));
  EXPECT_THAT(shown({"session", "list"}, 120),
              testing::MatchesRegex("ID [^\n]*\n" + row + "  " + session.getPath() + "\n"));
  EXPECT_TRUE(session.destroy());
}

TEST(ToolNarrow, GivesADetailOfDoctorLinesOfItsOwn) {
  ::close(KOVA::Backup::Path::createIpcLockFile("x"));
  ::chmod("/tmp/kovabackup", 0777);
  EXPECT_THAT(shown({"doctor"}, 60),
              HasSubstr("\nwrong  ipc root\n       /tmp/kovabackup has mode 0777 instead of 0755\n"
                        "       chmod 0755 /tmp/kovabackup\n"));
  EXPECT_THAT(shown({"doctor"}, 80),
              HasSubstr("\nwrong  ipc root      /tmp/kovabackup has mode 0777 instead of 0755\n"));
}

using ToolNarrowOption = ToolOption;

TEST_F(ToolNarrowOption, BreaksAllRowsAtTheSameColumn) {
  const std::string longName(50, 'n');
  writeFile(file_, "[" + longName + "]\na=1\n[s]\nb=2\n");
  EXPECT_EQ("SECTION\n  OPTION\n" + longName + "\n  a=1\ns\n  b=2\n",
            shown({"option", "list", file_}, 52));
}

TEST_F(ToolNarrowOption, BeginsARowWithItsFirstCellHoweverWideItIs) {
  const std::string longName(50, 'n');
  writeFile(file_, "[" + longName + "]\na=1\n");
  EXPECT_EQ("SECTION\n  OPTION\n" + longName + "\n  a=1\n", shown({"option", "list", file_}, 40));
}

} // namespace
