#ifndef KOVABACKUP_TESTS_LEASE_H
#define KOVABACKUP_TESTS_LEASE_H

/// @file Another process that has a lease on a file and releases it on request.

#include <csignal>
#include <fcntl.h>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest {

///     LeaseHolder holder(path);
///     if (!holder.held()) GTEST_SKIP() << "skipped: no leases on this file system";
///     ... open the file ...
///     EXPECT_TRUE(holder.wasAsked());
class LeaseHolder {
public:
  explicit LeaseHolder(const std::string &path) {
    int ends[2] = {-1, -1};
    if (::pipe2(ends, O_CLOEXEC) != 0) {
      return;
    }
    child_ = ::fork();
    if (child_ == 0) {
      ::_exit(hold(path, ends[1]) ? 0 : 1);
    }
    ::close(ends[1]);
    char answer = 'n';
    held_ = ::read(ends[0], &answer, 1) == 1 && answer == 'y';
    ::close(ends[0]);
  }
  ~LeaseHolder() {
    if (child_ > 0) {
      ::kill(child_, SIGKILL);
      ::waitpid(child_, nullptr, 0);
    }
  }
  LeaseHolder(const LeaseHolder &) = delete;
  LeaseHolder &operator=(const LeaseHolder &) = delete;

  bool held() const { return held_; }

  /// Waits until the lease is released. Returns: whether a process requested that.
  bool wasAsked() {
    int status = -1;
    const pid_t ended = ::waitpid(child_, &status, 0);
    child_ = -1;
    return ended > 0 && WIFEXITED(status) && WEXITSTATUS(status) == 0;
  }

private:
  static bool hold(const std::string &path, int out) {
    sigset_t asked;
    ::sigemptyset(&asked);
    ::sigaddset(&asked, SIGIO);
    ::sigprocmask(SIG_BLOCK, &asked, nullptr);
    const int fd = ::open(path.c_str(), O_RDWR | O_CLOEXEC);
    const char answer = ::fcntl(fd, F_SETLEASE, F_WRLCK) == 0 ? 'y' : 'n';
    int signal = 0;
    return ::write(out, &answer, 1) == 1 && answer == 'y' && ::sigwait(&asked, &signal) == 0 &&
           ::fcntl(fd, F_SETLEASE, F_UNLCK) == 0;
  }

  pid_t child_ = -1;
  bool held_ = false;
};

} // namespace KovaTest

#endif
