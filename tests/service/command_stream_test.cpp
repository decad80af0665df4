#include "kovabackup/service/command.h"

#include "tests/service/command_fixture.h"

#include <cerrno>
#include <fstream>
#include <random>
#include <sys/stat.h>

using KovaTest::CommandTest;
using KovaTest::kHelper;
using KovaTest::Pipe;
using KovaTest::readFile;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class CommandStreams : public CommandTest {
protected:
  /// What the function of lines receives for a text.
  std::vector<std::string> linesOf(const std::string &text, std::size_t longest,
                                   std::uint64_t &dropped) {
    std::vector<std::string> lines;
    Command command = helper({"copy"});
    command.input(text).lines(
        Stream::Out, [&lines](std::string_view line) { lines.emplace_back(line); }, longest);
    const Result result = command.run();
    EXPECT_TRUE(result.ok());
    EXPECT_EQ("", result.out.text);
    dropped = result.out.dropped;
    return lines;
  }

  std::vector<std::string> linesOf(const std::string &text, std::size_t longest = 65536) {
    std::uint64_t dropped = 0;
    return linesOf(text, longest, dropped);
  }

  mode_t modeOf(const std::string &path) {
    struct stat info = {};
    EXPECT_EQ(0, ::stat(path.c_str(), &info));
    return info.st_mode & 07777;
  }
};

// What lines promises, byte by byte.
std::vector<std::string> plainLines(const std::string &text, std::size_t longest,
                                    std::uint64_t &dropped) {
  std::vector<std::string> lines;
  bool open = false;
  dropped = 0;
  for (const char c : text) {
    if (!open) {
      lines.emplace_back();
      open = true;
    }
    if (c == '\n') {
      open = false;
    } else if (lines.back().size() < longest) {
      lines.back() += c;
    } else {
      ++dropped;
    }
  }
  return lines;
}

} // namespace

TEST_F(CommandStreams, CapturesTheErrorsAlone) {
  const Result result = helper({"flood", "0", "5"}).capture(Stream::Err, 10).run();
  EXPECT_EQ("eeeee", result.err.text);
  EXPECT_EQ("", result.out.text);
}

TEST_F(CommandStreams, CapturesBothStreamsWithoutDeadlock) {
  const std::size_t size = 3000000; // more than any pipe holds
  Command command = helper({"flood", std::to_string(size), std::to_string(size)});
  const Result result = command.capture(Stream::Out, size).capture(Stream::Err, size).run();
  EXPECT_TRUE(result.ok());
  EXPECT_EQ(std::string(size, 'o'), result.out.text);
  EXPECT_EQ(std::string(size, 'e'), result.err.text);
  EXPECT_EQ(0U, result.out.dropped + result.err.dropped);
}

TEST_F(CommandStreams, DropsAndCountsWhatIsBeyondTheLimit) {
  Command command = helper({"flood", "200000", "5000"});
  const Result result = command.capture(Stream::Out, 70001).capture(Stream::Err, 0).run();
  EXPECT_TRUE(result.ok());
  EXPECT_EQ(std::string(70001, 'o'), result.out.text);
  EXPECT_EQ(129999U, result.out.dropped);
  EXPECT_EQ("", result.err.text);
  EXPECT_EQ(5000U, result.err.dropped);
}

TEST_F(CommandStreams, CapturesNothingUnasked) {
  const Result result = helper({"flood", "1000", "1000"}).run();
  EXPECT_TRUE(result.ok());
  EXPECT_EQ("", result.out.text + result.err.text);
  EXPECT_EQ(0U, result.out.dropped + result.err.dropped);
}

TEST_F(CommandStreams, KeepsTheOutputOfACommandThatFails) {
  Pipe gate;
  gate.closeWriteEnd();
  const Result result =
      helper({"await", "8"}).passFd(gate.readEnd(), 8).capture(Stream::Out, 100).run();
  EXPECT_EQ(5, result.code);
  EXPECT_EQ("ready\n", result.out.text);
}

