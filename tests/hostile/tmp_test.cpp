// A /tmp and a tree /tmp/kovabackup that are not what services expect: read-only, full, a file, a
// link, another user's.
#include "tests/hostile/small_root.h"
#include "tests/hostile/surroundings.h"

#include "kovabackup/session.h"

#include <fcntl.h>
#include <filesystem>
#include <sys/mount.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
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

class HostileTmp : public HostileTest {
protected:
  static std::string finding(const Outcome &doctor, const std::string &check) {
    const std::size_t at = doctor.out.find("\t" + check + "\t");
    const std::size_t start = at == std::string::npos ? at : doctor.out.rfind('\n', at) + 1;
    return at == std::string::npos ? ""
                                   : doctor.out.substr(start, doctor.out.find('\n', at) - start);
  }

  static void makeSocket(const std::string &path) {
    struct sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    path.copy(address.sun_path, sizeof address.sun_path - 1);
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    EXPECT_EQ(0, ::bind(fd, reinterpret_cast<struct sockaddr *>(&address), sizeof address));
    ::close(fd);
  }
};

TEST_F(HostileTmp, ReadOnlyHoldsNoSession) {
  KOVA_OR_SKIP(makeReadOnly("/tmp"));
  const Outcome outcome = runLibrary([] { return Session().create(); });
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log,
              ElementsAre("[err] path/path_util:395 mkdir /tmp/kovabackup path failed. "
                          "Read-only file system",
                          "[err] session:82 failed to create temp directory []"));
}

