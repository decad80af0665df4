// Entries that no session left, names that others take meanwhile, and file systems and kernels that
// can do less.
#include "tests/service/session_hooks.h"
#include "tests/service/session_store_support.h"

#include "tests/support/fault.h"

#include <cerrno>
#include <memory>

namespace {

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
namespace fs = std::filesystem;

class SessionEntries : public SessionStoreTest {
protected:
  // The name in the session root beside that of the session.
  static std::string freshNameBeside(const std::string &id) {
    for (const std::string &name : namesIn(kSessionRoot)) {
      if (name != id) {
        return name;
      }
    }
    return "";
  }

  void makeRoot() { (void)KOVA::Backup::Path::createIpcTempPath("session", 0700); }

  const OnlyProcesses only;
};

TEST_F(SessionEntries, TheRootIsThatOfTheLibrary) {
  EXPECT_EQ(kSessionRoot, SessionStore::root());
}

TEST_F(SessionEntries, ALinkToAFileOfASessionsNameIsForeign) {
  makeRoot();
  writeFile(folderOf("seln.abcdef"), "");
  fs::create_symlink(folderOf("seln.abcdef"), linkOf("seln.000000"));
  const SessionInfo found = find("seln.000000");
  EXPECT_EQ(State::Foreign, found.state);
  EXPECT_EQ("the link points to '" + folderOf("seln.abcdef") + "', which is not a directory",
            found.problem);
}

TEST_F(SessionEntries, AnEmptyOrRelativeLinkIsForeign) {
  makeRoot();
  fs::create_symlink("seln.abcdef", linkOf("seln.000000"));
  EXPECT_EQ(State::Foreign, find("seln.000000").state);
}

TEST_F(SessionEntries, ADirectoryInThePlaceOfALinkIsBroken) {
  makeRoot();
  fs::create_directory(linkOf("seln.000000"));
  const SessionInfo found = find("seln.000000");
  EXPECT_EQ(State::Broken, found.state);
  EXPECT_EQ("not a symbolic link", found.problem);
}

TEST_F(SessionEntries, ALinkThatGoesWhileItIsExaminedIsAbsent) {
  makeDangling("seln.000000");
  SessionInfo found;
  const Fault fault("readlink", 1, ENOENT);
  EXPECT_FALSE(store.find("seln.000000", found, error));
  EXPECT_EQ(ENOENT, error.code);
  EXPECT_EQ("lstat", error.step);
}

TEST_F(SessionEntries, ALinkThatGoesWhileItIsRemovedIsGone) {
  const SessionInfo dangling = find(makeDangling("seln.000000"));
  const Fault fault("unlink", 1, ENOENT);
  EXPECT_TRUE(remove(dangling));
  EXPECT_TRUE(fault.fired());
}

// The target of a link that can be read but not examined may be the directory that looks lost.
TEST_F(SessionEntries, ADirectoryIsNotLostWhileALinkOfItsNameCannotBeFollowed) {
  makeLost();
  const std::string path = makeLost();
  const std::string name = fs::path(path).filename();
  fs::create_symlink("/tmp/elsewhere/" + name, linkOf("seln.000000"));
  const Fault fault("stat", 1, EACCES);
  const std::vector<SessionInfo> all = list();
  EXPECT_TRUE(fault.fired());
  ASSERT_EQ(2U, all.size());
  EXPECT_EQ(State::Dangling, all[0].state);
  EXPECT_EQ(State::Lost, all[1].state);
  EXPECT_NE(path, all[1].path);
}

TEST_F(SessionEntries, NothingIsLostForCertainWhileALinkCannotBeRead) {
  makeLost();
  makeDangling("seln.000000");
  std::vector<SessionInfo> all;
  const Fault unread("readlink", 1, EIO);
  const Fault unfollowed("stat", 1, EACCES);
  EXPECT_FALSE(store.list(all, error));
  EXPECT_EQ(EACCES, error.code);
  EXPECT_EQ("stat", error.step);
  EXPECT_EQ(linkOf("seln.000000"), error.path);
  ASSERT_EQ(1U, all.size());
  EXPECT_EQ(State::Foreign, all[0].state);
  EXPECT_EQ("Input/output error", all[0].problem);
}

TEST_F(SessionEntries, AVolumeThatIsNotUsableIsNotSearched) {
  makeLost();
  for (const int code : {EACCES, EROFS}) {
    const Fault fault("access", 1, code, true);
    EXPECT_THAT(list(), IsEmpty()) << code;
  }
}

TEST_F(SessionEntries, AVolumeOfUnknownUsabilityIsSearched) {
  makeLost();
  const Fault fault("access", 1, EIO, true);
  EXPECT_EQ(1U, list().size());
}

TEST_F(SessionEntries, AVolumeThatIsNotMountedOrNotAccessibleIsNotSearched) {
  makeLost();
  platform.volumes[0].status = 0;
  EXPECT_THAT(list(), IsEmpty());
  platform.volumes[0].status = 1;
  platform.volumes[0].accessStatus = 0;
  EXPECT_THAT(list(), IsEmpty());
  platform.volumes[0].accessStatus = 1;
  EXPECT_EQ(1U, list().size());
}

// Kernels and file systems that cannot rename without replacing.
TEST_F(SessionEntries, ASessionIsRemovedWhereRenamesAlwaysReplace) {
  for (const int code : {EINVAL, ENOSYS, EPERM}) {
    const SessionInfo session = find(makeOnVolume());
    const Fault fault("renameat2", 1, code, true);
    EXPECT_TRUE(remove(session)) << error.step << " " << error.code;
    EXPECT_TRUE(fault.fired());
    EXPECT_THAT(namesIn(volume.path), IsEmpty());
    EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
  }
}

TEST_F(SessionEntries, ARenameThatAlwaysReplacesReplacesNothing) {
  const SessionInfo session = find(makeOnVolume());
  std::string taken;
  const EachCall each([&](const std::string &call, const std::string &) {
    if (call == "renameat2" && taken.empty()) {
      taken = freshNameBeside(session.id);
      fs::create_directory(folderOf(taken));
    }
  });
  const Fault fault("renameat2", 1, EINVAL, true);
  EXPECT_TRUE(remove(session)) << error.step << " " << error.code;
  EXPECT_NE("", taken);
  EXPECT_THAT(namesIn(volume.path), ElementsAre(taken));
}

TEST_F(SessionEntries, ANameThatMayBeTakenIsNotReplaced) {
  const SessionInfo session = find(makeOnVolume());
  const Fault fault("renameat2", 1, EINVAL, true);
  std::unique_ptr<Fault> unknown;
  {
    const EachCall each([&](const std::string &call, const std::string &) {
      if (call == "renameat2" && unknown == nullptr) {
        unknown = std::make_unique<Fault>("lstat", 1, EIO);
      }
    });
    EXPECT_FALSE(remove(session));
  }
  EXPECT_TRUE(unknown != nullptr && unknown->fired());
  EXPECT_EQ(EIO, error.code);
  EXPECT_EQ(session.path, find(session.id).path);
  EXPECT_TRUE(isThere(session.path + "/file"));
}

// A lost session without its time would count as young, and not be listed.
TEST_F(SessionEntries, ALostSessionKeepsItsFreshNameWhenItsTimeCannotBeRestored) {
  const SessionInfo lost = findLost(makeLost());
  {
    const Fault kept("unlinkat", 1, EIO, true);
    const Fault untimed("utimensat", 1, EPERM, true);
    EXPECT_FALSE(remove(lost));
    EXPECT_TRUE(untimed.fired());
  }
  EXPECT_EQ(EPERM, error.code);
  EXPECT_EQ("utimensat", error.step);
  EXPECT_FALSE(isThere(lost.path));
  ASSERT_EQ(1U, list().size());
  const SessionInfo renamed = list()[0];
  EXPECT_EQ(State::Complete, renamed.state);
  EXPECT_TRUE(isThere(renamed.path + "/file"));
}

TEST_F(SessionEntries, ASessionWithALinkIsPutBackThoughItsTimeCannotBeRestored) {
  const SessionInfo session = find(makeOnVolume(kDay));
  const Fault kept("unlinkat", 1, EIO, true);
  const Fault untimed("utimensat", 1, EPERM, true);
  EXPECT_FALSE(remove(session));
  EXPECT_TRUE(untimed.fired());
  EXPECT_EQ("unlinkat", error.step);
  EXPECT_EQ(session.path, find(session.id).path);
  EXPECT_TRUE(isThere(session.path + "/file"));
}

TEST_F(SessionEntries, ASessionThatIsPutBackGetsTheLinkAgainThatItLostMeanwhile) {
  const SessionInfo session = find(makeOnVolume(kDay));
  int renames = 0;
  {
    const EachCall each([&](const std::string &call, const std::string &) {
      if (call == "renameat2" && ++renames == 2) {
        fs::remove(linkOf(session.id));
      }
    });
    const Fault kept("unlinkat", 1, EIO, true);
    EXPECT_FALSE(remove(session));
  }
  EXPECT_EQ(2, renames);
  EXPECT_EQ(State::Complete, find(session.id).state);
  EXPECT_EQ(session.path, find(session.id).path);
}

TEST_F(SessionEntries, ALinkThatLeadsToItselfHidesNoLostSession) {
  const std::string path = makeLost();
  const std::string loop = folderOf("loop");
  fs::create_directory(loop);
  const std::string target = loop + "/" + fs::path(path).filename().string();
  fs::create_symlink(target, target);
  fs::create_symlink(target, linkOf("seln.000000"));
  EXPECT_EQ(path, findLost(path).path);
}

TEST_F(SessionEntries, WhatIsNoPartIsNotCountedAsGone) {
  writeFile(folderOf("outside"), "12345");
  const SessionInfo session = find(makeOnVolume());
  std::uint64_t gone = 0;
  SessionRemoval how;
  for (const char *name : {"", ".", "..", "../outside", "absent"}) {
    how.parts.push_back({name, 1});
  }
  how.gone = [&](std::uint64_t bytes) { gone += bytes; };
  EXPECT_TRUE(remove(session, how));
  EXPECT_EQ(0U, gone);
  EXPECT_TRUE(isThere(folderOf("outside")));
}

TEST_F(SessionEntries, ARenameThatFailsKeepsTheSession) {
  const SessionInfo session = find(makeOnVolume());
  const Fault unknown("renameat2", 1, ENOSYS, true);
  const Fault failing("rename", 1, EIO);
  EXPECT_FALSE(remove(session));
  EXPECT_EQ(EIO, error.code);
  EXPECT_EQ("renameat2", error.step);
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(session.id));
  EXPECT_TRUE(isThere(session.path + "/file"));
}

