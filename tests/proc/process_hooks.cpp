#include "tests/proc/process_hooks.h"

#include "tests/support/interpose.h"
#include "tests/support/shared_memory.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cerrno>
#include <csignal>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>

namespace KovaTest {
namespace {

struct Call {
  std::atomic<pid_t> pid{0}; // 0 until text is complete
  char text[120] = "";
};

// What the test's process and its forked children share.
struct Shared {
  std::atomic<bool> recording{false};
  std::atomic<int> count{0};
  std::array<Call, 2000> calls{};
};

// Created before main, so that no child creates its own.
Shared *const shared = makeShared<Shared>();
const pid_t testPid = ::getpid();

std::vector<WaitStep> *script = nullptr;
std::size_t nextStep = 0;
std::atomic<pid_t> awaited{0}; // the handler of another thread may read it
bool inSignal = false;         // a sanitizer's signal(2) calls sigaction(2)
const char *hookedText = nullptr;
std::function<void()> *hook = nullptr;

// Safe in a signal handler and in a forked child.
__attribute__((format(printf, 1, 2))) void note(const char *format, ...) {
  if (shared == nullptr || !shared->recording) {
    return;
  }
  const int saved = errno;
  const int index = shared->count++;
  if (index >= static_cast<int>(shared->calls.size())) {
    std::abort(); // an incomplete list would prove nothing
  }
  Call &call = shared->calls[static_cast<std::size_t>(index)];
  va_list args;
  va_start(args, format);
  std::vsnprintf(call.text, sizeof call.text, format, args);
  va_end(args);
  call.pid = ::getpid();
  errno = saved;
}

void runHook(const char *text) {
  if (hook != nullptr && !inForkedChild() && std::strcmp(hookedText, text) == 0) {
    const int saved = errno;
    hookedText = "";
    (*hook)();
    errno = saved;
  }
}

bool fails(const char *function) {
  return inForkedChild() ? failsInChild(function) : failsNow(function);
}

std::vector<std::string> listCalls(bool ofChildren) {
  std::vector<std::string> list;
  const int count = std::min(shared->count.load(), static_cast<int>(shared->calls.size()));
  for (int i = 0; i < count; ++i) {
    const Call &call = shared->calls[static_cast<std::size_t>(i)];
    if (call.pid != 0 && (call.pid != testPid) == ofChildren) {
      list.emplace_back(call.text);
    }
  }
  return list;
}

} // namespace

Recording::Recording() {
  for (Call &call : shared->calls) {
    call.pid = 0;
  }
  shared->count = 0;
  shared->recording = true;
}

Recording::~Recording() {
  shared->recording = false;
}

std::vector<std::string> Recording::own() const {
  return listCalls(false);
}

std::vector<std::string> Recording::children() const {
  return listCalls(true);
}

int Recording::count(const std::string &text) const {
  int count = 0;
  for (const std::string &call : own()) {
    count += call == text ? 1 : 0;
  }
  return count;
}

std::vector<std::vector<std::string>> Recording::eachChild() const {
  std::vector<pid_t> pids;
  std::vector<std::vector<std::string>> lists;
  const int count = std::min(shared->count.load(), static_cast<int>(shared->calls.size()));
  for (int i = 0; i < count; ++i) {
    const Call &call = shared->calls[static_cast<std::size_t>(i)];
    if (call.pid == 0 || call.pid == testPid) {
      continue;
    }
    const auto found = std::find(pids.begin(), pids.end(), call.pid.load());
    const auto index = static_cast<std::size_t>(found - pids.begin());
    if (found == pids.end()) {
      pids.push_back(call.pid);
      lists.emplace_back();
    }
    lists[index].emplace_back(call.text);
  }
  return lists;
}

CallHook::CallHook(const char *text, std::function<void()> after) {
  hookedText = text;
  hook = new std::function<void()>(std::move(after));
}

CallHook::~CallHook() {
  delete std::exchange(hook, nullptr);
}

WaitScript::WaitScript(std::vector<WaitStep> steps) {
  script = new std::vector<WaitStep>(std::move(steps));
  nextStep = 0;
}

WaitScript::~WaitScript() {
  delete std::exchange(script, nullptr);
}

bool WaitScript::finished() const {
  return nextStep >= script->size();
}

pid_t lastAwaited() {
  return awaited;
}

} // namespace KovaTest

using KovaTest::fails;
using KovaTest::modeArgument;
using KovaTest::note;
using KovaTest::realFunction;

