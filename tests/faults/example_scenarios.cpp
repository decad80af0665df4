// The example service: its verbs, from the task file to archives.

#include "kovabackup/option_map.h"
#include "tests/crash/programs.h"
#include "tests/faults/scenario.h"
#include "tests/faults/world.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;
using KovaTest::Crash::runProgram;

const std::string kTasks = std::string(kWork) + "/tasks.conf";
const std::string kTasksBefore = std::string(kWork) + "/tasks.before";
const std::string kIdentity = std::string(kWork) + "/identity";
const std::string kSource = std::string(kWork) + "/source";
const std::string kArchive = std::string(kWork) + "/made.tar.zst";
const std::string kRestored = std::string(kWork) + "/restored";
constexpr const char *kPassphrase = "open sesame";
// In order of their names.
constexpr const char *kEntries = "tmp/scenario/source/\ntmp/scenario/source/below/\n"
                                 "tmp/scenario/source/below/file\ntmp/scenario/source/file\n";
constexpr int kWarnings = 3;

std::string destination() {
  return volume() + "/archives";
}

std::string oldArchive() {
  return destination() + "/docs-20200101T000000.000Z.tar.zst";
}

void makeSource() {
  fs::create_directories(kSource + "/below");
  std::ofstream(kSource + "/file") << "12345";
  std::ofstream(kSource + "/below/file") << "1";
}

void prepareTask(const std::string &recipient) {
  makeSource();
  fs::create_directory(destination());
  std::ofstream(oldArchive()) << "old";
  OptionMap task;
  (void)task.optLoadJsonString(R"({"name":"docs","exclude":[],"include":[],"one-file-system":false,
                                   "keep":1,"level":1,"passphrase":""})");
  task.optSet("source", std::list<std::string>{kSource});
  task.optSet("destination", destination());
  task.optSet("recipient", recipient);
  (void)task.optSectionExport(kTasks, "task1", true);
  OptionMap other;
  other.optSet("x", 1);
  (void)other.optSectionExport(kTasks, "other", true);
  fs::copy_file(kTasks, kTasksBefore);
}

void prepareEncrypted() {
  (void)runProgram({"/usr/bin/age-keygen", "-o", kIdentity});
  const std::string label = "# public key: ";
  std::ifstream in(kIdentity);
  for (std::string line; std::getline(in, line);) {
    if (line.rfind(label, 0) == 0) {
      prepareTask(line.substr(label.size()));
    }
  }
}

void prepareArchive() {
  makeSource();
  (void)runProgram({"/usr/bin/tar", "--zstd", "-C", "/", "-cf", kArchive, kSource.substr(1)});
}

// Its end is missing.
void prepareTornArchive() {
  prepareArchive();
  fs::resize_file(kArchive, fs::file_size(kArchive) - 20);
}

// The names in an archive, sorted; "" of one that is not complete.
std::string entriesOf(const std::string &archive) {
  const std::string listing = std::string(kWork) + "/listing";
  fs::remove(listing);
  if (runProgram({"/usr/bin/tar", "--zstd", "-tf", archive}, listing) != 0) {
    return "";
  }
  std::ifstream in(listing);
  std::vector<std::string> names;
  for (std::string name; std::getline(in, name);) {
    names.push_back(name);
  }
  std::sort(names.begin(), names.end());
  std::string text;
  for (const std::string &name : names) {
    text += name + "\n";
  }
  return text;
}

// The same of an encrypted one.
std::string entriesOfEncrypted(const std::string &archive) {
  const std::string plain = std::string(kWork) + "/plain";
  fs::remove(plain);
  const int status =
      runProgram({"/usr/bin/age", "--decrypt", "--identity", kIdentity, "-o", plain, archive});
  return status == 0 ? entriesOf(plain) : "";
}

// The path in a line of the form "ok; 4 files, 6 bytes -> PATH, 400 bytes".
std::string announcedIn(const std::string &text) {
  const std::string arrow = " -> ";
  const std::size_t begin = text.find(arrow);
  const std::size_t end = text.find(", ", begin);
  return begin == std::string::npos || end == std::string::npos
             ? ""
             : text.substr(begin + arrow.size(), end - begin - arrow.size());
}

