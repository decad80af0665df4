// Who gets a run lock, and who keeps it.

#include "tests/service/lock_support.h"

#include "kovabackup/option_map.h"

#include <atomic>
#include <fcntl.h>
#include <filesystem>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

namespace {

namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;

class RunLockTest : public testing::Test {
protected:
  Error error_;
  RunLock lock_{"run"};
};

} // namespace

TEST_F(RunLockTest, IsHeldByOneObjectAtATime) {
  EXPECT_EQ(-1, lock_.fd());
  ASSERT_TRUE(lock_.take(error_));
  expectError(error_, 0, "", "");
  EXPECT_LE(0, lock_.fd());
  RunLock second("run");
  EXPECT_FALSE(second.take(error_));
  expectError(error_, EWOULDBLOCK, "flock", kLockFile);
  EXPECT_EQ(-1, second.fd());
  lock_.release();
  EXPECT_EQ(-1, lock_.fd());
  EXPECT_TRUE(second.take(error_));
  EXPECT_FALSE(lock_.take(error_));
  second.release();
  second.release();
  EXPECT_TRUE(lock_.take(error_));
}

TEST_F(RunLockTest, OfAnotherNameIsAnotherLock) {
  ASSERT_TRUE(lock_.take(error_));
  EXPECT_TRUE(isFree("other"));
}

TEST_F(RunLockTest, IsReleasedByTheDestructor) {
  {
    RunLock lock("run");
    ASSERT_TRUE(lock.take(error_));
  }
  EXPECT_TRUE(isFree("run"));
}

TEST_F(RunLockTest, ExcludesOtherProcesses) {
  OtherProcess other([&] { return take(lock_); });
  ASSERT_TRUE(other.begun());
  EXPECT_FALSE(lock_.take(error_));
  expectError(error_, EWOULDBLOCK, "flock", kLockFile);
  other.kill();
  EXPECT_TRUE(lock_.take(error_)) << "the kernel releases the lock of a killed process";
}

TEST_F(RunLockTest, ExcludesOtherThreads) {
  constexpr int kThreads = 8;
  constexpr int kRounds = 50;
  std::atomic<int> rounds{0}; // only the lock keeps an addition from being lost
  std::vector<std::thread> threads;
  threads.reserve(kThreads);
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&] {
      RunLock lock("run");
      for (int round = 0; round < kRounds; ++round) {
        Error error;
        EXPECT_TRUE(lock.take(error, Millis(-1)));
        rounds.store(rounds.load(std::memory_order_relaxed) + 1, std::memory_order_relaxed);
        lock.release();
      }
    });
  }
  for (std::thread &thread : threads) {
    thread.join();
  }
  EXPECT_EQ(kThreads * kRounds, rounds);
}

TEST_F(RunLockTest, IsTheLockOfTheOptionMapsWithThatToken) {
  OptionMap map;
  ASSERT_TRUE(map.setLockToken("run") && map.lock());
  EXPECT_FALSE(lock_.take(error_));
  expectError(error_, EWOULDBLOCK, "flock", kLockFile);
  ASSERT_TRUE(map.unlock());
  ASSERT_TRUE(lock_.take(error_));
  const pid_t waiter = ::fork();
  if (waiter == 0) {
    lock_.release(); // its copy, which would keep the lock
    ::_exit(map.lock() ? 0 : 1);
  }
  awaitWaiting(waiter);
  lock_.release();
  int status = -1;
  EXPECT_EQ(waiter, ::waitpid(waiter, &status, 0));
  EXPECT_EQ(0, status);
}

TEST_F(RunLockTest, IsNotTakenTwiceByAnObject) {
  ASSERT_TRUE(lock_.take(error_));
  const int fd = lock_.fd();
  EXPECT_FALSE(lock_.take(error_, Millis(-1)));
  expectError(error_, EALREADY, "flock", kLockFile);
  EXPECT_EQ(fd, lock_.fd());
  EXPECT_FALSE(isFree("run"));
}

TEST_F(RunLockTest, IsNotTakenTwiceWithTheNumberOfStandardInput) {
  const int input = ::fcntl(STDIN_FILENO, F_DUPFD_CLOEXEC, 3);
  (void)::close(STDIN_FILENO);
  EXPECT_TRUE(lock_.take(error_));
  EXPECT_EQ(STDIN_FILENO, lock_.fd());
  EXPECT_FALSE(lock_.take(error_));
  expectError(error_, EALREADY, "flock", kLockFile);
  lock_.release();
  EXPECT_EQ(-1, ::fcntl(STDIN_FILENO, F_GETFD));
  if (input >= 0) {
    EXPECT_EQ(STDIN_FILENO, ::dup2(input, STDIN_FILENO));
    EXPECT_EQ(0, ::close(input));
  }
}

