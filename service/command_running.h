#ifndef KOVA_SERVICE_COMMAND_RUNNING_H
#define KOVA_SERVICE_COMMAND_RUNNING_H

/// @file A command from its start to its end.
///
///     state      entered by                          left by
///     (new)      the constructor                     start: running, or ended (NotStarted)
///     running    the program was executed            its end: ended; limit or cancel: stopping
///     stopping   SIGTERM was sent                    its end: ended; the grace period: SIGKILL
///     once ended      reaped, or the status is lost       -
/// abandon leads from every state to ended, by SIGKILL.

#include "service/command_launch.h"
#include "service/command_reader.h"

#include <chrono>
#include <poll.h>

namespace KOVA::Backup::Service {

using Clock = std::chrono::steady_clock;
using TimePoint = Clock::time_point;

/// The point in time after a span; TimePoint::max() for a negative span or one beyond the clock.
TimePoint pointAfter(TimePoint start, Millis span);

class RunningPrivate {
public:
  static constexpr std::size_t kPolls = 4; // entries that prepare sets and serve reads

  /// Copies what serving the command requires.
  explicit RunningPrivate(const CommandPrivate &command);
  ~RunningPrivate();
  RunningPrivate(const RunningPrivate &) = delete;
  RunningPrivate &operator=(const RunningPrivate &) = delete;

  /// Starts the command, or ends with NotStarted. Logs a failure.
  void start(const CommandPrivate &command, const Plumbing &plumbing = {});

  /// Ends with NotStarted and the error.
  void endNotStarted(Error error) noexcept;

  /// Makes the limit pass at the given time, if it would not pass before.
  void limitBy(TimePoint at) noexcept { limitAt_ = std::min(limitAt_, at); }

  bool ended() const noexcept { return ended_; }
  pid_t pid() const noexcept { return child_.pid; }

  /// Sets what is to be polled; entries that are not needed have descriptor -1.
  void prepare(struct pollfd *polls) const noexcept;

  /// When serve has something to do even if no descriptor is ready.
  TimePoint nextDeadline() const noexcept;

  /// Does what is due. An exception passes through with the command killed and reaped.
  void serve(const struct pollfd *polls);

  /// Kills and reaps the command if it has not ended. The error, if any, goes into the Result.
  void abandon(int code = 0, const char *step = "") noexcept;

  /// The Result of a command that has ended; later ones are without texts.
  Result takeResult();

private:
  void read(StreamReader &reader, short ready);
  void serveDeadlines();
  void stop(TimePoint now);
  void finish();
  void killRestOfGroup() noexcept;
  void reap() noexcept;
  void send(int sig) noexcept;
  void noteFailure(int code, const char *step) noexcept;

  Child child_;
  StreamReader out_;
  StreamReader err_;
  std::vector<char> buffer_; // empty if no stream is read
  const Cancel *cancel_;
  std::function<void()> tick_;
  Millis limit_;
  Millis grace_;
  Millis interval_;
  bool ownGroup_;
  TimePoint startedAt_ = TimePoint::min();
  TimePoint limitAt_ = TimePoint::max();
  TimePoint killAt_ = TimePoint::max();
  TimePoint tickAt_ = TimePoint::max();
  bool stopping_ = false;
  bool killSent_ = false;
  bool ended_ = false;
  Result result_;
};

/// Waits until one of the commands has something to do or the deadline passes, and serves all.
/// Commands that have ended are left out. polls has kPolls entries for each command.
void serveOnce(const std::vector<RunningPrivate *> &commands, std::vector<struct pollfd> &polls,
               TimePoint deadline);

} // namespace KOVA::Backup::Service

#endif