struct Recorded {
  std::string result;
  std::string report;
  std::string settings; // and the other section
};

Recorded readTasks(const std::string &path) {
  OptionMap task;
  OptionMap other;
  if (!task.optSectionLoad(path, "task", 1) || !other.optSectionLoad(path, "other", -1)) {
    return {};
  }
  Recorded recorded;
  recorded.result = task.optString("lastResult", "");
  recorded.report = task.optString("lastReport", "");
  for (const char *key : {"lastRun", "lastResult", "lastReport", "messages"}) {
    task.optRemove(key);
  }
  recorded.settings = task.optToJsonString() + other.optToJsonString();
  return recorded;
}

void checkRecorded(const Seen &seen, bool complete, Findings &findings) {
  const Recorded recorded = readTasks(kTasks);
  findings.expect(!recorded.settings.empty() &&
                      recorded.settings == readTasks(kTasksBefore).settings,
                  "the task is torn: " + seen.contentOf(kTasks));
  static const std::vector<std::string> results = {"", "did not end", "ok", "warnings"};
  findings.expect(std::count(results.begin(), results.end(), recorded.result) == 1 ||
                      recorded.result.rfind("failed: ", 0) == 0,
                  "the result is " + recorded.result);
  findings.expect(recorded.result != "ok" || complete, "recorded as ok, but without an archive");
  findings.expect(seen.exitCode != 0 || recorded.result == "ok",
                  "exit code 0, but the result is " + recorded.result);
  findings.expect(seen.exitCode != kWarnings || recorded.result == "warnings",
                  "exit code 3, but the result is " + recorded.result);
  const std::string announced = announcedIn(recorded.report);
  findings.expect(announced.empty() || seen.exists(announced), "recorded, but lost: " + announced);
}

void checkRun(const Seen &seen, Findings &findings,
              const std::function<std::string(const std::string &)> &entries) {
  bool complete = false;
  for (const std::string &archive : seen.matching(destination() + "/docs-*")) {
    if (archive != oldArchive()) {
      const std::string found = entries(archive);
      findings.expect(!found.empty(), "not a complete archive: " + archive);
      complete = complete || found == kEntries;
    }
  }
  findings.expect(complete || seen.exists(oldArchive()), "the old archive is lost");
  const std::string announced = announcedIn(seen.out);
  findings.expect(announced.empty() || seen.exists(announced), "announced, but lost: " + announced);
  findings.expect(seen.exitCode != 0 || complete, "exit code 0, but there is no complete archive");
  checkRecorded(seen, complete, findings);
}

// What is printed with success is what the clean run prints.
void checkPrinted(const Seen &seen, Findings &findings) {
  findings.expect(seen.exitCode != 0 || seen.clean == nullptr || seen.out == seen.clean->out,
                  "exit code 0, but it printed:\n" + seen.out);
}

void checkDryRun(const Seen &seen, Findings &findings) {
  checkPrinted(seen, findings);
  findings.expect(seen.contentOf(oldArchive()) == "old", "the old archive is lost");
  findings.expect(seen.contentOf(kTasks) == seen.before.at(kTasks), "the task is changed");
}

void checkFile(const Seen &seen, Findings &findings) {
  const std::string content = seen.contentOf(kTasks);
  const bool isOld = content == seen.before.at(kTasks);
  const bool isNew = seen.clean == nullptr || content == seen.clean->contentOf(kTasks);
  findings.expect(isOld || isNew, "torn:\n" + content);
  findings.expect(isNew || seen.exitCode != 0, "exit code 0, but the file is unchanged");
  findings.expect(isOld || seen.exitCode == 0 || seen.killed() ||
                      seen.failedIn("fsync flock write close memory"),
                  "it failed, but the file is changed");
  findings.expect(seen.contentOf(oldArchive()) == "old", "the old archive is lost");
  checkPrinted(seen, findings);
}

