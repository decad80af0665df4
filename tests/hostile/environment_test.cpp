// Odd environments: nothing at all, folders that are not there, huge ones, odd names of the
// program, and masks for the modes of files.
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/service/run_lock.h"
#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"

#include <clocale>
#include <cstdlib>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

class HostileEnvironment : public HostileTest {
protected:
  static std::string conf() { return "KOVA_PLATFORM_CONF=" + configuration(); }

  static Outcome run(const std::vector<std::string> &arguments,
                     const std::vector<std::string> &environment) {
    Program program{{"kovabackup"}, environment};
    program.words.insert(program.words.end(), arguments.begin(), arguments.end());
    return runProgram(program);
  }

  // A program that says where it was found.
  static void makeProgram(const std::string &folder) {
    ::mkdir(folder.c_str(), 0755);
    const std::string file = writeFile(folder + "/hostile", "#!/bin/sh\necho " + folder + "\n");
    ::chmod(file.c_str(), 0755);
  }
};

TEST_F(HostileEnvironment, WithoutAnyVariableTheCommandWorks) {
  const Outcome outcome = run({"session", "create"}, {});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.out, StartsWith("sess."));
}

TEST_F(HostileEnvironment, WithoutAnyVariableACommandIsFoundInTheUsualFolders) {
  const Outcome outcome = run({"run", "--", "sh", "-c", "exit 5"}, {});
  EXPECT_EQ(5, outcome.exitCode) << outcome;
}

TEST_F(HostileEnvironment, AnEmptyPathMeansTheWorkingFolder) {
  makeProgram(stage() + "/here");
  const ScopedWorkingDir here(stage() + "/here");
  EXPECT_EQ(stage() + "/here\n", run({"run", "--", "hostile"}, {"PATH=", conf()}).out);
}

TEST_F(HostileEnvironment, EmptyComponentsOfThePathMeanTheWorkingFolder) {
  makeProgram(stage() + "/here");
  const ScopedWorkingDir here(stage() + "/here");
  for (const std::string path : {":/none", "/none:", "/none::/none", "."}) {
    const Outcome outcome = run({"run", "--", "hostile"}, {"PATH=" + path, conf()});
    EXPECT_EQ(stage() + "/here\n", outcome.out) << path << "\n" << outcome;
  }
}

TEST_F(HostileEnvironment, APathOfFoldersThatAreNotThereFindsNothing) {
  const Outcome outcome = run({"run", "--", "sh"}, {"PATH=/none:/dev/null:relative", conf()});
  EXPECT_EQ(127, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("not started"));
}

TEST_F(HostileEnvironment, ATempFolderOfTheEnvironmentIsNotUsed) {
  const std::string folder = stage() + "/elsewhere";
  ::mkdir(folder.c_str(), 0777);
  const Outcome outcome =
      run({"session", "create"}, {"PATH=/usr/bin", "TMPDIR=" + folder, "TMP=" + folder, conf()});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(folder), IsEmpty());
}

TEST_F(HostileEnvironment, AHugeEnvironmentIsNoHindrance) {
  std::vector<std::string> environment = {"PATH=/usr/bin:/bin", conf()};
  for (int number = 0; number < 1000; ++number) {
    environment.push_back("V" + std::to_string(number) + "=" + std::string(1000, 'x'));
  }
  const Outcome outcome = run({"run", "--", "env"}, environment);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.out, testing::Not(HasSubstr("V999"))) << "none of it reaches the command";
}

TEST_F(HostileEnvironment, ATerminalThatDoesNotExistChangesNothing) {
  const Outcome outcome =
      run({"session", "list"}, {"TERM=nothing", "COLUMNS=-1", "LINES=x", conf()});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("", outcome.out);
}

TEST_F(HostileEnvironment, ALocaleThatDoesNotExistChangesNothing) {
  const Outcome outcome =
      run({"session", "list", "--json"}, {"LC_ALL=xx_YY.nothing", "LANG=/etc/passwd", conf()});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("", outcome.messages);
}

TEST_F(HostileEnvironment, AProgramWithoutAnyWordShowsItsHelp) {
  const Outcome outcome = runProgram({{}});
  EXPECT_EQ(2, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("Usage: kovabackup"));
}

TEST_F(HostileEnvironment, AnEmptyNameOfTheProgramIsNotTakenForACommand) {
  const Outcome outcome = runProgram({{"", "--version"}});
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.out, StartsWith("kovabackup "));
}

