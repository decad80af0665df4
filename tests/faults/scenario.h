#ifndef KOVABACKUP_TESTS_FAULTS_SCENARIO_H
#define KOVABACKUP_TESTS_FAULTS_SCENARIO_H

/// @file A scenario: something that users do, and what must hold afterwards whatever failed.
///
///     prepare   what is on the disk before; runs in a process of its own
///     run       what users do; in the traced process. It says (report.h) what the library
///               reported, and makes no system calls of its own
///     check     compares what was said with the disk
///
/// A scenario of a program has arguments. If it has run, too, that prepares the process in which
/// the program then runs, and nothing fails in it.

#include "tests/faults/tracer.h"
#include "tests/support/findings.h"

#include <functional>
#include <map>
#include <string>
#include <vector>

namespace KovaTest::Faults {

/// What one run has left, seen from outside.
struct Seen {
  Trace trace;
  std::map<std::string, std::string> said;   ///< see report.h
  std::vector<std::string> log;              ///< lines of the system log
  std::map<std::string, std::string> before; ///< the disk after prepare
  std::map<std::string, std::string> disk;   ///< path -> content of all files, "" for folders
  std::string out;                           ///< of the program
  std::string messages;                      ///< its standard error
  int exitCode = -1;                         ///< of the program; -1 when a signal ended it
  int allocations = 0;                       ///< that were counted
  int kept = 0;                              ///< of them and others, not released at the end
  bool prepared = false;                     ///< whether prepare came to its end
  const Seen *clean = nullptr;               ///< the run in which nothing failed

  bool killed() const { return trace.killed; }
  /// Whether the library said so; false when it was not asked, or was killed before.
  bool isTrue(const std::string &key) const { return valueOf(key) == "true"; }
  bool isFalse(const std::string &key) const { return valueOf(key) == "false"; }
  std::string valueOf(const std::string &key) const;
  bool exists(const std::string &path) const { return disk.count(path) != 0; }
  std::string contentOf(const std::string &path) const;
  /// The paths on the disk that match a pattern of fnmatch(3), in which "*" stays in one folder.
  std::vector<std::string> matching(const std::string &pattern) const;
  /// Whether the call that failed is one of those, each between spaces.
  bool failedIn(const std::string &calls) const;
};

struct Scenario {
  std::string name;
  std::function<void()> prepare;
  std::function<void()> run;
  std::function<void(const Seen &, Findings &)> check;
  std::vector<std::string> mayStay;        ///< patterns of what is documented to stay
  std::vector<std::string> arguments = {}; ///< of the program
  std::string input = "";                  ///< its standard input
  int exitCode = 0;                        ///< of the program when nothing fails
  bool keepsDescriptors = false;           ///< hands one to its caller
  /// Calls after whose failure a descriptor is documented to stay open.
  std::string keepsDescriptorsIf = "";
  std::string program = KOVA_TOOL_PATH;
  std::vector<std::string> variables = {}; ///< NAME=VALUE, of the program
  int mostExitCode = 4;                    ///< the highest that is documented
  bool mayAbort = false; ///< where memory runs out, as outside main, where nothing can catch it
};

/// Calls after whose failure a removal may end early without a word, as path_util.h and
/// temp_manager.h say.
constexpr const char *kWalkCalls = "open openat newfstatat fstat lstat stat getdents64 mmap brk "
                                   "close fcntl dup readlink read statx memory";

using Scenarios = std::vector<Scenario>;

void addSessionScenarios(Scenarios &all);
void addOptionScenarios(Scenarios &all);
void addTemporaryScenarios(Scenarios &all);
void addServiceScenarios(Scenarios &all);
void addTreeScenarios(Scenarios &all);
void addProcessScenarios(Scenarios &all);
void addProgramScenarios(Scenarios &all);
void addTextScenarios(Scenarios &all);
void addValueScenarios(Scenarios &all);
void addObjectScenarios(Scenarios &all);
void addInquiryScenarios(Scenarios &all);
void addCommandScenarios(Scenarios &all);
void addCommandQueryScenarios(Scenarios &all);
void addCommandRunScenarios(Scenarios &all);
/// None where the example service is not built.
void addExampleScenarios(Scenarios &all);
/// Scenarios with a defect each, which must be found: the tests of the test.
void addBrokenScenarios(Scenarios &all);

} // namespace KovaTest::Faults

#endif
