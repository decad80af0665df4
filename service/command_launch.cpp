#include "service/command_launch.h"

#include "base/log_line.h"
#include "base/retry_on_eintr.h"
#include "service/failed.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <limits>
#include <poll.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

using Base::retryOnEintr;
using Base::UniqueFd;
namespace Log = Base::Log;

constexpr char kModule[] = "service/command";

// execve(2)'s two lists, and the texts that they point to.
class Texts {
public:
  explicit Texts(std::vector<std::string> texts) : texts_(std::move(texts)) {
    for (std::string &text : texts_) {
      pointers_.push_back(text.data());
    }
    pointers_.push_back(nullptr);
  }

  char *const *data() const { return pointers_.data(); }

private:
  std::vector<std::string> texts_;
  std::vector<char *> pointers_;
};

bool isName(const std::string &name) {
  return !name.empty() && name.find('=') == std::string::npos;
}

std::vector<std::string> environmentOf(const CommandPrivate &command) {
  std::vector<std::string> environment;
  const char *path = std::getenv("PATH");
  const bool given = command.envs.count("PATH") != 0;
  if (path != nullptr && !given) {
    environment.push_back(std::string("PATH=") + path);
  }
  for (const auto &[name, value] : command.envs) {
    if (isName(name)) {
      environment.push_back(name);
      environment.back().append("=").append(value);
    }
  }
  return environment;
}

std::vector<PassedFd> passedOf(const CommandPrivate &command) {
  std::vector<PassedFd> passed;
  for (const auto &[target, source] : command.passed) {
    passed.push_back({source, target});
  }
  return passed;
}

// No signal handler may run in a child that shares our memory. Cancellation of threads is a signal
// that cannot be blocked, and would leave the child without an owner.
class Undisturbed {
public:
  Undisturbed() {
    (void)::pthread_setcancelstate(PTHREAD_CANCEL_DISABLE, &cancelState_);
    sigset_t all;
    ::sigfillset(&all);
    error_ = ::pthread_sigmask(SIG_SETMASK, &all, &mask_);
  }
  ~Undisturbed() {
    if (error_ == 0) {
      (void)::pthread_sigmask(SIG_SETMASK, &mask_, nullptr);
    }
    (void)::pthread_setcancelstate(cancelState_, nullptr);
  }
  Undisturbed(const Undisturbed &) = delete;
  Undisturbed &operator=(const Undisturbed &) = delete;

  int error() const { return error_; }

private:
  sigset_t mask_{};
  int cancelState_ = 0;
  int error_ = 0;
};

bool createUndisturbed(ChildPlan &plan, Child &child, Error &error) {
  const Undisturbed undisturbed;
  if (undisturbed.error() != 0) {
    errno = undisturbed.error();
    return failed(error, "pthread_sigmask");
  }
  return createChild(plan, child, error);
}

enum class Report { Executed, Failed, Unreadable };

// A child that shared our memory has sent what it sends, so the pipe is not waited for: another
// process that was forked meanwhile might hold its other end. Any other child is waited for.
Report readReport(int fd, bool sharedMemory, ChildFailure &failure) {
  if (!sharedMemory) {
    struct pollfd readable = {fd, POLLIN, 0};
    (void)retryOnEintr([&] { return ::poll(&readable, 1, -1); });
  }
  const ssize_t size = retryOnEintr([&] { return ::read(fd, &failure, sizeof failure); });
  if (size == static_cast<ssize_t>(sizeof failure)) {
    return Report::Failed;
  }
  return size == 0 || (size < 0 && errno == EAGAIN) ? Report::Executed : Report::Unreadable;
}

void describe(const ChildFailure &failure, const CommandPrivate &command, Error &error) {
  error.code = failure.code;
  error.step = kChildStepNames.at(static_cast<std::size_t>(failure.step));
  if (failure.step == ChildStep::Execve) {
    error.path = command.program();
  } else if (failure.fd >= 0) {
    error.path = std::to_string(failure.fd);
  }
}

// Callers who know a shell expect that a name alone is enough. errno stays as it is.
const char *adviceFor(const ChildFailure &failure, const CommandPrivate &command) {
  const bool isName =
      failure.step == ChildStep::Execve && failure.code == ENOENT && *command.program() != '/';
  return isName ? "; PATH is not searched: give an absolute path" : "";
}

