// The lock token: its states, every failing step, and mutual exclusion.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"
#include "tests/support/waits_for_flock.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <poll.h>
#include <sched.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr const char *kLockFile = "/tmp/kovabackup/lock/token";

class LockToken : public PlatformTest {
protected:
  LockToken() { EXPECT_TRUE(map_.setLockToken("token")); }

  LogCapture log_;
  OptionMap map_;
};

// The descriptor of the lock file in this process, or -1.
int lockDescriptor() {
  for (const auto &[name, target] : takeCensus()) {
    if (name.rfind("fd ", 0) == 0 && target.find(kLockFile) != std::string::npos) {
      return std::stoi(name.substr(3));
    }
  }
  return -1;
}

bool isLocked() {
  const int fd = ::open(kLockFile, O_RDWR | O_CLOEXEC);
  const bool locked = ::flock(fd, LOCK_EX | LOCK_NB) != 0;
  ::close(fd);
  return locked;
}

std::string fdText(int fd) {
  return " fd: [" + std::to_string(fd) + "].";
}

} // namespace

TEST_F(LockToken, WithoutOneNothingIsOpened) {
  OptionMap map;
  const Census before = takeCensus();
  EXPECT_TRUE(map.lock());
  EXPECT_TRUE(map.lock());
  EXPECT_EQ(before, takeCensus());
  EXPECT_TRUE(map.unlock());
  EXPECT_TRUE(map.unlock());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(LockToken, MustNotBeEmpty) {
  EXPECT_FALSE(map_.setLockToken(""));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 923, "setLockToken: invalid parameter.")));
  EXPECT_TRUE(map_.lock());
  EXPECT_GE(lockDescriptor(), 0) << "the old token stays";
  EXPECT_TRUE(map_.unlock());
}

TEST_F(LockToken, CanBeReplacedWhileNotHeld) {
  EXPECT_TRUE(map_.setLockToken("first"));
  EXPECT_TRUE(map_.setLockToken("token"));
  EXPECT_TRUE(map_.lock());
  EXPECT_GE(lockDescriptor(), 0);
  EXPECT_TRUE(map_.unlock());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(LockToken, StaysWhileItIsHeld) {
  ASSERT_TRUE(map_.lock());
  const int fd = lockDescriptor();
  EXPECT_FALSE(map_.setLockToken("other"));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 927,
                                               "setLockToken: file locked already." + fdText(fd))));
  EXPECT_TRUE(map_.unlock());
  EXPECT_TRUE(map_.lock());
  EXPECT_GE(lockDescriptor(), 0) << "the old token stays";
  EXPECT_TRUE(map_.unlock());
}

TEST_F(LockToken, EmptyIsSaidBeforeHeld) {
  ASSERT_TRUE(map_.lock());
  EXPECT_FALSE(map_.setLockToken(""));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 923, "setLockToken: invalid parameter.")));
  EXPECT_TRUE(map_.unlock());
}

TEST_F(LockToken, LocksAndUnlocksTheFile) {
  EXPECT_TRUE(map_.lock());
  EXPECT_TRUE(isLocked());
  EXPECT_TRUE(map_.unlock());
  EXPECT_FALSE(isLocked());
  EXPECT_EQ(-1, lockDescriptor());
  struct stat file {};
  EXPECT_EQ(0, ::stat(kLockFile, &file)) << "the lock file stays";
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(LockToken, IsNotReentrant) {
  ASSERT_TRUE(map_.lock());
  const int fd = lockDescriptor();
  EXPECT_FALSE(map_.lock());
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 944, "lock: file locked already." + fdText(fd))));
  EXPECT_TRUE(isLocked());
  EXPECT_TRUE(map_.unlock());
}

// A service that has closed its standard input gets descriptor 0 for the lock.
TEST_F(LockToken, DescriptorZeroIsHeldLikeAnyOther) {
  const int input = ::fcntl(0, F_DUPFD_CLOEXEC, 3);
  ::close(0);
  EXPECT_TRUE(map_.lock());
  EXPECT_EQ(0, lockDescriptor());
  EXPECT_FALSE(map_.lock());
  EXPECT_FALSE(map_.setLockToken("other"));
  EXPECT_TRUE(map_.unlock());
  EXPECT_EQ(-1, lockDescriptor());
  if (input >= 0) {
    ::dup2(input, 0);
    ::close(input);
  }
  EXPECT_THAT(
      log_.take(),
      ElementsAre(errLine("option_map", 944, "lock: file locked already. fd: [0]."),
                  errLine("option_map", 927, "setLockToken: file locked already. fd: [0].")));
}

TEST_F(LockToken, UnlockingWhatIsNotHeldFailsUnderTheWordLock) {
  EXPECT_FALSE(map_.unlock());
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 975, "lock: file released already. fd: [-1].")));
  ASSERT_TRUE(map_.lock());
  EXPECT_TRUE(map_.unlock());
  EXPECT_FALSE(map_.unlock());
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 975, "lock: file released already. fd: [-1].")));
}

TEST_F(LockToken, ALockFileThatCannotBeOpenedIsAFailure) {
  ASSERT_TRUE(map_.lock());
  ASSERT_TRUE(map_.unlock());
  {
    const Fault fault("open", 1, EMFILE);
    EXPECT_FALSE(map_.lock());
    EXPECT_TRUE(fault.fired());
  }
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 951, "lock: open lock token failed.")));
  EXPECT_TRUE(map_.lock()) << "not held, so it can be tried again";
  EXPECT_TRUE(map_.unlock());
}

