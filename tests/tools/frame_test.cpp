// What holds for every command: help, wrong usage, streams, colour and failed writes. Mostly shown
// with lock show, which needs nothing on disk.
#include "tests/tools/run_tool.h"

#include "base/unique_fd.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sstream>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

TEST(ToolFrame, ShowsAShortHelpWithoutArguments) {
  const ToolResult result = runTool({});
  EXPECT_EQ(2, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("Usage: kovabackup COMMAND"));
  EXPECT_THAT(result.messages, HasSubstr("Examples:\n  kovabackup doctor"));
}

TEST(ToolFrame, ShowsTheCommandsOfAGroupWithoutCommand) {
  const ToolResult result = runTool({"lock"});
  EXPECT_EQ(2, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("Usage: kovabackup lock COMMAND"));
  EXPECT_EQ("'kovabackup lock' needs a command",
            document(runTool({"lock", "--json"}))["errors"][0]["message"].asString());
}

TEST(ToolFrame, PrintsHelpOnStandardOutput) {
  for (const std::vector<std::string> &words :
       std::vector<std::vector<std::string>>{{"lock", "show", "--help"},
                                             {"lock", "show", "-h"},
                                             {"--help", "lock", "show"},
                                             {"help", "lock", "show"},
                                             {"--no-color", "help", "lock", "show"}}) {
    const ToolResult result = runTool(words);
    EXPECT_EQ(0, result.exitCode) << result;
    EXPECT_EQ("", result.messages);
    EXPECT_THAT(result.out, HasSubstr("Usage: kovabackup lock show [OPTIONS] TOKEN"));
    EXPECT_THAT(result.out, HasSubstr("Examples:\n  kovabackup lock show"));
  }
}

TEST(ToolFrame, ShowsInTheHelpWhatTakesAValueAndWhatRepeats) {
  const std::string prune = runTool({"session", "prune", "--help"}).out;
  EXPECT_THAT(prune, HasSubstr("\n      --older-than AGE      remove"));
  EXPECT_THAT(prune, HasSubstr("\n      --dry-run             only"));
  EXPECT_THAT(runTool({"explain", "--help"}).out,
              HasSubstr("Usage: kovabackup explain [OPTIONS] [MESSAGE...]\n"));
  EXPECT_THAT(runTool({"net", "probe", "--help"}).out,
              HasSubstr("Usage: kovabackup net probe [OPTIONS] HOST:PORT\n"));
}

TEST(ToolFrame, PrintsTheVersion) {
  const ToolResult result = runTool({"--version"});
  EXPECT_EQ(0, result.exitCode);
  EXPECT_THAT(result.out, testing::MatchesRegex("kovabackup [0-9]+\\.[0-9]+\\.[0-9]+\n"));
  EXPECT_EQ(result.out, "kovabackup " +
                            document(runTool({"--version", "--json"}))["version"].asString() +
                            "\n");
}

TEST(ToolFrame, SuggestsTheWordThatWasMeant) {
  EXPECT_EQ("kovabackup: unknown command 'lok'; did you mean 'lock'?\nTry 'kovabackup --help'.\n",
            runTool({"lok", "show", "x"}).messages);
  EXPECT_EQ("kovabackup: unknown command 'shw'; did you mean 'show'?\n"
            "Try 'kovabackup lock --help'.\n",
            runTool({"lock", "shw"}).messages);
  EXPECT_EQ("kovabackup: unknown option '--jsn'; did you mean '--json'?\n"
            "Try 'kovabackup lock show --help'.\n",
            runTool({"lock", "show", "--jsn", "x"}).messages);
  EXPECT_EQ("kovabackup: unknown command 'frobnicate'\nTry 'kovabackup --help'.\n",
            runTool({"frobnicate"}).messages);
}

TEST(ToolFrame, HasNoHelpOnUnknownCommands) {
  for (const std::vector<std::string> &words :
       std::vector<std::vector<std::string>>{{"lock", "shw", "--help"},
                                             {"lock", "--help", "shw"},
                                             {"--help", "lock", "shw"},
                                             {"help", "lock", "shw"},
                                             {"lock", "shw", "-h"}}) {
    const ToolResult result = runTool(words);
    EXPECT_EQ(2, result.exitCode) << result;
    EXPECT_EQ("", result.out);
    EXPECT_THAT(result.messages,
                StartsWith("kovabackup: unknown command 'shw'; did you mean 'show'?\n"));
  }
  EXPECT_EQ(2, runTool({"help", "frobnicate"}).exitCode);
  EXPECT_EQ(2, runTool({"help", "frobnicate", "show"}).exitCode);
}

