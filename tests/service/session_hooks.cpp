#include "tests/service/session_hooks.h"

#include "tests/support/interpose.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest {
namespace {

EachCall *active = nullptr;

void before(const char *call, const char *path) {
  if (active != nullptr && !active->running) {
    active->running = true;
    active->step(call, path);
    active->running = false;
  }
}

const OnlyProcesses *only = nullptr;
DIR *processes = nullptr; // /proc, open

bool isHidden(const char *name) {
  if (only == nullptr || name[0] < '0' || name[0] > '9') {
    return false;
  }
  const pid_t pid = std::atoi(name);
  return pid != ::getpid() &&
         std::find(only->others.begin(), only->others.end(), pid) == only->others.end();
}

} // namespace

OnlyProcesses::OnlyProcesses(std::vector<pid_t> pids) : others(std::move(pids)) {
  only = this;
}

OnlyProcesses::~OnlyProcesses() {
  only = nullptr;
}

EachCall::EachCall(Step toRun) : step(std::move(toRun)) {
  active = this;
}

EachCall::~EachCall() {
  active = nullptr;
}

} // namespace KovaTest

using KovaTest::before;
using KovaTest::failsNow;
using KovaTest::realFunction;

extern "C" {

int symlink(const char *target, const char *path) noexcept {
  before("symlink", path);
  return failsNow("symlink")
             ? -1
             : realFunction<int(const char *, const char *)>("symlink")(target, path);
}

int renameat2(int fromDir, const char *from, int toDir, const char *to,
              unsigned int flags) noexcept {
  before("renameat2", from);
  return failsNow("renameat2") ? -1
                               : realFunction<int(int, const char *, int, const char *, unsigned)>(
                                     "renameat2")(fromDir, from, toDir, to, flags);
}

int rename(const char *from, const char *to) noexcept {
  before("rename", from);
  return failsNow("rename") ? -1
                            : realFunction<int(const char *, const char *)>("rename")(from, to);
}

int unlink(const char *path) noexcept {
  before("unlink", path);
  return failsNow("unlink") ? -1 : realFunction<int(const char *)>("unlink")(path);
}

int unlinkat(int dir, const char *path, int flags) noexcept {
  before("unlinkat", path);
  return failsNow("unlinkat")
             ? -1
             : realFunction<int(int, const char *, int)>("unlinkat")(dir, path, flags);
}

int utimensat(int dir, const char *path, const timespec *times, int flags) noexcept {
  before("utimensat", path);
  return failsNow("utimensat") ? -1
                               : realFunction<int(int, const char *, const timespec *, int)>(
                                     "utimensat")(dir, path, times, flags);
}

int flock(int fd, int operation) noexcept {
  before("flock", "");
  return failsNow("flock") ? -1 : realFunction<int(int, int)>("flock")(fd, operation);
}

DIR *opendir(const char *path) {
  static auto *const real = realFunction<DIR *(const char *)>("opendir");
  before("opendir", path);
  DIR *const dir = failsNow("opendir") ? nullptr : real(path);
  if (std::strcmp(path, "/proc") == 0) {
    KovaTest::processes = dir;
  }
  return dir;
}

dirent *readdir(DIR *dir) {
  static auto *const real = realFunction<dirent *(DIR *)>("readdir");
  if (failsNow("readdir")) {
    return nullptr;
  }
  dirent *entry = real(dir);
  while (entry != nullptr && dir == KovaTest::processes && KovaTest::isHidden(entry->d_name)) {
    entry = real(dir);
  }
  return entry;
}

ssize_t getrandom(void *buffer, size_t size, unsigned int flags) {
  return failsNow("getrandom")
             ? -1
             : realFunction<ssize_t(void *, size_t, unsigned)>("getrandom")(buffer, size, flags);
}

int stat(const char *path, struct stat *out) noexcept {
  return failsNow("stat") ? -1 : realFunction<int(const char *, struct stat *)>("stat")(path, out);
}
}
