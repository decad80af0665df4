#include "tests/support/census.h"

#include <cerrno>
#include <csignal>
#include <cstring>
#include <dirent.h>
#include <filesystem>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

extern char **environ;

namespace KovaTest {
namespace {

namespace fs = std::filesystem;

// The flag that libc sets on every action that it installs; callers do not set it.
constexpr int kRestorerFlag = 0x04000000;

void addDescriptors(Census &census) {
  DIR *dir = ::opendir("/proc/self/fd");
  if (dir == nullptr) {
    return;
  }
  while (const dirent *entry = ::readdir(dir)) {
    const std::string name = entry->d_name;
    if (name[0] == '.' || name == std::to_string(::dirfd(dir))) {
      continue;
    }
    char target[4096] = "";
    if (::readlink(("/proc/self/fd/" + name).c_str(), target, sizeof target - 1) >= 0) {
      census["fd " + name] = target;
    }
  }
  ::closedir(dir);
}

void addSignals(Census &census) {
  sigset_t mask;
  ::sigprocmask(SIG_SETMASK, nullptr, &mask);
  for (int sig = 1; sig < NSIG; ++sig) {
    struct sigaction action;
    if (::sigaction(sig, nullptr, &action) != 0) {
      continue;
    }
    census["signal " + std::to_string(sig)] =
        std::to_string(reinterpret_cast<std::uintptr_t>(action.sa_handler)) + " flags " +
        std::to_string(action.sa_flags & ~kRestorerFlag) +
        (::sigismember(&mask, sig) == 1 ? " blocked" : "");
  }
}

void addEnvironment(Census &census) {
  for (char **entry = environ; entry != nullptr && *entry != nullptr; ++entry) {
    const std::string text = *entry;
    census["environment " + text.substr(0, text.find('='))] = text;
  }
}

void addTmp(Census &census) {
  std::error_code ignored;
  for (const fs::directory_entry &entry : fs::directory_iterator("/tmp", ignored)) {
    if (entry.path() != "/tmp/kovabackup") {
      census["file " + entry.path().string()] = "";
    }
  }
}

} // namespace

Census takeCensus() {
  Census census;
  addDescriptors(census);
  addSignals(census);
  addEnvironment(census);
  addTmp(census);
  std::error_code ignored;
  census["working directory"] = fs::current_path(ignored).string();
  const mode_t mask = ::umask(0);
  ::umask(mask);
  census["umask"] = std::to_string(mask);
  siginfo_t info;
  std::memset(&info, 0, sizeof info);
  const int found = ::waitid(P_ALL, 0, &info, WEXITED | WNOHANG | WNOWAIT);
  census["children"] = found == -1 && errno == ECHILD ? "none" : "some";
  return census;
}

int countOpenDescriptors() {
  Census census;
  addDescriptors(census);
  return static_cast<int>(census.size());
}

void CensusGuard::OnTestStart(const testing::TestInfo &) {
  std::error_code ignored;
  fs::remove_all("/tmp/kovabackup", ignored);
  before_ = takeCensus();
}

void CensusGuard::OnTestEnd(const testing::TestInfo &) {
  const Census after = takeCensus();
  for (const auto &[name, value] : after) {
    const auto was = before_.find(name);
    if (was == before_.end()) {
      ADD_FAILURE() << "the test left " << name << " (" << value << ")";
    } else if (was->second != value) {
      ADD_FAILURE() << "the test changed " << name << " from " << was->second << " to " << value;
    }
  }
  for (const auto &[name, value] : before_) {
    if (after.count(name) == 0) {
      ADD_FAILURE() << "the test took away " << name << " (" << value << ")";
    }
  }
}

} // namespace KovaTest
