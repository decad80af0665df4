#ifndef KOVABACKUP_SERVICE_COMMAND_H
#define KOVABACKUP_SERVICE_COMMAND_H

/// @file Child commands with a time limit, captured output, and a result that says what happened.
///
///     Command tar({"/bin/tar", "-cf", "-", "etc/hostname"}); // a path: PATH is not searched
///     tar.env("LC_ALL", "C").toFile(Stream::Out, "/tmp/hostname.tar", 0640);
///     tar.capture(Stream::Err, 4096).limit(std::chrono::minutes(10)).cancelledBy(cancel);
///     const Result result = tar.run();
///     if (!result.ok()) std::fprintf(stderr, "%s\n", result.err.text.c_str());
///
/// A Command describes a program to run. The description can be amended, and run any number of
/// times. run waits for the command; start returns a Running, whose wait does. While a thread
/// waits, it serves the command: it collects or hands on output, enforces the limit, answers a
/// request to cancel and calls the callbacks. No other thread does that: a command that is started
/// but not waited for runs without a limit, and blocks once its output fills a pipe.
///
/// The child performs these steps, in this order:
///     becomes the leader of its own process group, if ownGroup says so;
///     asks to be killed when the thread that started it ends, unless diesWithUs says otherwise;
///     resets every signal to its default action, and unblocks all signals;
///     changes to "/" (a failure is ignored);
///     connects descriptors 0, 1 and 2, in this order, and then those of passFd;
///     closes every other open descriptor, whatever the limit on open files is;
///     calls execve(2) with an environment of PATH, if it is set, and the command's variables.
/// The umask, limits, user and groups are the caller's, and so is the process group, except with
/// ownGroup. A standard stream that nothing is said about is connected to /dev/null.
///
/// The child is created with vfork(2)'s semantics: its cost does not depend on how much memory the
/// caller has, and the calling thread sleeps until execve(2) has replaced the child. Programs built
/// with a sanitizer use fork(2).
///
/// Failure:   by the Result; std::bad_alloc and what a callback throws are passed on.
/// errno:     not meaningful.
/// Log:       under the module path "service/command", at LOG_ERR: 101 when a command could not be
///            prepared or created, 102 when a step in its child failed. Nothing else is logged.
/// Threads:   one thread per object, except that any number of threads may run the same Command,
///            as long as none amends it. Any number of commands may run at once. Threads that
///            change the environment (setenv(3)) must not do so while a command is started.
/// Signals:   no handler is installed and no action changed. All signals are blocked in the calling
///            thread while it starts a command. Signals that arrive do not end a wait; to stop a
///            command from a handler, use cancelledBy.
/// Process:   the host may handle SIGCHLD as it likes. If it ignores SIGCHLD (or sets
///            SA_NOCLDWAIT), or reaps children that are not its own, as wait(2) does, then the
///            status of a command is lost, which the Result says. No other child is ever reaped.
/// Kernel:    Linux 5.4 or later. close_range(2) is used if the kernel has it (5.9).

#include "kovabackup/nodiscard.h"
#include "kovabackup/service/cancel.h"
#include "kovabackup/service/error.h"
#include "kovabackup/service/millis.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>
#include <sys/resource.h>
#include <sys/types.h>
#include <vector>

