#include "tests/crash/campaign.h"

#include "tests/faults/world.h"

#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <random>
#include <sched.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest::Crash {
namespace {

constexpr int kShown = 20;

bool hasFailed = false;
int shown = 0;

[[noreturn]] void workAsFirst(const std::function<std::string()> &work) {
  ::prctl(PR_SET_PDEATHSIG, SIGKILL); // all of the namespace ends with this process
  std::string why;
  try {
    why = work();
  } catch (const std::exception &failure) {
    std::printf("FAILED: %s\n", failure.what());
    hasFailed = true;
  }
  if (!why.empty()) {
    std::printf("skipped: %s\n", why.c_str());
  }
  std::fflush(nullptr);
  ::_exit(hasFailed ? EXIT_FAILURE : EXIT_SUCCESS);
}

} // namespace

bool parse(int argc, char **argv, Options &options) {
  options.seed = std::random_device()();
  for (int index = 1; index < argc; ++index) {
    const std::string word = argv[index];
    const bool hasValue = index + 1 < argc;
    if (word == "--seed" && hasValue) {
      options.seed = std::strtoull(argv[++index], nullptr, 10);
    } else if (word == "--broken" && hasValue) {
      options.broken = argv[++index];
    } else if (std::atoi(word.c_str()) > 0) {
      options.count = std::atoi(word.c_str());
    } else {
      std::fprintf(stderr, "usage: %s [NUMBER] [--seed SEED] [--broken WHAT]\n", argv[0]);
      return false;
    }
  }
  return true;
}

int runInNamespaces(const std::function<std::string()> &work) {
  if (::geteuid() != 0 || ::unshare(CLONE_NEWNS | CLONE_NEWPID) != 0) {
    std::printf("skipped: root with the right to make namespaces is required\n");
    return EXIT_SUCCESS;
  }
  std::fflush(nullptr);
  const pid_t pid = ::fork();
  if (pid == 0) {
    workAsFirst(work);
  }
  int status = 0;
  (void)::waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : EXIT_FAILURE;
}

std::string enterWorld() {
  (void)::chdir("/");
  const std::string why = Faults::enterWorld();
  if (!why.empty()) {
    return why;
  }
  Faults::resetWorld();
  // Thousands of lines about what was killed do not belong to the log of the machine.
  (void)::mount("/dev/null", "/dev/log", nullptr, MS_BIND, nullptr);
  ::umask(022);
  return "";
}

void setFailed() {
  hasFailed = true;
}

void showProgress(int before, int now, int all, const char *what) {
  constexpr int kParts = 10;
  if (before * kParts / all != now * kParts / all && now < all) {
    std::printf("%d of %d %s\n", now, all, what);
    std::fflush(stdout);
  }
}

void show(const std::string &where, const Findings &findings) {
  for (const std::string &sentence : findings.list()) {
    if (++shown <= kShown) {
      std::printf("FOUND %s: %s\n", where.c_str(), sentence.c_str());
    }
  }
}

} // namespace KovaTest::Crash
