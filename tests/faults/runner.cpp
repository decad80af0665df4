#include "tests/faults/runner.h"

#include "tests/faults/allocations.h"
#include "tests/faults/calls.h"
#include "tests/faults/log_lines.h"
#include "tests/faults/marker.h"
#include "tests/faults/report.h"
#include "tests/faults/world.h"

#include <array>
#include <csignal>
#include <cstring>
#include <fcntl.h>
#include <fnmatch.h>
#include <new>
#include <sstream>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

// Names of temporary files that a killed writer leaves, and that the next one removes.
const std::vector<std::string> kSlots = {std::string(kWork) + "/.*.tmp",
                                         std::string(kWork) + "/*/.*.tmp"};

constexpr const char *kMemoryCalls = "mmap mremap brk memory";

bool prepare(const Scenario &scenario) {
  const pid_t pid = ::fork();
  if (pid == 0) {
    scenario.prepare();
    ::_exit(0);
  }
  int status = -1;
  (void)::waitpid(pid, &status, 0);
  return status == 0;
}

void runInside(const Scenario &scenario) {
  markBegin();
  const int before = liveAllocations();
  countAllocations(true);
  try {
    scenario.run();
    countAllocations(false);
  } catch (const std::bad_alloc &) {
    countAllocations(false);
    say("threw", std::string_view("bad_alloc"));
  } catch (const std::exception &other) {
    countAllocations(false);
    say("threw", std::string_view(other.what()));
  }
  report().kept = liveAllocations() - before;
  markEnd();
}

// The streams of the program.
class Streams {
public:
  explicit Streams(const std::string &input) {
    for (int &fd : fds_) {
      fd = ::memfd_create("stream", MFD_CLOEXEC);
    }
    (void)!::write(fds_[0], input.data(), input.size());
    (void)::lseek(fds_[0], 0, SEEK_SET);
  }
  ~Streams() {
    for (const int fd : fds_) {
      ::close(fd);
    }
  }
  Streams(const Streams &) = delete;
  Streams &operator=(const Streams &) = delete;

  void connect() const {
    for (int number = 0; number < 3; ++number) {
      (void)::dup2(fds_[static_cast<std::size_t>(number)], number);
    }
  }
  std::string content(std::size_t stream) const {
    std::string text(static_cast<std::size_t>(::lseek(fds_[stream], 0, SEEK_END)), '\0');
    (void)!::pread(fds_[stream], text.data(), text.size(), 0);
    return text;
  }

private:
  std::array<int, 3> fds_{};
};

// The pointers that execve requires.
std::vector<char *> pointersTo(std::vector<std::string> &words) {
  std::vector<char *> pointers;
  for (std::string &word : words) {
    pointers.push_back(word.data());
  }
  pointers.push_back(nullptr);
  return pointers;
}

void runProgram(const Scenario &scenario, const Streams &streams) {
  std::vector<std::string> words{scenario.program};
  words.insert(words.end(), scenario.arguments.begin(), scenario.arguments.end());
  std::vector<std::string> variables{
      "PATH=/usr/bin:/bin", "TERM=dumb", "LD_PRELOAD=" KOVA_FAULTS_PRELOAD,
      std::string("KOVA_PLATFORM_CONF=") + std::getenv("KOVA_PLATFORM_CONF"),
      std::string(kReportVariable) + "=" + std::to_string(reportDescriptor())};
  variables.insert(variables.end(), scenario.variables.begin(), scenario.variables.end());
  streams.connect();
  ::execve(scenario.program.c_str(), pointersTo(words).data(), pointersTo(variables).data());
  ::_exit(126);
}

void readSaid(Seen &seen) {
  std::istringstream said(report().said.text());
  for (std::string line; std::getline(said, line);) {
    const std::size_t equals = line.find('=');
    if (equals != std::string::npos) {
      seen.said[line.substr(0, equals)] = line.substr(equals + 1);
    }
  }
  std::istringstream log(report().log.text());
  for (std::string line; std::getline(log, line);) {
    seen.log.push_back(line);
  }
}

