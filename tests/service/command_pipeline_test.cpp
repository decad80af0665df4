#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"

#include <cerrno>
#include <stdexcept>

using KovaTest::CommandTest;
using KovaTest::Pipe;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

using KOVA::Backup::Service::runPipeline;

class CommandPipeline : public CommandTest {
protected:
  Pipe gate_;
  Pipe held_;
};

} // namespace

TEST_F(CommandPipeline, ConnectsEachOutputToTheNextInput) {
  const std::string text(1000000, 'x');
  const Command first = std::move(helper({"copy"}).input(text));
  const Command second = helper({"copy"});
  const Command third = std::move(helper({"copy"}).capture(Stream::Out, text.size()));
  const std::vector<Result> results = runPipeline({&first, &second, &third});
  ASSERT_EQ(3U, results.size());
  EXPECT_TRUE(results[0].ok());
  EXPECT_TRUE(results[1].ok());
  EXPECT_TRUE(results[2].ok());
  EXPECT_EQ(text, results[2].out.text);
}

TEST_F(CommandPipeline, ReplacesWhatTheCommandsSayOfTheStreamsBetween) {
  const Command first =
      std::move(helper({"flood", "3", "4"}).capture(Stream::Out, 100).capture(Stream::Err, 100));
  const Command second =
      std::move(helper({"copy"}).input("unused").capture(Stream::Out, 100).toFd(Stream::Err, 1));
  const std::vector<Result> results = runPipeline({&first, &second});
  EXPECT_EQ("", results.at(0).out.text);
  EXPECT_EQ("eeee", results.at(0).err.text);
  EXPECT_EQ("ooo", results.at(1).out.text);
}

TEST_F(CommandPipeline, RunsOneCommand) {
  const Command only = std::move(helper({"copy"}).input("x").capture(Stream::Out, 100));
  EXPECT_EQ("x", runPipeline({&only}).at(0).out.text);
}

TEST_F(CommandPipeline, RunsNone) {
  EXPECT_THAT(runPipeline({}), IsEmpty());
}

TEST_F(CommandPipeline, RunsTheSameCommandTwice) {
  const Command copy = std::move(helper({"copy"}).input("x").capture(Stream::Out, 100));
  EXPECT_EQ("x", runPipeline({&copy, &copy}).at(1).out.text);
}

TEST_F(CommandPipeline, ReportsEachEnd) {
  const Command first = given({"exit", "3"});
  const Command second = given({"die", std::to_string(SIGUSR2)});
  const std::vector<Result> results = runPipeline({&first, &second});
  EXPECT_EQ(3, results.at(0).code);
  EXPECT_EQ(End::Signalled, results.at(1).end);
}

TEST_F(CommandPipeline, EndsAWriterWhoseReaderHasEnded) {
  const Command writer = helper({"flood", "10000000", "0"});
  const Command reader = given({"exit", "0"});
  const std::vector<Result> results = runPipeline({&writer, &reader});
  EXPECT_EQ(End::Signalled, results.at(0).end);
  EXPECT_EQ(SIGPIPE, results.at(0).code);
  EXPECT_FALSE(results.at(0).killed);
  EXPECT_TRUE(results.at(1).ok());
}

TEST_F(CommandPipeline, StopsAllAtItsLimit) {
  Command first = helper({"await", "8"});
  Command second = helper({"await", "8"});
  first.passFd(gate_.readEnd(), 8);
  second.passFd(gate_.readEnd(), 8).limit(std::chrono::hours(1));
  const std::vector<Result> results = runPipeline({&first, &second}, Millis(1));
  for (const Result &result : results) {
    EXPECT_TRUE(result.timedOut);
    EXPECT_EQ(SIGTERM, result.code);
  }
}

TEST_F(CommandPipeline, KeepsTheLimitOfACommand) {
  Command first = helper({"await", "8"});
  first.passFd(gate_.readEnd(), 8).limit(Millis(1));
  const Command second = helper({"copy"});
  const std::vector<Result> results = runPipeline({&first, &second}, std::chrono::hours(1));
  EXPECT_TRUE(results.at(0).timedOut);
  EXPECT_TRUE(results.at(1).ok());
}

TEST_F(CommandPipeline, KillsTheOthersWhenOneCannotBeStarted) {
  Command first = helper({"await", "8"});
  first.passFd(gate_.readEnd(), 8).passFd(held_.writeEnd(), 9);
  const Command second({"/nowhere/program"});
  const Command third = given({"exit", "0"});
  const std::vector<Result> results = runPipeline({&first, &second, &third});
  EXPECT_TRUE(results.at(0).killed);
  EXPECT_EQ(SIGKILL, results.at(0).code);
  EXPECT_EQ(End::NotStarted, results.at(1).end);
  EXPECT_EQ(ENOENT, results.at(1).error.code);
  EXPECT_EQ(End::NotStarted, results.at(2).end);
  EXPECT_EQ(ECANCELED, results.at(2).error.code);
  EXPECT_EQ("", held_.readToEnd());
  EXPECT_THAT(log_.take(),
              ElementsAre(notExecuted("/nowhere/program", "execve", "/nowhere/program", ENOENT)));
}

TEST_F(CommandPipeline, KillsAllWhenACallbackThrows) {
  Command first = helper({"await", "8"});
  first.passFd(gate_.readEnd(), 8).passFd(held_.writeEnd(), 9);
  Command second = helper({"copy"});
  second.lines(Stream::Out, [](std::string_view) { throw std::runtime_error("line"); });
  EXPECT_THROW(runPipeline({&first, &second}), std::runtime_error);
  EXPECT_EQ("", held_.readToEnd());
}