// It may have been loaded just before it was renamed.
TEST_F(SessionEntries, ASessionWhoseAgeCannotBeSeenAgainIsKept) {
  for (const bool onVolume : {false, true}) {
    const SessionInfo session = find(onVolume ? makeOnVolume(kDay) : makeLocal(kDay));
    std::unique_ptr<Fault> fault;
    {
      const EachCall each([&](const std::string &call, const std::string &) {
        if (call == "renameat2" && fault == nullptr) {
          fault =
              std::make_unique<Fault>("lstat", 2, EIO); // the first checks which one was renamed
        }
      });
      SessionRemoval how;
      how.olderThan = std::chrono::hours(1);
      how.evenInUse = true;
      EXPECT_FALSE(remove(session, how));
    }
    EXPECT_TRUE(fault != nullptr && fault->fired());
    EXPECT_EQ(EIO, error.code);
    EXPECT_EQ("lstat", error.step);
    EXPECT_EQ(session.path, find(session.id).path);
    EXPECT_TRUE(isThere(session.path + "/file"));
  }
}

TEST_F(SessionEntries, AFreshNameThatIsAlwaysTakenIsNotSoughtForEver) {
  const SessionInfo session = find(makeOnVolume());
  const Fault fault("symlink", 1, EEXIST, true);
  EXPECT_FALSE(remove(session));
  EXPECT_EQ(EEXIST, error.code);
  EXPECT_EQ(10, fault.calls());
  EXPECT_TRUE(isThere(session.path + "/file"));
}

