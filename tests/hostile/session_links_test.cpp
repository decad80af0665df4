// Links and folders in the place of sessions, and volumes that vanish or change between two steps.
// What is not a session is never entered, and nothing but the session is removed.
#include "tests/hostile/surroundings.h"

#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"

#include <fcntl.h>
#include <filesystem>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;
namespace fs = std::filesystem;

class HostileSession : public HostileTest {
protected:
  void SetUp() override {
    HostileTest::SetUp();
    if (!IsSkipped()) {
      fs::create_directory(foreign_);
      writeFile(foreign_ + "/file", "foreign");
    }
  }
  void TearDown() override {
    if (!IsSkipped()) {
      EXPECT_EQ("foreign", readFile(foreign_ + "/file"));
    }
    HostileTest::TearDown();
  }

  static std::string create(const std::vector<std::string> &more = {}) {
    std::vector<std::string> words = {"session", "create"};
    words.insert(words.end(), more.begin(), more.end());
    const Outcome made = runCommand(words);
    EXPECT_EQ(0, made.exitCode) << made;
    return made.out.substr(0, made.out.find('\n'));
  }
  static std::string createOnVolume() { return create({"--volume", "max"}); }
  static std::string folderOf(const std::string &id) { return volume() + "/.kova_tmp/" + id; }
  static std::string entryOf(const std::string &id) { return std::string(kSessionRoot) + "/" + id; }

  // What show prints of the state.
  static std::string stateOf(const std::string &id) {
    const std::string out = runCommand({"session", "show", id}).out;
    const std::size_t start = out.find("\nstate\t");
    return start == std::string::npos
               ? "none"
               : out.substr(start + 7, out.find('\n', start + 1) - start - 7);
  }

  const std::string foreign_ = stage() + "/foreign";
};

/// The parameter is the target of a link in the place of a session on a volume.
class HostileSessionLink : public HostileSession,
                           public testing::WithParamInterface<const char *> {};

TEST_P(HostileSessionLink, IsForeignAndNeverFollowed) {
  create(); // makes the root
  fs::create_symlink(GetParam(), entryOf("seln.Aaaaaa"));
  EXPECT_THAT(stateOf("seln.Aaaaaa"), StartsWith("foreign: "));
  const Outcome outcome = runCommand({"session", "destroy", "--force", "seln.Aaaaaa"});
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("is left alone"));
  EXPECT_EQ(0, runCommand({"session", "prune", "--older-than", "0s", "--yes"}).exitCode);
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre("seln.Aaaaaa"));
}

INSTANTIATE_TEST_SUITE_P(To, HostileSessionLink,
                         testing::Values("/", ".", "..", "/proc/self/root", "/proc/self/cwd",
                                         "/usr", "/mnt/../", "/dev/null", "//"));

TEST_F(HostileSession, WhoseFolderIsALinkToTheRootIsRemovedWithoutFollowingIt) {
  create();
  fs::create_symlink("/", entryOf("sess.Aaaaaa"));
  EXPECT_EQ("broken: not a directory", stateOf("sess.Aaaaaa"));
  EXPECT_EQ(0, runCommand({"session", "prune", "--older-than", "0s", "--yes"}).exitCode);
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_F(HostileSession, WhoseFolderIsALinkIsNotLoaded) {
  create();
  fs::create_symlink(foreign_, entryOf("sess.Aaaaaa"));
  const Outcome outcome = runLibrary([] { return Session().load("sess.Aaaaaa"); });
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log, ElementsAre("[err] session:180 failed to lstat session[" +
                                       entryOf("sess.Aaaaaa") + "]"));
}

TEST_F(HostileSession, ThatIsALinkIsDestroyedByTheLibraryAsALink) {
  create();
  fs::create_symlink(foreign_, entryOf("sess.Aaaaaa"));
  const Outcome outcome = runLibrary([] { return Session::destroyById("sess.Aaaaaa"); });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_FALSE(isThere(entryOf("sess.Aaaaaa")));
}

