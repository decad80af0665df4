// The program examples/session_relay on the real stand-ins: it finds, moves and removes sessions,
// and notices when an expectation does not hold.

#include "kovabackup/session.h"
#include "tests/session/volume_mount.h"
#include "tests/support/child_process.h"
#include "tests/support/files.h"
#include "tests/support/platform_conf.h"

#include <filesystem>
#include <gmock/gmock.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

class SessionRelay : public testing::Test {
protected:
  void SetUp() override {
    if (!volume.failure.empty()) {
      GTEST_SKIP() << volume.failure;
    }
    std::filesystem::create_directories(tree + "/folder/empty");
    writeFile(tree + "/folder/file", "text");
    writeFile(tree + "/large", std::string(200000, 'x') + "end");
    writeFile(tree + "/nothing", "");
    std::filesystem::create_symlink("folder/file", tree + "/link");
  }

  // Makes a directory the largest volume of all.
  void nameVolume(const std::string &path) const {
    conf.write("[volume test]\npath=\"" + path + "\"\nfsType=3\nsize=4611686018427387904\n");
  }

  static ShellResult relay(const std::string &args) {
    return runShell(std::string(KOVA_SESSION_RELAY) + " " + args + " 2>&1");
  }

  void expectNothingLeft() const {
    EXPECT_THAT(namesIn("/tmp/kovabackup/session"), IsEmpty());
    EXPECT_THAT(namesIn(volume.path + "/.kova_tmp"), IsEmpty());
  }

  const TestFolder scratch;
  const std::string tree = scratch / "original";
  const PlatformConf conf;
  const VolumeMount volume;
};

} // namespace

TEST_F(SessionRelay, MovesATreeOverAVolumeAndLeavesNothing) {
  nameVolume(volume.path);
  const ShellResult outcome = relay(tree);
  EXPECT_EQ(0, outcome.exitCode) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr(volume.path + "  "));
  EXPECT_THAT(outcome.output, HasSubstr("directory " + volume.path + "/.kova_tmp/seln."));
  EXPECT_THAT(outcome.output, HasSubstr("checked   seln."));
  EXPECT_THAT(outcome.output, HasSubstr(": 3 files, 195.3 KiB, all equal"));
  EXPECT_THAT(outcome.output, HasSubstr("All checks passed"));
  expectNothingLeft();
}

TEST_F(SessionRelay, ExplainsWhatToConfigureWhereNoVolumeQualifies) {
  conf.write("[no such section]\n"); // so that no volume of the machine qualifies, either
  const ShellResult outcome = relay(tree);
  EXPECT_EQ(2, outcome.exitCode) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr("\n  none\n"));
  EXPECT_THAT(outcome.output, HasSubstr("/etc/kovaplatform/platform.conf"));
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

TEST_F(SessionRelay, ShowsTheSizesOfVolumes) {
  const auto sized = [&](const std::string &bytes) {
    conf.write("[volume test]\npath=\"" + volume.path + "\"\nfsType=3\nsize=" + bytes + "\n");
    return relay(tree).output;
  };
  EXPECT_THAT(sized("1023"), HasSubstr(" 1023 bytes "));
  EXPECT_THAT(sized("1024"), HasSubstr(" 1.0 KiB "));
  EXPECT_THAT(sized("4611686018427387904"), HasSubstr(" 4194304.0 TiB "));
}

TEST_F(SessionRelay, RefusesAVolumeUnderTmp) {
  const std::string under = scratch / "volume";
  std::filesystem::create_directory(under);
  nameVolume(under);
  const ShellResult outcome = relay(tree);
  EXPECT_EQ(1, outcome.exitCode) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr("under /tmp"));
  expectNothingLeft();
}

TEST_F(SessionRelay, RefusesATreeThatHoldsTheSession) {
  nameVolume(volume.path);
  const ShellResult outcome = relay(volume.path);
  EXPECT_EQ(1, outcome.exitCode) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr("lies in " + volume.path));
  expectNothingLeft();
}

TEST_F(SessionRelay, RemovesTheSessionWhenAStepFails) {
  nameVolume(volume.path);
  const ShellResult outcome = relay(tree + "/folder/file"); // not a folder, so it cannot be walked
  EXPECT_EQ(1, outcome.exitCode) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr("the process for 'fill' failed"));
  expectNothingLeft();
}

TEST_F(SessionRelay, NoticesEveryDifference) {
  struct Case {
    const char *what;
    void (*spoil)(const std::string &copy);
    const char *expected;
  };
  const Case cases[] = {
      {"content", [](const std::string &copy) { writeFile(copy + "/folder/file", "texT"); },
       "differs from"},
      {"size", [](const std::string &copy) { writeFile(copy + "/folder/file", "texts"); },
       "differs in size from"},
      {"end",
       [](const std::string &copy) {
         writeFile(copy + "/large", std::string(200000, 'x') + "enD");
       },
       "differs from"},
      {"missing", [](const std::string &copy) { std::filesystem::remove(copy + "/nothing"); },
       "is missing"},
      {"extra", [](const std::string &copy) { writeFile(copy + "/folder/extra", ""); },
       "holds more files"},
      {"link",
       [](const std::string &copy) {
         std::filesystem::remove(copy + "/folder/file");
         std::filesystem::create_symlink("../large", copy + "/folder/file");
       },
       "is missing"},
  };
  for (const Case &one : cases) {
    SCOPED_TRACE(one.what);
    Session session;
    ASSERT_TRUE(session.create());
    ASSERT_EQ(0, relay("fill " + session.getId() + " " + tree).exitCode);
    ASSERT_EQ(0, relay("check " + session.getId() + " " + tree).exitCode);
    one.spoil(session.getPath() + "/tree");
    const ShellResult outcome = relay("check " + session.getId() + " " + tree);
    EXPECT_EQ(1, outcome.exitCode);
    EXPECT_THAT(outcome.output, HasSubstr(one.expected));
    EXPECT_EQ(0, relay("destroy " + session.getId()).exitCode);
  }
  expectNothingLeft();
}

TEST_F(SessionRelay, FailsForAnIdThatIsNone) {
  for (const char *args : {"fill sess.AAAAAA /", "check seln.AAAAAA /", "destroy seln.AAAAAA"}) {
    EXPECT_EQ(1, relay(args).exitCode) << args;
  }
}

TEST_F(SessionRelay, RefusesArgumentsThatItDoesNotKnow) {
  for (const char *args : {"--help", "fill", "fill sess.AAAAAA", "a b", "destroy a b"}) {
    const ShellResult outcome = relay(args);
    EXPECT_EQ(2, outcome.exitCode) << args;
    EXPECT_THAT(outcome.output, HasSubstr("usage: session_relay")) << args;
  }
}