TEST(ToolFrame, ShowsTheHelpDespiteOtherMistakes) {
  EXPECT_EQ(0, runTool({"lock", "show", "--bogus", "a", "b", "--help"}).exitCode);
  EXPECT_EQ(0, runTool({"session", "--volume", "max", "create", "--help"}).exitCode);
}

TEST(ToolFrame, FindsCommandsBehindTwoDashes) {
  EXPECT_EQ(3, runTool({"--", "lock", "show", "x"}).exitCode);
  EXPECT_EQ(3, runTool({"lock", "--", "show", "-x"}).exitCode);
  EXPECT_EQ("kovabackup: unknown command 'help'\nTry 'kovabackup --help'.\n",
            runTool({"--", "help"}).messages);
  EXPECT_EQ("kovabackup: unknown command '--help'\nTry 'kovabackup lock --help'.\n",
            runTool({"lock", "--", "--help"}).messages);
}

TEST(ToolFrame, RefusesValuesForFlags) {
  const ToolResult result = runTool({"lock", "show", "--json=yes", "x"});
  EXPECT_EQ(2, result.exitCode);
  EXPECT_EQ("kovabackup: --json takes no value\nTry 'kovabackup lock show --help'.\n",
            result.messages);
  EXPECT_EQ(2, runTool({"lock", "show", "--null=x", "x"}).exitCode);
}

TEST(ToolFrame, TakesNamesExactlyRatherThanByTheirFirstLetters) {
  EXPECT_EQ("kovabackup: unknown option '--nul'; did you mean '--null'?\n"
            "Try 'kovabackup lock show --help'.\n",
            runTool({"lock", "show", "--nul", "x"}).messages);
}

TEST(ToolFrame, SaysWhereAnOptionBelongs) {
  EXPECT_EQ("kovabackup: option '--volume' must follow 'kovabackup session create'\n"
            "Try 'kovabackup session create --help'.\n",
            runTool({"session", "--volume", "max", "create"}).messages);
}

TEST(ToolFrame, TakesAnyWordAsTheValueOfAnOption) {
  for (const std::string value : {"--json", "--", "-h", "", "\x01", "a=b"}) {
    const ToolResult result = runTool({"net", "probe", "--timeout", value, "x:1"});
    EXPECT_EQ(2, result.exitCode) << result;
    EXPECT_THAT(result.messages, HasSubstr("kovabackup: '" + value + "' is not a valid timeout"));
    EXPECT_EQ(result.messages, runTool({"net", "probe", "--timeout=" + value, "x:1"}).messages);
  }
}

TEST(ToolFrame, TakesTheLastValueOfARepeatedOption) {
  const ToolResult result =
      runTool({"net", "probe", "--timeout", "first", "x:1", "--timeout=last"});
  EXPECT_THAT(result.messages, HasSubstr("'last' is not a valid timeout"));
}

TEST(ToolFrame, TakesLettersThatShareADash) {
  EXPECT_EQ(0, runTool({"lock", "show", "-0h"}).exitCode);
  EXPECT_THAT(runTool({"lock", "show", "-0x", "a"}).messages, HasSubstr("unknown option '-x'"));
}

TEST(ToolFrame, SaysHowToGiveArgumentsThatLookLikeOptions) {
  EXPECT_EQ("kovabackup: unknown option '-x'; put -- before arguments that begin with -\n"
            "Try 'kovabackup lock show --help'.\n",
            runTool({"lock", "show", "-x"}).messages);
}

TEST(ToolFrame, ShortensMessagesThatAreTooLongToRead) {
  const ToolResult result = runTool({"lock", "show", "x", std::string(100000, 'y') + "z"});
  EXPECT_EQ(2, result.exitCode);
  EXPECT_LT(result.messages.size(), 1000U);
  EXPECT_THAT(result.messages, StartsWith("kovabackup: unexpected argument 'yyy"));
  EXPECT_THAT(result.messages, HasSubstr("yyyz'\nTry "));
}

TEST(ToolFrame, EndsWrongUsageWith2) {
  for (const std::vector<std::string> &words :
       std::vector<std::vector<std::string>>{{"frobnicate"},
                                             {"lock", "shw"},
                                             {"lock", "show"},
                                             {"lock", "show", "a", "b"},
                                             {"lock", "show", "--bogus", "a"},
                                             {"lock", "show", "-x", "a"},
                                             {"--bogus"},
                                             {"lock", "show", "a", "--json=5x", "--bogus"}}) {
    const ToolResult result = runTool(words);
    EXPECT_EQ(2, result.exitCode) << result;
    EXPECT_EQ("", result.out);
    EXPECT_THAT(result.messages, StartsWith("kovabackup: ")) << result;
  }
}