TEST_F(HostileEnvironment, MessagesNameTheCommandWhateverItIsCalled) {
  const Outcome outcome = runProgram({{"\n\033[2Jx", "nothing"}});
  EXPECT_EQ(2, outcome.exitCode);
  EXPECT_THAT(outcome.messages, StartsWith("kovabackup: ")) << outcome;
}

/// The parameter is the umask.
class HostileUmask : public HostileTest, public testing::WithParamInterface<int> {
protected:
  static void setMask() { ::umask(static_cast<mode_t>(GetParam())); }
  static int masked(int mode) { return mode & ~GetParam(); }
};

TEST_P(HostileUmask, SessionsAndTheirFoldersHaveTheirModes) {
  const Outcome outcome = runCommand({"session", "create"}, setMask);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(0755, modeOf(kIpcRoot));
  EXPECT_EQ(0700, modeOf(kSessionRoot));
  const std::set<std::string> names = namesIn(kSessionRoot);
  ASSERT_EQ(1U, names.size());
  EXPECT_EQ(0700, modeOf(kSessionRoot + ("/" + *names.begin())));
}

TEST_P(HostileUmask, TheKeyIsItsOwnersAlone) {
  const Outcome outcome = runLibrary(
      [] {
        OptionMap map;
        return map.optSet("secret", "open sesame", true) &&
               map.optSecret("secret", "") == "open sesame";
      },
      setMask);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(0600, modeOf(keyFile()));
}

TEST_P(HostileUmask, ASavedFileKeepsItsMode) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\n");
  ::chmod(file.c_str(), 0664);
  const Outcome outcome = runCommand({"option", "set", file, "task1", "a", "b"}, setMask);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(0664, modeOf(file));
}

TEST_P(HostileUmask, ANewSectionFileFollowsTheMask) {
  const std::string file = stage() + "/new.conf";
  const Outcome outcome = runCommand({"option", "set", file, "task1", "a", "b"}, setMask);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(masked(0644), modeOf(file));
}

TEST_P(HostileUmask, TemporariesArePrivate) {
  const Outcome outcome = runLibrary(
      [] {
        const ScopedTempFile file(stage() + "/file", true);
        const ScopedTempFolder folder(stage() + "/folder");
        return modeOf(file.getPath()) == 0600 && modeOf(folder.getPath()) == 0700;
      },
      setMask);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(left(), IsEmpty());
}

TEST_P(HostileUmask, APublishedFileHasTheModeThatWasAsked) {
  const Outcome outcome = runLibrary(
      [] {
        Service::PublishedFile file(stage() + "/archive", 0640);
        Service::Error error;
        return file.create(error) && file.publish(error);
      },
      setMask);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(0640, modeOf(stage() + "/archive"));
}

TEST_P(HostileUmask, AVolumeGetsItsOpenFolder) {
  const Outcome outcome = runCommand({"session", "create", "--volume", "max"}, setMask);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(01777, modeOf(volume() + "/.kova_tmp"));
}

INSTANTIATE_TEST_SUITE_P(Masks, HostileUmask, testing::Values(0, 0177, 0777));

/// The parameter is a locale with another decimal point or other letters.
class HostileLocale : public HostileTest, public testing::WithParamInterface<const char *> {
protected:
  // Compiled for the test where the machine has its source.
  static void setLocale() {
    const std::string folder = stage() + "/locales";
    ::mkdir(folder.c_str(), 0755);
    const std::string name = GetParam();
    const std::string make = "localedef -i " + name + " -f UTF-8 " + folder + "/" + name +
                             ".UTF-8 >/dev/null 2>&1 </dev/null";
    need(std::system(make.c_str()) == 0, "there is no source of the locale " + name);
    ::setenv("LOCPATH", folder.c_str(), 1);
    need(std::setlocale(LC_ALL, (name + ".UTF-8").c_str()) != nullptr, "setlocale");
  }
};

TEST_P(HostileLocale, OptionsAreWrittenAndReadAsEverywhere) {
  const std::string file =
      writeFile(stage() + "/task.conf", "[task1]\nINTITLE=\"I\"\nreal=1.5\nnumber=1234567\n");
  const Outcome outcome = runLibrary(
      [&] {
        OptionMap task;
        return task.optSectionLoad(file, "task", 1) && task.optString("INTITLE", "") == "I" &&
               task.optInt("number", 0) == 1234567 &&
               task.optToJsonString() == "{\"INTITLE\":\"I\",\"number\":1234567,\"real\":1.5}";
      },
      setLocale);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

INSTANTIATE_TEST_SUITE_P(Of, HostileLocale, testing::Values("de_DE", "tr_TR"));

} // namespace
