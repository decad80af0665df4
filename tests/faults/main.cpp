// Makes each system call of a scenario that is in the table of calls.cpp fail in turn, for all
// scenarios, and checks what each run leaves.
//
//   kova_faults [--at-least NUMBER] [--kill | --memory] [--verbose] [PART]
//   kova_faults --broken
//
// PART selects the scenarios whose names contain it. --at-least takes an even sample of about that
// many instead of all. --kill sends SIGKILL at each system call instead, --memory makes each
// allocation fail. --broken runs scenarios with a defect each and fails unless each is found.

#include "tests/faults/runner.h"
#include "tests/faults/world.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <iostream>
#include <sched.h>
#include <sstream>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

constexpr int kWorkers = 2;
constexpr std::size_t kShownFindings = 5; // of each scenario and worker

struct Options {
  std::size_t atLeast = 0; // 0 for all
  Mode mode = Mode::Failures;
  bool broken = false;
  bool verbose = false;
  std::string part;
};

struct Count {
  std::size_t made = 0;
  std::size_t wrong = 0;
};

Scenarios scenariosFor(const Options &options) {
  Scenarios all;
  if (options.broken) {
    addBrokenScenarios(all);
  } else {
    addSessionScenarios(all);
    addOptionScenarios(all);
    addTemporaryScenarios(all);
    addServiceScenarios(all);
    addTreeScenarios(all);
    addProcessScenarios(all);
    addProgramScenarios(all);
    addTextScenarios(all);
    addValueScenarios(all);
    addObjectScenarios(all);
    addInquiryScenarios(all);
    addCommandScenarios(all);
    addCommandQueryScenarios(all);
    addCommandRunScenarios(all);
    addExampleScenarios(all);
  }
  all.erase(std::remove_if(all.begin(), all.end(),
                           [&](const Scenario &scenario) {
                             return scenario.name.find(options.part) == std::string::npos;
                           }),
            all.end());
  return all;
}

void show(const Scenario &scenario, const Injection &injection, const Seen &seen,
          const std::vector<std::string> &wrong) {
  std::ostringstream text;
  text << "FOUND in " << scenario.name << ": " << describe(injection, seen) << "\n";
  for (const std::string &sentence : wrong) {
    text << "    " << sentence << "\n";
  }
  for (const auto &[key, value] : seen.said) {
    text << "      said: " << key << "=" << value << "\n";
  }
  for (const std::string &line : seen.log) {
    text << "      log: " << line << "\n";
  }
  if (!seen.messages.empty()) {
    text << "      messages: " << seen.messages << "\n";
  }
  std::cout << text.str() << std::flush;
}

// One scenario with the injections that are due, each worker taking every second one.
class Campaign {
public:
  Campaign(const Scenario &scenario, const Options &options)
      : scenario_(scenario), options_(options), clean_(runScenario(scenario, {})) {
    injections_ = injectionsFor(clean_, options.mode);
  }

  std::size_t size() const { return injections_.size(); }

  // A clean run in which something is wrong is a defect of the scenario.
  bool isClean() const {
    const std::vector<std::string> wrong = assessClean(scenario_, clean_);
    if (!wrong.empty()) {
      show(scenario_, {}, clean_, wrong);
    }
    return wrong.empty();
  }

  // first is the number of injections of the scenarios before, so that the stride is even over all.
  Count run(std::size_t first, std::size_t stride, std::size_t worker) {
    Count count;
    for (std::size_t index = 0; index < injections_.size(); ++index) {
      const std::size_t number = first + index;
      if (number % stride == 0 && (number / stride) % kWorkers == worker) {
        ++count.made;
        count.wrong += assessOne(injections_[index], count.wrong < kShownFindings) ? 0U : 1U;
      }
    }
    return count;
  }

private:
  bool assessOne(const Injection &injection, bool shown) {
    Seen seen = runScenario(scenario_, injection);
    seen.clean = &clean_;
    const std::vector<std::string> wrong = assess(scenario_, seen);
    if (!wrong.empty() && (shown || options_.verbose)) {
      show(scenario_, injection, seen, wrong);
    }
    return wrong.empty();
  }

  const Scenario &scenario_;
  const Options &options_;
  const Seen clean_;
  std::vector<Injection> injections_;
};

bool work(const Options &options, std::size_t worker, std::FILE *results) {
  const Scenarios scenarios = scenariosFor(options);
  std::vector<Campaign> campaigns;
  campaigns.reserve(scenarios.size());
  std::size_t total = 0;
  for (const Scenario &scenario : scenarios) {
    campaigns.emplace_back(scenario, options);
    if (!options.broken && !campaigns.back().isClean()) {
      return false;
    }
    total += campaigns.back().size();
  }
  const std::size_t stride =
      options.atLeast == 0 ? 1 : std::max<std::size_t>(1, total / options.atLeast);
  std::size_t first = 0;
  for (std::size_t index = 0; index < campaigns.size(); ++index) {
    const Count count = campaigns[index].run(first, stride, worker);
    std::fprintf(results, "%zu %zu %zu %zu\n", index, campaigns[index].size(), count.made,
                 count.wrong);
    std::fflush(results); // a child that flushes all its streams would write it again
    first += campaigns[index].size();
  }
  return true;
}