TEST(ToolFrame, ReportsWrongUsageAsJsonWhenAsked) {
  for (const std::vector<std::string> &words :
       std::vector<std::vector<std::string>>{{"--json", "lock", "shw"},
                                             {"lock", "show", "--bogus", "--json"},
                                             {"lock", "show", "--json"},
                                             {"--json"}}) {
    const ToolResult result = runTool(words);
    EXPECT_EQ(2, result.exitCode) << result;
    EXPECT_EQ("", result.messages);
    EXPECT_EQ(2, document(result)["errors"][0]["exitCode"].asInt());
  }
}

TEST(ToolFrame, PointsToTheHelpAfterAnyWrongUsage) {
  EXPECT_EQ("kovabackup: '..' is not a valid lock token\nTry 'kovabackup lock show --help'.\n",
            runTool({"lock", "show", ".."}).messages);
}

TEST(ToolFrame, TakesWordsLiterally) {
  // Argument parsers give each of these a meaning.
  for (const std::string token :
       {"[a,b]", "{}", "%%", "++", "show", "lock", "-5", "-9", "\x01x", "a b"}) {
    const ToolResult result = runTool({"lock", "show", "--json", token});
    EXPECT_EQ(3, result.exitCode) << result;
    EXPECT_EQ(token, document(result)["token"].asString());
  }
}

