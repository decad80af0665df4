// Who is reported to hold a run lock, whatever became of that process.

#include "tests/service/lock_support.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/command.h"
#include "tests/support/pid_namespace.h"

#include <filesystem>
#include <sys/file.h>
#include <sys/syscall.h>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;

class RunLockHolder : public testing::Test {
protected:
  Error error_;
  RunLock lock_{"run"};
};

constexpr const char *kThisProgram = "service_run_loc"; // as the kernel cuts it

} // namespace

TEST_F(RunLockHolder, ReportsItsHolder) {
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

TEST_F(RunLockHolder, ReportsAMapThatHoldsItWithoutATime) {
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

TEST_F(RunLockHolder, ReportsAMapOfThePidOfAnOldNote) {
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

TEST_F(RunLockHolder, IgnoresNotesThatItDidNotWrite) {
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
TEST_F(RunLockHolder, ReadsNoMoreThanANote) {
  OptionMap map; // which follows links
  ASSERT_TRUE(isFree("other"));
  fs::create_symlink("/dev/zero", kLockFile);
  ASSERT_TRUE(map.setLockToken("run") && map.lock());
  EXPECT_EQ(::getpid(), holderOf("run").taker);
  EXPECT_EQ(0, holderOf("run").since);
  EXPECT_TRUE(map.unlock());
}

TEST_F(RunLockHolder, OutlivesAKilledServiceWhileItsCommandRuns) {
  if (hidesLocksOfEndedTakers()) {
    GTEST_SKIP() << "skipped: this PID namespace hides a lock whose taker has ended";
  }
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
TEST_F(RunLockHolder, ReportsATakerThatIsNotReapedAsEnded) {
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
TEST_F(RunLockHolder, IsNotFooledByAPidThatIsUsedAgain) {
  if (hidesLocksOfEndedTakers()) {
    GTEST_SKIP() << "skipped: this PID namespace hides a lock whose taker has ended";
  }
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

TEST_F(RunLockHolder, ListsHoldersAndThoseThatWait) {
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

TEST_F(RunLockHolder, LooksWithoutMakingAnything) {
  std::vector<LockUser> users;
  EXPECT_TRUE(RunLock::users("run", users, error_));
  LockHolder holder;
  EXPECT_FALSE(RunLock::holder("run", holder));
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
  writeFile("/tmp/kovabackup", "in the way");
  EXPECT_TRUE(RunLock::users("run", users, error_));
  EXPECT_EQ(0, ::unlink("/tmp/kovabackup"));
}
