// Standard descriptors that the caller has closed, in every combination. What is opened then gets
// such a number, and must neither receive messages nor be taken for a stream.
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/command.h"
#include "kovabackup/subprocess.h"

#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::IsEmpty;

/// The parameter has one bit for each closed descriptor.
class HostileDescriptors : public HostileTest, public testing::WithParamInterface<int> {
protected:
  static void closeThem() {
    for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
      if (isClosed(fd)) {
        ::close(fd);
      }
    }
  }
  static bool isClosed(int fd) { return (GetParam() & (1 << fd)) != 0; }
};

TEST_P(HostileDescriptors, TheCommandMakesASessionOnlyIfItCanPrintTheId) {
  const Outcome outcome = runCommand({"session", "create"}, closeThem);
  EXPECT_EQ(isClosed(STDOUT_FILENO) ? 1 : 0, outcome.exitCode) << outcome;
  EXPECT_EQ(isClosed(STDOUT_FILENO) ? 0U : 1U, namesIn(kSessionRoot).size());
}

TEST_P(HostileDescriptors, TheCommandWritesTheSectionAndNothingElseIntoTheFile) {
  const std::string file = stage() + "/task.conf";
  const Outcome outcome = runCommand({"option", "set", file, "task1", "name", "a"}, closeThem);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
}

TEST_P(HostileDescriptors, ASavedSectionHoldsTheOptionsAlone) {
  const std::string file = stage() + "/task.conf";
  const Outcome outcome = runLibrary(
      [&] {
        OptionMap task;
        return task.optSectionCreate(file, "task", true) && task.optSet("name", "a") &&
               task.optSectionSave() && !task.optSectionLoad(file, "none", -1);
      },
      closeThem);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
}

TEST_P(HostileDescriptors, AChildHasItsThreeDescriptorsAndNoOther) {
  const std::string file = stage() + "/out";
  const Outcome outcome = runLibrary(
      [&] {
        SubProcess command("/bin/sh");
        command.addArgList("-c", "cat; echo said; cd /proc/self/fd && echo [0-9]*", nullptr);
        command.setStdOutput(file, 0600);
        return command.call() == 0;
      },
      closeThem);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("said\n0 1 2 3\n", readFile(file)) << "3 is the shell's own, of the folder";
  EXPECT_THAT(outcome.log, IsEmpty());
}

TEST_P(HostileDescriptors, TheServicesCommandCapturesBothStreams) {
  const Outcome outcome = runLibrary(
      [] {
        Service::Command command({"/bin/sh", "-c", "cat; echo wrong >&2"});
        command.input("in").capture(Service::Stream::Out, 100).capture(Service::Stream::Err, 100);
        const Service::Result result = command.run();
        return result.ok() && result.out.text == "in" && result.err.text == "wrong\n";
      },
      closeThem);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.log, IsEmpty());
}

TEST_P(HostileDescriptors, ACommandThatIsRunSaysAsMuchAsItCan) {
  const Outcome outcome = runCommand(
      {"run", "--stderr", stage() + "/err", "--", "sh", "-c", "echo out; echo err >&2"}, closeThem);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(readFile(stage() + "/err"), testing::EndsWith("err\n"));
  EXPECT_EQ(isClosed(STDOUT_FILENO) ? "" : "out\n", outcome.out);
  EXPECT_EQ("", outcome.messages);
}

INSTANTIATE_TEST_SUITE_P(Closed, HostileDescriptors, testing::Range(1, 8));

} // namespace
