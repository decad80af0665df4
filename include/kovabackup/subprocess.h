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
///     if (status == -1) return false;                      // not started, logged
///     return WIFEXITED(status) && WEXITSTATUS(status) == 0;
///
/// A SubProcess describes a command. The description can be amended and run any number of times, in
/// three ways: call waits for the command, callBackground detaches it, and exec replaces the
/// calling process with it.
///
/// The child performs these steps, in this order:
///     changes to "/" (a failure is ignored);
///     clears the environment except for PATH, if it is set, then sets the command's variables in
///         the order of their names (a PATH among them takes precedence);
///     connects descriptor 0 to /dev/null;
///     connects descriptor 1, then 2, as described, or to /dev/null: by dup2(2) from a descriptor;
///         or by opening a file for reading and appending, creating it with mode 0600 (less the
///         umask), and setting its mode by fchmod(2) if one is given;
///     closes every other open descriptor, whatever the limit on open files is;
///     writes the command to the system log, at LOG_DEBUG;
///     calls execv(2).
/// The signal mask, ignored signals, umask, limits, user and groups are the caller's. So are the
/// process group and the session, except after callBackground(true).
///
/// Redirections are made one after the other: output first, then errors. So setStdError(1) sends
/// errors wherever output goes, setStdOutput(2) with setStdError(1) does not exchange the two, and
/// setStdOutput(0) means /dev/null. A descriptor that is its own target stays open in the command,
/// even if it is close-on-exec.
///
/// A caller that has closed its own descriptors 0, 1 or 2 gets the same result, with two
/// exceptions. First, the close-on-exec flag of a descriptor that is its own target then takes
/// effect. Second, if the socket of the system log was opened under one of these numbers, the
/// command loses that stream. Such a caller opens /dev/null under the free numbers before it first
/// logs.
///
/// A step that fails in the child is logged there (LOG_ERR) and ends the child with exit code 127.
/// If memory runs out before the argument vector is built, the child exits with 127 without a log
/// line; but a variable that it can no longer hold is left out silently. A command that itself
/// exits with 127 has the same status; the log distinguishes them, because only a failed step
/// writes a line such as "proc/subprocess:256 execv [...] failed".
///
/// Failure:   by return value; only std::bad_alloc is thrown, and std::out_of_range by toString.
/// errno:     not meaningful.
/// Log:       under the module path "proc/subprocess"; a line of "proc/signal" precedes 321 and
///            348. In the child: 213 for /dev/null, 222 and 159 for dup2, 140 and 146 for an output
///            file, 238 for memory and 256 for execv; 247 and 250, at LOG_DEBUG, for the command.
/// Threads:   one thread per object. One call at a time in a process, and no UtilExec::Execv at the
///            same time: the actions of SIGTERM and SIGCHLD and the pid of the child belong to the
///            process. Other threads may run, but the child's steps use setenv(3), opendir(3) and
///            syslog(3). If another thread is inside one of these at the moment of the fork, its
///            lock may stay held in the child for ever, and call waits for ever with it. Memory
///            allocation is safe with glibc. Programs with such threads start their commands before
///            they start the threads, or through a helper process.
/// Signals:   no function here is async-signal-safe.
/// Process:   while a child is started and awaited, SIGCHLD is without SA_NOCLDWAIT; during call,
///            SIGTERM has another handler. Both are restored on every exit path. Meanwhile the
///            program must not ignore SIGCHLD (SIG_IGN) and must not reap our child, as wait(2) or
///            waitpid(2) for -1 would: call and callBackground would then retry waitpid(2) for ever
///            without sleeping. No other child is ever reaped.

#include "kovabackup/nodiscard.h"

#include <cstddef>
#include <list>
#include <memory>
#include <string>
#include <type_traits>
#include <vector>

namespace KOVA {
namespace Backup {
struct SubProcessPrivate; // declared before the pragma, so that it is not exported

/// Whether all types but the last are those of C strings.
template <typename... Types>
struct AreTextsBeforeTheLast : std::true_type {};

template <typename First, typename Second, typename... Rest>
struct AreTextsBeforeTheLast<First, Second, Rest...>
    : std::integral_constant<bool, std::is_convertible<First, const char *>::value &&
                                       AreTextsBeforeTheLast<Second, Rest...>::value> {};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// One command: its arguments, its additional variables, and the targets of its output and errors.
/// Nothing is checked before the command runs.
///
/// Ownership: the object owns copies of all texts. Descriptors remain the caller's: they must be
///            open when the command is run, and only exec closes them in the calling process.
class SubProcess {
public:
  // Deliberately not explicit: a path is accepted as a command without arguments.
  // NOLINTBEGIN(google-explicit-constructor): part of the interface

  /// Creates a command from the path of its program. program must not be null.
  SubProcess(const char *program);

  /// Creates a command from the path of its program.
  SubProcess(const std::string &program);

  /// Creates a command from its complete argument vector, which starts with the program's path. An
  /// empty vector is accepted: such a command cannot be executed (call gives exit code 127), and
  /// toString throws.
  SubProcess(std::list<std::string> argv);

  /// Creates a command from its complete argument vector, as the list form does.
  SubProcess(std::vector<std::string> argv);

  // NOLINTEND(google-explicit-constructor)

  /// Releases the description. A command that is running in the background is not affected.
  ~SubProcess();

  SubProcess(const SubProcess &) = delete;
  SubProcess &operator=(const SubProcess &) = delete;

  /// Appends one argument unchanged. The command sees it up to its first NUL byte.
  void addArg(const std::string &arg);