TEST_F(CommandStreams, DoesNotWaitForThoseThatHoldTheStreams) {
  Pipe gate;
  Pipe held;
  Command command = helper({"leave", "8"});
  command.passFd(gate.readEnd(), 8).passFd(held.writeEnd(), 9).capture(Stream::Out, 100);
  const Result result = command.run(); // although the gate is still shut
  EXPECT_TRUE(result.ok());
  EXPECT_EQ("left\n", result.out.text);
  gate.closeWriteEnd();
  EXPECT_EQ("", held.readToEnd());
}

TEST_F(CommandStreams, DoesNotReadForEverWhatOthersWrite) {
  Pipe held;
  Command command = helper({"drown", "9"});
  const Result result = command.passFd(held.writeEnd(), 9).capture(Stream::Out, 1000).run();
  EXPECT_TRUE(result.ok());
  EXPECT_GE(result.out.text.size() + result.out.dropped, 1000U);
  EXPECT_EQ("", held.readToEnd()) << "the writer ends once nothing reads";
}

TEST_F(CommandStreams, HandsOnLines) {
  EXPECT_THAT(linesOf("one\n\nthree\n"), ElementsAre("one", "", "three"));
  EXPECT_THAT(linesOf("one\ntwo"), ElementsAre("one", "two"));
  EXPECT_THAT(linesOf("\n"), ElementsAre(""));
  EXPECT_THAT(linesOf(""), IsEmpty());
  EXPECT_THAT(linesOf(std::string("a\0b\n", 4)), ElementsAre(std::string("a\0b", 3)));
}

TEST_F(CommandStreams, CutsLinesThatAreTooLong) {
  std::uint64_t dropped = 0;
  EXPECT_THAT(linesOf("123456\n1234\n12345", 4, dropped), ElementsAre("1234", "1234", "1234"));
  EXPECT_EQ(3U, dropped);
  EXPECT_THAT(linesOf("ab\n\n", 0, dropped), ElementsAre("", ""));
  EXPECT_EQ(2U, dropped);
}

TEST_F(CommandStreams, CutsLinesAsAPlainTranscriptionDoes) {
  const unsigned seed = std::random_device()();
  SCOPED_TRACE(testing::Message() << "seed " << seed);
  std::minstd_rand random(seed);
  for (int round = 0; round < 30; ++round) {
    std::string text;
    const std::size_t size = random() % 200000;
    const auto oneNewlineIn = 1 + random() % 2000;
    while (text.size() < size) {
      text += random() % oneNewlineIn == 0 ? '\n' : static_cast<char>('a' + random() % 26);
    }
    const std::size_t longest = random() % 3000;
    std::uint64_t expectedDropped = 0;
    std::uint64_t dropped = 0;
    const auto expected = plainLines(text, longest, expectedDropped);
    EXPECT_EQ(expected, linesOf(text, longest, dropped));
    EXPECT_EQ(expectedDropped, dropped);
  }
}

TEST_F(CommandStreams, HandsOnLinesWhileTheCommandRuns) {
  Pipe gate;
  Command command = helper({"await", "8"});
  command.passFd(gate.readEnd(), 8);
  command.lines(Stream::Out, [&gate](std::string_view) { gate.closeWriteEnd(); });
  EXPECT_EQ(5, command.run().code) << "the command goes on only after its line was read";
}

TEST_F(CommandStreams, ConnectsToADescriptor) {
  Pipe pipe;
  EXPECT_TRUE(helper({"copy"}).input("text").toFd(Stream::Out, pipe.writeEnd()).run().ok());
  EXPECT_EQ("text", pipe.readToEnd());
}

TEST_F(CommandStreams, ConnectsErrorsToWhereverOutputGoes) {
  Command command = helper({"flood", "3", "3"});
  EXPECT_EQ("oooeee", command.capture(Stream::Out, 10).toFd(Stream::Err, 1).run().out.text);
}

TEST_F(CommandStreams, TakesANegativeDescriptorForDevNull) {
  Command command = helper({"copy"});
  command.input("text").inputFd(-1).capture(Stream::Out, 10).toFd(Stream::Err, -1);
  EXPECT_EQ("", command.run().out.text);
}

TEST_F(CommandStreams, SaysWhichStreamIsNotOpen) {
  const Result result = given({"exit", "0"}).toFd(Stream::Err, 1000).run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(EBADF, result.error.code);
  EXPECT_THAT(log_.take(), ElementsAre(notExecuted(kHelper, "dup2", "1000", EBADF)));
}

