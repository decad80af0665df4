// From fork to execv. The process is the child of a caller that may have threads; a lock that one
// of them held at the fork stays held here forever. For exec it is the caller itself. Only the
// following may run here, in this order:
//
//     chdir                             to "/"
//     getenv, clearenv, setenv          PATH and the command's variables
//     open, dup2                        /dev/null, descriptor 0
//     open, fchmod, dup2, close         descriptors 1 and 2
//     opendir, readdir, dirfd,
//         strtol, close, close_range,
//         closedir                      the other descriptors
//     calloc                            the argument vector
//     syslog                            what is launched, and a step that failed
//     execv
//     free, close                       when execv has returned
//
// Add nothing to this list. Apart from it only the copy of PATH allocates. The copy is made here
// and not before the fork because exec reads PATH after chdir, too, and because making it earlier
// would not be safer: setenv allocates in any case. The argument vector and the log lines look as
// if they could be made before the fork. They cannot, because their failures are the child's: it
// logs them under its pid and reports them to the caller by exit code 127.

#include "base/unique_fd.h"
#include "common/log.h"
#include "proc/subprocess_private.h"

#include <algorithm>
#include <cstdlib>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <optional>
#include <sys/stat.h>
#include <sys/syscall.h>
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
    std::optional<std::string> path; // a copy: clearenv discards the value itself
    if (const char *value = ::getenv("PATH")) {
      path = value;
    }
    (void)::clearenv();
    if (path) {
      (void)::setenv("PATH", path->c_str(), 1);
    }
  }
  for (const auto &[name, value] : command.envs) {
    (void)::setenv(name.c_str(), value.c_str(), 1); // an invalid name is left out
  }
}

bool duplicateOnto(int target, int fd) {
  if (::dup2(fd, target) < 0) {
    Log::error(kModule, 159, "dup2(%d) failed, %m", target);
    return false;
  }
  return true;
}

// Handles a descriptor that is its own target. dup2 onto itself changes nothing, so a descriptor
// marked close-on-exec would be missing in the command; a copy of a copy is not marked. The first
// copy is made on spare, which is then set to /dev/null again by a copy of descriptor 0.
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
  // Not close-on-exec: when descriptor 1 or 2 was closed, this may be the target itself.
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

// Closes all descriptors except 0 to 2 and that of the list, which it is given in ascending order.
//
// Listing a descriptor costs the kernel several times as much as closing it, and numbers are mostly
// in use without gaps. Therefore each run of numbers is closed to its end before the kernel lists
// it, and the list only says where the next run begins. A process that has many descriptors is
// spared a call for each of them where the kernel has close_range(2) and no filter refuses it.
class Sweep {
public:
  explicit Sweep(int list) : list_(list) { closeRun(STDERR_FILENO + 1); }

  // Closes fd and those after it, up to the first number that is not open.
  void closeRun(int fd) {
    if (fd < next_) {
      return; // closed already, or a standard stream
    }
    for (next_ = fd; next_ == list_ || ::close(next_) == 0;) {
      ++next_;
      if (++closed_ == kMany && closeRest()) {
        return;
      }
    }
  }

private:
  static constexpr int kMany = 256;

  bool closeRest() const {
    return (next_ >= list_ || closeRange(next_, static_cast<unsigned>(list_) - 1)) &&
           closeRange(std::max(next_, list_ + 1), ~0U);
  }

  static bool closeRange(int first, unsigned last) {
    return ::syscall(SYS_close_range, static_cast<unsigned>(first), last, 0U) == 0;
  }

  int list_;
  int next_ = STDERR_FILENO + 1; // all below are closed
  int closed_ = 0;
};

// Closes all descriptors except 0 to 2, as the list of open descriptors names them: a limit of a
// million then costs nothing, and a limit lowered after a descriptor was opened hides none. The
// kernel lists them in ascending order, so closing during the walk skips none.
// Returns: false when there is no list. Nothing is closed then, deliberately without a failure.
bool closeInherited() {
  const std::unique_ptr<DIR, CloseDir> list(::opendir("/proc/self/fd"));
  if (!list) {
    return false;
  }
  Sweep sweep(::dirfd(list.get()));
  while (const dirent *entry = ::readdir(list.get())) {
    if (entry->d_name[0] != '.') {
      sweep.closeRun(static_cast<int>(std::strtol(entry->d_name, nullptr, 10)));
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
    argv.get()[i] = const_cast<char *>(args[i].c_str()); // execv's type; it does not write to them
    Log::debug(kModule, 250, "arg[%d] = [%s]", static_cast<int>(i), args[i].c_str());
  }
  const char *program = args.empty() ? "" : args.front().c_str();
  (void)::execv(program, argv.get());
  Log::error(kModule, 256, "execv [%s] failed, %m", program);
}

} // namespace

bool launchInChild(const SubProcessPrivate &command) {
  (void)!::chdir("/"); // frees the caller's directory; a failure does not matter
  setUpEnvironment(command);
  // Not close-on-exec: when descriptor 0 was closed, this is descriptor 0 itself.
  Base::UniqueFd null(::open("/dev/null", O_RDWR));
  if (!null) {
    Log::error(kModule, 213, "open /dev/null failed, %m");
    return false;
  }
  if (::dup2(null.get(), STDIN_FILENO) < 0) {
    Log::error(kModule, 222, "dup2 %d failed, %m", STDIN_FILENO);
    return false;
  }
  // When descriptor 1 or 2 was closed, null may be that descriptor, which a redirection replaces.
  // Descriptor 0 is /dev/null as well.
  const int source = null.get() > STDERR_FILENO ? null.get() : STDIN_FILENO;
  if (!redirectStream(STDOUT_FILENO, command.stdOut, source) ||
      !redirectStream(STDERR_FILENO, command.stdErr, source)) {
    return false;
  }
  if (closeInherited() && null.get() > STDERR_FILENO) {
    (void)null.release(); // closed already; the number may become another file's
  }
  execCommand(command.args);
  return false;
}

} // namespace KOVA::Backup
