// The waits of Running, and the loop under them.

#include "base/retry_on_eintr.h"
#include "service/command_running.h"

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <iterator>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

using std::chrono::nanoseconds;

// Calls ppoll(2) once; an interruption is as good as a ready descriptor.
int pollUntil(std::vector<struct pollfd> &polls, TimePoint deadline) {
  struct timespec left = {};
  if (deadline != TimePoint::max()) {
    const auto span = std::max(nanoseconds(deadline - Clock::now()), nanoseconds(0));
    const auto whole = std::chrono::duration_cast<std::chrono::seconds>(span);
    left.tv_sec = static_cast<std::time_t>(whole.count());
    left.tv_nsec = static_cast<long>((span - whole).count());
  }
  const int ready =
      ::ppoll(polls.data(), polls.size(), deadline == TimePoint::max() ? nullptr : &left, nullptr);
  return ready < 0 && errno == EINTR ? 0 : ready;
}

// ppoll refuses more entries than the process may have open files, those without a descriptor
// included, and all commands may share one Cancel. So each descriptor is polled once.
int pollDistinct(std::vector<struct pollfd> &polls, TimePoint deadline) {
  const auto isLower = [](const pollfd &a, const pollfd &b) { return a.fd < b.fd; };
  const auto isSame = [](const pollfd &a, const pollfd &b) { return a.fd == b.fd; };
  std::vector<struct pollfd> distinct;
  std::copy_if(polls.begin(), polls.end(), std::back_inserter(distinct),
               [](const pollfd &poll) { return poll.fd >= 0; });
  std::sort(distinct.begin(), distinct.end(), isLower);
  distinct.erase(std::unique(distinct.begin(), distinct.end(), isSame), distinct.end());
  const int ready = pollUntil(distinct, deadline);
  for (struct pollfd &poll : polls) {
    if (ready > 0 && poll.fd >= 0) {
      poll.revents = std::lower_bound(distinct.begin(), distinct.end(), poll, isLower)->revents;
    }
  }
  return ready;
}

} // namespace

void serveOnce(const std::vector<RunningPrivate *> &commands, std::vector<struct pollfd> &polls,
               TimePoint deadline) {
  struct pollfd *next = polls.data();
  for (const RunningPrivate *command : commands) {
    for (std::size_t i = 0; i < RunningPrivate::kPolls; ++i) {
      next[i] = {-1, 0, 0};
    }
    if (!command->ended()) {
      command->prepare(next);
      deadline = std::min(deadline, command->nextDeadline());
    }
    next += RunningPrivate::kPolls;
  }
  const int ready =
      commands.size() == 1 ? pollUntil(polls, deadline) : pollDistinct(polls, deadline);
  if (ready < 0) {
    const int code = errno;
    for (RunningPrivate *command : commands) {
      command->abandon(code, "ppoll");
    }
    return;
  }
  next = polls.data();
  for (RunningPrivate *command : commands) {
    if (!command->ended()) {
      command->serve(next);
    }
    next += RunningPrivate::kPolls;
  }
}

Running::Running(std::unique_ptr<RunningPrivate> running) noexcept : private_(std::move(running)) {}
Running::~Running() = default;
Running::Running(Running &&other) noexcept = default;
Running &Running::operator=(Running &&other) noexcept = default;

pid_t Running::pid() const noexcept {
  return private_->pid();
}

Result Running::wait() {
  try {
    const std::vector<RunningPrivate *> commands = {private_.get()};
    std::vector<struct pollfd> polls(RunningPrivate::kPolls);
    while (!private_->ended()) {
      serveOnce(commands, polls, TimePoint::max());
    }
  } catch (...) {
    private_->abandon();
    throw;
  }
  return private_->takeResult();
}

std::size_t Running::waitAny(const std::vector<Running *> &all, Millis limit) {
  const TimePoint deadline = pointAfter(Clock::now(), limit);
  std::vector<RunningPrivate *> commands;
  commands.reserve(all.size());
  for (const Running *running : all) {
    commands.push_back(running->private_.get());
  }
  std::vector<struct pollfd> polls(commands.size() * RunningPrivate::kPolls);
  const auto hasEnded = [](const RunningPrivate *command) { return command->ended(); };
  for (;;) {
    const auto first = std::find_if(commands.begin(), commands.end(), hasEnded);
    if (first != commands.end() || commands.empty()) {
      return static_cast<std::size_t>(first - commands.begin());
    }
    // Commands are looked at once even if the limit is 0 or has passed.
    const bool last = Clock::now() >= deadline;
    serveOnce(commands, polls, deadline);
    if (last && std::none_of(commands.begin(), commands.end(), hasEnded)) {
      return commands.size();
    }
  }
}

} // namespace KOVA::Backup::Service
