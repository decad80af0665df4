// How long a command may wait for a lock, and whom it names as the holder meanwhile.

#include "tests/tools/option_support.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"
#include "tests/support/pid_namespace.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Path::createIpcLockFile;
using KOVA::Base::UniqueFd;
using testing::HasSubstr;

class ToolLockTimeout : public ToolOption {
protected:
  ToolResult setWithin(const std::string &seconds) const {
    return option({"set", file_, "s", "k", "v", "--lock", "t", "--lock-timeout", seconds});
  }
};

TEST_F(ToolLockTimeout, IsAtMostAnHour) {
  for (const char *seconds : {"0", "3600"}) {
    const ToolResult result = setWithin(seconds);
    EXPECT_EQ(0, result.exitCode) << result;
  }
}

TEST_F(ToolLockTimeout, IsRefusedBeyond) {
  for (const char *seconds : {"-1", "3601", "1.5", "", "5s"}) {
    const ToolResult result = setWithin(seconds);
    EXPECT_EQ(2, result.exitCode) << result;
    EXPECT_THAT(result.messages, HasSubstr("is not a valid time limit"));
  }
  EXPECT_FALSE(std::filesystem::exists(file_));
}

TEST_F(ToolLockTimeout, RequiresALock) {
  const ToolResult result = option({"set", file_, "s", "k", "v", "--lock-timeout", "5"});
  EXPECT_EQ(2, result.exitCode) << result;
  EXPECT_FALSE(std::filesystem::exists(file_));
}

class ToolLockWait : public ToolOption {
protected:
  // Waits until the command has named the holder so, then unlocks and expects success.
  void expectNamed(const UniqueFd &lock, const std::string &holder) const {
    ToolSetup wide = setup();
    wide.columns = 200; // for the complete message on one line
    TerminalTool tool({"option", "set", file_, "s", "k", "v", "--lock", "t"}, wide);
    tool.expect("waiting for the lock 't', which process " + holder + " holds\r\n");
    ASSERT_EQ(0, ::flock(lock.get(), LOCK_UN)); // closing would not: the command inherited it
    EXPECT_EQ(0, tool.wait().exitCode);
  }
};

TEST_F(ToolLockWait, NamesTheProgramOfTheHolder) {
  const UniqueFd lock(createIpcLockFile("t"));
  ASSERT_EQ(0, ::flock(lock.get(), LOCK_EX));
  expectNamed(lock, std::to_string(::getpid()) + " (tool_lock_timeo)");
}

TEST_F(ToolLockWait, SaysThatTheHolderHasEnded) {
  if (hidesLocksOfEndedTakers()) {
    GTEST_SKIP() << "skipped: this PID namespace hides a lock whose taker has ended";
  }
  const UniqueFd lock(createIpcLockFile("t"));
  const pid_t child = ::fork();
  if (child == 0) {
    ::_exit(::flock(lock.get(), LOCK_EX)); // the lock lives on in our copy of the descriptor
  }
  ::waitpid(child, nullptr, 0);
  expectNamed(lock, std::to_string(child) + " (ended; a child keeps the lock)");
}

} // namespace
