// Describing a command. subprocess_child_test shows the effect of redirections and variables.

#include "kovabackup/subprocess.h"

#include "tests/proc/launch_fixture.h"

#include <fcntl.h>
#include <list>
#include <stdexcept>
#include <string>
#include <type_traits>
#include <vector>

using namespace KovaTest;
using KOVA::Backup::SubProcess;
using testing::StartsWith;

namespace {
using Strings = std::vector<std::string>;
}

TEST(SubProcessText, JoinsTheArgumentsWithSingleSpaces) {
  const std::vector<std::pair<Strings, std::string>> commands = {
      {{"/bin/echo"}, "/bin/echo"},
      {{"/bin/tar", "-cf", "a b.tar"}, "/bin/tar -cf a b.tar"},
      {{""}, ""},
      {{"", ""}, " "},
      {{"a", "", "b"}, "a  b"},
      {{" a ", "'b'", "\"c\"", "\n"}, " a  'b' \"c\" \n"},
      {{"%s", "%n"}, "%s %n"},
  };
  for (const auto &[args, text] : commands) {
    EXPECT_EQ(text, SubProcess(args).toString());
  }
}

namespace {
void expectNoText(const SubProcess &command) {
  try {
    (void)command.toString();
    ADD_FAILURE() << "nothing was thrown";
  } catch (const std::out_of_range &error) {
    EXPECT_THAT(error.what(), StartsWith("basic_string::substr"));
  }
}
} // namespace

TEST(SubProcessText, ThrowsForACommandWithoutArguments) {
  expectNoText(SubProcess(Strings()));
  expectNoText(SubProcess(std::list<std::string>()));
}

TEST(SubProcessText, ShowsNeitherVariablesNorRedirections) {
  SubProcess command("/bin/true");
  command.setEnv("NAME", "value");
  command.setStdOutput("/tmp/out", 0600);
  command.setStdError(7);
  EXPECT_EQ("/bin/true", command.toString());
}

TEST(SubProcessArguments, ComeFromEachConstructor) {
  const char *chars = "/bin/a b";
  EXPECT_EQ("/bin/a b", SubProcess(chars).toString());
  EXPECT_EQ("/bin/a b", SubProcess(std::string(chars)).toString());
  EXPECT_EQ("x y z", SubProcess(std::list<std::string>{"x", "y", "z"}).toString());
  EXPECT_EQ("x y z", SubProcess(Strings{"x", "y", "z"}).toString());
}

TEST(SubProcessArguments, AreCopiesOfTheCallers) {
  Strings args = {"/bin/a", "b"};
  const SubProcess command(args);
  args[1] = "changed";
  EXPECT_EQ("/bin/a b", command.toString());
}

TEST(SubProcessArguments, AreAppendedInOrder) {
  SubProcess command("p");
  command.addArg("one");
  command.addArg("");
  command.addArg("two words");
  EXPECT_EQ("p one  two words", command.toString());
}

TEST(SubProcessArguments, CanFillAnEmptyCommand) {
  SubProcess command{Strings()};
  command.addArg("/bin/late");
  EXPECT_EQ("/bin/late", command.toString());
}

TEST(SubProcessArgumentList, EndsAtTheFirstNullPointer) {
  SubProcess command("p");
  command.addArgList("a", "b", nullptr);
  EXPECT_EQ("p a b", command.toString());
  command.addArgList("c", nullptr);
  EXPECT_EQ("p a b c", command.toString());
  const char *none = nullptr;
  command.addArgList("d", none, "e", nullptr);
  EXPECT_EQ("p a b c d", command.toString());
}

TEST(SubProcessArgumentList, AppendsNothingWhenTheFirstIsNull) {
  SubProcess command("p");
  command.addArgList(nullptr);
  EXPECT_EQ("p", command.toString());
  const char *none = nullptr;
  command.addArgList(none, "a", nullptr);
  EXPECT_EQ("p", command.toString());
}

TEST(SubProcessArgumentList, TakesManyArguments) {
  SubProcess command("p");
  command.addArgList("1", "2", "3", "4", "5", "6", "7", "8", "9", "10", "11", "12", nullptr);
  EXPECT_EQ("p 1 2 3 4 5 6 7 8 9 10 11 12", command.toString());
}

TEST(SubProcessFormatArgument, IsFormattedAndNeverSplit) {
  SubProcess command("p");
  command.addFormatArg("--%s=%d of %5.1f%%", "part one", 3, 12.25);
  command.addFormatArg("%s", "");
  EXPECT_EQ("p --part one=3 of  12.2% ", command.toString());
}

