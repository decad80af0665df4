// More ways to run a program: everything that can be said about a command.

#include "base/unique_fd.h"
#include "kovabackup/service/command.h"
#include "kovabackup/subprocess.h"
#include "tests/faults/attempt.h"
#include "tests/faults/world.h"

#include <fcntl.h>
#include <list>
#include <string>
#include <system_error>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

using KOVA::Backup::SubProcess;
using KOVA::Backup::Service::Cancel;
using KOVA::Backup::Service::Command;
using KOVA::Backup::Service::Result;
using KOVA::Backup::Service::Running;
using KOVA::Backup::Service::Stream;

const std::string kOutput = std::string(kWork) + "/output";
const std::string kErrors = std::string(kWork) + "/errors";
const std::string kPassed = std::string(kWork) + "/passed";
constexpr std::chrono::seconds kLimit(10);

void describeProgram() {
  attempt("from a list", [] {
    SubProcess program(std::list<std::string>{"/bin/tar", "-cf"});
    program.addArg("an argument that is longer than what a string holds in itself");
    program.addArgList("x", "y", nullptr);
    program.addFormatArg("--label=%s-%03d", "task", 7);
    program.setEnv("LC_ALL", "C");
    program.setStdError(kErrors, 0600);
    return program.toString();
  });
  attempt("from a vector", [] {
    return SubProcess(std::vector<std::string>{"/bin/tar", "-tf"}).toString();
  });
}

void callInBackground() {
  attempt("started", [] {
    SubProcess program(std::string("/bin/true"));
    program.setStdOutput(2);
    program.setStdError(1);
    return program.callBackground(true);
  });
}

void checkStarted(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isFalse("started") || !seen.log.empty(), "not started without a word");
}

// In the place of the scenario's process.
void becomeProgram() {
  SubProcess program(std::string("/bin/sh"));
  program.addArgList("-c", "echo $WORD; exit 7", nullptr);
  program.setEnv("WORD", "hello");
  program.setStdOutput(kOutput, 0600);
  (void)program.exec();
  ::_exit(1); // its descriptors are closed
}

void checkBecome(const Seen &seen, Findings &findings) {
  constexpr int kProgramsCode = 7;
  constexpr int kFailed = 1;
  findings.expect(seen.killed() || seen.exitCode == kProgramsCode || seen.exitCode == kFailed ||
                      seen.failedIn("memory mmap mremap brk"),
                  "exit code " + std::to_string(seen.exitCode));
  // A variable is left out when memory runs out for it.
  findings.expect(seen.exitCode != kProgramsCode || seen.contentOf(kOutput) == "hello\n" ||
                      (seen.failedIn("memory mmap brk") && seen.contentOf(kOutput) == "\n"),
                  "the program has run, but its output is not there");
}

void sayResult(const Result &result, const std::string &lines) {
  say("ok", result.ok());
  say("end", static_cast<int>(result.end));
  say("error", result.error.code);
  say("text", result.out.text);
  say("lines", lines);
}

void runDescribed() {
  std::string lines;
  lines.reserve(100);
  int ticks = 0;
  Command command({"/bin/sh", "-c", "echo $WORD; echo first >&2; echo second >&2; echo x >&5"});
  const KOVA::Base::UniqueFd fd(::open(kPassed.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600));
  command.env("WORD", "hello").inputFd(-1).capture(Stream::Out, 100).passFd(fd.get(), 5);
  command.lines(Stream::Err, [&](std::string_view line) { lines.append(line).append(" "); });
  command.limit(kLimit, kLimit).ownGroup().diesWithUs(false);
  command.every(std::chrono::milliseconds(1), [&] { ++ticks; });
  Command moved({"/bin/false"});
  moved = std::move(command);
  const Result result = moved.run();
  sayResult(result, lines);
}

void checkDescribed(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("ok") ||
                      (seen.valueOf("text") == "hello" && seen.valueOf("lines") == "first second "),
                  "ok, but the output is " + seen.valueOf("text") + " " + seen.valueOf("lines"));
  // The scenario's own open may have failed, or its close.
  findings.expect(!seen.isTrue("ok") || seen.contentOf(kPassed) == "x\n" || seen.killed(),
                  "ok, but nothing went to the descriptor");
  findings.expect(!seen.isFalse("ok") || seen.valueOf("error") != "0" ||
                      seen.valueOf("end") == std::to_string(static_cast<int>(Result::End::Exited)),
                  "not run, but there is no error");
}

void waitForBoth() {
  Command slow({"/bin/sh", "-c", "read word; exit 3"});
  Command quick({"/bin/true"});
  slow.input("hello\n").toFile(Stream::Out, kOutput, 0600).toFd(Stream::Err, 1).limit(kLimit);
  quick.limit(kLimit);
  Running first = slow.start();
  Running second = quick.start();
  say("numbered", first.pid() != 0);
  say("index", static_cast<int>(Running::waitAny({&first, &second}, kLimit)));
  const Result one = first.wait();
  const Result two = second.wait();
  say("first", one.error.code == 0 ? one.code : -1);
  say("second", two.error.code == 0 ? two.code : -1);
}

void checkBoth(const Seen &seen, Findings &findings) {
  const std::string first = seen.valueOf("first");
  const std::string second = seen.valueOf("second");
  findings.expect(first.empty() || first == "3" || first == "1" || first == "-1",
                  "the first one ended with " + first);
  findings.expect(second.empty() || second == "0" || second == "-1",
                  "the second one ended with " + second);
}

void cancelBefore() {
  try {
    Cancel cancel;
    cancel.request();
    Command command({"/bin/sh", "-c", "echo run >/tmp/scenario/output"});
    command.cancelledBy(cancel);
    const Result result = command.run();
    say("requested", cancel.requested());
    say("cancelled", result.cancelled);
  } catch (const std::system_error &) {
    say("descriptor", std::string_view("none"));
  }
}

void checkCancelled(const Seen &seen, Findings &findings) {
  if (seen.failedIn("write poll")) {
    return; // of an eventfd, which never fail for these reasons
  }
  findings.expect(!seen.exists(kOutput), "cancelled, but it was run");
  findings.expect(!seen.isFalse("requested"), "requested, but it is not known");
  findings.expect(seen.valueOf("descriptor").empty() || seen.failedIn("eventfd2"), "it threw");
}

} // namespace

void addProgramScenarios(Scenarios &all) {
  all.push_back({"subprocess described", [] {}, describeProgram, checkAttempts, {}});
  all.push_back({"subprocess in the background", [] {}, callInBackground, checkStarted, {}});
  all.push_back({"subprocess exec", [] {}, becomeProgram, checkBecome, {kOutput}});
  all.back().keepsDescriptors = true; // of the steps that succeeded
  all.push_back({"command described", [] {}, runDescribed, checkDescribed, {kPassed}});
  all.push_back({"commands waited for", [] {}, waitForBoth, checkBoth, {kOutput}});
  all.push_back({"command cancelled", [] {}, cancelBefore, checkCancelled, {kOutput}});
}

} // namespace KovaTest::Faults