  /// Appends each argument up to the terminating null pointer, which is required. A call without it
  /// is reported by -Wformat (g++) or by default (clang++).
  ///     addArgList("-x", "-y", nullptr) appends two; addArgList(nullptr) appends none
  void addArgList(const char *first, ...) __attribute__((sentinel));

  /// Appends nothing: the list that begins with its end. It is a function of its own, because the
  /// compilers' check of the terminating null pointer does not accept it as the first argument.
  template <typename End>
  typename std::enable_if<std::is_same<End, std::nullptr_t>::value>::type addArgList(End) {}

  /// A std::string or a number among the arguments does not compile.
  template <typename... Rest>
  typename std::enable_if<!AreTextsBeforeTheLast<Rest...>::value>::type
  addArgList(const char *, const Rest &...) {
    static_assert(sizeof...(Rest) == 0, "addArgList takes C strings: use c_str(), or addArg and "
                                        "addFormatArg for each argument");
  }

  /// Appends one argument, formatted as by printf(3). White space does not split it.
  void addFormatArg(const char *format, ...) __attribute__((format(printf, 2, 3)));

  /// Sets an environment variable for the command. The last value of a name applies. A name that
  /// setenv(3) rejects, because it is empty or contains "=", is ignored silently when the command
  /// runs.
  void setEnv(const std::string &name, const std::string &value);

  /// Sends standard output to a file, which is created if necessary and appended to. A relative
  /// path is relative to "/". The last setStdOutput replaces all earlier ones completely. An empty
  /// path means /dev/null.
  /// Units: mode is a set of permission bits, which the file gets regardless of the umask. 0 keeps
  ///        the mode of an existing file and gives a new file 0600 less the umask.
  void setStdOutput(const std::string &path, int mode);

  /// Sends standard output to an open descriptor; a negative fd means /dev/null, the initial state.
  /// If fd is not open when the command runs, the child exits with code 127, unless fd is the
  /// lowest free number: the child then opens /dev/null under it.
  void setStdOutput(int fd);

  /// Sends standard error to a file, as setStdOutput does for standard output.
  /// Units: mode as in setStdOutput.
  void setStdError(const std::string &path, int mode);

  /// Sends standard error to an open descriptor, as setStdOutput does for standard output.
  void setStdError(int fd);

  /// The arguments joined by single spaces, for messages. Nothing is quoted, so the text cannot be
  /// split into the arguments again. Variables and redirections are not included.
  ///     {"/bin/tar", "-cf", "a b.tar"} gives "/bin/tar -cf a b.tar"
  /// Errors: std::out_of_range ("basic_string::substr...") for a command without arguments.
  std::string toString() const;

  /// Runs the command and waits for it. A SIGTERM that the caller receives meanwhile is forwarded
  /// to the command: once for each SIGTERM that arrives, and then again whenever any other signal
  /// interrupts the wait. The command itself decides whether to end.
  /// Returns: the wait status, for WIFEXITED and the related macros of waitpid(2); -1 when the
  ///          command could not be started or waited for. A set-up step or execv(2) that fails in
  ///          the child gives exit code 127.
  /// Errors:  SIGCHLD's flags cannot be changed; fork(2) fails; SIGTERM's handler cannot be set. In
  ///          the last case the command runs, and the caller must reap it.
  /// Log:     LOG_ERR lines: 321, 331 and 285 for these errors; 291 when SIGTERM's previous action
  ///          could not be restored, in which case the status is returned nevertheless; in the
  ///          child, the step that failed.
  /// Blocks:  until the command ends, without limit, even while it is stopped. Processes that the
  ///          command leaves behind are not waited for, whichever descriptors they hold.
  /// Signals: if the caller has a handler for SIGTERM, it still runs, before the signal is
  ///          forwarded, but without the mask and flags with which it was set. A handler set with
  ///          SA_SIGINFO receives a siginfo_t that contains only the signal's number. SIG_IGN and
  ///          SIG_DFL have no effect: during call a SIGTERM ends only the command. The wait begins
  ///          when the handler is set. From then on every SIGTERM is forwarded, even one that
  ///          arrives just before waitpid(2); an earlier one triggers the caller's action. The
  ///          child has the caller's handlers until execv.
  KOVA_NODISCARD int call() const;

  /// Starts the command detached from the caller and returns at once. Its parent is init, or the
  /// nearest subreaper. With newSession, it leads a session of its own (setsid(2)).
  /// Returns: true when the command's process was forked. Whether the command can be executed, and
  ///          how it ends, is not reported. Deliberately also true when SIGCHLD's flags could not
  ///          be changed, although nothing was started.
  /// Errors:  fork(2) fails, in the caller or in the intermediate process.
  /// Log:     LOG_ERR lines: 348 for SIGCHLD's flags, 358 and 364 for fork; in the child, the step
  ///          that failed.
  /// Blocks:  until the intermediate process has forked and ended.
  KOVA_NODISCARD bool callBackground(bool newSession) const;

  /// Replaces the calling process with the command. Meant for a process that was forked for this
  /// purpose.
  /// Returns: only when a step failed, and then false. The process keeps the changes of the steps
  ///          that succeeded: working directory, environment, descriptors 0 to 2, and every other
  ///          descriptor closed.
  /// Log:     one LOG_ERR line for the step that failed.
  /// Signals: no signal action or mask is changed.
  bool exec() const;

private:
  std::unique_ptr<SubProcessPrivate> private_;
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
