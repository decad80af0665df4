#include "check.h"

#include <kovabackup/service/cancel.h>
#include <kovabackup/service/command.h>

#include <cerrno>
#include <string>
#include <string_view>
#include <unistd.h>
#include <utility>
#include <vector>

using namespace KOVA::Backup::Service;

namespace {

Command shell(const std::string &script) {
  return Command({"/bin/sh", "-c", script});
}

void callCancel() {
  Cancel cancel;
  check(cancel.fd() >= 0 && !cancel.requested(), "requested, fd");
  cancel.request();
  check(cancel.requested(), "request");
  check(shell("true").cancelledBy(cancel).run().error.code == ECANCELED, "cancelledBy");
}

void callStreams() {
  std::string lines;
  Command command = shell("cat; echo \"$NAME\" >&2; echo passed >&7");
  command.env("NAME", "value").input("text").capture(Stream::Out, 100);
  command.lines(Stream::Err, [&](std::string_view line) { lines += line; });
  int ends[2];
  check(::pipe(ends) == 0, "a pipe to pass");
  command.passFd(ends[1], 7);
  const Result result = command.run();
  check(result.ok() && result.out.text == "text", "input, capture, run");
  check(lines == "value", "env, lines");
  char passed[7] = {};
  check(::read(ends[0], passed, sizeof passed) == 7 && passed[0] == 'p', "passFd");
  ::close(ends[0]);
  ::close(ends[1]);
}

void callRedirections() {
  Command command = shell("cat; echo error >&2");
  command.inputFd(-1).toFile(Stream::Out, "/tmp/service.out", 0600).toFd(Stream::Err, 1);
  check(command.run().ok(), "inputFd");
  Command print({"/bin/cat", "/tmp/service.out"});
  check(print.capture(Stream::Out, 100).run().out.text == "error\n", "toFile, toFd");
}

void callLimits() {
  int ticks = 0;
  Command command = shell("exec sleep 60");
  command.ownGroup().diesWithUs().every(Millis(1), [&] { ++ticks; });
  command.limit(Millis(50), Millis(10000));
  const Result result = command.run();
  check(result.timedOut && !result.ok(), "limit, ownGroup, diesWithUs");
  check(ticks > 0, "every");
}

void callRunning() {
  Command command = shell("exit 3");
  Command moved(std::move(command));
  command = std::move(moved);
  Running first = command.start();
  check(first.pid() > 0, "start, pid");
  Running second(std::move(first));
  Running third = command.start();
  check(Running::waitAny({&second, &third}) < 2, "waitAny");
  check(third.wait().code == 3, "wait");
  third = std::move(second);
  check(third.wait().code == 3, "a moved command");
}

void callPipeline() {
  const Command print({"/bin/echo", "text"});
  Command copy({"/bin/cat"});
  copy.capture(Stream::Out, 100);
  const std::vector<Result> results = runPipeline({&print, &copy});
  check(results.size() == 2 && results[1].out.text == "text\n", "runPipeline");
}

} // namespace

void callCommands() {
  callCancel();
  callStreams();
  callRedirections();
  callLimits();
  callRunning();
  callPipeline();
}