TEST_F(HostileTmp, ReadOnlyIsNamedByTheCommand) {
  KOVA_OR_SKIP(makeReadOnly("/tmp"));
  const Outcome outcome = runCommand({"session", "create"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot create a session: /tmp: Read-only file system\n", outcome.messages);
}

TEST_F(HostileTmp, ReadOnlyGivesNoLockAndThereforeNoChange) {
  KOVA_OR_SKIP(makeReadOnly("/tmp"));
  const Outcome outcome =
      runCommand({"option", "set", stage() + "/task.conf", "task1", "a", "b", "--lock", "t"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr("cannot take the lock 't'")) << outcome;
  EXPECT_THAT(left(), IsEmpty());
}

TEST_F(HostileTmp, WithoutProgramsAndDevicesServesAsAnyOther) {
  if (::mount(nullptr, "/tmp", nullptr, MS_REMOUNT | MS_BIND | MS_NOEXEC | MS_NODEV | MS_NOSUID,
              nullptr) != 0) {
    GTEST_SKIP() << "skipped: /tmp cannot be remounted";
  }
  EXPECT_EQ(0, runCommand({"session", "create"}).exitCode);
  EXPECT_EQ(0, runCommand({"session", "prune", "--older-than", "0s", "--yes"}).exitCode);
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_F(HostileTmp, WithoutInodesIsNamedByTheCommand) {
  KOVA_OR_SKIP(mountOn("/tmp", "nr_inodes=1,mode=1777"));
  const Outcome outcome = runCommand({"session", "create"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot create a session: /tmp: No space left on device\n",
            outcome.messages);
}

TEST_F(HostileTmp, WithoutInodesLeavesNoHalfOfASession) {
  KOVA_OR_SKIP(mountOn("/tmp", "nr_inodes=4,mode=1777"));
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  const std::set<std::string> before = namesIn(kSessionRoot);
  EXPECT_EQ(1, runCommand({"session", "create"}).exitCode);
  EXPECT_EQ(before, namesIn(kSessionRoot));
}

TEST_F(HostileTmp, WithoutBlocksStillHoldsASessionAndTheDoctorSaysFull) {
  KOVA_OR_SKIP(mountOn("/tmp", "size=4k,mode=1777"));
  writeFile("/tmp/fill", std::string(4096, 'x'));
  EXPECT_EQ(0, runCommand({"session", "create"}).exitCode);
  EXPECT_THAT(finding(runCommand({"doctor"}), "tmp"), StartsWith("wrong\ttmp\t/tmp: full\t"));
}

TEST_F(HostileTmp, OnAnotherMountInTheMiddleHidesSessionsAndLosesNone) {
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  KOVA_OR_SKIP(mountOn("/tmp", "mode=1777"));
  EXPECT_EQ("", runCommand({"session", "list"}).out);
  ::umount2("/tmp", MNT_DETACH);
  EXPECT_THAT(runCommand({"session", "list"}).out, StartsWith("sess."));
}

TEST_F(HostileTmp, MountedTwiceShowsASessionOnce) {
  KOVA_OR_SKIP(bindOn("/tmp", volume()));
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  const std::string list = runCommand({"session", "list"}).out;
  EXPECT_EQ(list.find('\n'), list.size() - 1) << list;
}

TEST_F(HostileTmp, ThatIsMissingIsNamedByTheCommand) {
  const Outcome outcome = runCommand({"session", "create"}, [] { SmallRoot({"/dev"}).enter(); });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, StartsWith("kovabackup: cannot create a session"));
}

TEST_F(HostileTmp, ThatIsMissingIsWrongToTheDoctor) {
  const Outcome outcome = runCommand({"doctor"}, [] { SmallRoot({"/dev"}).enter(); });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(3, outcome.exitCode) << outcome;
  EXPECT_EQ("wrong\ttmp\t/tmp is not a directory\tcreate it: mkdir -m 1777 /tmp",
            finding(outcome, "tmp"));
}

TEST_F(HostileTmp, ThatIsAFileHoldsNoSession) {
  const Outcome outcome = runLibrary([] { return Session().create(); },
                                     [] {
                                       const SmallRoot root({});
                                       writeFile(root / "/tmp", "");
                                       root.enter();
                                     });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log,
              ElementsAre("[err] path/path_util:395 mkdir /tmp/kovabackup path failed. "
                          "Not a directory",
                          "[err] session:82 failed to create temp directory []"));
}

TEST_F(HostileTmp, ThatIsALinkToAFolderServes) {
  const Outcome outcome = runLibrary(
      [] {
        Session session;
        return session.create() && isThere("/var/tmp/kovabackup/session") && session.destroy();
      },
      [] {
        const SmallRoot root({});
        fs::create_directories(root / "/var/tmp");
        fs::create_symlink("/var/tmp", root / "/tmp");
        root.enter();
      });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileTmp, ThatIsALinkToNothingHoldsNoSession) {
  const Outcome outcome = runLibrary([] { return Session().create(); },
                                     [] {
                                       const SmallRoot root({});
                                       fs::create_symlink("/nowhere", root / "/tmp");
                                       root.enter();
                                     });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log, ElementsAre(HasSubstr("path/path_util:395"), HasSubstr("session:82")));
}

class HostileIpcRoot : public HostileTmp {};

TEST_F(HostileIpcRoot, ThatIsADanglingLinkIsNotCreatedElsewhere) {
  fs::create_symlink(stage() + "/nowhere", kIpcRoot);
  const Outcome outcome = runCommand({"session", "create"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot create a session: /tmp/kovabackup: No such file or directory\n",
            outcome.messages);
  EXPECT_FALSE(isThere(stage() + "/nowhere"));
}

TEST_F(HostileIpcRoot, ThatIsALinkIsWarnedOfAndNothingBehindItIsRemoved) {
  fs::create_directory(stage() + "/elsewhere");
  fs::create_symlink(stage() + "/elsewhere", kIpcRoot);
  const Outcome made = runCommand({"session", "create"});
  EXPECT_EQ(0, made.exitCode) << made;
  EXPECT_THAT(made.messages, HasSubstr("/tmp/kovabackup cannot be trusted"));
  const Outcome outcome = runCommand({"session", "prune", "--older-than", "0s", "--yes"});
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("nothing was changed"));
  EXPECT_EQ(1U, namesIn(stage() + "/elsewhere/session").size());
}

TEST_F(HostileIpcRoot, ThatIsAFileIsNamed) {
  writeFile(kIpcRoot, "mine");
  const Outcome outcome = runCommand({"session", "create"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot create a session: /tmp/kovabackup/session: Not a directory\n",
            outcome.messages);
  EXPECT_EQ("mine", readFile(kIpcRoot));
}

TEST_F(HostileIpcRoot, ThatIsAFifoIsNotWaitedFor) {
  ASSERT_EQ(0, ::mkfifo(kIpcRoot, 0644));
  EXPECT_EQ(1, runCommand({"session", "create"}).exitCode);
  EXPECT_EQ(1, runCommand({"session", "list"}).exitCode);
  EXPECT_EQ(3, runCommand({"lock", "show", "t"}).exitCode);
}

TEST_F(HostileIpcRoot, ThatIsASocketIsNotADirectory) {
  makeSocket(kIpcRoot);
  const Outcome outcome = runCommand({"session", "list"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot read /tmp/kovabackup/session: Not a directory\n", outcome.messages);
}

TEST_F(HostileIpcRoot, ThatIsAFileIsNotBlamedOnTheUsersPrivileges) {
  writeFile(kIpcRoot, "");
  const Outcome doctor = runCommand({"doctor"});
  EXPECT_EQ(3, doctor.exitCode);
  EXPECT_EQ(
      "wrong\tipc root\t/tmp/kovabackup is not a directory\tremove it; it is created on first "
      "use",
      finding(doctor, "ipc root"));
  EXPECT_THAT(doctor.out, testing::Not(HasSubstr("as root"))) << "root would not get there either";
}

TEST_F(HostileIpcRoot, WithWrongModesIsSetRightByTheNextSession) {
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  ::chmod(kSessionRoot, 0777);
  ::chmod(kIpcRoot, 0000);
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  EXPECT_EQ(0755, modeOf(kIpcRoot));
  EXPECT_EQ(0700, modeOf(kSessionRoot));
}

TEST_F(HostileIpcRoot, OfAnotherUserIsWarnedOfAndNothingInItIsRemoved) {
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  if (::chown(kIpcRoot, kNobody, kNobody) != 0) {
    GTEST_SKIP() << "skipped: no other user is known here";
  }
  EXPECT_THAT(runCommand({"session", "create"}).messages, HasSubstr("cannot be trusted"));
  EXPECT_EQ(1, runCommand({"session", "prune", "--older-than", "0s", "--yes"}).exitCode);
  EXPECT_EQ(2U, namesIn(kSessionRoot).size());
}

TEST_F(HostileIpcRoot, WhoseSessionRootIsAFileHoldsNoSession) {
  fs::create_directory(kIpcRoot);
  writeFile(kSessionRoot, "mine");
  const Outcome outcome = runLibrary([] { return Session().create(); });
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log, ElementsAre(StartsWith("[err] session:99 ScopedTempFolder failed[")))
      << outcome;
  EXPECT_EQ("mine", readFile(kSessionRoot));
}

TEST_F(HostileIpcRoot, WhoseSessionRootIsALinkIsNotPruned) {
  fs::create_directory(kIpcRoot);
  fs::create_directories(stage() + "/foreign/sess.Aaaaaa");
  fs::create_symlink(stage() + "/foreign", kSessionRoot);
  const Outcome outcome = runCommand({"session", "prune", "--older-than", "0s", "--yes"});
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_TRUE(isThere(stage() + "/foreign/sess.Aaaaaa"));
}

TEST_F(HostileIpcRoot, WhoseLockFolderIsAFileGivesNoLock) {
  fs::create_directory(kIpcRoot);
  writeFile(kLockFolder, "");
  const Outcome outcome =
      runCommand({"option", "set", stage() + "/task.conf", "task1", "a", "b", "--lock", "t"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot take the lock 't': /tmp/kovabackup/lock/t: Not a directory\n",
            outcome.messages);
  EXPECT_FALSE(isThere(stage() + "/task.conf"));
}

class HostileLockFile : public HostileTmp {
protected:
  void SetUp() override {
    HostileTmp::SetUp();
    if (!IsSkipped()) {
      fs::create_directories(kLockFolder);
    }
  }
  // Sets an option under the lock.
  static Outcome setLocked() {
    return runCommand({"option", "set", stage() + "/task.conf", "task1", "a", "b", "--lock", "t"});
  }
  const std::string file_ = std::string(kLockFolder) + "/t";
};

TEST_F(HostileLockFile, ThatIsAFolderIsNamed) {
  fs::create_directory(file_);
  const Outcome outcome = setLocked();
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot take the lock 't': /tmp/kovabackup/lock/t: Is a directory\n",
            outcome.messages);
  EXPECT_FALSE(isThere(stage() + "/task.conf"));
}

TEST_F(HostileLockFile, ThatIsAFifoIsLockedAndNotWaitedFor) {
  ASSERT_EQ(0, ::mkfifo(file_.c_str(), 0600));
  EXPECT_EQ(0, setLocked().exitCode);
}

TEST_F(HostileLockFile, ThatIsASocketIsNamed) {
  makeSocket(file_);
  const Outcome outcome = setLocked();
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr("No such device or address")) << outcome;
}

TEST_F(HostileLockFile, ThatIsADanglingLinkCreatesNothingElsewhere) {
  fs::create_symlink(stage() + "/victim", file_);
  const Outcome outcome = setLocked();
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_FALSE(isThere(stage() + "/victim"));
}

TEST_F(HostileLockFile, ThatIsALinkLoopIsNamed) {
  fs::create_symlink("t", file_);
  const Outcome outcome = setLocked();
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr("Too many levels of symbolic links"));
}

TEST_F(HostileLockFile, OfAProcessThatHasEndedIsFree) {
  writeFile(file_, "999999999 stale\n");
  EXPECT_EQ(3, runCommand({"lock", "show", "t"}).exitCode);
  EXPECT_EQ(0, setLocked().exitCode);
}

} // namespace
