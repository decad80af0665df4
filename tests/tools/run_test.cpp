#include "tests/tools/run_tool.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using testing::HasSubstr;
using testing::IsEmpty;

TEST(ToolRun, PassesOutputAndExitCodeOn) {
  const ToolResult result = runTool({"run", "--", "sh", "-c", "echo out; echo err >&2; exit 42"});
  EXPECT_EQ(42, result.exitCode) << result;
  EXPECT_EQ("out\n", result.out);
  EXPECT_EQ("err\n", result.messages);
}

TEST(ToolRun, TakesTheCommandsWordsAsTheyAre) {
  EXPECT_EQ("[a,b]|--json|--|++||\n", runTool({"run", "--", "printf", "%s|%s|%s|%s|%s|\\n", "[a,b]",
                                               "--json", "--", "++", ""})
                                          .out);
}

TEST(ToolRun, GivesACleanEnvironment) {
  ToolSetup setup;
  setup.environment["SECRET"] = "x";
  const ToolResult result =
      runTool({"run", "--env", "B=2 3", "--env=A=[1]", "--", "/usr/bin/env"}, setup);
  EXPECT_EQ("PATH=/usr/bin:/bin\nA=[1]\nB=2 3\n", result.out) << result;
}

TEST(ToolRun, StartsInTheRootWithoutInput) {
  const ToolResult result = runTool({"run", "--", "sh", "-c", "pwd; cat"}, {"typed"});
  EXPECT_EQ("/\n", result.out) << result;
}

TEST(ToolRun, FindsARelativePathFromWhereTheUserIs) {
  const TestFolder folder;
  writeFile(folder / "script", "#!/bin/sh\necho here $1\n");
  ::chmod((folder / "script").c_str(), 0755);
  ToolSetup setup;
  setup.folder = folder.path();
  EXPECT_EQ("here we\n", runTool({"run", "./script", "we"}, setup).out);
}

TEST(ToolRun, AppendsToFiles) {
  const TestFolder folder;
  writeFile(folder / "out", "before\n");
  ToolSetup setup;
  setup.folder = folder.path();
  const ToolResult result = runTool({"run", "--stdout", "out", "--stderr", folder / "err", "--",
                                     "sh", "-c", "echo a; echo b >&2"},
                                    setup);
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_EQ("before\na\n", readFile(folder / "out"));
  EXPECT_EQ("b\n", readFile(folder / "err"));
}

TEST(ToolRun, TellsTheSignalThatEndedTheCommand) {
  const ToolResult result = runTool({"run", "--", "sh", "-c", "kill -TERM $$"});
  EXPECT_EQ(128 + SIGTERM, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("was terminated by signal 15 (Terminated)"));
}

TEST(ToolRun, TellsACommandThatIsNotThere) {
  const ToolResult name = runTool({"run", "--", "no-such-command"});
  EXPECT_EQ(127, name.exitCode);
  EXPECT_EQ("kovabackup: not started: there is no command 'no-such-command' on PATH\n",
            name.messages);
  const ToolResult path = runTool({"run", "--", "/nowhere/x"});
  EXPECT_EQ(127, path.exitCode);
  EXPECT_EQ("kovabackup: not started: /nowhere/x: No such file or directory\n", path.messages);
  EXPECT_EQ(127, runTool({"run", "--", ""}).exitCode);
}

TEST(ToolRun, TellsACommandThatMayNotBeRun) {
  EXPECT_EQ(126, runTool({"run", "--", "/etc/passwd"}).exitCode);
  EXPECT_EQ(126, runTool({"run", "--", "/tmp"}).exitCode);
}

TEST(ToolRun, TellsThatItsOwn127MayBeTheCommands) {
  const ToolResult result = runTool({"run", "--", "sh", "-c", "exit 127"});
  EXPECT_EQ(127, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("ended with 127: either this is its own exit code or"));
}

