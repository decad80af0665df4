#ifndef KOVABACKUP_TESTS_SERVICE_LOCK_SUPPORT_H
#define KOVABACKUP_TESTS_SERVICE_LOCK_SUPPORT_H

/// @file Other processes that hold locks, and the lock files.

#include "kovabackup/service/run_lock.h"

#include "base/unique_fd.h"
#include "tests/service/expect_error.h"
#include "tests/support/child_process.h"
#include "tests/support/files.h"
#include "tests/support/waits_for_flock.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <functional>
#include <gmock/gmock.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest {

using KOVA::Backup::Service::LockHolder;
using KOVA::Backup::Service::LockUser;
using KOVA::Backup::Service::Millis;
using KOVA::Backup::Service::RunLock;

inline const std::string kLockFolder = "/tmp/kovabackup/lock";
inline const std::string kLockFile = kLockFolder + "/run";

/// A pipe whose ends are closed when they are destroyed.
struct Pipe {
  Pipe() {
    int ends[2] = {-1, -1};
    EXPECT_EQ(0, ::pipe2(ends, O_CLOEXEC));
    out.reset(ends[0]);
    in.reset(ends[1]);
  }
  /// Waits until a byte has come or all writers have ended. Returns: whether it was a byte.
  bool wait() const {
    char byte = 0;
    return ::read(out.get(), &byte, 1) == 1;
  }
  bool send() const { return ::write(in.get(), "y", 1) == 1; }

  KOVA::Base::UniqueFd out;
  KOVA::Base::UniqueFd in;
};

/// A forked process that begins with some work, which returns whether it succeeded, and then waits
/// for end or kill.
class OtherProcess {
public:
  explicit OtherProcess(const std::function<bool()> &begin) {
    pid_ = ::fork();
    if (pid_ == 0) {
      (void)::prctl(PR_SET_PDEATHSIG, SIGKILL);
      goOn_.in.reset();
      const bool begun = begin() && begun_.send();
      (void)goOn_.wait();
      ::_exit(begun && !testing::Test::HasFailure() ? 0 : 1);
    }
    begun_.in.reset();
    goOn_.out.reset();
  }
  ~OtherProcess() {
    if (pid_ > 0) {
      EXPECT_EQ(0, end());
    }
  }
  OtherProcess(const OtherProcess &) = delete;
  OtherProcess &operator=(const OtherProcess &) = delete;

  pid_t pid() const { return pid_; }
  /// Waits for the end of its first work. Returns: whether that succeeded.
  bool begun() const { return begun_.wait(); }
  /// Returns: the exit status, -1 after a signal.
  int end() {
    goOn_.in.reset();
    return reap();
  }
  void kill() {
    EXPECT_EQ(0, ::kill(pid_, SIGKILL));
    EXPECT_EQ(-1, reap());
  }

private:
  int reap() {
    int status = -1;
    EXPECT_EQ(pid_, ::waitpid(pid_, &status, 0));
    pid_ = -1;
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  Pipe begun_;
  Pipe goOn_;
  pid_t pid_ = -1;
};

/// Waits until the process waits for an flock.
inline void awaitWaiting(pid_t pid) {
  while (!waitsForFlock(pid)) {
    ASSERT_EQ(0, ::waitpid(pid, nullptr, WNOHANG)) << "it has ended";
    ::sched_yield();
  }
}

inline bool take(RunLock &lock, Millis limit = Millis(0)) {
  Error error;
  return lock.take(error, limit);
}

/// Whether the lock of that name can be taken now.
inline bool isFree(const std::string &name) {
  RunLock lock(name);
  return take(lock);
}

/// The holder of a lock that is held.
inline LockHolder holderOf(const std::string &name) {
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder(name, holder));
  return holder;
}

inline auto isUser(pid_t pid, bool waits, const std::string &command) {
  return testing::AllOf(testing::Field(&LockUser::pid, pid),
                        testing::Field(&LockUser::waits, waits),
                        testing::Field(&LockUser::command, command));
}

} // namespace KovaTest

#endif