namespace KOVA {
namespace Backup {
namespace Service {
struct CommandPrivate; // declared before the pragma, so that they are not exported
class RunningPrivate;
} // namespace Service
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Service {

/// A standard stream that a command writes to.
enum class Stream { Out, Err };

/// What was kept of a stream.
struct Captured {
  std::string text;          ///< the beginning of the stream, up to the limit of capture
  std::uint64_t dropped = 0; ///< bytes read that were not kept, or not handed on by lines
};

/// What became of a command.
struct Result {
  enum class End {
    NotStarted, ///< the program was not executed; error names the step that failed
    Exited,     ///< code is its exit status
    Signalled,  ///< code is the number of the signal that ended it
    StatusLost  ///< it has ended; the host ignores SIGCHLD or another wait took its status
  };

  End end = End::NotStarted;
  int code = 127;         ///< see End; 127 for NotStarted as in a shell, -1 for StatusLost
  bool timedOut = false;  ///< the limit passed and the command was stopped
  bool cancelled = false; ///< a request to cancel came and the command was stopped or not started
  bool killed = false; ///< we sent SIGKILL: after the grace period or a failure, or at once for a
                       ///< member of a pipeline that could not be started completely
  Error error;         ///< of the step that failed: of the start, or of serving the command
  Captured out;        ///< of Stream::Out
  Captured err;        ///< of Stream::Err
  struct rusage usage = {}; ///< of the command and of those of its children that it waited for
  std::chrono::nanoseconds wall{}; ///< from the start until a wait noticed the end, on the
                                   ///< monotonic clock

  /// Whether the command ended by itself with exit status 0, and was served without a failure.
  bool ok() const {
    return end == End::Exited && code == 0 && error.code == 0 && !timedOut && !cancelled;
  }
};

/// A command that was started.
///
/// Ownership: owns the child and the descriptors to it. Destruction, or assignment over it, kills
///            the command (its process group with ownGroup) by SIGKILL and reaps it. What was given
///            to the Command is copied; the Command may be destroyed meanwhile. A Cancel must
///            outlive the Running.
class Running {
public:
  ~Running();
  Running(Running &&other) noexcept;
  Running &operator=(Running &&other) noexcept;
  Running(const Running &) = delete;
  Running &operator=(const Running &) = delete;

  /// The command's process, which is also its group with ownGroup; -1 if it was not started. The
  /// number is the command's until wait or waitAny has reported its end.
  pid_t pid() const noexcept;

  /// Serves the command until it ends. What is in the pipes at this moment is read; what processes
  /// write that the command left behind is not waited for, and they get SIGPIPE or EPIPE.
  /// Returns: the result. Of another call after it the same, with captured texts empty.
  /// Errors:  a failing wait, or a pipe that cannot be read, is in Result::error. After a failing
  ///          wait the command is killed.
  /// Throws:  what a callback throws, and std::bad_alloc. The command was then killed and reaped.
  /// Blocks:  until the command ends. A command that SIGKILL cannot end, because it runs for
  ///          another user or hangs in a device, is waited for without limit.
  KOVA_NODISCARD Result wait();

  /// Serves several commands until the first of them has ended. One that had already ended counts.
  /// Returns: the index of one that has ended, the lowest if there are several; all.size() when the
  ///          limit passed, which does not affect the commands. No element may be null.
  /// Errors:  as wait; a failing wait kills all of them.
  /// Throws:  as wait; only the command concerned was killed and reaped, and counts as ended.
  static std::size_t waitAny(const std::vector<Running *> &all, Millis limit = Millis(-1));

private:
  friend class Command;
  explicit Running(std::unique_ptr<RunningPrivate> running) noexcept;

  std::unique_ptr<RunningPrivate> private_;
};

/// The description of a command. Each function returns the object, so that calls can be chained.
/// Nothing is checked before the command is started. The last call for a stream, for the input and
/// for each variable applies.
///
/// Ownership: the object owns copies of all texts and callbacks. Descriptors remain the caller's,
///            and must be open when the command is started.
class Command {
public:
  /// Describes a command by its complete argument vector, which starts with the program's path. A
  /// relative path is relative to "/". Without any argument the command cannot be started (EINVAL).
  explicit Command(std::vector<std::string> argv);
  ~Command();
  Command(Command &&other) noexcept;
  Command &operator=(Command &&other) noexcept;
  Command(const Command &) = delete;
  Command &operator=(const Command &) = delete;

  /// Sets an environment variable. A PATH takes precedence over the caller's. A name that is empty
  /// or contains "=" is ignored.
  Command &env(const std::string &name, const std::string &value);

  /// Gives the command a text as its standard input, then end of file. The text is in a file
  /// without a name that cannot be changed (memfd_create(2)), so a command that does not read it
  /// does no harm.
  Command &input(std::string text);

  /// Connects standard input to an open descriptor; a negative fd means /dev/null, the initial
  /// state. It is shared with the caller, file offset included.
  Command &inputFd(int fd);

  /// Collects the stream in the Result: its first limit bytes. The rest is read, so that the
  /// command is never blocked, and counted in Captured::dropped.
  Command &capture(Stream stream, std::size_t limit);

  /// Calls line for every line, without its newline, in the thread that waits. Of a line longer
  /// than longest the first longest bytes are handed on; the rest is counted in Captured::dropped.
  /// A last line without a newline is handed on when the stream or the command ends.
  Command &lines(Stream stream, std::function<void(std::string_view)> line,
                 std::size_t longest = 65536);

  /// Connects the stream to an open descriptor; a negative fd means /dev/null, the initial state.
  /// Descriptors are connected one after the other: 0 means the command's own input, and
  /// toFd(Stream::Err, 1) sends errors wherever output goes.
  Command &toFd(Stream stream, int fd);

  /// Appends the stream to a file, which is created if necessary. A relative path is relative to
  /// "/"; an empty one means /dev/null.
  /// Units: mode is a set of permission bits, which the file gets regardless of the umask. 0 keeps
  ///        the mode of an existing file and gives a new file 0600 less the umask.
  Command &toFile(Stream stream, const std::string &path, int mode = 0);

  /// Hands an open descriptor of the caller to the command under the number as, which must be above
  /// 2 and below INT_MAX (else EINVAL at the start). Numbers may be exchanged: passFd(5, 6) with
  /// passFd(6, 5).
  Command &passFd(int fd, int as);

  /// Stops the command when time has passed since its start: by SIGTERM, and by SIGKILL after
  /// another span, grace. A negative grace means that SIGKILL is never sent. grace also applies to
  /// a request to cancel, so limit(Millis(-1), grace) sets only that. Without this call there is no
  /// time limit, and the grace period is 5 seconds.
  Command &limit(Millis time, Millis grace = Millis(5000));

  /// Makes the command the leader of a process group, which is then signalled in its place when it
  /// is stopped. When the leader ends after that, the rest of the group is killed at once. Where
  /// the host ignores SIGCHLD or reaps the leader, kernels before 6.9 cannot do that, and
  /// Result::error says so.
  Command &ownGroup(bool on = true);

  /// Sets whether the kernel kills the command (SIGKILL) when we end; it does by default. The
  /// kernel ties this to the thread that started the command: it is killed when that thread ends,
  /// even if the process goes on. It does not apply to what the command starts, nor to a program
  /// that is set-user-ID, set-group-ID or has capabilities.
  Command &diesWithUs(bool on = true);

  /// Calls tick at intervals (of at least a millisecond) while the command is waited for. Ticks
  /// that were missed are left out.
  Command &every(Millis interval, std::function<void()> tick);

  /// Stops the command as limit does when the request is made, and does not start it if the request
  /// was made before: the Result is then NotStarted, ECANCELED, and nothing is logged. The Cancel
  /// must outlive every Running.
  Command &cancelledBy(Cancel &cancel);

  /// Starts the command and waits for it, as start and Running::wait do.
  KOVA_NODISCARD Result run() const;

  /// Starts the command. If it cannot be started, this is logged, and wait returns the Result
  /// at once.
  /// Throws: std::bad_alloc, and what copying a callback throws. Nothing was then started.
  KOVA_NODISCARD Running start() const;

private:
  friend std::vector<Result> runPipeline(const std::vector<const Command *> &commands,
                                         Millis limit);
  std::unique_ptr<CommandPrivate> private_;
};

/// Runs commands at once, each with its output connected to the next one's input, and waits for all
/// of them. Output of all but the last and input of all but the first are replaced; else every
/// command is run as it is described. A command whose reader has ended gets SIGPIPE.
///     Command list({"/bin/ls", "/etc"}), count({"/usr/bin/wc", "-l"});
///     count.capture(Stream::Out, 100);
///     const std::vector<Result> results = runPipeline({&list, &count});
/// Returns: the results, in the order of the commands. When one cannot be started, those before it
///          were killed, and those after it are NotStarted with ECANCELED.
/// Throws:  as Running::wait; all commands were then killed and reaped.
/// Units:   limit applies to the pipeline, and stops every command as Command::limit does.
/// Blocks:  until all commands have ended.
KOVA_NODISCARD std::vector<Result> runPipeline(const std::vector<const Command *> &commands,
                                               Millis limit = Millis(-1));

} // namespace Service
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