bool matchesAny(const std::string &path, const std::vector<std::string> &patterns) {
  for (const std::string &pattern : patterns) {
    if (::fnmatch(pattern.c_str(), path.c_str(), FNM_PATHNAME | FNM_PERIOD) == 0) {
      return true;
    }
  }
  return false;
}

void assessEnd(const Scenario &scenario, const Seen &seen, Findings &findings) {
  findings.expect(!seen.trace.endless, "it does not end");
  if (seen.killed() || seen.trace.endless) {
    return;
  }
  const bool aborted = WIFSIGNALED(seen.trace.status) && WTERMSIG(seen.trace.status) == SIGABRT;
  findings.expect(WIFEXITED(seen.trace.status) ||
                      (aborted && scenario.mayAbort && seen.failedIn(kMemoryCalls)),
                  "a signal ended it: " + std::to_string(WTERMSIG(seen.trace.status)));
  const std::string threw = seen.valueOf("threw");
  findings.expect(threw.empty() || (threw == "bad_alloc" && seen.failedIn(kMemoryCalls)),
                  "it threw " + threw);
  findings.expect(seen.trace.children == 0, "it leaves a child");
  if (scenario.arguments.empty()) {
    findings.expect(seen.trace.leaked.empty() || scenario.keepsDescriptors ||
                        seen.failedIn(scenario.keepsDescriptorsIf),
                    "it leaves open " +
                        (seen.trace.leaked.empty() ? "" : *seen.trace.leaked.begin()));
    findings.expect(seen.trace.executed || seen.trace.signalsBefore == seen.trace.signalsAfter,
                    "masks or handlers differ:\n" + seen.trace.signalsBefore +
                        seen.trace.signalsAfter);
    findings.expect(seen.clean == nullptr || seen.kept <= seen.clean->kept,
                    "memory that is not released: " + std::to_string(seen.kept));
  }
}

void assessDisk(const Scenario &scenario, const Seen &seen, Findings &findings) {
  const bool slotsMayStay = seen.killed() || seen.failedIn("unlink unlinkat");
  for (const auto &entry : seen.disk) {
    const std::string &path = entry.first;
    findings.expect(seen.before.count(path) != 0 ||
                        (seen.clean != nullptr && seen.clean->exists(path)) ||
                        seen.clean == nullptr || matchesAny(path, scenario.mayStay) ||
                        (slotsMayStay && matchesAny(path, kSlots)),
                    "left behind: " + path);
  }
}

void assessProgram(const Scenario &scenario, const Seen &seen, Findings &findings) {
  if (seen.killed()) {
    return;
  }
  findings.expect((seen.exitCode >= 0 && seen.exitCode <= scenario.mostExitCode) ||
                      !WIFEXITED(seen.trace.status), // see assessEnd
                  "exit code " + std::to_string(seen.exitCode));
  findings.expect(seen.exitCode == 0 || seen.exitCode == scenario.exitCode ||
                      !(seen.messages + seen.out).empty() || seen.failedIn("write writev"),
                  "it failed without a word");
}

std::string errnoName(int error) {
  const char *const name = ::strerrorname_np(error);
  return name == nullptr ? std::to_string(error) : name;
}

void addFailures(const Trace &clean, std::vector<Injection> &all) {
  for (std::size_t call = 0; call < clean.calls.size(); ++call) {
    const int at = static_cast<int>(call) + 1;
    for (int variant = 0; variant < clean.variants[call]; ++variant) {
      all.push_back({Manner::Once, at, variant});
      all.push_back({Manner::Lasting, at, variant});
    }
    if (clean.partial[call]) {
      all.push_back({Manner::Partial, at, 0});
    }
    if (clean.interrupts[call]) {
      all.push_back({Manner::Interrupted, at, 0});
    }
  }
}

