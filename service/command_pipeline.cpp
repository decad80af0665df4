#include "service/command_running.h"

#include <algorithm>
#include <cerrno>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

using Base::UniqueFd;
using Members = std::vector<std::unique_ptr<RunningPrivate>>;

// Starts a member that reads from the pipe before it, and replaces that by the one behind it.
void startMember(RunningPrivate &member, const CommandPrivate &command, bool last,
                 UniqueFd &pipeBefore) {
  UniqueFd readEnd;
  UniqueFd writeEnd;
  Error error;
  if (!last && !openPipe(readEnd, writeEnd, error)) {
    logNotStarted(command, error);
    member.endNotStarted(std::move(error));
    return;
  }
  member.start(command, {pipeBefore.get(), writeEnd.get()});
  pipeBefore = std::move(readEnd);
}

// A part of a pipeline serves no purpose.
void abandonAll(Members &members) {
  for (auto &member : members) {
    if (member->pid() >= 0) {
      member->abandon();
    } else if (!member->ended()) {
      member->endNotStarted({ECANCELED, "runPipeline", ""});
    }
  }
}

std::vector<Result> waitForAll(const Members &members) {
  std::vector<RunningPrivate *> commands;
  for (const auto &member : members) {
    commands.push_back(member.get());
  }
  std::vector<struct pollfd> polls(commands.size() * RunningPrivate::kPolls);
  while (std::any_of(commands.begin(), commands.end(),
                     [](const RunningPrivate *command) { return !command->ended(); })) {
    serveOnce(commands, polls, TimePoint::max());
  }
  std::vector<Result> results;
  results.reserve(commands.size());
  for (RunningPrivate *command : commands) {
    results.push_back(command->takeResult());
  }
  return results;
}

} // namespace

std::vector<Result> runPipeline(const std::vector<const Command *> &commands, Millis limit) {
  const TimePoint limitAt = pointAfter(Clock::now(), limit);
  Members members;
  for (const Command *command : commands) {
    members.push_back(std::make_unique<RunningPrivate>(*command->private_));
  }
  UniqueFd pipeBefore;
  for (std::size_t i = 0; i < commands.size(); ++i) {
    RunningPrivate &member = *members[i];
    startMember(member, *commands[i]->private_, i + 1 == commands.size(), pipeBefore);
    if (member.ended()) {
      abandonAll(members);
      break;
    }
    member.limitBy(limitAt);
  }
  pipeBefore.reset();
  return waitForAll(members);
}

} // namespace KOVA::Backup::Service