// Runs in a PID namespace of its own where that is possible.
int workInWorld(const Options &options, std::size_t worker, std::FILE *results) {
  const bool isolated = ::unshare(CLONE_NEWPID) == 0;
  const pid_t inner = isolated ? ::fork() : 0;
  if (inner == 0) {
    const std::string why = enterWorld();
    if (!why.empty()) {
      std::cout << "skipped: " << why << std::endl;
      ::_exit(EXIT_FAILURE);
    }
    const bool done = work(options, worker, results);
    std::fflush(results);
    ::_exit(done ? EXIT_SUCCESS : EXIT_FAILURE);
  }
  int status = 0;
  (void)::waitpid(inner, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : EXIT_FAILURE;
}

struct Row {
  std::size_t possible = 0;
  Count count;
};

const char *nameOf(Mode mode) {
  return mode == Mode::Kills ? "kills" : mode == Mode::Memory ? "failed allocations" : "failures";
}

bool report(const Options &options, const std::vector<Row> &rows) {
  const Scenarios scenarios = scenariosFor(options);
  Count all;
  bool asExpected = true;
  for (std::size_t index = 0; index < scenarios.size(); ++index) {
    const Row &row = rows[index];
    std::printf("%-40s %6zu of %6zu, %zu wrong\n", scenarios[index].name.c_str(), row.count.made,
                row.possible, row.count.wrong);
    all.made += row.count.made;
    all.wrong += row.count.wrong;
    asExpected = asExpected && (row.count.wrong > 0) == options.broken;
  }
  std::printf("%s: %zu in %zu scenarios, %zu wrong\n", nameOf(options.mode), all.made,
              scenarios.size(), all.wrong);
  return asExpected && all.made >= options.atLeast && all.made > 0;
}

bool parse(int argc, char **argv, Options &options) {
  for (int index = 1; index < argc; ++index) {
    const std::string word = argv[index];
    if (word == "--at-least" && index + 1 < argc) {
      options.atLeast = std::strtoul(argv[++index], nullptr, 10);
    } else if (word == "--kill") {
      options.mode = Mode::Kills;
    } else if (word == "--memory") {
      options.mode = Mode::Memory;
    } else if (word == "--broken") {
      options.broken = true;
    } else if (word == "--verbose") {
      options.verbose = true;
    } else if (word.rfind("--", 0) == 0) {
      return false;
    } else {
      options.part = word;
    }
  }
  return true;
}

std::vector<Row> readRows(std::FILE *results, std::size_t scenarios) {
  std::vector<Row> rows(scenarios);
  std::rewind(results);
  std::size_t index = 0;
  Row row;
  while (std::fscanf(results, "%zu %zu %zu %zu", &index, &row.possible, &row.count.made,
                     &row.count.wrong) == 4) {
    rows.at(index).possible = row.possible;
    rows.at(index).count.made += row.count.made;
    rows.at(index).count.wrong += row.count.wrong;
  }
  return rows;
}

int runAll(const Options &options) {
  std::FILE *const results = std::tmpfile();
  std::vector<pid_t> workers;
  for (std::size_t worker = 0; worker < kWorkers; ++worker) {
    const pid_t pid = ::fork();
    if (pid == 0) {
      ::_exit(workInWorld(options, worker, results));
    }
    workers.push_back(pid);
  }
  bool done = true;
  for (const pid_t pid : workers) {
    int status = 0;
    (void)::waitpid(pid, &status, 0);
    done = done && WIFEXITED(status) && WEXITSTATUS(status) == EXIT_SUCCESS;
  }
  const bool fine = report(options, readRows(results, scenariosFor(options).size()));
  std::fclose(results);
  return done && fine ? EXIT_SUCCESS : EXIT_FAILURE;
}

} // namespace
} // namespace KovaTest::Faults

int main(int argc, char **argv) {
  KovaTest::Faults::Options options;
  if (!KovaTest::Faults::parse(argc, argv, options)) {
    std::fprintf(stderr, "wrong usage; see the source\n");
    return EXIT_FAILURE;
  }
  const std::string why = KovaTest::Faults::whyNoTraces();
  if (!why.empty()) {
    std::printf("skipped: %s\n", why.c_str());
    return EXIT_SUCCESS;
  }
  return KovaTest::Faults::runAll(options);
}