TEST(ToolRun, TellsAFileThatCannotBeWritten) {
  const ToolResult result = runTool({"run", "--stdout", "/nowhere/x", "--", "true"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("not started: cannot write /nowhere/x"));
}

TEST(ToolRun, TellsTheEndAsJson) {
  const ToolResult result = runTool({"run", "--json", "--", "sh", "-c", "echo out; exit 3"});
  EXPECT_EQ(3, result.exitCode) << result;
  const Json::Value value = document(result);
  EXPECT_EQ(3, value["exitCode"].asInt());
  EXPECT_TRUE(value["signal"].isNull());
  EXPECT_THAT(value["program"].asString(), testing::EndsWith("/sh"));
  EXPECT_EQ("out\n", result.messages) << "the document keeps standard output for itself";
  const Json::Value ended = document(runTool({"run", "--json", "--", "sh", "-c", "kill -9 $$"}));
  EXPECT_TRUE(ended["exitCode"].isNull());
  EXPECT_EQ(9, ended["signal"].asInt());
  EXPECT_EQ(127, document(runTool({"run", "--json", "--", "/x"}))["errors"][0]["exitCode"].asInt());
}

TEST(ToolRun, RefusesWrongUsage) {
  EXPECT_EQ(2, runTool({"run"}).exitCode);
  EXPECT_EQ(2, runTool({"run", "--"}).exitCode);
  EXPECT_EQ(2, runTool({"run", "--new-session", "--", "true"}).exitCode);
  EXPECT_EQ(2, runTool({"run", "--env", "novalue", "--", "true"}).exitCode);
  EXPECT_EQ(2, runTool({"run", "--env", "=x", "--", "true"}).exitCode);
  const ToolResult result = runTool({"run", "ls", "-l"});
  EXPECT_EQ(2, result.exitCode) << "the command's options stand after --";
  EXPECT_THAT(result.messages, HasSubstr("unknown option '-l'; put -- before the command"));
}

// A pipe whose end is seen only when every process that has it open is gone.
TEST(ToolRun, LeavesABackgroundCommandBehind) {
  const TestFolder folder;
  ASSERT_EQ(0, ::mkfifo((folder / "go").c_str(), 0600));
  ASSERT_EQ(0, ::mkfifo((folder / "answer").c_str(), 0600));
  const ToolResult result =
      runTool({"run", "--background", "--new-session", "--stdout", folder / "out", "--", "sh", "-c",
               "read line <'" + (folder / "go") + "'; ps -o sid= -p $$; echo $line $$ >'" +
                   (folder / "answer") + "'"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.out + result.messages);
  writeFile(folder / "go", "hello\n"); // blocks until the command reads: it outlived the tool
  const std::string answer = readFile(folder / "answer");
  EXPECT_THAT(answer, testing::StartsWith("hello "));
  EXPECT_EQ(std::stoi(answer.substr(6)), std::stoi(readFile(folder / "out")))
      << "it leads a session of its own";
}

TEST(ToolRun, LeavesKeysToTheCommand) {
  TerminalTool tool(
      {"run", "--", "sh", "-c",
       "trap 'kill $!; echo cleaned up; exit 5' INT; tail -f /dev/null & echo ready; wait"});
  tool.expect("ready");
  tool.send("\x03");
  tool.expect("cleaned up");
  EXPECT_EQ(5, tool.wait().exitCode);
}

TEST(ToolRun, PassesATerminationOn) {
  TerminalTool tool(
      {"run", "--", "sh", "-c",
       "trap 'kill $!; echo ended; exit 6' TERM; tail -f /dev/null & echo ready; wait"});
  tool.expect("ready");
  ::kill(tool.pid(), SIGTERM);
  tool.expect("ended");
  EXPECT_EQ(6, tool.wait().exitCode);
}

TEST(ToolRun, GivesTheCommandTheSignalsOfAFreshProcess) {
  const ToolResult result =
      runTool({"run", "--", "grep", "-E", "Sig(Ign|Cgt)", "/proc/self/status"});
  EXPECT_THAT(result.out, HasSubstr("SigIgn:\t0000000000000000\n")) << result;
}

TEST(ToolRun, WaitsEvenWhenChildrenWereIgnored) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::signal(SIGCHLD, SIG_IGN);
    ::execl(KOVA_TOOL_PATH, "kovabackup", "run", "--", "sh", "-c", "exit 7", nullptr);
    ::_exit(126);
  }
  int status = 0;
  EXPECT_EQ(child, ::waitpid(child, &status, 0));
  EXPECT_EQ(7, WEXITSTATUS(status));
}

} // namespace
