// Scenarios that do what the library must never do. Each of them must be found.

#include "tests/faults/report.h"
#include "tests/faults/scenario.h"
#include "tests/faults/world.h"

#include <csignal>
#include <cstdlib>
#include <fcntl.h>
#include <string>
#include <syslog.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

const std::string kFile = std::string(kWork) + "/file";
constexpr std::string_view kText = "the complete text";

int openFile() {
  return ::open(kFile.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
}

void checkWritten(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("written") || seen.contentOf(kFile) == kText,
                  "written, but the file has other content");
}

void add(Scenarios &all, const std::string &name, const std::function<void()> &run) {
  all.push_back({name, [] {}, run, checkWritten, {kFile}});
}

void writeUnchecked() {
  const int fd = openFile();
  (void)!::write(fd, kText.data(), kText.size());
  ::close(fd);
  say("written", true);
}

void leaveOpen() {
  const int fd = openFile();
  if (fd >= 0 && ::fsync(fd) == 0) {
    ::close(fd);
  }
}

void leaveFile() {
  const int fd = ::open((kFile + ".new").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  if (fd >= 0 && ::fsync(fd) == 0) {
    ::unlink((kFile + ".new").c_str());
  }
  ::close(fd);
}

void logStrangely() {
  if (::access(kWork, F_OK) != 0) {
    ::syslog(LOG_ERR, "(%d) [err] session:9999 access failed", ::getpid());
  }
}

void repeatForEver() {
  while (::access(kWork, F_OK) != 0) {
  }
}

void abortAtOnce() {
  if (::access(kWork, F_OK) != 0) {
    std::abort();
  }
}

void leaveMask() {
  if (::access(kWork, F_OK) != 0) {
    sigset_t mask;
    sigemptyset(&mask);
    sigaddset(&mask, SIGTERM);
    ::sigprocmask(SIG_BLOCK, &mask, nullptr);
  }
}

void leaveChild() {
  if (::access(kWork, F_OK) != 0 && ::fork() == 0) {
    ::_exit(0);
  }
}

void keepMemory() {
  if (::access(kWork, F_OK) != 0) {
    void *volatile kept = std::malloc(1); // which the compiler may not leave out
    (void)kept;
  }
}

} // namespace

void addBrokenScenarios(Scenarios &all) {
  add(all, "a failed write reported as success", writeUnchecked);
  add(all, "a descriptor that stays open", leaveOpen);
  add(all, "a file that stays", leaveFile);
  add(all, "an unknown log line", logStrangely);
  add(all, "a call repeated for ever", repeatForEver);
  add(all, "an end by a signal", abortAtOnce);
  add(all, "a signal that stays blocked", leaveMask);
  add(all, "a child that stays", leaveChild);
  add(all, "memory that is not released", keepMemory);
}

} // namespace KovaTest::Faults
