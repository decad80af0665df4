// Who gets a run lock, who keeps it, and who is reported to have it.

#include "tests/service/lock_support.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/command.h"
#include "tests/support/census.h"
#include "tests/support/log_capture.h"

#include <atomic>
#include <filesystem>
#include <sys/file.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <thread>

using namespace KovaTest;
using testing::ElementsAre;
using testing::Eq;
using testing::Field;
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

auto isUser(pid_t pid, bool waits, const std::string &command) {
  return testing::AllOf(Field(&LockUser::pid, Eq(pid)), Field(&LockUser::waits, Eq(waits)),
                        Field(&LockUser::command, Eq(command)));
}

constexpr const char *kThisProgram = "service_run_loc"; // as the kernel cuts it

LockHolder holderOf(const std::string &name) {
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder(name, holder));
  return holder;
}

bool take(RunLock &lock, Millis limit = Millis(0)) {
  Error error;
  return lock.take(error, limit);
}

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

TEST_F(RunLockTest, ReportsItsHolder) {
  LockHolder holder;
  EXPECT_FALSE(RunLock::holder("run", holder)) << "it was never taken";
  const std::time_t before = std::time(nullptr);
  ASSERT_TRUE(lock_.take(error_));
  holder = holderOf("run");
  EXPECT_EQ(::getpid(), holder.taker);
  EXPECT_TRUE(holder.alive);
  EXPECT_LE(before, holder.since);
  EXPECT_GE(std::time(nullptr), holder.since);
  lock_.release();
  holder.taker = 7;
  EXPECT_FALSE(RunLock::holder("run", holder)) << "the note is old";
  EXPECT_EQ(7, holder.taker);
  EXPECT_TRUE(lock_.take(error_)) << "looking has left no lock";
}

TEST_F(RunLockTest, ReportsAMapThatHoldsItWithoutATime) {
  ASSERT_TRUE(lock_.take(error_)); // leaves a note
  lock_.release();
  OtherProcess other([] {
    OptionMap map;
    return map.setLockToken("run") && map.lock();
  });
  ASSERT_TRUE(other.begun());
  const LockHolder holder = holderOf("run");
  EXPECT_EQ(other.pid(), holder.taker);
  EXPECT_TRUE(holder.alive);
  EXPECT_EQ(0, holder.since);
}

TEST_F(RunLockTest, ReportsAMapOfThePidOfAnOldNote) {
  ASSERT_TRUE(isFree("run"));
  OptionMap map;
  ASSERT_TRUE(map.setLockToken("run") && map.lock());
  writeFile(kLockFile, std::to_string(::getpid()) + " 1 2\n"); // of an earlier process
  const LockHolder holder = holderOf("run");
  EXPECT_EQ(::getpid(), holder.taker);
  EXPECT_TRUE(holder.alive);
  EXPECT_EQ(0, holder.since);
  EXPECT_TRUE(map.unlock());
}

TEST_F(RunLockTest, IgnoresNotesThatItDidNotWrite) {
  ASSERT_TRUE(lock_.take(error_));
  const std::string good = readFile(kLockFile);
  const std::string pid = std::to_string(::getpid());
  for (const std::string &note :
       {std::string(), std::string("\n"), pid, pid + " 1", pid + " x 1\n", pid + " 1 x\n",
        "x" + good, good.substr(0, good.size() - 1) + " 1\n", pid + " 99999999999999999999 1\n",
        std::string("99999999999 1 1\n"), " \n" + good}) {
    writeFile(kLockFile, note);
    const LockHolder holder = holderOf("run");
    EXPECT_EQ(::getpid(), holder.taker);
    EXPECT_TRUE(holder.alive);
    EXPECT_EQ(0, holder.since) << note;
  }
  writeFile(kLockFile, good + "more");
  EXPECT_NE(0, holderOf("run").since);
}

// Whatever is in the place of the lock file, looking at it ends.
TEST_F(RunLockTest, ReadsNoMoreThanANote) {
  OptionMap map; // which follows links
  ASSERT_TRUE(isFree("other"));
  fs::create_symlink("/dev/zero", kLockFile);
  ASSERT_TRUE(map.setLockToken("run") && map.lock());
  EXPECT_EQ(::getpid(), holderOf("run").taker);
  EXPECT_EQ(0, holderOf("run").since);
  EXPECT_TRUE(map.unlock());
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

TEST_F(RunLockTest, OutlivesAKilledServiceWhileItsCommandRuns) {
  using namespace KOVA::Backup::Service;
  Pipe input;
  const std::time_t before = std::time(nullptr);
  OtherProcess service([&] {
    if (!take(lock_)) {
      return false;
    }
    Command command({"/bin/cat"});
    command.inputFd(input.out.get()).passFd(lock_.fd(), 5).diesWithUs(false);
    const auto *running = new Running(command.start()); // it is not killed by a destructor
    return running->pid() > 0;
  });
  ASSERT_TRUE(service.begun());
  const pid_t pid = service.pid();
  EXPECT_TRUE(holderOf("run").alive);
  service.kill();
  EXPECT_FALSE(lock_.take(error_));
  const LockHolder holder = holderOf("run");
  EXPECT_EQ(pid, holder.taker);
  EXPECT_FALSE(holder.alive);
  EXPECT_LE(before, holder.since);
  std::vector<LockUser> users;
  EXPECT_TRUE(RunLock::users("run", users, error_));
  EXPECT_THAT(users, ElementsAre(isUser(pid, false, "")));
  input.in.reset(); // cat ends
  EXPECT_TRUE(lock_.take(error_, Millis(-1)));
}

// A process that has ended but is not reaped yet has no descriptors any more.
TEST_F(RunLockTest, ReportsATakerThatIsNotReapedAsEnded) {
  ASSERT_TRUE(isFree("run"));
  const KOVA::Base::UniqueFd file(::open(kLockFile.c_str(), O_RDWR | O_CLOEXEC));
  const pid_t child = ::fork();
  if (child == 0) {
    ::_exit(::flock(file.get(), LOCK_EX));
  }
  siginfo_t info = {};
  EXPECT_EQ(0, ::waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT));
  const LockHolder holder = holderOf("run");
  EXPECT_EQ(child, holder.taker);
  EXPECT_FALSE(holder.alive);
  EXPECT_EQ(child, ::waitpid(child, nullptr, 0));
}

