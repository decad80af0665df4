// The program examples/session_relay, over the real stand-ins: it finds, moves and removes, and it
// notices when something does not hold.

#include "kovabackup/session.h"
#include "tests/platform/platform_conf.h"
#include "tests/session/volume_mount.h"
#include "tests/temp_manager/scratch.h"

#include <array>
#include <cstdio>
#include <gmock/gmock.h>
#include <sys/wait.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::HasSubstr;
using testing::IsEmpty;

namespace {

struct Outcome {
  int status = -1;
  std::string output;
};

class SessionRelay : public testing::Test {
protected:
  void SetUp() override {
    if (!volume.failure.empty()) {
      GTEST_SKIP() << volume.failure;
    }
    std::filesystem::create_directories(tree + "/folder/empty");
    writeText(tree + "/folder/file", "text");
    writeText(tree + "/large", std::string(200000, 'x') + "end");
    writeText(tree + "/nothing", "");
    std::filesystem::create_symlink("folder/file", tree + "/link");
  }

  // Makes a directory the largest volume of all.
  void nameVolume(const std::string &path) const {
    conf.write("[volume test]\npath=\"" + path + "\"\nfsType=3\nsize=4611686018427387904\n");
  }

  static Outcome relay(const std::string &args) {
    Outcome outcome;
    FILE *pipe = ::popen((std::string(KOVA_SESSION_RELAY) + " " + args + " 2>&1").c_str(), "re");
    if (pipe == nullptr) {
      return outcome;
    }
    std::array<char, 4096> block{};
    while (const std::size_t bytes = std::fread(block.data(), 1, block.size(), pipe)) {
      outcome.output.append(block.data(), bytes);
    }
    const int status = ::pclose(pipe);
    outcome.status = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    return outcome;
  }

  void expectNothingLeft() const {
    EXPECT_THAT(namesIn("/tmp/kovabackup/session"), IsEmpty());
    EXPECT_THAT(namesIn(volume.path + "/.kova_tmp"), IsEmpty());
  }

  const Scratch scratch;
  const std::string tree = scratch / "original";
  const PlatformConf conf;
  const VolumeMount volume;
};

} // namespace

TEST_F(SessionRelay, MovesATreeOverAVolumeAndLeavesNothing) {
  nameVolume(volume.path);
  const Outcome outcome = relay(tree);
  EXPECT_EQ(0, outcome.status) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr(volume.path + "  "));
  EXPECT_THAT(outcome.output, HasSubstr("directory " + volume.path + "/.kova_tmp/seln."));
  EXPECT_THAT(outcome.output, HasSubstr("checked   seln."));
  EXPECT_THAT(outcome.output, HasSubstr(": 3 files, 195.3 KiB, all equal"));
  EXPECT_THAT(outcome.output, HasSubstr("All checks passed"));
  expectNothingLeft();
}

TEST_F(SessionRelay, ExplainsWhatToConfigureWhereNoVolumeQualifies) {
  conf.write("[no such section]\n"); // so that no volume of the machine qualifies either
  const Outcome outcome = relay(tree);
  EXPECT_EQ(2, outcome.status) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr("\n  none\n"));
  EXPECT_THAT(outcome.output, HasSubstr("/etc/kovaplatform/platform.conf"));
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

TEST_F(SessionRelay, RefusesAVolumeUnderTmp) {
  const std::string under = scratch / "volume";
  std::filesystem::create_directory(under);
  nameVolume(under);
  const Outcome outcome = relay(tree);
  EXPECT_EQ(1, outcome.status) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr("under /tmp"));
  expectNothingLeft();
}

TEST_F(SessionRelay, RefusesATreeThatHoldsTheSession) {
  nameVolume(volume.path);
  const Outcome outcome = relay(volume.path);
  EXPECT_EQ(1, outcome.status) << outcome.output;
  EXPECT_THAT(outcome.output, HasSubstr("lies in " + volume.path));
  expectNothingLeft();
}

TEST_F(SessionRelay, RemovesTheSessionWhenAStepFails) {
  nameVolume(volume.path);
  const Outcome outcome = relay(tree + "/folder/file"); // no folder: it cannot be walked
  EXPECT_EQ(1, outcome.status) << outcome.output;
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
      {"content", [](const std::string &copy) { writeText(copy + "/folder/file", "texT"); },
       "differs from"},
      {"size", [](const std::string &copy) { writeText(copy + "/folder/file", "texts"); },
       "differs in size from"},
      {"end",
       [](const std::string &copy) {
         writeText(copy + "/large", std::string(200000, 'x') + "enD");
       },
       "differs from"},
      {"missing", [](const std::string &copy) { std::filesystem::remove(copy + "/nothing"); },
       "is missing"},
      {"extra", [](const std::string &copy) { writeText(copy + "/folder/extra", ""); },
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
    ASSERT_EQ(0, relay("fill " + session.getId() + " " + tree).status);
    ASSERT_EQ(0, relay("check " + session.getId() + " " + tree).status);
    one.spoil(session.getPath() + "/tree");
    const Outcome outcome = relay("check " + session.getId() + " " + tree);
    EXPECT_EQ(1, outcome.status);
    EXPECT_THAT(outcome.output, HasSubstr(one.expected));
    EXPECT_EQ(0, relay("destroy " + session.getId()).status);
  }
  expectNothingLeft();
}

TEST_F(SessionRelay, FailsForAnIdThatIsNone) {
  for (const char *args : {"fill sess.AAAAAA /", "check seln.AAAAAA /", "destroy seln.AAAAAA"}) {
    EXPECT_EQ(1, relay(args).status) << args;
  }
}

TEST_F(SessionRelay, RefusesArgumentsThatItDoesNotKnow) {
  for (const char *args : {"--help", "fill", "fill sess.AAAAAA", "a b", "destroy a b"}) {
    const Outcome outcome = relay(args);
    EXPECT_EQ(2, outcome.status) << args;
    EXPECT_THAT(outcome.output, HasSubstr("usage: session_relay")) << args;
  }
}
