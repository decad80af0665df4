#include "service/command_running.h"

#include "base/retry_on_eintr.h"
#include "service/kernel_usage.h"

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <new>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

constexpr std::size_t kBufferSize = 65536; // what a pipe holds by default

enum PollEntry : std::size_t { kPidEntry, kOutEntry, kErrEntry, kCancelEntry };

bool readsAny(const CommandPrivate &command) {
  return command.targets[0].readByUs() || command.targets[1].readByUs();
}

} // namespace

TimePoint pointAfter(TimePoint start, Millis span) {
  const auto room = std::chrono::duration_cast<Millis>(TimePoint::max() - start);
  return span < Millis(0) || span >= room ? TimePoint::max() : start + span;
}

RunningPrivate::RunningPrivate(const CommandPrivate &command)
    : out_(command.targets[0]),
      err_(command.targets[1]),
      buffer_(readsAny(command) ? kBufferSize : 0),
      cancel_(command.cancel),
      tick_(command.tick),
      limit_(command.limit),
      grace_(command.grace),
      interval_(command.interval),
      ownGroup_(command.ownGroup) {}

RunningPrivate::~RunningPrivate() {
  abandon();
}

void RunningPrivate::start(const CommandPrivate &command, const Plumbing &plumbing) {
  Streams streams;
  Error error;
  if (cancel_ != nullptr && cancel_->requested()) {
    result_.cancelled = true;
    endNotStarted({ECANCELED, "start", ""});
    return;
  }
  if (!openStreams(command, plumbing, streams, error)) {
    logNotStarted(command, error);
    endNotStarted(std::move(error));
    return;
  }
  startedAt_ = Clock::now();
  if (!launch(command, streams, child_, error)) {
    child_ = {};
    endNotStarted(std::move(error));
    return;
  }
  out_.open(std::move(streams.readEnds[0]));
  err_.open(std::move(streams.readEnds[1]));
  limitBy(pointAfter(startedAt_, limit_));
  tickAt_ = tick_ ? pointAfter(startedAt_, interval_) : TimePoint::max();
}

void RunningPrivate::endNotStarted(Error error) noexcept {
  result_.error = std::move(error);
  ended_ = true;
}

void RunningPrivate::prepare(struct pollfd *polls) const noexcept {
  polls[kPidEntry] = {child_.pidfd.get(), POLLIN, 0};
  polls[kOutEntry] = {out_.fd(), POLLIN, 0};
  polls[kErrEntry] = {err_.fd(), POLLIN, 0};
  // A request stays readable, so it is looked for only once.
  polls[kCancelEntry] = {cancel_ != nullptr && !stopping_ ? cancel_->fd() : -1, POLLIN, 0};
}

TimePoint RunningPrivate::nextDeadline() const noexcept {
  return std::min({stopping_ ? TimePoint::max() : limitAt_, killAt_, tickAt_});
}

void RunningPrivate::serve(const struct pollfd *polls) {
  try {
    read(out_, polls[kOutEntry].revents);
    read(err_, polls[kErrEntry].revents);
    if (polls[kPidEntry].revents != 0) {
      finish();
      return;
    }
    if (polls[kCancelEntry].revents != 0) { // not polled while the command is being stopped
      result_.cancelled = true;
      stop(Clock::now());
    }
    serveDeadlines();
  } catch (...) {
    abandon();
    throw;
  }
}

void RunningPrivate::read(StreamReader &reader, short ready) {
  if (ready == 0) {
    return;
  }
  const int code = reader.readSome(buffer_);
  if (code != 0) {
    noteFailure(code, "read");
  }
}

void RunningPrivate::serveDeadlines() {
  const TimePoint now = Clock::now();
  if (!stopping_ && now >= limitAt_) {
    result_.timedOut = true;
    stop(now);
  }
  if (now >= killAt_) {
    killAt_ = TimePoint::max();
    send(SIGKILL);
  }
  if (now >= tickAt_) {
    const auto missed = (now - tickAt_) / interval_;
    tickAt_ += interval_ * (missed + 1);
    tick_();
  }
}