TEST(ToolFrame, TakesWhatFollowsTwoDashesAsArguments) {
  const ToolResult result = runTool({"--json", "lock", "show", "--", "--json"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("--json", document(result)["token"].asString());
}

TEST(ToolFrame, LeavesOutRemarksWhenAsked) {
  for (const char *flag : {"-q", "--quiet"}) {
    const ToolResult result = runTool({"lock", "show", "x", flag});
    EXPECT_EQ(3, result.exitCode);
    EXPECT_EQ("", result.messages);
  }
  EXPECT_THAT(runTool({"-q", "lock", "show", ".."}).messages, StartsWith("kovabackup: '..'"))
      << "a failure";
}

TEST(ToolFrame, ShowsWhatTheLibrariesLogWhenAsked) {
  const TestFolder folder;
  writeFile(folder / "conf", "[s]\na=oops\n");
  const std::vector<std::string> words{"-q", "option", "list", folder / "conf", "s"};
  EXPECT_EQ("", runTool(words).messages);
  std::vector<std::string> verbose = words;
  verbose.emplace_back("--verbose");
  EXPECT_THAT(runTool(verbose).messages, HasSubstr("[err] option_map:508 json load failed key(a)"));
}

TEST(ToolFrame, UsesColourOnTerminalsOnly) {
  EXPECT_THAT(runTool({"lock", "shw"}).messages, Not(HasSubstr("\x1b")));
  EXPECT_THAT(runTool({"--help"}).out, Not(HasSubstr("\x1b")));
}

std::string shownOnTerminal(const std::vector<std::string> &words, const ToolSetup &setup = {}) {
  TerminalTool tool(words, setup);
  return tool.wait().out;
}

TEST(ToolFrame, UsesColourOnATerminal) {
  EXPECT_THAT(shownOnTerminal({"--help"}), HasSubstr("\x1b[1mUsage:\x1b[0m"));
  EXPECT_THAT(shownOnTerminal({"lock", "shw"}), HasSubstr("\x1b[31mkovabackup:\x1b[0m"));
}

TEST(ToolFrame, UsesNoColourWhereItIsTurnedOff) {
  EXPECT_THAT(shownOnTerminal({"--help"}, {"", {{"NO_COLOR", "1"}}}), Not(HasSubstr("\x1b")));
  EXPECT_THAT(shownOnTerminal({"--help"}, {"", {{"TERM", "dumb"}}}), Not(HasSubstr("\x1b")));
  EXPECT_THAT(shownOnTerminal({"lock", "show", "--no-color", "--help"}), Not(HasSubstr("\x1b")));
  EXPECT_THAT(shownOnTerminal({"--help"}, {"", {{"NO_COLOR", ""}}}), HasSubstr("\x1b"))
      << "an empty NO_COLOR counts as unset";
}

TEST(ToolFrame, EscapesControlBytesOfMessagesOnATerminalOnly) {
  const ToolSetup plain{"", {{"NO_COLOR", "1"}}};
  EXPECT_THAT(shownOnTerminal({"lock", "show", "a\x1b[2Jb"}, plain), HasSubstr("'a\\x1b[2Jb'"));
  EXPECT_THAT(runTool({"lock", "show", "a\x1b[2Jb"}).messages, HasSubstr("'a\x1b[2Jb'"));
}

TEST(ToolFrame, EscapesWhatReversesTextOnATerminal) {
  const std::string token = "a\xe2\x80\xae"
                            "b";
  EXPECT_THAT(shownOnTerminal({"lock", "show", token}), HasSubstr("'a\\xe2\\x80\\xaeb'"));
  EXPECT_THAT(runTool({"lock", "show", token}).messages, HasSubstr("'" + token + "'"));
  const ToolResult json = runTool({"lock", "show", token, "--json"});
  EXPECT_THAT(json.out, HasSubstr(R"("a\u202eb")"));
  EXPECT_EQ(token, document(json)["token"].asString());
}

TEST(ToolFrame, BreaksMessagesAtWordsOnATerminal) {
  const std::string token(60, 'x');
  EXPECT_EQ("kovabackup: the lock '" + token +
                "' was never taken:\r\nthere is no /tmp/kovabackup/lock/" + token + "\r\n",
            shownOnTerminal({"lock", "show", token}, {"", {{"NO_COLOR", "1"}}}));
}

TEST(ToolFrame, FitsTheHelpIntoANarrowTerminal) {
  ToolSetup setup{"", {{"NO_COLOR", "1"}}};
  setup.columns = 60;
  std::istringstream lines(shownOnTerminal({"session", "list", "--help"}, setup));
  for (std::string line; std::getline(lines, line) && line.rfind("Examples:", 0) != 0;) {
    EXPECT_LE(line.size(), 61U) << line; // with its carriage return
  }
}

// A command line that is large beside the memory: the command cannot even keep its words.
TEST(ToolFrame, SaysThatMemoryRanOutBeforeItBegan) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "skipped: the sanitizer reserves memory without end";
#endif
  std::vector<std::string> words{"lock", "show"};
  words.resize(17, std::string(100000, 'x'));
  ToolResult result;
  ToolSetup setup;
  setup.memoryLimit = std::size_t{4} << 20; // too little to load the libraries
  for (; result.messages != "kovabackup: memory ran out\n" && result.exitCode != 2;
       setup.memoryLimit += std::size_t{256} << 10) {
    result = runTool(words, setup);
  }
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_EQ("", result.out);
}

// Where memory does not even suffice for an exception the runtime would end the command by SIGABRT.
TEST(ToolFrame, IsNeverAbortedWhenMemoryRunsOut) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "skipped: the sanitizer reserves memory without end";
#endif
  constexpr std::size_t kStep = std::size_t{64} << 10; // fewer bytes than the runtime's reserve
  bool ranOut = false;
  ToolResult result;
  ToolSetup setup;
  setup.memoryLimit = std::size_t{6} << 20; // enough for an instrumented program without libraries
  for (; result.exitCode != 0; setup.memoryLimit += kStep) {
    result = runTool({"--version"}, setup);
    ASSERT_EQ(0, result.signal) << setup.memoryLimit << result;
    ranOut = ranOut || result.messages == "kovabackup: memory ran out\n";
  }
  EXPECT_TRUE(ranOut);
}

TEST(ToolFrame, FailsWhenTheDiskIsFull) {
  const UniqueFd full(::open("/dev/full", O_WRONLY | O_CLOEXEC));
  const ToolResult result = runTool({"--help"}, {"", {}, "/", full.get()});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: cannot write to standard output: No space left on device\n",
            result.messages);
}

TEST(ToolFrame, FailsWhenTheReaderHasGone) {
  int ends[2];
  ASSERT_EQ(0, ::pipe2(ends, O_CLOEXEC));
  ::close(ends[0]);
  const UniqueFd writeEnd(ends[1]);
  const ToolResult result = runTool({"--help"}, {"", {}, "/", writeEnd.get()});
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_EQ("", result.messages) << "a reader that has seen enough is normal";
}

TEST(ToolFrame, FailsWhenStandardOutputIsClosed) {
  const ToolResult result = runTool({"--help"}, {"", {}, "/", -2});
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("Bad file descriptor"));
}

TEST(ToolFrame, NeverOpensAFileAsClosedStandardInput) {
  const TestFolder folder;
  writeFile(folder / "values", "{}");
  ToolSetup setup;
  setup.closeIn = true;
  const ToolResult result = runTool({"template", "fill", "-", "--json", folder / "values"}, setup);
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("cannot read standard input"));
}

} // namespace