void resetReport(const Injection &injection) {
  report().said.clear();
  report().log.clear();
  report().allocations = 0;
  report().kept = 0;
  report().failAllocation = isMemory(injection.manner) ? injection.at : 0;
  report().failAfterwards = injection.manner == Manner::OutOfMemory;
}

} // namespace

Seen runScenario(const Scenario &scenario, const Injection &injection) {
  resetWorld();
  Seen seen;
  seen.prepared = prepare(scenario);
  seen.before = readWorld();
  resetReport(injection);
  const bool isProgram = !scenario.arguments.empty();
  const Streams streams(scenario.input);
  seen.trace = trace(
      [&] {
        if (isProgram) {
          if (scenario.run) {
            scenario.run();
          }
          runProgram(scenario, streams);
        } else {
          runInside(scenario);
        }
      },
      injection);
  readSaid(seen);
  seen.allocations = report().allocations;
  seen.kept = report().kept;
  if (isMemory(injection.manner) && seen.allocations >= injection.at) {
    seen.trace.failedCall = kMemory;
    seen.trace.failedErrno = ENOMEM;
  }
  seen.disk = readWorld();
  seen.out = streams.content(1);
  seen.messages = streams.content(2);
  seen.exitCode = WIFEXITED(seen.trace.status) ? WEXITSTATUS(seen.trace.status) : -1;
  return seen;
}

std::vector<std::string> assess(const Scenario &scenario, const Seen &seen) {
  Findings findings;
  findings.expect(seen.prepared, "it could not be prepared");
  assessEnd(scenario, seen, findings);
  assessDisk(scenario, seen, findings);
  if (!scenario.arguments.empty()) {
    assessProgram(scenario, seen, findings);
  }
  for (const std::string &line : seen.log) {
    findings.expect(isKnownLogLine(line), "an unknown log line: " + line);
  }
  scenario.check(seen, findings);
  return findings.list();
}

std::vector<std::string> assessClean(const Scenario &scenario, const Seen &seen) {
  Findings findings;
  for (const std::string &wrong : assess(scenario, seen)) {
    findings.expect(false, wrong);
  }
  findings.expect(seen.valueOf("threw").empty(), "it throws although nothing fails");
  for (const auto &[key, value] : seen.said) {
    findings.expect(value != "false", "nothing fails, but " + key + " is false");
  }
  findings.expect(scenario.arguments.empty() || seen.exitCode == scenario.exitCode,
                  "nothing fails, but the exit code is " + std::to_string(seen.exitCode));
  return findings.list();
}

std::vector<Injection> injectionsFor(const Seen &clean, Mode mode) {
  std::vector<Injection> all;
  if (mode == Mode::Kills) {
    for (int at = 1; at <= clean.trace.mainCalls; ++at) {
      all.push_back({Manner::Killed, at, 0});
    }
  } else if (mode == Mode::Memory) {
    for (int at = 1; at <= clean.allocations; ++at) {
      all.push_back({Manner::NoMemory, at, 0});
      all.push_back({Manner::OutOfMemory, at, 0});
    }
  } else {
    addFailures(clean.trace, all);
  }
  return all;
}

std::string describe(const Injection &injection, const Seen &seen) {
  static const std::map<Manner, std::string> words = {{Manner::None, "nothing"},
                                                      {Manner::Once, "once"},
                                                      {Manner::Lasting, "lastingly"},
                                                      {Manner::Partial, "partly"},
                                                      {Manner::Interrupted, "interrupted"},
                                                      {Manner::Killed, "killed"},
                                                      {Manner::NoMemory, "once"},
                                                      {Manner::OutOfMemory, "lastingly"}};
  return std::string(callName(seen.trace.failedCall)) + " " + errnoName(seen.trace.failedErrno) +
         " " + words.at(injection.manner) + " at call " + std::to_string(injection.at) +
         " variant " + std::to_string(injection.variant);
}

} // namespace KovaTest::Faults
