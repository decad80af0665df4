// Verbs of the command kovabackup that only look.

#include "tests/faults/scenario.h"
#include "tests/faults/sessions.h"
#include "tests/faults/world.h"

#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <netinet/in.h>
#include <sstream>
#include <string>
#include <sys/file.h>
#include <sys/socket.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;

const std::string kFile = std::string(kWork) + "/task.conf";
const std::string kOther = std::string(kWork) + "/other.conf";
const std::string kTemplate = std::string(kWork) + "/template";
const std::string kLockFolder = "/tmp/kovabackup/lock";
constexpr int kNegative = 3;

void prepareFiles() {
  std::ofstream(kFile) << "[task1]\nname=\"old\"\nretries=3\n[other]\nx=1\n";
  std::ofstream(kOther) << "[other]\nx=1\n[task1]\nname=\"new\"\nretries=3\n";
  std::ofstream(kTemplate) << "Backup of {{task}} ended: {{result}}\n";
}

// An answer, positive or negative, is the one that is given when nothing fails. A negative one may
// stay when the rest could not be printed, which is said.
void checkAnswer(const Seen &seen, Findings &findings) {
  const bool answered = seen.exitCode == 0 || seen.exitCode == kNegative;
  if (!answered || seen.clean == nullptr) {
    return;
  }
  findings.expect(seen.exitCode == seen.clean->exitCode,
                  "another answer: exit code " + std::to_string(seen.exitCode));
  findings.expect(
      seen.out == seen.clean->out ||
          (seen.exitCode == kNegative && (!seen.messages.empty() || seen.failedIn("write writev"))),
      "exit code " + std::to_string(seen.exitCode) + ", but it printed:\n" + seen.out);
}

// The files of which at least one could not be examined are shown with "+".
void checkShown(const Seen &seen, Findings &findings) {
  const bool counted = seen.out.find("+\n") == std::string::npos;
  std::istringstream lines(seen.out);
  for (std::string line; std::getline(lines, line);) {
    const bool size = line.rfind("files\t", 0) == 0 || line.rfind("bytes\t", 0) == 0;
    const bool steady = (size && counted) || line.rfind("path\t", 0) == 0;
    findings.expect(!steady || seen.clean == nullptr || seen.exitCode != 0 ||
                        seen.clean->out.find(line + "\n") != std::string::npos,
                    "exit code 0, but it printed " + line);
  }
  findings.expect(seen.exitCode != 0 || seen.out.find("\tsess.Aa1Bb2\n") != std::string::npos,
                  "exit code 0, but it printed:\n" + seen.out);
}

// A volume that cannot be examined does not qualify.
void checkPicked(const Seen &seen, Findings &findings) {
  findings.expect(seen.exitCode != 0 || seen.out == volume() + "/.kova_tmp\n",
                  "exit code 0, but it printed:\n" + seen.out);
  findings.expect(seen.exitCode == 0 || seen.out.empty() || seen.killed() ||
                      seen.failedIn("write writev"),
                  "it failed, but it printed:\n" + seen.out);
}

// Taken before the command starts, and so by the command.
void holdLock() {
  fs::create_directories(kLockFolder);
  const int fd = ::open((kLockFolder + "/tasks").c_str(), O_RDWR | O_CREAT, 0600);
  (void)::flock(fd, LOCK_EX);
}

void checkHeld(const Seen &seen, Findings &findings) {
  findings.expect(seen.exitCode != kNegative, "a lock that is held is said to be free");
  findings.expect(seen.exitCode != 0 || seen.out.rfind("holds\t", 0) == 0,
                  "exit code 0, but it printed:\n" + seen.out);
}

// A service that accepts connections. It is made with the first scenario, and each worker drains
// the connections that it has counted.
int listener() {
  static const int fd = [] {
    const int made = ::socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    struct sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    (void)::bind(made, reinterpret_cast<struct sockaddr *>(&address), sizeof address);
    (void)::listen(made, SOMAXCONN);
    return made;
  }();
  return fd;
}

std::string listenerAddress() {
  struct sockaddr_in address = {};
  socklen_t size = sizeof address;
  (void)::getsockname(listener(), reinterpret_cast<struct sockaddr *>(&address), &size);
  return "127.0.0.1:" + std::to_string(ntohs(address.sin_port));
}

int countConnections() {
  int count = 0;
  for (int fd = -1; (fd = ::accept4(listener(), nullptr, nullptr, SOCK_CLOEXEC)) >= 0;
       ::close(fd)) {
    ++count;
  }
  return count;
}

void checkProbed(const Seen &seen, Findings &findings) {
  const int connections = countConnections();
  findings.expect(seen.exitCode != 0 || connections > 0, "exit code 0, but nobody connected");
}

Scenario query(const std::string &name, const std::function<void()> &prepare,
               const std::vector<std::string> &arguments, int exitCode = 0,
               const std::string &input = "") {
  return {"kovabackup " + name, prepare, {}, checkAnswer, {}, arguments, input, exitCode};
}

void addFileQueries(Scenarios &all) {
  all.push_back(query("option sections", prepareFiles, {"option", "sections", kFile}));
  all.push_back(query("option diff", prepareFiles, {"option", "diff", kFile, kOther}, kNegative));
  all.push_back(query("option diff, the same", prepareFiles,
                      {"option", "diff", kFile, kOther, "--section", "other"}));
  all.push_back(query(
      "filter test", [] {},
      {"filter", "test", "--explain", "--exclude", "/a/**", "--include", "/a/b/*"}, 0,
      "/a/b/c\n/a/c\n/b\n"));
  all.push_back(query(
      "template fill", prepareFiles,
      {"template", "fill", kTemplate, "--set", "task=photos", "--set", "result=done", "--strict"}));
  all.push_back(query("explain", [] {}, {"explain", "session:126", "0x0900"}));
  all.push_back(query(
      "explain, of a log", [] {}, {"explain"}, 0,
      "backupd[12]: (12) [err] session:82 createIpcTempPath failed\nother\n"));
}

void addMachineQueries(Scenarios &all) {
  all.push_back({"kovabackup session show",
                 makeLocalSessions,
                 {},
                 checkShown,
                 {},
                 {"session", "show", "sess.Aa1Bb2"}});
  all.push_back({"kovabackup volume pick",
                 [] {},
                 {},
                 checkPicked,
                 {volume() + "/.kova_tmp"},
                 {"volume", "pick", "max"}});
  all.push_back(
      {"kovabackup lock show", [] {}, holdLock, checkHeld, {}, {"lock", "show", "tasks"}});
  all.push_back({"kovabackup lock list", [] {}, holdLock, checkHeld, {}, {"lock", "list"}});
  all.push_back({"kovabackup net probe",
                 [] {},
                 {},
                 checkProbed,
                 {},
                 {"net", "probe", listenerAddress(), "--timeout", "2"}});
  all.push_back(query(
      "net probe, refused", [] {}, {"net", "probe", "127.0.0.1:1"}, kNegative));
}

} // namespace

void addCommandQueryScenarios(Scenarios &all) {
  addFileQueries(all);
  addMachineQueries(all);
}

} // namespace KovaTest::Faults
