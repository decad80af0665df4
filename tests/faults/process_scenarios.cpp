// Commands that are run, and a connection that is tried.

#include "kovabackup/exec.h"
#include "kovabackup/network.h"
#include "kovabackup/service/command.h"
#include "kovabackup/subprocess.h"
#include "tests/faults/report.h"
#include "tests/faults/scenario.h"
#include "tests/faults/world.h"

#include <string>

namespace KovaTest::Faults {
namespace {

using KOVA::Backup::SubProcess;
using KOVA::Backup::UtilExec;
using KOVA::Backup::Service::Command;
using KOVA::Backup::Service::Result;
using KOVA::Backup::Service::runPipeline;
using KOVA::Backup::Service::Stream;

const std::string kOutput = std::string(kWork) + "/output";

void call() {
  SubProcess program("/bin/sh");
  program.addArgList("-c", "echo hello; exit 7", nullptr);
  program.setStdOutput(kOutput, 0600);
  say("code", program.call());
}

void checkCall(const Seen &seen, Findings &findings) {
  findings.expect(seen.valueOf("code") != "0", "a success that the program did not report");
  findings.expect(seen.valueOf("code") != "7" || seen.contentOf(kOutput) == "hello\n",
                  "the program has run, but its output is not there");
}

void execute() {
  UtilExec exec;
  const char *const words[] = {"/bin/sh", "-c", "exit 7", nullptr};
  say("code", exec.Execv(words[0], const_cast<char *const *>(words), nullptr));
}

void checkExecute(const Seen &seen, Findings &findings) {
  findings.expect(seen.valueOf("code") != "0", "a success that the program did not report");
}

void sayResult(const Result &result) {
  say("ended", result.end == Result::End::Exited);
  say("code", result.code);
  say("error", result.error.code);
  say("text", result.out.text);
  say("ok", result.ok());
}

void run() {
  Command command({"/bin/sh", "-c", "read word; echo \"$word\"; echo other >&2"});
  command.input("hello\n").capture(Stream::Out, 100).capture(Stream::Err, 100);
  command.limit(std::chrono::seconds(10));
  sayResult(command.run());
}

void runPipe() {
  const Command first({"/bin/echo", "hello"});
  Command second({"/bin/cat"});
  second.capture(Stream::Out, 100);
  const std::vector<Result> results = runPipeline({&first, &second}, std::chrono::seconds(10));
  sayResult(results.at(1));
}

void checkRun(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("ok") || seen.valueOf("text") == "hello",
                  "ok, but the output is " + seen.valueOf("text"));
  findings.expect(!seen.isFalse("ended") || seen.valueOf("error") != "0",
                  "not run, but there is no error");
}

// With one program of a pipeline not started, the other reads nothing and succeeds.
void checkPipe(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("ok") || seen.valueOf("text") == "hello" ||
                      seen.valueOf("text").empty(),
                  "ok, but the output is " + seen.valueOf("text"));
}

void probe() {
  say("code", KOVA::Backup::Net::testIpAndPortConnect("127.0.0.1", 1, 2));
}

void checkProbe(const Seen &seen, Findings &findings) {
  findings.expect(seen.valueOf("code") != "0", "a connection where nothing listens");
}

} // namespace

void addProcessScenarios(Scenarios &all) {
  all.push_back({"subprocess call", [] {}, call, checkCall, {kOutput}});
  all.push_back({"execv", [] {}, execute, checkExecute, {}});
  all.push_back({"command", [] {}, run, checkRun, {}});
  all.push_back({"pipeline", [] {}, runPipe, checkPipe, {}});
  all.push_back({"connection probe", [] {}, probe, checkProbe, {}});
}

} // namespace KovaTest::Faults