void RunningPrivate::stop(TimePoint now) {
  stopping_ = true;
  killAt_ = pointAfter(now, grace_);
  send(SIGTERM);
}

// The group is signalled before its leader is reaped: until then its number is not reused.
void RunningPrivate::finish() {
  const TimePoint now = Clock::now();
  if (stopping_ && ownGroup_) {
    killRestOfGroup();
  }
  for (StreamReader *reader : {&out_, &err_}) {
    const int code = reader->readRest(buffer_);
    if (code != 0) {
      noteFailure(code, "read");
    }
  }
  result_.wall = now - startedAt_;
  reap();
}

// When the host has reaped the leader, its number may belong to another group. Only the pidfd names
// the group then, which kernels before 6.9 do not support; the failure is noted.
void RunningPrivate::killRestOfGroup() noexcept {
  constexpr unsigned kToGroup = 4; // PIDFD_SIGNAL_PROCESS_GROUP, not in the headers of glibc 2.36
  if (isUnreaped(child_)) {
    if (::kill(-child_.pid, SIGKILL) != 0) {
      noteFailure(errno, "kill");
    }
  } else if (::syscall(SYS_pidfd_send_signal, child_.pidfd.get(), SIGKILL, nullptr, kToGroup) !=
                 0 &&
             errno != ESRCH) {
    noteFailure(errno, "pidfd_send_signal");
  }
}

// Blocks if the command has not ended yet.
void RunningPrivate::reap() noexcept {
  siginfo_t info = {};
  KernelUsage usage = {};
  const long reaped = Base::retryOnEintr(
      [&] { return ::syscall(SYS_waitid, P_PIDFD, child_.pidfd.get(), &info, WEXITED, &usage); });
  if (reaped == 0) {
    result_.usage = usageOf(usage);
    result_.end = info.si_code == CLD_EXITED ? Result::End::Exited : Result::End::Signalled;
    result_.code = info.si_status;
  } else {
    result_.end = Result::End::StatusLost;
    result_.code = -1;
    if (errno != ECHILD) {
      noteFailure(errno, "waitid");
    }
  }
  const bool bySigkill = result_.end == Result::End::Signalled && result_.code == SIGKILL;
  result_.killed = killSent_ && (bySigkill || reaped != 0);
  child_.pidfd.reset();
  out_.close();
  err_.close();
  ended_ = true;
}

void RunningPrivate::abandon(int code, const char *step) noexcept {
  if (ended_) {
    return;
  }
  if (child_.pid < 0) { // never started
    ended_ = true;
    return;
  }
  if (code != 0) {
    noteFailure(code, step);
  }
  send(SIGKILL);
  reap();
  result_.wall = Clock::now() - startedAt_;
}

// A leader may have left its group. It is signalled itself when the group is gone, and killed in
// any case.
void RunningPrivate::send(int sig) noexcept {
  const auto isFailure = [] { return errno != ESRCH && errno != ECHILD; };
  bool sent = ownGroup_ && isUnreaped(child_) && ::kill(-child_.pid, sig) == 0;
  if (ownGroup_ && !sent && isFailure()) {
    noteFailure(errno, "kill");
  }
  if (!sent || sig == SIGKILL) {
    sent = sendTo(child_, sig) || sent;
    if (!sent && isFailure()) {
      noteFailure(errno, "pidfd_send_signal");
    }
  }
  killSent_ = killSent_ || (sent && sig == SIGKILL);
}

// The first failure counts.
void RunningPrivate::noteFailure(int code, const char *step) noexcept {
  if (result_.error.code != 0) {
    return;
  }
  result_.error.code = code;
  try {
    result_.error.step = step;
  } catch (const std::bad_alloc &) { // the code must do
    result_.error.step.clear();
  }
}

Result RunningPrivate::takeResult() {
  Result result = result_;
  result.out = std::exchange(out_.captured(), {});
  result.err = std::exchange(err_.captured(), {});
  return result;
}

} // namespace KOVA::Backup::Service