namespace {

// A process with a given PID, which must be free; -1 when none can be had.
pid_t forkWithPid(pid_t pid, const std::function<void()> &work) {
  struct {
    alignas(8) std::uint64_t flags, pidfd, childTid, parentTid,
        exitSignal, stack, stackSize, tls, setTid, setTidSize;
  } args = {};
  args.exitSignal = SIGCHLD;
  args.setTid = reinterpret_cast<std::uint64_t>(&pid);
  args.setTidSize = 1;
  const long result = ::syscall(SYS_clone3, &args, sizeof args);
  if (result == 0) {
    work();
    ::_exit(0);
  }
  return static_cast<pid_t>(result);
}

} // namespace

// A service was killed, its child keeps the lock, and an unrelated process got the PID.
TEST_F(RunLockTest, IsNotFooledByAPidThatIsUsedAgain) {
  Pipe goOn;
  const pid_t taker = ::fork();
  if (taker == 0) {
    if (!take(lock_)) {
      ::_exit(1);
    }
    goOn.in.reset();
    if (::fork() == 0) { // keeps the descriptor
      (void)goOn.wait();
    }
    ::_exit(0);
  }
  int status = -1;
  ASSERT_EQ(taker, ::waitpid(taker, &status, 0));
  ASSERT_EQ(0, status);
  std::string note = readFile(kLockFile);
  note.insert(note.find(' ') + 1, "1"); // both may have started within one tick of the clock
  writeFile(kLockFile, note);
  Pipe end;
  const pid_t other = forkWithPid(taker, [&] {
    lock_.release();
    goOn.in.reset();
    end.in.reset();
    (void)end.wait();
  });
  if (other == taker) {
    const LockHolder holder = holderOf("run");
    EXPECT_EQ(taker, holder.taker);
    EXPECT_FALSE(holder.alive);
    EXPECT_NE(0, holder.since);
    writeFile(kLockFile, ""); // without a note, only the open file tells them apart
    EXPECT_FALSE(holderOf("run").alive);
    end.in.reset();
    EXPECT_EQ(other, ::waitpid(other, nullptr, 0));
  }
  goOn.in.reset();
  EXPECT_TRUE(lock_.take(error_, Millis(-1)));
  if (other != taker) {
    GTEST_SKIP() << "skipped: no process can be given a PID here";
  }
}

TEST_F(RunLockTest, ListsHoldersAndThoseThatWait) {
  std::vector<LockUser> users = {{1, true, "old"}};
  EXPECT_TRUE(RunLock::users("run", users, error_));
  EXPECT_THAT(users, IsEmpty()) << "it was never taken";
  ASSERT_TRUE(lock_.take(error_));
  const pid_t waiter = ::fork();
  if (waiter == 0) {
    (void)::prctl(PR_SET_NAME, "odd) name (x\n");
    lock_.release();
    RunLock lock("run");
    ::_exit(take(lock, Millis(-1)) ? 0 : 1);
  }
  awaitWaiting(waiter);
  EXPECT_TRUE(RunLock::users("run", users, error_));
  EXPECT_THAT(users, ElementsAre(isUser(::getpid(), false, kThisProgram),
                                 isUser(waiter, true, "odd) name (x\n")));
  EXPECT_EQ(::getpid(), holderOf("run").taker);
  lock_.release();
  int status = -1;
  EXPECT_EQ(waiter, ::waitpid(waiter, &status, 0));
  EXPECT_EQ(0, status);
  EXPECT_TRUE(RunLock::users("run", users, error_));
  EXPECT_THAT(users, IsEmpty());
  expectError(error_, 0, "", "");
}

TEST_F(RunLockTest, LooksWithoutMakingAnything) {
  std::vector<LockUser> users;
  EXPECT_TRUE(RunLock::users("run", users, error_));
  LockHolder holder;
  EXPECT_FALSE(RunLock::holder("run", holder));
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
  writeFile("/tmp/kovabackup", "in the way");
  EXPECT_TRUE(RunLock::users("run", users, error_));
  EXPECT_EQ(0, ::unlink("/tmp/kovabackup"));
}