TEST(SubProcessFormatArgument, MayBeLong) {
  for (const std::size_t length : {127U, 128U, 129U, 100000U}) {
    const std::string text(length, 'x');
    SubProcess command("p");
    command.addFormatArg("%s", text.c_str());
    EXPECT_EQ("p " + text, command.toString());
  }
}

TEST(SubProcessObject, IsNotCopied) {
  EXPECT_FALSE(std::is_copy_constructible<SubProcess>::value);
  EXPECT_FALSE(std::is_copy_assignable<SubProcess>::value);
  EXPECT_EQ(sizeof(void *), sizeof(SubProcess));
}

class SubProcessDescription : public Launch {};

TEST_F(SubProcessDescription, PassesTheArgumentsOneByOne) {
  const Strings hostile = {"two words", "", "%s%n", "\"quoted\"", "$PATH", "*", "-", "\xff\xfe"};
  const Report report = reportWith([&](SubProcess &command) {
    command.addArg("0");
    for (const std::string &arg : hostile) {
      command.addArg(arg);
    }
    command.addFormatArg("%d %s", 5, "five");
  });
  for (std::size_t i = 0; i < hostile.size(); ++i) {
    EXPECT_EQ(hostile[i], report.at("arg " + std::to_string(i + 4)));
  }
  EXPECT_EQ("5 five", report.at("arg " + std::to_string(hostile.size() + 4)));
}

TEST_F(SubProcessDescription, PassesAnArgumentUpToANulByte) {
  const std::string withNul("before\0after", 12);
  const Report report = reportWith([&](SubProcess &command) {
    command.addArg("0");
    command.addArg(withNul);
    command.addArg("next");
    EXPECT_THAT(command.toString(), testing::HasSubstr(withNul + " next"));
  });
  EXPECT_EQ("before", report.at("arg 4"));
  EXPECT_EQ("next", report.at("arg 5"));
}

TEST_F(SubProcessDescription, KeepsTheLastValueOfAVariable) {
  const Report report = reportWith([](SubProcess &command) {
    command.setEnv("NAME", "first");
    command.setEnv("OTHER", "");
    command.setEnv("NAME", "second");
  });
  EXPECT_EQ("second", report.at("env NAME"));
  EXPECT_EQ("", report.at("env OTHER"));
}

TEST_F(SubProcessDescription, KeepsTheLastRedirectionWhole) {
  const int fd = ::open(file("descriptor").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  const std::string path = file("path");
  // A descriptor after a file: the file is never created.
  Report report = reportWith([&](SubProcess &command) {
    command.setStdOutput(path, 0666);
    command.setStdError(path, 0666);
    command.setStdOutput(fd);
    command.setStdError(fd);
  });
  EXPECT_EQ(file("descriptor"), report.at("fd 1"));
  EXPECT_EQ(file("descriptor"), report.at("fd 2"));
  EXPECT_NE(0, ::access(path.c_str(), F_OK));
  // A file after a descriptor.
  report = reportWith([&](SubProcess &command) {
    command.setStdOutput(fd);
    command.setStdError(fd);
    command.setStdOutput(path, 0);
    command.setStdError(path, 0);
  });
  EXPECT_EQ(path, report.at("fd 1"));
  EXPECT_EQ(path, report.at("fd 2"));
  // Nothing after either of them.
  report = reportWith([&](SubProcess &command) {
    command.setStdOutput(fd);
    command.setStdError(path, 0);
    command.setStdOutput(-1);
    command.setStdError(-1);
  });
  EXPECT_EQ("/dev/null", report.at("fd 1"));
  EXPECT_EQ("/dev/null", report.at("fd 2"));
  report = reportWith([&](SubProcess &command) {
    command.setStdOutput(path, 0);
    command.setStdError(fd);
    command.setStdOutput(-1);
    command.setStdError(-1);
  });
  EXPECT_EQ("/dev/null", report.at("fd 1"));
  EXPECT_EQ("/dev/null", report.at("fd 2"));
  ::close(fd);
}

TEST_F(SubProcessDescription, DoesNotOwnTheDescriptors) {
  const int fd = ::open(file("descriptor").c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
  {
    SubProcess command(helperArgs({"exit", "0"}));
    command.setStdOutput(fd);
    EXPECT_EQ(0, command.call());
  }
  EXPECT_EQ(0, ::close(fd));
}

TEST_F(SubProcessDescription, RunsAnyNumberOfTimes) {
  SubProcess command(helperArgs({"report", file("report")}));
  command.setEnv("NAME", "value");
  for (int i = 0; i < 3; ++i) {
    EXPECT_EQ(0, command.call());
    EXPECT_EQ("value", parseReport(readFile(file("report"))).at("env NAME"));
  }
  command.addArg("5");
  int status = command.call();
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_EQ(5, WEXITSTATUS(status));
}
