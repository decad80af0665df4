// The way from fork to execv. The process may be the child of a threaded caller, where other
// threads' locks are held for ever, or for exec the caller itself. What may run here, in order:
//
//     chdir                             to "/"
//     getenv, clearenv, setenv          PATH and the command's variables
//     open, dup2                        /dev/null, descriptor 0
//     open, fchmod, dup2, close         descriptors 1 and 2
//     opendir, readdir, dirfd,
//         strtol, close, closedir       the other descriptors
//     calloc                            the argument vector
//     syslog                            what is launched, and a step that failed
//     execv
//     free, close                       when it returned
//
// Add nothing to it. Besides these only the copy of PATH allocates; it is made here and not before
// the fork because exec, too, reads PATH after chdir, and because a caller's memory is no safer for
// it: setenv allocates anyway. The argument vector and the log lines look as if they could be made
// before the fork. They cannot: their failures are the child's, logged under its pid and told to
// the caller by exit code 127.

#include "base/unique_fd.h"
#include "common/log.h"
#include "proc/subprocess_private.h"

#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup {
namespace {

constexpr char kModule[] = "proc/subprocess";

struct CloseDir {
  void operator()(DIR *dir) const { (void)::closedir(dir); }
};

struct Free {
  void operator()(void *memory) const { std::free(memory); }
};

void setUpEnvironment(const SubProcessPrivate &command) {
  if (command.clearEnv) {
    std::optional<std::string> path; // a copy: the value lies in what clearenv throws away
    if (const char *value = ::getenv("PATH")) {
      path = value;
    }
    (void)::clearenv();
    if (path) {
      (void)::setenv("PATH", path->c_str(), 1);
    }
  }
  for (const auto &[name, value] : command.envs) {
    (void)::setenv(name.c_str(), value.c_str(), 1); // a name that is none is left out
  }
}

bool duplicateOnto(int target, int fd) {
  if (::dup2(fd, target) < 0) {
    Log::error(kModule, 159, "dup2(%d) failed, %m", target);
    return false;
  }
  return true;
}

// A descriptor that is its own target. dup2 leaves it as it is, so that one marked close-on-exec
// would be missing in the command; a copy of a copy carries no mark. The detour goes over spare,
// which is /dev/null again afterwards, as descriptor 0 is.
bool duplicateOntoItself(int target, int spare) {
  if (spare <= STDERR_FILENO) {
    return duplicateOnto(target, target);
  }
  if (::dup2(target, spare) < 0 || ::dup2(spare, target) < 0 || ::dup2(STDIN_FILENO, spare) < 0) {
    Log::error(kModule, 159, "dup2(%d) failed, %m", target);
    return false;
  }
  return true;
}

bool redirectToFile(int target, const StdRedirect &redirect) {
  // Not close-on-exec: in a process without descriptor 1 or 2 this may be the target already.
  Base::UniqueFd file(::open(redirect.path.c_str(), O_RDWR | O_CREAT | O_APPEND, 0600));
  if (!file) {
    Log::error(kModule, 140, "open [%s] failed, %m", redirect.path.c_str());
    return false;
  }
  if (redirect.mode != 0 && ::fchmod(file.get(), static_cast<mode_t>(redirect.mode)) != 0) {
    Log::error(kModule, 146, "fchmod failed, %m");
    return false;
  }
  const bool duplicated = duplicateOnto(target, file.get());
  if (file.get() == target) {
    (void)file.release();
  }
  return duplicated;
}

bool redirectStream(int target, const StdRedirect &redirect, int null) {
  if (redirect.fd >= 0) {
    return redirect.fd == target ? duplicateOntoItself(target, null)
                                 : duplicateOnto(target, redirect.fd);
  }
  return redirect.path.empty() ? duplicateOnto(target, null) : redirectToFile(target, redirect);
}

// Closes all but 0 to 2, by the list of those that are open: a limit of a million costs nothing,
// and one that was lowered after a descriptor was opened hides none. The kernel lists by number, so
// closing on the way skips none.
// Returns: false when there is no list; nothing is closed then, which is deliberately no failure.
bool closeInherited() {
  const std::unique_ptr<DIR, CloseDir> list(::opendir("/proc/self/fd"));
  if (!list) {
    return false;
  }
  const int own = ::dirfd(list.get());
  while (const dirent *entry = ::readdir(list.get())) {
    if (entry->d_name[0] == '.') {
      continue;
    }
    const int fd = static_cast<int>(std::strtol(entry->d_name, nullptr, 10));
    if (fd > STDERR_FILENO && fd != own) {
      (void)::close(fd);
    }
  }
  return true;
}

void execCommand(const std::vector<std::string> &args) {
  const std::unique_ptr<char *, Free> argv(
      static_cast<char **>(std::calloc(args.size() + 1, sizeof(char *))));
  if (!argv) {
    Log::error(kModule, 238, "calloc failed, %m");
    return;
  }
  Log::debug(kModule, 247, "launch command:");
  for (std::size_t i = 0; i < args.size(); ++i) {
    argv.get()[i] = const_cast<char *>(args[i].c_str()); // execv takes them so and writes nothing
    Log::debug(kModule, 250, "arg[%d] = [%s]", static_cast<int>(i), args[i].c_str());
  }
  const char *program = args.empty() ? "" : args.front().c_str();
  (void)::execv(program, argv.get());
  Log::error(kModule, 256, "execv [%s] failed, %m", program);
}

} // namespace

bool launchInChild(const SubProcessPrivate &command) {
  (void)::chdir("/"); // else the command would hold the caller's directory; no reason not to run it
  setUpEnvironment(command);
  // Not close-on-exec: in a process without descriptor 0 this is descriptor 0.
  Base::UniqueFd null(::open("/dev/null", O_RDWR));
  if (!null) {
    Log::error(kModule, 213, "open /dev/null failed, %m");
    return false;
  }
  if (::dup2(null.get(), STDIN_FILENO) < 0) {
    Log::error(kModule, 222, "dup2 %d failed, %m", STDIN_FILENO);
    return false;
  }
  // In a process without descriptor 1 or 2, null may lie there and be replaced by the first
  // redirection; 0 is /dev/null as well.
  const int source = null.get() > STDERR_FILENO ? null.get() : STDIN_FILENO;
  if (!redirectStream(STDOUT_FILENO, command.stdOut, source) ||
      !redirectStream(STDERR_FILENO, command.stdErr, source)) {
    return false;
  }
  if (closeInherited() && null.get() > STDERR_FILENO) {
    (void)null.release(); // closed; by the end the number may be another file's
  }
  execCommand(command.args);
  return false;
}

} // namespace KOVA::Backup