TEST_F(LockToken, ALockDirectoryThatCannotBeMadeIsSaidByBoth) {
  const Fault fault("mkdir", 1, EACCES);
  EXPECT_FALSE(map_.lock());
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("path/path_util", 395,
                                  "mkdir /tmp/kovabackup path failed. Permission denied"),
                          errLine("option_map", 951, "lock: open lock token failed.")));
}

TEST_F(LockToken, AFailedFlockLeavesNothingOpen) {
  {
    const Fault fault("flock", 1, ENOLCK);
    errno = 0;
    EXPECT_FALSE(map_.lock());
    EXPECT_EQ(ENOLCK, errno);
  }
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 956,
                                               "lock: flock(LOCK_EX) failed. No locks available")));
  EXPECT_EQ(-1, lockDescriptor());
  EXPECT_TRUE(map_.lock());
  EXPECT_TRUE(map_.unlock());
}

TEST_F(LockToken, AFailedUnlockKeepsTheLock) {
  ASSERT_TRUE(map_.lock());
  const int fd = lockDescriptor();
  {
    const Fault fault("flock", 1, EIO);
    EXPECT_FALSE(map_.unlock());
  }
  EXPECT_THAT(
      log_.take(),
      ElementsAre(errLine("option_map", 980, "unlock: flock(LOCK_UN) failed. Input/output error")));
  EXPECT_TRUE(isLocked());
  EXPECT_EQ(fd, lockDescriptor());
  EXPECT_FALSE(map_.lock());
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 944, "lock: file locked already." + fdText(fd))));
  EXPECT_TRUE(map_.unlock());
}

TEST_F(LockToken, EveryFailingCallOfLockLeavesItNotHeld) {
  for (const char *call : {"mkdir", "chmod", "open", "flock"}) {
    forEachFailure(call, EIO, [&](Fault &) {
      const bool locked = map_.lock();
      const std::size_t lines = log_.take().size();
      EXPECT_EQ(locked, lockDescriptor() >= 0);
      EXPECT_EQ(locked, lines == 0);
      if (locked) {
        // A lasting failure of flock starts after this lock or with it.
        while (!map_.unlock()) {
          log_.take();
          ASSERT_STREQ("flock", call);
          map_ = OptionMap(); // forgets the descriptor, which stays open
          ASSERT_EQ(0, ::close(lockDescriptor()));
          ASSERT_TRUE(map_.setLockToken("token"));
          break;
        }
      }
    });
  }
}

TEST_F(LockToken, OfADestroyedMapStaysHeld) {
  {
    OptionMap map;
    ASSERT_TRUE(map.setLockToken("token"));
    ASSERT_TRUE(map.lock());
  }
  EXPECT_TRUE(isLocked());
  EXPECT_EQ(0, ::close(lockDescriptor()));
  EXPECT_FALSE(isLocked());
}

TEST_F(LockToken, OfAnotherNameDoesNotExclude) {
  OptionMap other;
  ASSERT_TRUE(other.setLockToken("other"));
  EXPECT_TRUE(map_.lock());
  EXPECT_TRUE(other.lock());
  EXPECT_TRUE(other.unlock());
  EXPECT_TRUE(map_.unlock());
}

TEST_F(LockToken, MakesAnotherProcessWait) {
  ASSERT_TRUE(map_.lock());
  int ends[2];
  ASSERT_EQ(0, ::pipe2(ends, O_CLOEXEC));
  const pid_t child = ::fork();
  if (child == 0) {
    ::close(lockDescriptor());
    OptionMap map;
    const bool locked = map.setLockToken("token") && map.lock();
    const char answer = locked ? 'y' : 'n';
    ::_exit(::write(ends[1], &answer, 1) == 1 && locked && map.unlock() ? 0 : 1);
  }
  while (!waitsForFlock(child)) {
    ASSERT_EQ(0, ::waitpid(child, nullptr, WNOHANG)) << "it has ended without waiting";
    ::sched_yield();
  }
  pollfd end{ends[0], POLLIN, 0};
  EXPECT_EQ(0, ::poll(&end, 1, 0)) << "it has the lock while we hold it";
  EXPECT_TRUE(map_.unlock());
  char answer = '?';
  EXPECT_EQ(1, ::read(ends[0], &answer, 1));
  EXPECT_EQ('y', answer);
  int status = 0;
  EXPECT_EQ(child, ::waitpid(child, &status, 0));
  EXPECT_EQ(0, status);
  ::close(ends[0]);
  ::close(ends[1]);
}

TEST_F(LockToken, ASignalEndsTheWait) {
  OptionMap holder;
  ASSERT_TRUE(holder.setLockToken("token"));
  ASSERT_TRUE(holder.lock());
  struct sigaction action {};
  struct sigaction before {};
  action.sa_handler = [](int) {}; // without SA_RESTART
  ASSERT_EQ(0, ::sigaction(SIGUSR1, &action, &before));
  const pid_t waker = ::fork();
  if (waker == 0) {
    while (!waitsForFlock(::getppid())) {
      ::sched_yield();
    }
    ::_exit(::kill(::getppid(), SIGUSR1) == 0 ? 0 : 1);
  }
  EXPECT_FALSE(map_.lock());
  EXPECT_EQ(waker, ::waitpid(waker, nullptr, 0));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 956,
                                  "lock: flock(LOCK_EX) failed. Interrupted system call")));
  ASSERT_EQ(0, ::sigaction(SIGUSR1, &before, nullptr));
  EXPECT_TRUE(holder.unlock());
}
