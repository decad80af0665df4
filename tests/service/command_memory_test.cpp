// Memory runs out at every allocation of Command in turn.

#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"

using KovaTest::CommandTest;
using KovaTest::countOpenDescriptors;
using KovaTest::forEachAllocation;

namespace {

class CommandMemory : public CommandTest {
protected:
  /// Runs an operation with every allocation failing in turn; afterwards nothing may be left.
  static void expectNothingLeft(const std::function<void()> &operation) {
    const int before = countOpenDescriptors();
    forEachAllocation(operation, [before](bool) {
      EXPECT_EQ(before, countOpenDescriptors());
      siginfo_t info;
      EXPECT_EQ(-1, ::waitid(P_ALL, 0, &info, WEXITED | WNOHANG | WNOWAIT));
      EXPECT_EQ(ECHILD, errno);
    });
  }
};

} // namespace

TEST_F(CommandMemory, LeavesNothingOfACommand) {
  std::string text(100000, 'x');
  expectNothingLeft([&] {
    Command command = helper({"copy"});
    command.env("A_NAME_THAT_IS_LONG", "a value that is not short").input(text);
    command.capture(Stream::Out, 70000).toFd(Stream::Err, 1).passFd(0, 7);
    const Result result = command.run();
    EXPECT_TRUE(result.ok());
    EXPECT_EQ(70000U, result.out.text.size());
  });
}

TEST_F(CommandMemory, LeavesNothingOfLines) {
  expectNothingLeft([] {
    std::size_t lines = 0;
    Command command = helper({"numbers", "20000"});
    command.lines(Stream::Out, [&lines](std::string_view) { ++lines; });
    EXPECT_TRUE(command.run().ok());
    EXPECT_EQ(20000U, lines);
  });
}

TEST_F(CommandMemory, LeavesNothingOfSeveral) {
  expectNothingLeft([] {
    Command command = helper({"copy"});
    command.input("text").capture(Stream::Out, 10);
    Running first = command.start();
    Running second = command.start();
    const std::size_t ended = KOVA::Backup::Service::Running::waitAny({&first, &second});
    EXPECT_LT(ended, 2U);
    EXPECT_TRUE(first.wait().ok());
    EXPECT_TRUE(second.wait().ok());
  });
}

TEST_F(CommandMemory, LeavesNothingOfAPipeline) {
  expectNothingLeft([] {
    Command first = helper({"copy"});
    Command second = helper({"copy"});
    first.input("text");
    second.capture(Stream::Out, 10);
    const auto results = KOVA::Backup::Service::runPipeline({&first, &second});
    EXPECT_EQ("text", results.at(1).out.text);
  });
}

TEST_F(CommandMemory, LeavesNothingOfACommandThatIsNotStarted) {
  expectNothingLeft(
      [] { EXPECT_FALSE(Command({"/nowhere/a/program/with/a/long/path"}).run().ok()); });
  EXPECT_FALSE(log_.take().empty());
}
