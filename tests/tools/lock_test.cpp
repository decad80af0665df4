#include "tests/tools/run_tool.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"
#include "kovabackup/service/run_lock.h"
#include "tests/support/pid_namespace.h"

#include <csignal>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Path::createIpcLockFile;
using KOVA::Base::UniqueFd;
using testing::HasSubstr;

UniqueFd held(const std::string &token) {
  UniqueFd fd(createIpcLockFile(token));
  EXPECT_EQ(0, ::flock(fd.get(), LOCK_EX));
  return fd;
}

TEST(ToolLockShow, NamesTheHolder) {
  const UniqueFd lock = held("tasks");
  const ToolResult result = runTool({"lock", "show", "tasks"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("holds\t" + std::to_string(::getpid()) + "\ttool_lock_test\n", result.out);
  EXPECT_EQ("", result.messages);
}

TEST(ToolLockShow, EndsRowsInNulBytesWhenAsked) {
  const UniqueFd lock = held("tasks");
  EXPECT_EQ("holds\t" + std::to_string(::getpid()) + "\ttool_lock_test" + '\0',
            runTool({"lock", "show", "tasks", "-0"}).out);
}

TEST(ToolLockShow, TellsTheHolderAsJson) {
  const UniqueFd lock = held("tasks");
  const ToolResult result = runTool({"lock", "show", "tasks", "--json"});
  EXPECT_EQ(0, result.exitCode) << result;
  const Json::Value value = document(result);
  EXPECT_TRUE(value["exists"].asBool());
  EXPECT_TRUE(value["held"].asBool());
  EXPECT_EQ("/tmp/kovabackup/lock/tasks", value["file"].asString());
  ASSERT_EQ(1U, value["holders"].size());
  EXPECT_EQ(::getpid(), value["holders"][0]["pid"].asInt());
  EXPECT_TRUE(value["holders"][0]["alive"].asBool());
  EXPECT_EQ(0U, value["waiting"].size());
}

TEST(ToolLockShow, NamesThoseThatWait) {
  const UniqueFd lock = held("tasks");
  const pid_t waiter = ::fork();
  if (waiter == 0) {
    ::prctl(PR_SET_PDEATHSIG, SIGKILL);
    const int fd = createIpcLockFile("tasks");
    ::flock(fd, LOCK_EX);
    ::_exit(0);
  }
  Json::Value value;
  do { // until the child has come to wait
    value = document(runTool({"lock", "show", "tasks", "--json"}));
  } while (value["waiting"].empty() && !testing::Test::HasFailure());
  EXPECT_EQ(waiter, value["waiting"][0]["pid"].asInt());
  EXPECT_EQ(1U, value["holders"].size());
  ::kill(waiter, SIGKILL);
  ::waitpid(waiter, nullptr, 0);
}

TEST(ToolLockShow, TellsWhenTheOneThatLockedHasEnded) {
  if (hidesLocksOfEndedTakers()) {
    GTEST_SKIP() << "skipped: this PID namespace hides a lock whose taker has ended";
  }
  UniqueFd lock(createIpcLockFile("tasks"));
  const pid_t child = ::fork();
  if (child == 0) {
    ::_exit(::flock(lock.get(), LOCK_EX)); // the lock lives on in our copy of the descriptor
  }
  ::waitpid(child, nullptr, 0);
  const ToolResult result = runTool({"lock", "show", "tasks"});
  EXPECT_EQ(0, result.exitCode) << result;
  const std::string us = "keeps\t" + std::to_string(::getpid()) + "\ttool_lock_test";
  EXPECT_EQ("holds\t" + std::to_string(child) + "\t(ended; a child keeps the lock)\n" + us + "\n",
            result.out);
  EXPECT_THAT(runTool({"lock", "list"}).out, HasSubstr("\n" + us + "\ttasks\n"));
  const Json::Value value = document(runTool({"lock", "show", "tasks", "--json"}));
  ASSERT_EQ(1U, value["keepers"].size());
  EXPECT_EQ(::getpid(), value["keepers"][0]["pid"].asInt());
}

TEST(ToolLockShow, TellsWhenTheLockWasTaken) {
  KOVA::Backup::Service::RunLock lock("nightly");
  KOVA::Backup::Service::Error error;
  ASSERT_TRUE(lock.take(error));
  EXPECT_THAT(runTool({"lock", "show", "nightly"}).messages,
              testing::MatchesRegex("kovabackup: process " + std::to_string(::getpid()) +
                                    " took the lock [0-9]+s ago\n"));
}

// Runs the command in a PID namespace of its own, as in a container.
ToolResult runInContainer(const std::vector<std::string> &arguments) {
  std::vector<std::string> words{"run",    "--",           "/usr/bin/unshare", "--pid",
                                 "--fork", "--mount-proc", KOVA_TOOL_PATH};
  words.insert(words.end(), arguments.begin(), arguments.end());
  return runTool(words);
}

TEST(ToolLockShow, SaysThatItDoesNotSeeProcessesOutsideAContainer) {
  const UniqueFd lock = held("tasks");
  if (runInContainer({"--version"}).exitCode != 0) {
    GTEST_SKIP() << "skipped: no PID namespace can be created here";
  }
  const ToolResult result = runInContainer({"lock", "show", "tasks"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("kovabackup: no process in this container holds the lock 'tasks'; whether one outside "
            "does cannot be seen from here\n",
            result.messages);
  const ToolResult list = runInContainer({"lock", "list"});
  EXPECT_EQ("free\t-\t-\ttasks\n", list.out);
  EXPECT_EQ("kovabackup: free means that no process in this container holds the lock; whether one "
            "outside does cannot be seen from here\n",
            list.messages);
  EXPECT_FALSE(document(runInContainer({"lock", "show", "tasks", "--json"}))["seesAll"].asBool());
}

// The kernel does not list a lock in a container when its taker has ended, but shows it at the
// descriptor of the process that keeps it.
TEST(ToolLockShow, FindsTheKeeperInAContainer) {
  if (runInContainer({"--version"}).exitCode != 0) {
    GTEST_SKIP() << "skipped: no PID namespace can be created here";
  }
  const ToolResult result = runTool(
      {"run", "--", "/usr/bin/unshare", "--pid", "--fork", "--mount-proc", "/bin/sh", "-c",
       "mkdir -p -m 755 /tmp/kovabackup; mkdir -m 770 /tmp/kovabackup/lock; "
       "exec 9>/tmp/kovabackup/lock/tasks; /usr/bin/flock 9; exec \"$0\" lock show tasks 9>&-",
       KOVA_TOOL_PATH});
  EXPECT_EQ(3, result.exitCode) << "the descriptor was closed: " << result;
  const ToolResult kept = runTool(
      {"run", "--", "/usr/bin/unshare", "--pid", "--fork", "--mount-proc", "/bin/sh", "-c",
       "exec 9>/tmp/kovabackup/lock/tasks; /usr/bin/flock 9; \"$0\" lock show tasks; exit $?",
       KOVA_TOOL_PATH});
  EXPECT_EQ(0, kept.exitCode) << kept;
  EXPECT_THAT(kept.out, HasSubstr("keeps\t1\tsh\n"));
}

TEST(ToolLockShow, TellsAFreeLock) {
  if (hidesLocksOfEndedTakers()) {
    GTEST_SKIP() << "skipped: in a container it is not known whether a lock is free";
  }
  { const UniqueFd lock = held("tasks"); }
  const ToolResult result = runTool({"lock", "show", "tasks"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: no process holds the lock 'tasks'\n", result.messages);
}

TEST(ToolLockShow, IsNotMisledByALockOnAnotherFile) {
  const UniqueFd lock = held("other");
  { const UniqueFd file(createIpcLockFile("tasks")); }
  EXPECT_EQ(3, runTool({"lock", "show", "tasks"}).exitCode);
}

TEST(ToolLockShow, MakesNothing) {
  const ToolResult result = runTool({"lock", "show", "tasks"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("was never taken"));
  EXPECT_FALSE(std::filesystem::exists("/tmp/kovabackup"));
  const ToolResult json = runTool({"lock", "show", "tasks", "--json"});
  EXPECT_EQ(3, json.exitCode);
  EXPECT_FALSE(document(json)["exists"].asBool());
  EXPECT_EQ("", json.messages);
}

TEST(ToolLockShow, RefusesTokensThatLeadElsewhere) {
  for (const char *token : {"", "..", ".", "../../etc/passwd", "a/../b", "a/", "/", "x/./y"}) {
    EXPECT_EQ(2, runTool({"lock", "show", token}).exitCode) << token;
  }
  EXPECT_EQ(3, runTool({"lock", "show", "/etc/tasks.conf"}).exitCode);
}

TEST(ToolLockList, ListsFreeAndHeldLocks) {
  { const UniqueFd lock = held("idle"); }
  const UniqueFd lock = held("tasks");
  const ToolResult result = runTool({"lock", "list"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("free\t-\t-\tidle\nholds\t" + std::to_string(::getpid()) + "\ttool_lock_test\ttasks\n",
            result.out);
  const Json::Value locks = document(runTool({"lock", "list", "--json"}))["locks"];
  ASSERT_EQ(2U, locks.size());
  EXPECT_EQ("idle", locks[0]["token"].asString());
  EXPECT_EQ(0U, locks[0]["holders"].size());
  EXPECT_EQ(::getpid(), locks[1]["holders"][0]["pid"].asInt());
}

TEST(ToolLockList, IsSortedAndCut) {
  { const UniqueFd lock = held("idle"); }
  const UniqueFd lock = held("tasks");
  const ToolResult result = runTool({"lock", "list", "--sort", "-holders", "--limit", "1"});
  EXPECT_EQ("holds\t" + std::to_string(::getpid()) + "\ttool_lock_test\ttasks\n", result.out);
  EXPECT_EQ("kovabackup: --limit leaves out 1 of 2\n", result.messages);
  EXPECT_EQ(2, runTool({"lock", "list", "--sort", "pid"}).exitCode);
}

TEST(ToolLockList, IsEmptyWithoutLocks) {
  const ToolResult result = runTool({"lock", "list"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: no lock was ever taken\n", result.messages);
  EXPECT_FALSE(std::filesystem::exists("/tmp/kovabackup"));
}

TEST(ToolLockList, TellsAFolderThatItCannotRead) {
  { const UniqueFd lock = held("tasks"); }
  std::filesystem::remove_all("/tmp/kovabackup/lock");
  writeFile("/tmp/kovabackup/lock", "");
  const ToolResult result = runTool({"lock", "list"});
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_EQ("kovabackup: cannot read /tmp/kovabackup/lock: Not a directory\n", result.messages);
}

TEST(ToolLockShow, ShowsAHeadingOnATerminal) {
  const UniqueFd lock = held("tasks");
  TerminalTool tool({"lock", "show", "tasks"}, {"", {{"NO_COLOR", "1"}}});
  EXPECT_THAT(tool.wait().out, testing::StartsWith("STATE  "));
}

TEST(ToolLockList, EscapesControlBytesOfATokenOnATerminalOnly) {
  { const UniqueFd lock = held("a\x1b[2Jb"); }
  TerminalTool tool({"lock", "list"}, {"", {{"NO_COLOR", "1"}}});
  EXPECT_THAT(tool.wait().out, HasSubstr("  a\\x1b[2Jb\r\n"));
  EXPECT_EQ("free\t-\t-\ta\x1b[2Jb\n", runTool({"lock", "list"}).out);
}

} // namespace