TEST_F(CommandStreams, AppendsToAFile) {
  const std::string path = folder_ / "out";
  Command command = helper({"copy"});
  command.input("one\n").toFile(Stream::Out, path);
  EXPECT_TRUE(command.run().ok());
  EXPECT_TRUE(command.run().ok());
  EXPECT_EQ("one\none\n", readFile(path));
  EXPECT_EQ(0600U, modeOf(path));
}

TEST_F(CommandStreams, GivesAFileItsMode) {
  const std::string path = folder_ / "out";
  EXPECT_TRUE(helper({"copy"}).toFile(Stream::Out, path, 0666).run().ok());
  EXPECT_EQ(0666U, modeOf(path));
  EXPECT_TRUE(helper({"copy"}).toFile(Stream::Out, path).run().ok());
  EXPECT_EQ(0666U, modeOf(path)) << "0 leaves it alone";
}

TEST_F(CommandStreams, TakesARelativeFileFromTheRootFolder) {
  const std::string path = folder_ / "out";
  EXPECT_TRUE(helper({"copy"}).input("x").toFile(Stream::Out, path.substr(1)).run().ok());
  EXPECT_EQ("x", readFile(path));
}

TEST_F(CommandStreams, TakesAnEmptyPathForDevNull) {
  EXPECT_TRUE(helper({"flood", "10", "10"}).toFile(Stream::Out, "").run().ok());
}

TEST_F(CommandStreams, SaysWhichFileCannotBeOpened) {
  const Result result = helper({"copy"}).toFile(Stream::Err, "/nowhere/file").run();
  EXPECT_EQ(End::NotStarted, result.end);
  EXPECT_EQ(127, result.code);
  EXPECT_EQ("open", result.error.step);
  EXPECT_EQ("/nowhere/file", result.error.path);
  EXPECT_THAT(log_.take(),
              ElementsAre(notStarted(KovaTest::kCommandHelper, "open", "/nowhere/file", ENOENT)));
}

TEST_F(CommandStreams, ReadsAText) {
  std::string text(1000000, 'x');
  text += std::string("\0end", 4);
  const Result result = helper({"copy"}).input(text).capture(Stream::Out, 2000000).run();
  EXPECT_EQ(text, result.out.text);
}

TEST_F(CommandStreams, ReadsTheTextFromItsBeginningEachTime) {
  Command command = helper({"copy"});
  command.input("text").capture(Stream::Out, 10);
  EXPECT_EQ("text", command.run().out.text);
  EXPECT_EQ("text", command.run().out.text);
}

TEST_F(CommandStreams, ProtectsTheText) {
  const Result result = helper({"seals"}).input("text").capture(Stream::Out, 100).run();
  EXPECT_THAT(result.out.text, testing::EndsWith(" refused\n"));
  const int seals = std::stoi(result.out.text);
  const int expected = F_SEAL_WRITE | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL;
  EXPECT_EQ(expected, seals & expected);
}

TEST_F(CommandStreams, TakesNoHarmFromATextThatIsNotRead) {
  EXPECT_TRUE(given({"exit", "0"}).input(std::string(1000000, 'x')).run().ok());
}

TEST_F(CommandStreams, ReadsADescriptor) {
  std::ofstream(folder_ / "in") << "from a file";
  const int fd = ::open((folder_ / "in").c_str(), O_RDONLY | O_CLOEXEC);
  EXPECT_EQ("from a file", helper({"copy"}).inputFd(fd).capture(Stream::Out, 100).run().out.text);
  EXPECT_EQ(11, ::lseek(fd, 0, SEEK_CUR)) << "the offset is shared";
  ::close(fd);
}

TEST_F(CommandStreams, GivesTheTextsOnlyOnce) {
  Running running = helper({"flood", "10", "10"}).capture(Stream::Out, 100).start();
  EXPECT_EQ(10U, running.wait().out.text.size());
  const Result again = running.wait();
  EXPECT_TRUE(again.ok());
  EXPECT_EQ("", again.out.text);
}
