#ifndef KOVABACKUP_SUBPROCESS_H
#define KOVABACKUP_SUBPROCESS_H

/// @file Child commands with a clean environment, known standard streams and no stray descriptors.
///
///     SubProcess tar("/bin/tar");                          // a path: PATH is not searched
///     tar.addFormatArg("--label=%s-%03d", task, run);
///     tar.addArgList("-cf", archive.c_str(), "etc/hostname", nullptr);
///     tar.setEnv("LC_ALL", "C");
///     tar.setStdError("/var/log/backup/tar.log", 0640);    // appended to; output to /dev/null
///     const int status = tar.call();
///     if (status == -1) return false;                      // not started; logged
///     return WIFEXITED(status) && WEXITSTATUS(status) == 0;
///
/// A command is described, amended and then run any number of times, in one of three ways: call
/// waits for it, callBackground leaves it to itself, exec turns the calling process into it.
///
/// In the child, in this order, the launcher
///     changes to "/" (and goes on if that fails);
///     empties the environment but for PATH, if there is one, then sets the command's variables in
///         the order of their names (a PATH among them wins);
///     connects descriptor 0 to /dev/null;
///     connects descriptor 1, then 2, as described or to /dev/null: by dup2(2) from a descriptor;
///         or by opening a file for reading and appending, created with mode 0600 (less the
///         umask), and setting its mode by fchmod(2) if one is given;
///     closes every other descriptor that is open, and none that is not, whatever the limit is;
///     writes the command to the system log, at LOG_DEBUG;
///     calls execv(2).
/// Signal mask, ignored signals, umask, limits, user and groups are the caller's. The process group
/// and session are, too, except for callBackground(true).
///
/// Redirections are made one after the other. So setStdError(1) sends errors wherever output went,
/// setStdOutput(2) with setStdError(1) is no exchange, and setStdOutput(0) is /dev/null. A
/// descriptor that is its own target stays open in the command even if marked close-on-exec.
///
/// A caller whose own descriptors 0, 1 or 2 are closed gets the same, with two exceptions: the mark
/// close-on-exec of a descriptor that is its own target then counts, and a system log's socket that
/// was opened in one of these places takes the command's stream away. Such a caller opens /dev/null
/// there before it first logs.
///
/// A step that fails in the child is logged there (LOG_ERR) and ends the child with code 127;
/// memory that runs out before the argument vector is made ends it so without a line. The command's
/// own 127 looks the same; the log tells: "proc/subprocess:256 execv [...] failed" and its like are
/// ours.
///
/// Failure:   by return value; nothing is thrown but std::bad_alloc, and std::out_of_range by
///            toString.
/// errno:     not meaningful.
/// Log:       under the module path "proc/subprocess"; before 321 and 348 a line of "proc/signal".
///            In the child 213 /dev/null, 222 and 159 dup2, 140 and 146 a file for output, 238
///            memory, 256 execv; 247 and 250, at LOG_DEBUG, the command.
/// Threads:   one thread per object. One call at a time in a process, and no UtilExec::Execv
///            meanwhile: the actions of SIGTERM and SIGCHLD and the child to forward to belong to
///            the whole process. Other threads may run, but the child's steps use setenv(3),
///            opendir(3) and syslog(3): a thread that at the moment of the fork is inside one of
///            them may leave its lock held in the child for ever, and call waits with it. Allocated
///            memory is safe with glibc. Programs with such threads start their commands before
///            them or through a helper process.
/// Process:   while a child is started and awaited SIGCHLD is without SA_NOCLDWAIT, during call
///            SIGTERM has another handler; both are put back on every way out. Meanwhile the host
///            must not ignore SIGCHLD (SIG_IGN) and must not reap our child, as wait(2) or
///            waitpid(2) for -1 would do: call and callBackground would then ask for the child for
///            ever, without sleeping. No child is reaped but our own.

#include <list>
#include <memory>
#include <string>
#include <vector>

namespace KOVA {
namespace Backup {
struct SubProcessPrivate; // stands before the pragma: it is not exported
}
} // namespace KOVA

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// One command: arguments, additional variables, and where output and errors go. Nothing given is
/// checked before the command runs.
///
/// Ownership: the object owns copies of all texts. Descriptors stay the caller's; they are needed
///            when the command is run and are never closed in the caller, except by exec.
class SubProcess {
public:
  // Conversions on purpose: a path stands for the command without arguments.
  // NOLINTBEGIN(google-explicit-constructor): part of the interface

  /// A command of its path alone. program is not null.
  SubProcess(const char *program);
  SubProcess(const std::string &program);