TEST_F(HostileSession, WithLinksInsideIsDestroyedAndTheirTargetsStay) {
  const std::string id = create();
  fs::create_symlink(foreign_, entryOf(id) + "/link");
  fs::create_symlink("/", entryOf(id) + "/root");
  fs::create_symlink("root", entryOf(id) + "/root2");
  ASSERT_EQ(0, runCommand({"session", "destroy", id}).exitCode);
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_F(HostileSession, WithAForeignFolderMountedInItStaysWithIt) {
  const std::string id = create();
  fs::create_directory(entryOf(id) + "/inside");
  KOVA_OR_SKIP(bindOn(foreign_, entryOf(id) + "/inside"));
  const Outcome outcome = runCommand({"session", "destroy", "--force", id});
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("could not be removed completely"));
}

TEST_F(HostileSession, WithFifosSocketsAndDevicesIsDestroyed) {
  const std::string id = create();
  ASSERT_EQ(0, ::mkfifo((entryOf(id) + "/fifo").c_str(), 0000));
  (void)::mknod((entryOf(id) + "/device").c_str(), S_IFCHR | 0600, 0); // not without privilege
  writeFile(entryOf(id) + "/\xff\n\t\xe2\x80\xae -rf", "");
  EXPECT_EQ(0, runCommand({"session", "destroy", id}).exitCode);
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

class HostileVolume : public HostileSession {};

TEST_F(HostileVolume, ThatVanishesLeavesADanglingSession) {
  const std::string id = createOnVolume();
  KOVA_OR_SKIP(mountOn(volume(), "mode=0755"));
  EXPECT_EQ("dangling: the target of the link does not exist", stateOf(id));
  const Outcome outcome = runLibrary([&] { return Session().load(id); });
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log,
              ElementsAre("[err] session:180 failed to lstat session[" + folderOf(id) + "]"));
}

TEST_F(HostileVolume, ThatComesBackHasItsSessionAgain) {
  const std::string id = createOnVolume();
  writeFile(folderOf(id) + "/file", "data");
  KOVA_OR_SKIP(mountOn(volume(), "mode=0755"));
  EXPECT_EQ(0, runCommand({"session", "prune", "--older-than", "1h", "--yes"}).exitCode);
  ASSERT_EQ(0, ::umount2(volume().c_str(), MNT_DETACH));
  EXPECT_EQ("whole", stateOf(id));
  EXPECT_EQ("data", readFile(folderOf(id) + "/file"));
}

TEST_F(HostileVolume, ThatIsUnmountedInTheMiddleOfAWriteKeepsTheProcessAlive) {
  KOVA_OR_SKIP(mountOn(volume(), "mode=0755"));
  const Outcome outcome = runLibrary([] {
    const ScopedVolumeTempFile file(TempManager::maxVolume(), "list", false);
    return file.isValid() && ::umount2(volume().c_str(), MNT_DETACH) == 0 &&
           ::write(file.getFileDescripter(), "data", 4) == 4;
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.log, IsEmpty()) << "the removal of what is gone is no failure";
}

TEST_F(HostileVolume, ThatBecomesReadOnlyIsNotChosen) {
  const std::string id = createOnVolume();
  KOVA_OR_SKIP(bindOn(volume(), volume()));
  KOVA_OR_SKIP(makeReadOnly(volume()));
  EXPECT_EQ(3, runCommand({"session", "create", "--volume", "max"}).exitCode);
  EXPECT_EQ("whole", stateOf(id));
}

TEST_F(HostileVolume, ThatBecomesReadOnlyKeepsASessionThatIsDestroyed) {
  const std::string id = createOnVolume();
  KOVA_OR_SKIP(bindOn(volume(), volume()));
  KOVA_OR_SKIP(makeReadOnly(volume()));
  const Outcome outcome = runCommand({"session", "destroy", id});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: session " + id + " could not be removed completely: " + folderOf(id) +
                ": Read-only file system\n",
            outcome.messages);
  EXPECT_EQ("whole", stateOf(id));
}

TEST_F(HostileVolume, ThatBecomesReadOnlyIsSaidByTheLibraryOnce) {
  const std::string id = createOnVolume();
  KOVA_OR_SKIP(bindOn(volume(), volume()));
  KOVA_OR_SKIP(makeReadOnly(volume()));
  const Outcome outcome = runLibrary([&] { return Session::destroyById(id); });
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log,
              ElementsAre("[err] path/path_util:32 rmdir " + folderOf(id) +
                              " failed. Read-only file system",
                          "[err] session:234 failed to remove session[" + folderOf(id) + "]"));
  EXPECT_TRUE(isThere(folderOf(id)));
}

