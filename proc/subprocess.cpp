#include "kovabackup/subprocess.h"

#include "common/log.h"
#include "kovabackup/signal.h"
#include "kovabackup/string_util.h"
#include "proc/subprocess_private.h"

#include <cstdarg>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup {
namespace {

constexpr char kModule[] = "proc/subprocess";
constexpr int kSetUpFailed = 127;

// Removes SA_NOCLDWAIT from SIGCHLD during its lifetime: with that flag no status of a child is
// kept for waitpid. A child that runs a command restores the flags itself, since it never reaches
// the destructor.
class WaitableChildren {
public:
  WaitableChildren() : changed_(signalHandlerRemoveFlags(SIGCHLD, SA_NOCLDWAIT, oldFlags_)) {}
  ~WaitableChildren() {
    if (changed_) {
      restore();
    }
  }
  WaitableChildren(const WaitableChildren &) = delete;
  WaitableChildren &operator=(const WaitableChildren &) = delete;

  explicit operator bool() const { return changed_; }
  void restore() const { (void)signalHandlerSetFlags(SIGCHLD, oldFlags_); } // logs its failure

private:
  int oldFlags_ = 0;
  bool changed_;
};

// Neither a failure nor an exception may return the child into the caller's code.
[[noreturn]] void runAndExit(const SubProcessPrivate &command) {
  try {
    (void)launchInChild(command);
  } catch (...) { // out of memory
  }
  ::_exit(kSetUpFailed);
}

// Runs in the intermediate process: forks the process that runs the command and exits, so that init
// becomes the parent of that process.
[[noreturn]] void forkAndExit(const SubProcessPrivate &command, const WaitableChildren &waitable,
                              bool newSession) {
  const pid_t child = ::fork();
  if (child < 0) {
    Log::error(kModule, 364, "fork failed, %m");
    ::_exit(kSetUpFailed);
  }
  if (child > 0) {
    ::_exit(0);
  }
  waitable.restore();
  if (newSession) {
    (void)::setsid(); // cannot fail: a new child is not a group leader
  }
  runAndExit(command);
}

bool exitedWithZero(pid_t child) {
  int status = 0;
  pid_t ended = -1;
  do {
    ended = ::waitpid(child, &status, 0);
  } while (ended == -1);
  return ended == child && WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

} // namespace

SubProcess::SubProcess(const char *program) : SubProcess(std::vector<std::string>{program}) {}

SubProcess::SubProcess(const std::string &program)
    : SubProcess(std::vector<std::string>{program}) {}

SubProcess::SubProcess(std::list<std::string> argv)
    : SubProcess(std::vector<std::string>(argv.begin(), argv.end())) {}

SubProcess::SubProcess(std::vector<std::string> argv)
    : private_(std::make_unique<SubProcessPrivate>()) {
  private_->args = std::move(argv);
}

SubProcess::~SubProcess() = default;

void SubProcess::addArg(const std::string &arg) {
  private_->args.push_back(arg);
}

void SubProcess::addArgList(const char *first, ...) {
  va_list rest;
  va_start(rest, first);
  for (const char *arg = first; arg != nullptr; arg = va_arg(rest, const char *)) {
    addArg(arg);
  }
  va_end(rest);
}

void SubProcess::addFormatArg(const char *format, ...) {
  va_list args;
  va_start(args, format);
  addArg(vstringf(format, args));
  va_end(args);
}

void SubProcess::setEnv(const std::string &name, const std::string &value) {
  private_->envs[name] = value;
}

void SubProcess::setStdOutput(const std::string &path, int mode) {
  private_->stdOut = {-1, path, mode};
}

void SubProcess::setStdOutput(int fd) {
  private_->stdOut = {fd, "", 0};
}

void SubProcess::setStdError(const std::string &path, int mode) {
  private_->stdErr = {-1, path, mode};
}

void SubProcess::setStdError(int fd) {
  private_->stdErr = {fd, "", 0};
}

std::string SubProcess::toString() const {
  std::string text;
  for (const std::string &arg : private_->args) {
    text += " " + arg;
  }
  return text.substr(1); // throws when there is no argument, which is deliberate
}

int SubProcess::call() const {
  const WaitableChildren waitable;
  if (!waitable) {
    Log::error(kModule, 321, "remove SA_RESTART failed, %m"); // the flag's wrong name is deliberate
    return -1;
  }
  const pid_t child = ::fork();
  if (child < 0) {
    Log::error(kModule, 331, "fork failed, %m");
    return -1;
  }
  if (child == 0) {
    waitable.restore();
    runAndExit(*private_);
  }
  return waitForChild(child);
}

bool SubProcess::callBackground(bool newSession) const {
  const WaitableChildren waitable;
  if (!waitable) {
    Log::error(kModule, 348, "remove SA_RESTART failed, %m"); // the flag's wrong name is deliberate
    return true;                                              // deliberate, too
  }
  const pid_t child = ::fork();
  if (child < 0) {
    Log::error(kModule, 358, "fork failed, %m");
    return false;
  }
  if (child == 0) {
    forkAndExit(*private_, waitable, newSession);
  }
  return exitedWithZero(child);
}

bool SubProcess::exec() const {
  return launchInChild(*private_);
}

} // namespace KOVA::Backup