void killAndReap(const Child &child) {
  const Base::ErrnoGuard guard;
  // Whatever refuses the call, reaping would wait for the program.
  if (!sendTo(child, SIGKILL) && isUnreaped(child)) {
    (void)::kill(child.pid, SIGKILL);
  }
  reapQuietly(child);
}

bool learnOutcome(const CommandPrivate &command, int reportFd, const ChildPlan &plan,
                  const Child &child, Error &error) {
  ChildFailure failure = {};
  const Report report = readReport(reportFd, plan.sharesMemory, failure);
  if (report == Report::Executed) {
    return true;
  }
  if (report == Report::Unreadable) {
    killAndReap(child);
    (void)failed(error, "read");
    logNotStarted(command, error);
    return false;
  }
  reapQuietly(child);
  describe(failure, command, error);
  errno = error.code;
  const char *advice = adviceFor(failure, command);
  Log::error(kModule, 102, "[%s] was not executed: %s [%s] failed, %m%s", command.program(),
             error.step.c_str(), error.path.c_str(), advice);
  return false;
}

bool checkDescription(const CommandPrivate &command, Error &error) {
  errno = EINVAL;
  if (command.args.empty()) {
    return failed(error, "execve");
  }
  if (command.passed.empty()) {
    return true;
  }
  const auto &lowest = *command.passed.begin();
  const auto &highest = *command.passed.rbegin();
  if (lowest.first <= STDERR_FILENO) {
    return failed(error, "dup2", std::to_string(lowest.second));
  }
  // The child moves descriptors above the highest number.
  if (highest.first == std::numeric_limits<int>::max()) {
    return failed(error, "dup2", std::to_string(highest.second));
  }
  return true;
}

} // namespace

void logNotStarted(const CommandPrivate &command, const Error &error) {
  errno = error.code;
  Log::error(kModule, 101, "[%s] was not started: %s [%s] failed, %m", command.program(),
             error.step.c_str(), error.path.c_str());
}

bool isUnreaped(const Child &child) noexcept {
  siginfo_t ignored;
  const auto pidfd = static_cast<id_t>(child.pidfd.get());
  return retryOnEintr(
             [&] { return ::waitid(P_PIDFD, pidfd, &ignored, WEXITED | WNOHANG | WNOWAIT); }) == 0;
}

// A pidfd cannot be another process's. Not every filter of system calls, and not every version of
// valgrind, lets this call pass; filters also report EPERM, which kill then confirms or not.
bool sendTo(const Child &child, int sig) noexcept {
  return ::syscall(SYS_pidfd_send_signal, child.pidfd.get(), sig, nullptr, 0U) == 0 ||
         ((errno == ENOSYS || errno == EPERM) && isUnreaped(child) && ::kill(child.pid, sig) == 0);
}

void reapQuietly(const Child &child) {
  siginfo_t ignored;
  (void)retryOnEintr(
      [&] { return ::waitid(P_PIDFD, static_cast<id_t>(child.pidfd.get()), &ignored, WEXITED); });
}

bool launch(const CommandPrivate &command, const Streams &streams, Child &child, Error &error) {
  UniqueFd reportRead;
  UniqueFd reportWrite;
  if (!checkDescription(command, error) || !openReadPipe(reportRead, reportWrite, error)) {
    logNotStarted(command, error);
    return false;
  }
  const Texts arguments(command.args);
  const Texts environment(environmentOf(command));
  std::vector<PassedFd> passed = passedOf(command);
  ChildPlan plan;
  plan.program = command.program();
  plan.argv = arguments.data();
  plan.envp = environment.data();
  plan.standard = streams.standard;
  plan.passed = passed.data();
  plan.passedCount = passed.size();
  plan.report = reportWrite.get();
  plan.ownGroup = command.ownGroup;
  plan.diesWithUs = command.diesWithUs;
  plan.parent = ::getpid();
  if (!createUndisturbed(plan, child, error)) {
    logNotStarted(command, error);
    return false;
  }
  reportWrite.reset();
  return learnOutcome(command, reportRead.get(), plan, child, error);
}

} // namespace KOVA::Backup::Service
