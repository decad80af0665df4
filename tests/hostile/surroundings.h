#ifndef KOVABACKUP_TESTS_HOSTILE_SURROUNDINGS_H
#define KOVABACKUP_TESTS_HOSTILE_SURROUNDINGS_H

/// @file Complete operations in hostile surroundings: a machine of its own for each test, and
/// processes that spoil their surroundings before they run the command or use the library.
///
///     TEST_F(HostileLimits, NoFileMayGrow) {
///       const Outcome outcome = runCommand({"session", "create"}, [] { limit(RLIMIT_FSIZE, 0); });
///       KOVA_SKIP_WHERE_LACKING(outcome);
///       EXPECT_EQ(0, outcome.exitCode) << outcome;
///     }
///
/// What a test mounts, replaces or creates in its own process is gone at its end as well.

#include "tests/support/files.h"

#include <functional>
#include <gmock/gmock.h>
#include <ostream>
#include <set>
#include <stdexcept>
#include <string>
#include <sys/types.h>
#include <vector>

namespace KovaTest::Hostile {

/// Thrown where the surroundings cannot be made here, because a privilege or a feature of the
/// kernel is missing.
class Lacking : public std::runtime_error {
public:
  using std::runtime_error::runtime_error;
};

/// Throws Lacking with what and errno's text unless done is true.
void need(bool done, const std::string &what);

/// What became of an operation.
struct Outcome {
  std::string lacking;          ///< why its surroundings could not be made; "" when they were
  int exitCode = -1;            ///< -1 when a signal ended it
  int signal = 0;               ///< the signal that ended it
  std::string out;              ///< standard output
  std::string messages;         ///< standard error
  std::vector<std::string> log; ///< of the library: "[err] session:99 ...", without PIDs
};

std::ostream &operator<<(std::ostream &os, const Outcome &outcome);

using Step = std::function<void()>;

/// A program to run. What is empty takes its usual value.
struct Program {
  std::vector<std::string> words;                 ///< its arguments, from argv[0]
  std::vector<std::string> environment = usual(); ///< "NAME=VALUE"
  std::string path = command();                   ///< of its file
  std::string input = {};                         ///< on standard input

  /// The path of kovabackup.
  static std::string command();
  /// PATH, and where the configuration of the platform is.
  static std::vector<std::string> usual();
};

/// Runs a program in a child, in which surroundings has been called.
Outcome runProgram(const Program &program, const Step &surroundings = {});

/// Runs the command kovabackup.
Outcome runCommand(std::vector<std::string> arguments, const Step &surroundings = {});

/// Calls the operation, which uses the library, in a child in which surroundings has been called.
/// The exit code is 0 when it returns true, else 1. A descriptor that it leaves open, and a child
/// that it leaves, fail the test.
Outcome runLibrary(const std::function<bool()> &operation, const Step &surroundings = {});

/// A machine of its own: mounts, an empty /tmp, and outside it a stage with one volume, the
/// platform's configuration and the folder of its key.
class HostileTest : public testing::Test {
protected:
  void SetUp() override;
  void TearDown() override;

  /// The paths below /tmp and the stage that did not exist at the beginning.
  std::set<std::string> left() const;

private:
  int machine_ = -1; // the mount namespace of the test program
  std::set<std::string> before_;
};

/// A folder outside /tmp for the files of a test.
const std::string &stage();
/// The volume in it, the configuration and the key file.
std::string volume();
std::string configuration();
std::string keyFile();

constexpr const char *kIpcRoot = "/tmp/kovabackup";
constexpr const char *kSessionRoot = "/tmp/kovabackup/session";
constexpr const char *kLockFolder = "/tmp/kovabackup/lock";
constexpr uid_t kNobody = 65534;

/// Steps in a child. Each throws Lacking when it cannot be taken.
void limit(int resource, unsigned long most);
void becomeNobody();
void mountOn(const std::string &target, const std::string &options);
void bindOn(const std::string &source, const std::string &target);
void makeReadOnly(const std::string &target);

} // namespace KovaTest::Hostile

/// Skips the test where the surroundings could not be made.
#define KOVA_SKIP_WHERE_LACKING(outcome)                                                           \
  if (!(outcome).lacking.empty())                                                                  \
  GTEST_SKIP() << "skipped: " << (outcome).lacking

/// Skips the test where a step that its own process takes throws Lacking.
#define KOVA_OR_SKIP(step)                                                                         \
  try {                                                                                            \
    step;                                                                                          \
  } catch (const KovaTest::Hostile::Lacking &why) {                                                \
    GTEST_SKIP() << "skipped: " << why.what();                                                     \
  }

#endif