TEST_F(SessionEntries, AdoptionDoesNotSeekANameForEver) {
  const SessionInfo lost = findLost(makeLost());
  std::string id = "unchanged";
  const Fault fault("symlink", 1, EEXIST, true);
  EXPECT_FALSE(store.adopt(lost, id, error));
  EXPECT_EQ(EEXIST, error.code);
  EXPECT_EQ(10, fault.calls());
  EXPECT_EQ("unchanged", id);
}

TEST_F(SessionEntries, AdoptionIsReportedWhenTheRootCannotBeMade) {
  const SessionInfo lost = findLost(makeLost());
  fs::remove(kSessionRoot);
  LogCapture log;
  std::string id;
  const Fault fault("mkdir", 1, ENOSPC, true);
  EXPECT_FALSE(store.adopt(lost, id, error));
  EXPECT_EQ(ENOSPC, error.code);
  EXPECT_EQ("mkdir", error.step);
  EXPECT_EQ(kSessionRoot, error.path);
  EXPECT_EQ(1U, log.take().size());
}

TEST_F(SessionEntries, ARootThatOthersCanWriteIsRefused) {
  const SessionInfo session = find(makeLocal());
  for (const mode_t mode : {0720U, 0702U}) {
    ASSERT_EQ(0, ::chmod(kSessionRoot, mode));
    EXPECT_FALSE(remove(session));
    EXPECT_EQ(EPERM, error.code);
    EXPECT_EQ("refused", error.step);
  }
  ASSERT_EQ(0, ::chmod(kSessionRoot, 0700));
  EXPECT_TRUE(remove(session));
}

TEST_F(SessionEntries, ADirectoryIsPutBackWhenAnotherTookItsPlace) {
  const SessionInfo session = find(makeLocal());
  const EachCall each([&](const std::string &call, const std::string &path) {
    if (call == "renameat2" && path == session.path) {
      fs::remove_all(path);
      fs::create_directory(path);
      writeFile(path + "/other", "");
    }
  });
  EXPECT_FALSE(remove(session));
  EXPECT_EQ(ESTALE, error.code);
  EXPECT_EQ("refused", error.step);
}

} // namespace