TEST_F(HostileVolume, WhoseSessionWasReplacedByAFileIsLeftAlone) {
  const std::string id = createOnVolume();
  fs::remove(folderOf(id));
  writeFile(folderOf(id), "another's");
  EXPECT_THAT(stateOf(id), StartsWith("foreign: "));
  EXPECT_EQ(1, runCommand({"session", "destroy", "--force", id}).exitCode);
  EXPECT_EQ("another's", readFile(folderOf(id)));
}

TEST_F(HostileVolume, WhoseSessionWasReplacedByALinkIsLeftAlone) {
  const std::string id = createOnVolume();
  fs::remove(folderOf(id));
  fs::create_symlink(foreign_, folderOf(id));
  EXPECT_THAT(stateOf(id), StartsWith("foreign: "));
  EXPECT_EQ(1, runCommand({"session", "destroy", "--force", id}).exitCode);
  EXPECT_TRUE(isThere(folderOf(id)));
}

TEST_F(HostileVolume, WhoseTempFolderIsAFileIsNotChosen) {
  writeFile(volume() + "/.kova_tmp", "mine");
  EXPECT_EQ(3, runCommand({"session", "create", "--volume", "max"}).exitCode);
  EXPECT_EQ("mine", readFile(volume() + "/.kova_tmp"));
}

TEST_F(HostileVolume, WhoseTempFolderIsALinkIsNotChosen) {
  fs::create_symlink(foreign_, volume() + "/.kova_tmp");
  EXPECT_EQ(3, runCommand({"session", "create", "--volume", "max"}).exitCode);
  EXPECT_THAT(namesIn(foreign_), ElementsAre("file"));
}

TEST_F(HostileVolume, WhoseTempFolderIsADanglingLinkCreatesNothingElsewhere) {
  fs::create_symlink(stage() + "/nowhere", volume() + "/.kova_tmp");
  EXPECT_EQ(3, runCommand({"session", "create", "--volume", "max"}).exitCode);
  EXPECT_FALSE(isThere(stage() + "/nowhere"));
}

TEST_F(HostileVolume, ThatIsMissingFallsBackToALocalSessionOnlyWhereAsked) {
  fs::remove(volume());
  const Outcome outcome = runLibrary([] {
    Session session;
    return session.create(TempManager::maxVolume(true)) &&
           session.getId().substr(0, 5) == "sess." && session.destroy() &&
           !session.create(TempManager::maxExtVolume());
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.log, ElementsAre("[err] session:126 failed to getVolumePath()"));
}

/// The parameter is the year of a session's last load, as a clock that is wrong makes it.
class HostileClock : public HostileSession, public testing::WithParamInterface<int> {
protected:
  static bool isPast() { return GetParam() < 2000; }

  static void setYear(const std::string &path) {
    constexpr long long kSecondsOfYear = 31556952;
    const timespec then = {static_cast<time_t>((GetParam() - 1970) * kSecondsOfYear), 0};
    const timespec times[] = {then, then};
    ASSERT_EQ(0, ::utimensat(AT_FDCWD, path.c_str(), times, 0));
  }
};

TEST_P(HostileClock, ASessionOfTheFutureIsYoungAndOneOfThePastIsOld) {
  const std::string id = create();
  setYear(entryOf(id));
  EXPECT_EQ("whole", stateOf(id));
  EXPECT_EQ(0, runCommand({"session", "prune", "--older-than", "1w", "--yes"}).exitCode);
  EXPECT_EQ(isPast() ? 0U : 1U, namesIn(kSessionRoot).size());
}

TEST_P(HostileClock, ASessionIsLoadedAndGetsTheTimeOfNow) {
  const std::string id = create();
  setYear(entryOf(id));
  EXPECT_EQ(0, runLibrary([&] { return Session().load(id); }).exitCode);
  EXPECT_EQ(0, runCommand({"session", "prune", "--older-than", "1h", "--yes"}).exitCode);
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(id));
}

INSTANTIATE_TEST_SUITE_P(Years, HostileClock, testing::Values(1902, 1969, 2039, 2107));

} // namespace
