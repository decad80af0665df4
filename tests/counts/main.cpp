// Runs every case in a process of its own, and prints what scripts/counts.py reads:
//
//     run NAME PID             callgrind counts the case in this process; it has a baseline
//     probe NAME PID           the same without a baseline: only for the growth
//     skip NAME REASON
//     growth NAME NAME BOUND   the second case has four times the size of the first one
//
// Exit status: 0 when every result is right or skipped.

#include "tests/counts/counted.h"

#include "tests/support/private_tmp.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <set>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

// Callgrind finds this function by its name. The barrier keeps the compiler from leaving the
// function by a jump into the operation, where the count would begin too late.
extern "C" __attribute__((noinline)) bool kovaCounted(const KovaCounts::Operation &operation) {
  const bool right = operation();
  asm volatile("" ::: "memory");
  return right;
}

namespace KovaCounts {
namespace {

constexpr int kSkipped = 77;
constexpr std::size_t kGrowth = 4;
constexpr char kScratch[] = "/tmp/counts";
constexpr char kConfig[] = "/tmp/platform.conf";
constexpr char kLog[] = "/dev/log";
constexpr char kKey[] = "/tmp/secret.key";

std::string noPrivateTmp; // why /tmp is not private; empty when it is

// A fixed key, so that each run encrypts the same.
void setUpFiles() {
  noPrivateTmp = KovaTest::enterPrivateTmp();
  if (!noPrivateTmp.empty()) {
    return;
  }
  writeFile(kKey, std::string(32, 'k'));
  writeFile(kConfig, std::string("[secret]\nkeyFile=\"") + kKey + "\"\n");
  require(::chmod(kKey, 0600) == 0 && ::chmod(kConfig, 0644) == 0 && ::mkdir(kScratch, 0700) == 0 &&
              ::setenv("KOVA_PLATFORM_CONF", kConfig, 1) == 0,
          "the files of the program");
  // What is logged reaches no machine's log, and costs the same where there is none.
  require(::access(kLog, F_OK) != 0 || ::mount(kConfig, kLog, nullptr, MS_BIND, nullptr) == 0,
          "hiding the system log");
}

std::string nameOf(const Case &one, std::size_t size) {
  return size == 0 ? one.name : std::string(one.name) + "/" + std::to_string(size);
}

std::set<std::size_t> sizesOf(const Case &one) {
  std::set<std::size_t> sizes(one.sizes.begin(), one.sizes.end());
  if (one.from != 0) {
    sizes.insert({one.from, one.from * kGrowth});
  }
  if (sizes.size() > 1) {
    sizes.erase(0);
  }
  return sizes;
}

bool hasBaseline(const Case &one, std::size_t size) {
  return std::find(one.sizes.begin(), one.sizes.end(), size) != one.sizes.end();
}

// Returns: whether the result was right.
bool runInChild(const Case &one, std::size_t size) {
  const std::string name = nameOf(one, size);
  const pid_t child = ::fork();
  if (child == 0) {
    one.run(size);
    std::_Exit(0); // cleaning up at exit is not part of any case
  }
  int status = -1;
  require(child > 0 && ::waitpid(child, &status, 0) == child, "a process for the case");
  if (WIFEXITED(status) && WEXITSTATUS(status) == kSkipped) {
    std::printf("skip %s %s\n", name.c_str(), noPrivateTmp.c_str());
  } else if (status == 0) {
    std::printf("%s %s %d\n", hasBaseline(one, size) ? "run" : "probe", name.c_str(),
                static_cast<int>(child));
  } else {
    std::fprintf(stderr, "%s failed\n", name.c_str());
    return false;
  }
  std::fflush(stdout); // otherwise the next child would print it, too
  return true;
}

bool runCases(const Cases &cases) {
  bool right = true;
  for (const Case &one : cases) {
    for (const std::size_t size : sizesOf(one)) {
      right = runInChild(one, size) && right;
    }
    if (one.from != 0) {
      std::printf("growth %s %s %g\n", nameOf(one, one.from).c_str(),
                  nameOf(one, one.from * kGrowth).c_str(), one.bound);
    }
  }
  return right;
}

void endUnless(bool holds, const char *what) {
  if (!holds) {
    std::fprintf(stderr, "wrong result: %s\n", what);
    std::_Exit(1);
  }
}

} // namespace

void count(const Operation &operation) {
  endUnless(operation(), "of the first run");
  countOnce(operation);
}

void countOnce(const Operation &operation) {
  endUnless(kovaCounted(operation), "of the counted run");
}

void require(bool holds, const char *what) {
  endUnless(holds, what);
}

std::string scratchFolder() {
  if (!noPrivateTmp.empty()) {
    std::_Exit(kSkipped);
  }
  return kScratch;
}

void writeFile(const std::string &path, const std::string &text) {
  std::ofstream out(path, std::ios::binary);
  out << text << std::flush;
  require(out.good(), path.c_str());
}

std::string repeated(const std::string &text, std::size_t times) {
  std::string all;
  all.reserve(text.size() * times);
  for (std::size_t i = 0; i < times; ++i) {
    all += text;
  }
  return all;
}

} // namespace KovaCounts

int main() {
  using namespace KovaCounts;
  setUpFiles();
  bool right = true;
  for (const Cases &cases :
       {stringCases(), pathCases(), filterCases(), jsonCases(), optionCases(), sectionCases(),
        platformCases(), processCases(), treeCases(), selfCases()}) {
    right = runCases(cases) && right;
  }
  return right ? 0 : 1;
}
