// Verbs of the command kovabackup.

#include "tests/faults/scenario.h"
#include "tests/faults/sessions.h"
#include "tests/faults/world.h"

#include <fstream>
#include <sstream>
#include <string>

namespace KovaTest::Faults {
namespace {

const std::string kFile = std::string(kWork) + "/task.conf";
constexpr const char *kBefore = "[task1]\nname=\"old\"\nretries=3\n[other]\nx=1\n";
const std::string kRoot = kSessionRoot;

void prepareFile() {
  std::ofstream(kFile) << kBefore;
}

// A command that ends with 0 has printed what it prints when nothing fails.
void checkPrinted(const Seen &seen, Findings &findings) {
  findings.expect(seen.exitCode != 0 || seen.clean == nullptr || seen.out == seen.clean->out,
                  "exit code 0, but it printed:\n" + seen.out);
}

void checkFile(const Seen &seen, Findings &findings) {
  const std::string content = seen.contentOf(kFile);
  const bool isOld = content == kBefore;
  const bool isNew = seen.clean == nullptr || content == seen.clean->contentOf(kFile);
  findings.expect(isOld || isNew, "torn:\n" + content);
  findings.expect(isNew || seen.exitCode != 0, "exit code 0, but the file is unchanged");
  findings.expect(isOld || seen.exitCode == 0 || seen.killed() ||
                      seen.failedIn("fsync flock write close memory"),
                  "it failed, but the file is changed");
}

// The cipher text differs each time.
void checkSecret(const Seen &seen, Findings &findings) {
  const std::string content = seen.contentOf(kFile);
  const bool isNew = content.find("\npassword=\"") != std::string::npos;
  findings.expect(isNew || content == kBefore, "torn:\n" + content);
  findings.expect(isNew || seen.exitCode != 0, "exit code 0, but the file is unchanged");
  findings.expect(content.find("password=\"\"") == std::string::npos, "the secret is empty");
  findings.expect(!seen.exists(kKeyFile) || seen.contentOf(kKeyFile).size() == 32,
                  "the key is not complete");
}

void checkCreated(const Seen &seen, Findings &findings) {
  if (seen.exitCode == 0) {
    const std::string id = seen.out.substr(0, seen.out.find('\n'));
    findings.expect(!id.empty() && seen.exists(kRoot + "/" + id),
                    "exit code 0, but there is no session " + id);
  }
}

void checkListed(const Seen &seen, Findings &findings) {
  for (const char *id : {"sess.Aa1Bb2", "sess.Ee5Ff6"}) {
    findings.expect(seen.exitCode != 0 || seen.out.find(id) != std::string::npos,
                    "exit code 0, but it did not print " + std::string(id));
  }
}

void checkDestroyed(const Seen &seen, Findings &findings) {
  findings.expect(seen.exitCode != 0 || !seen.exists(kOld), "exit code 0, but it is there");
  findings.expect(seen.contentOf(kYoung + "/file") == "12345", "another session is not complete");
}

// A volume that cannot be examined is listed as not mounted.
void checkVolumes(const Seen &seen, Findings &findings) {
  findings.expect(seen.exitCode != 0 ||
                      seen.out.find("\"path\":\"" + volume() + "\"") != std::string::npos,
                  "exit code 0, but it printed:\n" + seen.out);
}

// What cannot be examined is a note; it never counts as one more thing that is well.
void checkDoctor(const Seen &seen, Findings &findings) {
  const auto oks = [](const std::string &text) {
    std::istringstream lines(text);
    int count = 0;
    for (std::string line; std::getline(lines, line);) {
      count += line.rfind("ok\t", 0) == 0 ? 1 : 0;
    }
    return count;
  };
  findings.expect(seen.exitCode != 0 || seen.out.find("\nsummary\t") != std::string::npos,
                  "exit code 0, but it printed:\n" + seen.out);
  findings.expect(seen.clean == nullptr || oks(seen.out) <= oks(seen.clean->out),
                  "more is well than when nothing fails:\n" + seen.out);
}

void addOptions(Scenarios &all) {
  const std::vector<std::string> set = {"option", "set",     kFile,    "task1",
                                        "name",   "new one", "--lock", "task.conf"};
  all.push_back({"kovabackup option set", prepareFile, {}, checkFile, {}, set});
  all.push_back({"kovabackup option set --secret",
                 prepareFile,
                 {},
                 checkSecret,
                 {},
                 {"option", "set", kFile, "task1", "password", "--secret"},
                 "open sesame"});
  all.push_back({"kovabackup option unset",
                 prepareFile,
                 {},
                 checkFile,
                 {},
                 {"option", "unset", kFile, "task1", "name"}});
  all.push_back({"kovabackup option get",
                 prepareFile,
                 {},
                 checkPrinted,
                 {},
                 {"option", "get", kFile, "task1", "name"}});
  all.push_back({"kovabackup option list",
                 prepareFile,
                 {},
                 checkPrinted,
                 {},
                 {"option", "list", kFile, "task1", "--json"}});
}

void addSessions(Scenarios &all) {
  const std::vector<std::string> fresh = {kRoot + "/sess.*", kRoot + "/sess.*/*",
                                          kRoot + "/sess.*/*/*", kRoot + "/__sess__.lock"};
  all.push_back(
      {"kovabackup session create", [] {}, {}, checkCreated, fresh, {"session", "create"}});
  all.push_back({"kovabackup session create --volume",
                 [] {},
                 {},
                 checkCreated,
                 {kRoot + "/seln.*", volume() + "/.kova_tmp/seln.*"},
                 {"session", "create", "--volume", "max"}});
  all.push_back({"kovabackup session destroy",
                 makeLocalSessions,
                 {},
                 checkDestroyed,
                 fresh,
                 {"session", "destroy", "sess.Aa1Bb2"}});
  all.push_back({"kovabackup session prune",
                 makeLocalSessions,
                 {},
                 checkDestroyed,
                 fresh,
                 {"session", "prune", "--older-than", "1h", "--yes"}});
  all.push_back({"kovabackup session path",
                 makeLocalSessions,
                 {},
                 checkPrinted,
                 {},
                 {"session", "path", "sess.Aa1Bb2"}});
  all.push_back({"kovabackup session list",
                 makeLocalSessions,
                 {},
                 checkListed,
                 {},
                 {"session", "list", "--json"}});
}

} // namespace

void addCommandScenarios(Scenarios &all) {
  addOptions(all);
  addSessions(all);
  all.push_back(
      {"kovabackup volume list", [] {}, {}, checkVolumes, {}, {"volume", "list", "--json"}});
  all.push_back({"kovabackup doctor", makeLocalSessions, {}, checkDoctor, {}, {"doctor"}});
}

} // namespace KovaTest::Faults
