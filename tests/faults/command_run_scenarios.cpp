// Verbs of the command kovabackup that run other programs, and the adoption of a session.

#include "tests/faults/scenario.h"
#include "tests/faults/sessions.h"
#include "tests/faults/world.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <sys/stat.h>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;

const std::string kFile = std::string(kWork) + "/task.conf";
const std::string kOutput = std::string(kWork) + "/output";
constexpr const char *kBefore = "[task1]\nname=\"old\"\nretries=3\n[other]\nx=1\n";
constexpr const char *kKeptText = "/tmp/kovabackup-edit.*/section.conf";
constexpr int kProgramsCode = 7;
constexpr int kNotStarted = 127;

void prepareFile() {
  std::ofstream(kFile) << kBefore;
}

// An edited text that was not saved is kept, and the message says where. Another one may stay where
// it cannot be removed.
void checkEdited(const Seen &seen, Findings &findings) {
  const std::string content = seen.contentOf(kFile);
  const bool isOld = content == kBefore;
  const bool isNew = seen.clean == nullptr || content == seen.clean->contentOf(kFile);
  findings.expect(isOld || isNew, "torn:\n" + content);
  findings.expect(isNew || seen.exitCode != 0, "exit code 0, but the file is unchanged");
  findings.expect(isOld || seen.exitCode == 0 || seen.killed() ||
                      seen.failedIn("fsync flock write close memory"),
                  "it failed, but the file is changed");
  for (const std::string &path : seen.matching(kKeptText)) {
    const bool silent = seen.killed() || isNew || seen.failedIn(kWalkCalls) ||
                        seen.failedIn("unlink unlinkat rmdir") || seen.failedIn("write writev");
    findings.expect(silent || seen.messages.find(path) != std::string::npos,
                    "kept without a word: " + path);
  }
}

void addEdit(Scenarios &all) {
  all.push_back({"kovabackup option edit",
                 prepareFile,
                 {},
                 checkEdited,
                 {"/tmp/kovabackup-edit.*", "/tmp/kovabackup-edit.*/*"},
                 {"option", "edit", kFile, "task1", "--lock", "task.conf"}});
  // The shell that runs the editor adds the path, and starts no process.
  all.back().variables = {"EDITOR=echo 'name=\"edited\"' >"};
}

// 126 and 127 are those of a program that was not started.
void checkRun(const Seen &seen, Findings &findings) {
  findings.expect(seen.exitCode != 0, "a success that the program did not report");
  // A variable is left out when memory runs out for it.
  findings.expect(seen.exitCode != kProgramsCode || seen.contentOf(kOutput) == "hello\n" ||
                      (seen.failedIn("memory mmap brk") && seen.contentOf(kOutput) == "\n"),
                  "the program has run, but its output is not there");
}

// Nothing is promised but that a process was made.
void checkStarted(const Seen &seen, Findings &findings) {
  findings.expect(seen.out.empty(), "it printed:\n" + seen.out);
}

void addRun(Scenarios &all) {
  all.push_back({"kovabackup run",
                 [] {},
                 {},
                 checkRun,
                 {kOutput},
                 {"run", "--env", "WORD=hello", "--stdout", kOutput, "--", "sh", "-c",
                  "echo $WORD; exit 7"}});
  all.back().exitCode = kProgramsCode;
  all.back().mostExitCode = kNotStarted;
  all.push_back({"kovabackup run --background",
                 [] {},
                 {},
                 checkStarted,
                 {},
                 {"run", "--background", "--new-session", "--", "true"}});
  all.back().mostExitCode = kNotStarted;
}

const std::string kRoot = kSessionRoot;

std::string lost() {
  return volume() + "/.kova_tmp/seln.Ii9Jj0";
}

void prepareLost() {
  makeLocalSessions();
  fs::create_directory(volume() + "/.kova_tmp");
  ::chmod((volume() + "/.kova_tmp").c_str(), 01777);
  makeSession(lost(), 7200);
}

void checkAdopted(const Seen &seen, Findings &findings) {
  const std::string id = seen.out.substr(0, seen.out.find('\n'));
  findings.expect(seen.exitCode != 0 || seen.contentOf(kRoot + "/" + id) == "-> " + lost(),
                  "exit code 0, but the link does not lead there: " + id);
  findings.expect(seen.contentOf(lost() + "/file") == "12345", "the content is lost");
}

} // namespace

void addCommandRunScenarios(Scenarios &all) {
  addEdit(all);
  addRun(all);
  all.push_back({"kovabackup session adopt",
                 prepareLost,
                 {},
                 checkAdopted,
                 {kRoot + "/seln.*", kRoot + "/__sess__.lock"},
                 {"session", "adopt", lost()}});
}

} // namespace KovaTest::Faults