extern "C" {

pid_t fork() noexcept {
  static auto *const real = realFunction<pid_t()>("fork");
  note("fork");
  return fails("fork") ? -1 : real();
}

pid_t waitpid(pid_t pid, int *status, int options) {
  static auto *const real = realFunction<pid_t(pid_t, int *, int)>("waitpid");
  note(options == 0 ? "waitpid" : "waitpid with options");
  if (fails("waitpid")) {
    return -1;
  }
  if (KovaTest::inForkedChild()) {
    return real(pid, status, options);
  }
  KovaTest::awaited = pid;
  if (KovaTest::script == nullptr || KovaTest::nextStep >= KovaTest::script->size()) {
    const pid_t result = real(pid, status, options);
    KovaTest::runHook("waitpid");
    return result;
  }
  const KovaTest::WaitStep step = (*KovaTest::script)[KovaTest::nextStep++];
  if (step.before) {
    step.before();
  }
  if (step.error != 0) {
    errno = step.error;
    return -1;
  }
  if (!step.result) {
    return real(pid, status, options);
  }
  if (step.status) {
    *status = *step.status;
  }
  return *step.result == KovaTest::kAwaited ? pid : *step.result;
}

int kill(pid_t pid, int sig) noexcept {
  static auto *const real = realFunction<int(pid_t, int)>("kill");
  note("kill %s %d", pid == KovaTest::awaited ? "child" : "other", sig);
  return fails("kill") ? -1 : real(pid, sig);
}

unsigned int sleep(unsigned int seconds) {
  static auto *const real = realFunction<unsigned int(unsigned int)>("sleep");
  note("sleep %u", seconds);
  const unsigned int left = real(seconds);
  KovaTest::runHook("sleep 0");
  return left;
}

int sigaction(int sig, const struct sigaction *action, struct sigaction *old) noexcept {
  static auto *const real =
      realFunction<int(int, const struct sigaction *, struct sigaction *)>("sigaction");
  if (!KovaTest::inSignal) {
    note("sigaction %d %s", sig, action == nullptr ? "read" : "write");
  }
  if (fails("sigaction")) {
    return -1;
  }
  const int result = real(sig, action, old);
  KovaTest::runHook(sig == SIGTERM && action != nullptr   ? "sigaction 15 write"
                    : sig == SIGCHLD && action == nullptr ? "sigaction 17 read"
                                                          : "sigaction");
  return result;
}

sighandler_t signal(int sig, sighandler_t handler) noexcept {
  static auto *const real = realFunction<sighandler_t(int, sighandler_t)>("signal");
  note("signal %d", sig);
  if (fails("signal")) {
    return SIG_ERR;
  }
  KovaTest::inSignal = true;
  const sighandler_t old = real(sig, handler);
  KovaTest::inSignal = false;
  KovaTest::runHook(sig == SIGTERM ? "signal 15" : "signal 2");
  return old;
}

pid_t setsid() noexcept {
  static auto *const real = realFunction<pid_t()>("setsid");
  note("setsid");
  return fails("setsid") ? -1 : real();
}

int chdir(const char *path) noexcept {
  static auto *const real = realFunction<int(const char *)>("chdir");
  note("chdir %s", path);
  return fails("chdir") ? -1 : real(path);
}

char *getenv(const char *name) noexcept {
  static auto *const real = realFunction<char *(const char *)>("getenv");
  note("getenv %s", name);
  return real(name);
}

int clearenv() noexcept {
  static auto *const real = realFunction<int()>("clearenv");
  note("clearenv");
  return fails("clearenv") ? -1 : real();
}

int setenv(const char *name, const char *value, int overwrite) noexcept {
  static auto *const real = realFunction<int(const char *, const char *, int)>("setenv");
  note("setenv %s %d", name, overwrite);
  return fails("setenv") ? -1 : real(name, value, overwrite);
}

int open(const char *path, int flags, ...) {
  static auto *const real = realFunction<int(const char *, int, ...)>("open");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  note("open %s %#x %o", path, static_cast<unsigned>(flags), mode);
  return fails("open") ? -1 : real(path, flags, mode);
}

int dup2(int from, int to) noexcept {
  static auto *const real = realFunction<int(int, int)>("dup2");
  note("dup2 %d %d", from, to);
  return fails("dup2") ? -1 : real(from, to);
}

int fchmod(int fd, mode_t mode) noexcept {
  static auto *const real = realFunction<int(int, mode_t)>("fchmod");
  note("fchmod %d %o", fd, mode);
  return fails("fchmod") ? -1 : real(fd, mode);
}

int close(int fd) {
  static auto *const real = realFunction<int(int)>("close");
  note("close %d", fd);
  const int result = real(fd);
  return fails("close") ? -1 : result; // a descriptor is closed whatever close(2) reports
}

long syscall(long number, ...) noexcept {
  static auto *const real = realFunction<long(long, ...)>("syscall");
  va_list args;
  va_start(args, number);
  long values[6];
  for (long &value : values) {
    value = va_arg(args, long);
  }
  va_end(args);
  if (number == SYS_close_range) {
    note("close_range %u %u", static_cast<unsigned>(values[0]), static_cast<unsigned>(values[1]));
    if (fails("close_range")) {
      return -1;
    }
  }
  return real(number, values[0], values[1], values[2], values[3], values[4], values[5]);
}

DIR *opendir(const char *path) {
  static auto *const real = realFunction<DIR *(const char *)>("opendir");
  note("opendir %s", path);
  return fails("opendir") ? nullptr : real(path);
}

int closedir(DIR *dir) {
  static auto *const real = realFunction<int(DIR *)>("closedir");
  note("closedir");
  return real(dir);
}

int execv(const char *path, char *const argv[]) noexcept {
  static auto *const real = realFunction<int(const char *, char *const *)>("execv");
  note("execv %s", path);
  return fails("execv") ? -1 : real(path, argv);
}

void _exit(int code) {
  static auto *const real = realFunction<void(int)>("_exit");
  note("_exit %d", code);
  real(code);
  std::abort(); // not reached
}
}