  /// A command of its whole argument vector, path first. An empty one is accepted; it cannot be
  /// executed (call gives exit code 127) and has no text.
  SubProcess(std::list<std::string> argv);
  SubProcess(std::vector<std::string> argv);

  // NOLINTEND(google-explicit-constructor)

  ~SubProcess();

  SubProcess(const SubProcess &) = delete;
  SubProcess &operator=(const SubProcess &) = delete;

  /// Appends an argument as it stands; a NUL byte ends it for the command.
  void addArg(const std::string &arg);

  /// Appends each argument up to a null pointer, which must be there.
  ///     addArgList("-x", "-y", nullptr) appends two; addArgList(nullptr) appends none
#if defined(__clang__)
  void addArgList(const char *first, ...) __attribute__((sentinel(0, 1)));
#else
  void addArgList(const char *first, ...); // g++'s sentinel would refuse the second example
#endif

  /// Appends one argument, formatted as by printf(3); blanks do not split it.
  void addFormatArg(const char *format, ...) __attribute__((format(printf, 2, 3)));

  /// Sets a variable for the command; the last value of a name counts. A name that setenv(3)
  /// refuses is left out without a message.
  void setEnv(const std::string &name, const std::string &value);

  /// Sends standard output to a file, which is created if need be and appended to. A relative path
  /// is one below "/". The last of all setStdOutput counts, whole.
  /// Units: mode holds permission bits that the file gets whatever the umask is; 0 keeps those of
  ///        an existing file and 0600 less the umask of a new one.
  void setStdOutput(const std::string &path, int mode);

  /// Sends standard output to an open descriptor; -1 to /dev/null, as in the beginning. One that is
  /// not open when the command runs ends the child with 127, unless it has the first free number:
  /// that is /dev/null's in the child.
  void setStdOutput(int fd);

  /// setStdOutput for standard error.
  void setStdError(const std::string &path, int mode);
  void setStdError(int fd);

  /// The arguments with single spaces between them, for messages: not quoted, so it cannot be
  /// split again, and without variables and redirections.
  ///     {"/bin/tar", "-cf", "a b.tar"} gives "/bin/tar -cf a b.tar"
  /// Errors: std::out_of_range ("basic_string::substr...") for a command without arguments.
  std::string toString() const;

  /// Runs the command and waits for it. A SIGTERM that the caller receives meanwhile is sent on to
  /// the command, once for each that arrives and again whenever another signal interrupts the wait;
  /// that the command ends is up to the command.
  /// Returns: the wait status, for WIFEXITED and its like; -1 when the command could not be started
  ///          or waited for. Set-up or execv failed in the child: exit code 127.
  /// Errors:  SIGCHLD's flags cannot be changed; fork fails; SIGTERM's handler cannot be set: the
  ///          command then runs and is left to the caller to reap.
  /// Log:     LOG_ERR for each of these, 321, 331 and 285; 291 for a handler of SIGTERM that could
  ///          not be put back, the result is the status all the same; in the child the step.
  /// Blocks:  until the command ends, without limit, also while it is stopped; what it started and
  ///          left behind is not waited for, whatever descriptors that holds.
  /// Signals: the handler that the caller had for SIGTERM still runs, before the signal is sent on,
  ///          without the mask and flags that it was set with; one set with SA_SIGINFO is given a
  ///          siginfo_t that tells the number only. SIG_IGN and SIG_DFL are not called: during call
  ///          a SIGTERM ends nobody but the command. The wait begins when the handler is set. A
  ///          SIGTERM from then on is sent on however short before waitpid(2) it comes; an earlier
  ///          one meets the caller's action. The child has the caller's handlers until execv.
  int call() const;

  /// Starts the command as no child of ours and returns at once: its parent is init, or the nearest
  /// subreaper. With newSession it leads a session of its own.
  /// Returns: true when the command's process was forked; what becomes of it is not reported, nor
  ///          whether it can be executed. Deliberately true also when SIGCHLD's flags could not be
  ///          changed, though nothing was started then.
  /// Errors:  fork fails, here or in the process between.
  /// Log:     LOG_ERR: 348 SIGCHLD's flags, 358 and 364 fork; in the child the step that failed.
  /// Blocks:  until the process between has forked and ended.
  bool callBackground(bool newSession) const;

  /// Turns the calling process into the command. Meant for a process that was forked for that:
  /// Returns: only when a step failed, then false. The process is left changed as far as the steps
  ///          went: working directory, environment, descriptors 0 to 2, all others closed.
  /// Log:     LOG_ERR for the step that failed.
  /// Signals: none is touched.
  bool exec() const;

private:
  std::unique_ptr<SubProcessPrivate> private_;
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