TEST_F(RunLockTest, HasTheFileOfTheToken) {
  const ScopedUmask umask(0027);
  ASSERT_TRUE(lock_.take(error_));
  EXPECT_EQ(0770, modeOf(kLockFolder));
  EXPECT_EQ(0640, modeOf(kLockFile));
  EXPECT_EQ(kLockFile, RunLock::path("run"));
  EXPECT_EQ(FD_CLOEXEC, ::fcntl(lock_.fd(), F_GETFD));
  EXPECT_THAT(readFile(kLockFile),
              MatchesRegex(std::to_string(::getpid()) + " [1-9][0-9]* [1-9][0-9]*\n"));
  lock_.release();
  EXPECT_THAT(namesIn(kLockFolder), ElementsAre("run")) << "the file is never removed";
}

TEST_F(RunLockTest, ReplacesTheNoteOfARunBefore) {
  const Error none;
  ASSERT_TRUE(lock_.take(error_));
  lock_.release();
  const std::string note = readFile(kLockFile);
  writeFile(kLockFile, std::string(1000, '9') + "\n");
  ASSERT_TRUE(lock_.take(error_));
  EXPECT_EQ(note.substr(0, note.rfind(' ')), readFile(kLockFile).substr(0, note.rfind(' ')));
  EXPECT_EQ(note.size(), readFile(kLockFile).size());
}

TEST_F(RunLockTest, RefusesNamesThatLeadElsewhere) {
  for (const std::string &name :
       {std::string(), std::string("/"), std::string("."), std::string(".."), std::string("a/"),
        std::string("../x"), std::string("a/../b"), std::string("./a"), std::string("a/."),
        std::string("a\0b", 3), std::string("a\0", 2)}) {
    error_ = Error();
    EXPECT_FALSE(RunLock(name).take(error_)) << name;
    expectError(error_, EINVAL, "open", name);
    std::vector<LockUser> users = {{1, true, "untouched"}};
    EXPECT_FALSE(RunLock::users(name, users, error_));
    expectError(error_, EINVAL, "stat", name);
    EXPECT_THAT(users, ElementsAre(isUser(1, true, "untouched")));
    LockHolder holder;
    EXPECT_FALSE(RunLock::holder(name, holder));
    EXPECT_EQ("", RunLock::path(name));
  }
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

TEST_F(RunLockTest, NamesMayHaveSlashesAndDots) {
  EXPECT_EQ(kLockFile, RunLock::path("//run"));
  EXPECT_TRUE(isFree("..."));
  EXPECT_TRUE(isFree(".x..y"));
  EXPECT_FALSE(RunLock("etc/run").take(error_));
  expectError(error_, ENOENT, "open", kLockFolder + "/etc/run");
  fs::create_directory(kLockFolder + "/etc");
  EXPECT_TRUE(RunLock("etc/run").take(error_));
  EXPECT_FALSE(RunLock("etc").take(error_));
  expectError(error_, EISDIR, "open", kLockFolder + "/etc");
}

TEST_F(RunLockTest, DoesNotFollowALink) {
  ASSERT_TRUE(isFree("other"));
  const TestFolder folder;
  fs::create_symlink(folder / "target", kLockFile);
  EXPECT_FALSE(lock_.take(error_, Millis(-1)));
  expectError(error_, ELOOP, "open", kLockFile);
  EXPECT_THAT(folder.names(), IsEmpty());
}

TEST_F(RunLockTest, WritesToNothingThatHasAnotherName) {
  ASSERT_TRUE(isFree("other"));
  const std::string other = writeFile("/tmp/kovabackup/precious", "precious");
  fs::create_hard_link(other, kLockFile);
  EXPECT_TRUE(lock_.take(error_));
  EXPECT_FALSE(isFree("run"));
  EXPECT_EQ("precious", readFile(other));
  const LockHolder holder = holderOf("run");
  EXPECT_EQ(::getpid(), holder.taker);
  EXPECT_EQ(0, holder.since);
}

TEST_F(RunLockTest, WritesToRegularFilesOnly) {
  ASSERT_TRUE(isFree("other"));
  ASSERT_EQ(0, ::mkfifo(kLockFile.c_str(), 0666));
  EXPECT_TRUE(lock_.take(error_));
  EXPECT_FALSE(isFree("run"));
  int unread = -1;
  EXPECT_EQ(0, ::ioctl(lock_.fd(), FIONREAD, &unread));
  EXPECT_EQ(0, unread);
}

// A child without exec keeps the lock, as does a program that was given the descriptor.
TEST_F(RunLockTest, IsKeptByAForkedChild) {
  ASSERT_TRUE(lock_.take(error_));
  OtherProcess child([] { return true; });
  ASSERT_TRUE(child.begun());
  lock_.release();
  EXPECT_FALSE(lock_.take(error_));
  EXPECT_EQ(EWOULDBLOCK, error_.code);
  EXPECT_EQ(::getpid(), holderOf("run").taker);
  EXPECT_EQ(0, child.end());
  EXPECT_TRUE(lock_.take(error_));
}

TEST_F(RunLockTest, IsKeptWhenAForkedChildDestroysTheObject) {
  ASSERT_TRUE(lock_.take(error_));
  EXPECT_EQ(0, runInChild([&] {
              lock_.release();
              return 0;
            }));
  EXPECT_FALSE(isFree("run"));
}