// Read by another process, since the platform keeps the key for the life of a process.
bool isAdded() {
  const pid_t pid = ::fork();
  if (pid == 0) {
    OptionMap task;
    ::_exit(task.optSectionLoad(kTasks, "task", 2) &&
                    task.optSecret("passphrase", "") == kPassphrase
                ? 0
                : 1);
  }
  int status = 0;
  (void)::waitpid(pid, &status, 0);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

// The cipher text differs each time.
void checkSecret(const Seen &seen, Findings &findings) {
  const std::string content = seen.contentOf(kTasks);
  const bool isOld = content == seen.before.at(kTasks);
  findings.expect(isOld || isAdded(), "there is a task without its passphrase:\n" + content);
  findings.expect(!isOld || seen.exitCode != 0, "exit code 0, but there is no task");
  findings.expect(content.find(kPassphrase) == std::string::npos, "the passphrase is readable");
}

void checkRestored(const Seen &seen, Findings &findings) {
  const std::string folder = kRestored + kSource;
  findings.expect(seen.exitCode != 0 || (seen.contentOf(folder + "/file") == "12345" &&
                                         seen.contentOf(folder + "/below/file") == "1"),
                  "exit code 0, but a file is missing");
}

void add(Scenarios &all, const std::string &name, const std::function<void()> &prepare,
         const std::function<void(const Seen &, Findings &)> &check,
         const std::vector<std::string> &arguments) {
  std::vector<std::string> words{"--tasks", kTasks};
  words.insert(words.end(), arguments.begin(), arguments.end());
  all.push_back({"example " + name, prepare, {}, check, {}, words});
  all.back().program = KOVA_EXAMPLE_PATH;
  all.back().mayAbort = true; // the library for its command line has objects outside main
}

void addRuns(Scenarios &all) {
  const auto plain = [](const Seen &seen, Findings &findings) {
    checkRun(seen, findings, entriesOf);
  };
  const auto encrypted = [](const Seen &seen, Findings &findings) {
    checkRun(seen, findings, entriesOfEncrypted);
  };
  add(all, "run", [] { prepareTask(""); }, plain, {"run", "1"});
  all.back().mayStay = {destination() + "/docs-*.tar.zst"};
  add(all, "run with a recipient", prepareEncrypted, encrypted, {"run", "1"});
  all.back().mayStay = {destination() + "/docs-*.tar.zst.age"};
  add(all, "run --dry-run", [] { prepareTask(""); }, checkDryRun, {"run", "1", "--dry-run"});
}

void addTaskVerbs(Scenarios &all) {
  const auto prepare = [] { prepareTask(""); };
  add(all, "add", prepare, checkFile,
      {"add", "--name", "photos", "--source", kSource, "--destination", destination()});
  add(all, "add --passphrase-stdin", prepare, checkSecret,
      {"add", "--name", "photos", "--source", kSource, "--destination", destination(),
       "--passphrase-stdin"});
  all.back().input = std::string(kPassphrase) + "\n";
  add(all, "edit", prepare, checkFile, {"edit", "1", "--keep", "5", "--exclude", "**.tmp"});
  add(all, "remove", prepare, checkFile, {"remove", "1"});
  add(all, "list", prepare, checkPrinted, {"list"});
  add(all, "status", prepare, checkPrinted, {"status", "1"});
}

void addArchiveVerbs(Scenarios &all) {
  add(all, "check", prepareArchive, checkPrinted, {"check", kArchive});
  add(all, "check of a torn archive", prepareTornArchive,
      [](const Seen &seen, Findings &findings) {
        findings.expect(seen.exitCode != 0, "a torn archive is said to be complete");
      },
      {"check", kArchive});
  all.back().exitCode = 1;
  add(all, "restore", prepareArchive, checkRestored, {"restore", kArchive, "--to", kRestored});
  all.back().mayStay = {kRestored,
                        kRestored + "/tmp",
                        kRestored + "/tmp/*",
                        kRestored + "/tmp/*/*",
                        kRestored + "/tmp/*/*/*",
                        kRestored + "/tmp/*/*/*/*"};
}

} // namespace

void addExampleScenarios(Scenarios &all) {
  if (std::string_view(KOVA_EXAMPLE_PATH).empty()) {
    return;
  }
  addRuns(all);
  addTaskVerbs(all);
  addArchiveVerbs(all);
}

} // namespace KovaTest::Faults
