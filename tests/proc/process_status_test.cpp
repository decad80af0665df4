// What /proc and kill(2) report about a process.

#include "kovabackup/exec.h"

#include "tests/proc/process_hooks.h"
#include "tests/support/counting_loop.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <gmock/gmock.h>
#include <string>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>
#include <vector>

using namespace KovaTest;
namespace Process = KOVA::Backup::Process;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

// A child with the given name that waits to be killed.
class NamedChild {
public:
  explicit NamedChild(const char *name) {
    int ready[2];
    (void)!::pipe(ready);
    pid_ = ::fork();
    if (pid_ == 0) {
      ::prctl(PR_SET_NAME, name);
      ::close(ready[1]); // signals that the name is set
      ::close(ready[0]);
      for (;;) {
        ::pause();
      }
    }
    ::close(ready[1]);
    char byte = 0;
    (void)!::read(ready[0], &byte, 1);
    ::close(ready[0]);
  }
  ~NamedChild() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
  NamedChild(const NamedChild &) = delete;
  NamedChild &operator=(const NamedChild &) = delete;

  pid_t pid() const { return pid_; }

private:
  pid_t pid_;
};

bool comesToState(pid_t pid, int state) {
  for (int i = 0; i < 60000; ++i) {
    if (Process::getStatus(pid) == state) {
      return true;
    }
    ::usleep(1000);
  }
  return false;
}

} // namespace

TEST(ProcessStatus, IsFoundWhateverTheNameHolds) {
  for (const char *name :
       {"plain", "two words", "a) R (b", ") Z 1", "((", "))", "a\nb", "\n) Z", "", " ", "x) "}) {
    const NamedChild child(name);
    EXPECT_TRUE(comesToState(child.pid(), 'S')) << "name '" << name << "'";
    EXPECT_FALSE(Process::isZombie(child.pid()));
  }
}

TEST(ProcessStatus, IsRunningForTheOneWhoAsks) {
  EXPECT_EQ('R', Process::getStatus(::getpid()));
}

TEST(ProcessStatus, IsStoppedForAStoppedProcess) {
  const NamedChild child("stops");
  ::kill(child.pid(), SIGSTOP);
  EXPECT_TRUE(comesToState(child.pid(), 'T'));
}

TEST(ProcessStatus, IsZombieUntilReaped) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::_exit(0);
  }
  siginfo_t info = {};
  ASSERT_EQ(0, ::waitid(P_PID, static_cast<id_t>(child), &info, WEXITED | WNOWAIT));
  EXPECT_EQ('Z', Process::getStatus(child));
  EXPECT_TRUE(Process::isZombie(child));
  EXPECT_TRUE(Process::isAlive(child));
  ::waitpid(child, nullptr, 0);
  EXPECT_EQ(0, Process::getStatus(child));
  EXPECT_FALSE(Process::isZombie(child));
  EXPECT_FALSE(Process::isAlive(child));
}

TEST(ProcessStatus, IsUnknownForPidsBelowOne) {
  const Recording calls;
  for (const int pid : {0, -1, -12345}) {
    EXPECT_EQ(0, Process::getStatus(pid));
    EXPECT_FALSE(Process::isZombie(pid));
  }
  EXPECT_THAT(calls.own(), IsEmpty());
}

TEST(ProcessStatus, OpensTheStatFileCloseOnExec) {
  const Recording calls;
  (void)Process::getStatus(1);
  ASSERT_EQ(2U, calls.own().size());
  EXPECT_EQ("open /proc/1/stat 0x80000 0", calls.own()[0]);
}

TEST(ProcessStatus, IsUnknownWhenTheFileCannotBeReadAndLeavesNoDescriptor) {
  for (const char *function : {"open", "read"}) {
    forEachFailure(function, EIO, [](Fault &fault) {
      const int state = Process::getStatus(::getpid());
      EXPECT_EQ(fault.fired() ? 0 : 'R', state);
    });
  }
}

namespace {

const char *statText = nullptr;

} // namespace

// The content of the file, if a test sets it.
extern "C" ssize_t read(int fd, void *buf, size_t size) {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("read");
  if (failsNow("read")) {
    return -1;
  }
  if (statText == nullptr) {
    return real(fd, buf, size);
  }
  EXPECT_EQ(4095U, size);
  const std::size_t length = std::min(size, std::strlen(statText));
  std::memcpy(buf, statText, length);
  return static_cast<ssize_t>(length);
}

TEST(ProcessStatus, StandsTwoPlacesAfterTheLastParenthesis) {
  const std::string longName = std::string(4092, 'x');
  const std::vector<std::pair<std::string, int>> files = {
      {"12 (cat) S 1", 'S'},
      {"12 (a) R (b) D 1", 'D'},
      {"12 (a) Z", 'Z'},
      {"", 0},
      {"12 no name S", 0},
      {"12 (", 0},
      {")", 0},
      {") ", 0},
      {"12 (a)", 0},
      {"12 (a) ", 0},
      {longName + ") R", 'R'}, // the last byte that is read
      {longName + "x) R", 0},
  };
  for (const auto &[text, state] : files) {
    statText = text.c_str();
    const int found = Process::getStatus(1);
    statText = nullptr;
    EXPECT_EQ(state, found) << text.substr(0, 40);
  }
}

TEST(ProcessIsAlive, IsTrueOfOneselfAndOfInit) {
  EXPECT_TRUE(Process::isAlive(::getpid()));
  EXPECT_TRUE(Process::isAlive(1));
}

TEST(ProcessIsAlive, IsFalseOnlyWhenThereIsNoSuchProcess) {
  const std::vector<std::pair<int, bool>> answers = {{ESRCH, false}, {EPERM, true}, {EINVAL, true}};
  for (const auto &[error, alive] : answers) {
    const Fault fault("kill", 1, error);
    EXPECT_EQ(alive, Process::isAlive(4711)) << std::strerror(error);
  }
}

TEST(ProcessIsAlive, KeepsErrno) {
  for (const int error : {0, ESRCH, EPERM}) {
    const Fault fault("kill", error == 0 ? 0 : 1, error);
    errno = ENOTTY;
    (void)Process::isAlive(::getpid());
    EXPECT_EQ(ENOTTY, errno);
  }
}

TEST(ProcessIsAlive, SendsNothing) {
  const Recording calls;
  EXPECT_TRUE(Process::isAlive(::getpid()));
  EXPECT_THAT(calls.own(), ElementsAre("kill other 0"));
}

TEST(ProcessIsAlive, IsTrueOfAProcessOfAnotherUser) {
  const pid_t child = ::fork();
  if (child == 0) {
    const bool changed = ::setuid(65534) == 0;
    ::_exit(!changed ? 2 : ::kill(1, 0) != 0 && errno == EPERM && Process::isAlive(1) ? 0 : 1);
  }
  int status = 0;
  ::waitpid(child, &status, 0);
  if (WEXITSTATUS(status) == 2) {
    GTEST_SKIP() << "skipped: cannot become another user here";
  }
  EXPECT_EQ(0, WEXITSTATUS(status));
}
