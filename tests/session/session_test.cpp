#include "tests/session/session_fixture.h"
#include "tests/support/counting_loop.h"

#include <cerrno>
#include <filesystem>
#include <type_traits>
#include <unistd.h>
#include <utime.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr const char *kModule = "session";

// The last mode that access was called with; for root, access succeeds whatever the mode.
int accessAskedFor = -1;

void makeOld(const std::string &path) {
  const utimbuf old{1000, 1000};
  ASSERT_EQ(0, ::utime(path.c_str(), &old));
}

} // namespace

extern "C" int access(const char *path, int mode) noexcept {
  static auto *const real = realFunction<int(const char *, int)>("access");
  accessAskedFor = mode;
  return failsNow("access") ? -1 : real(path, mode);
}

// --- shape ---

TEST(SessionShape, IsOneOwningPointer) {
  EXPECT_EQ(sizeof(void *), sizeof(Session));
  EXPECT_FALSE(std::is_copy_constructible<Session>::value);
  EXPECT_FALSE(std::is_copy_assignable<Session>::value);
  EXPECT_FALSE(std::is_move_constructible<Session>::value);
  EXPECT_FALSE(std::is_move_assignable<Session>::value);
  EXPECT_FALSE(std::is_polymorphic<Session>::value);
}

TEST_F(Sessions, HoldsIdAndPathInThisOrderBehindIt) {
  Session session;
  ASSERT_TRUE(session.create());
  struct Record {
    std::string id, path;
  };
  const Record *record = *reinterpret_cast<Record **>(&session);
  EXPECT_EQ(session.getId(), record->id);
  EXPECT_EQ(session.getPath(), record->path);
}

TEST(SessionShape, IsEmptyAtFirst) {
  expectEmpty(Session());
  EXPECT_FALSE(isThere("/tmp/kovabackup"));
}

namespace {
bool cleanUp(const std::string &id) {
  Session session;
  return session.load(id) && session.destroy();
}
} // namespace

TEST_F(Sessions, TravelAsTheHeaderShows) {
  FakeVolumes platform(volume.path);
  platform.supportedLocation = freshLocation();
  Session session;
  ASSERT_TRUE(session.create(TempManager::maxExtBtrfsVolume()));
  writeFile(session.getPath() + "/file", "text");
  EXPECT_EQ("text", readFile(Session::getPathById(session.getId()) + "/file"));
  EXPECT_TRUE(cleanUp(session.getId()));
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

// --- by id ---

TEST_F(Sessions, PathOfNoIdIsRefused) {
  LogCapture log;
  EXPECT_EQ("", Session::getPathById(""));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 250, "invalid parameter, empty session id")));
}

TEST_F(Sessions, PathOfALocalIdIsComputed) {
  for (const char *id :
       {"sess.AAAAAA", "sess", "other", "sel", "Seln.AAAAAA", "../other", "a/b", "sess/"}) {
    EXPECT_EQ(linkOf(id), Session::getPathById(id));
  }
  EXPECT_FALSE(isThere(kSessionRoot));
}

TEST_F(Sessions, PathOfAMissingLinkIsNoneSilently) {
  EXPECT_EQ("", Session::getPathById("seln.AAAAAA"));
  EXPECT_EQ("", Session::getPathById("seln"));
}

TEST_F(Sessions, PathOfWhatIsNoLinkIsNone) {
  std::filesystem::create_directories(linkOf("seln.AAAAAA"));
  LogCapture log;
  EXPECT_EQ("", Session::getPathById("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(
                              kModule, 259, "failed to read link[" + linkOf("seln.AAAAAA") + "]")));
}

TEST_F(Sessions, PathOfAnIdThatIsTooLongForALinkIsNone) {
  std::filesystem::create_directories(kSessionRoot);
  EXPECT_EQ("", Session::getPathById("seln" + std::string(251, 'x'))) << "255 bytes, but no link";
  const std::string tooLong = "seln" + std::string(252, 'x');
  LogCapture log;
  EXPECT_EQ("", Session::getPathById(tooLong));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 259, "failed to read link[" + linkOf(tooLong) + "]")));
}

TEST_F(Sessions, PathIsWhatTheLinkHoldsUpTo1024Bytes) {
  std::filesystem::create_directories(kSessionRoot);
  for (const std::size_t length : {1U, 1023U, 1024U, 1025U, 4000U}) {
    const std::string target(length, 't');
    ASSERT_EQ(0, ::symlink(target.c_str(), linkOf("seln.AAAAAA").c_str()));
    EXPECT_EQ(target.substr(0, 1024), Session::getPathById("seln.AAAAAA"));
    std::filesystem::remove(linkOf("seln.AAAAAA"));
  }
}

// --- loading ---

TEST_F(Sessions, LoadBindsALocalOneAndRefreshesItsTimes) {
  Session made;
  ASSERT_TRUE(made.create());
  makeOld(made.getPath());
  Session session;
  EXPECT_TRUE(session.load(made.getId()));
  EXPECT_EQ(made.getId(), session.getId());
  EXPECT_EQ(made.getPath(), session.getPath());
  struct stat info;
  ASSERT_EQ(0, ::lstat(made.getPath().c_str(), &info));
  EXPECT_GT(info.st_atime, 1000);
  EXPECT_GT(info.st_mtime, 1000);
}

TEST_F(Sessions, LoadLeavesTheTimesOfWhatLiesInIt) {
  Session made;
  ASSERT_TRUE(made.create());
  const std::string file = made.getPath() + "/file";
  writeFile(file, "text");
  makeOld(file);
  Session session;
  EXPECT_TRUE(session.load(made.getId()));
  struct stat info;
  ASSERT_EQ(0, ::lstat(file.c_str(), &info));
  EXPECT_EQ(1000, info.st_mtime);
}

TEST_F(Sessions, LoadBindsAVolumeOneByItsLink) {
  FakeVolumes platform(volume.path);
  Session made;
  ASSERT_TRUE(made.create(anyVolume()));
  makeOld(made.getPath());
  Session session;
  EXPECT_TRUE(session.load(made.getId()));
  EXPECT_EQ(made.getId(), session.getId());
  EXPECT_EQ(made.getPath(), session.getPath());
  struct stat info;
  ASSERT_EQ(0, ::lstat(made.getPath().c_str(), &info));
  EXPECT_GT(info.st_mtime, 1000);
}

TEST_F(Sessions, LoadDoesNotReplaceABoundOne) {
  Session session;
  ASSERT_TRUE(session.create());
  LogCapture log;
  EXPECT_FALSE(session.load(""));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 170,
                                              "session has been loaded[" + session.getId() + "][" +
                                                  session.getPath() + "]")));
  EXPECT_NE("", session.getId());
}

TEST_F(Sessions, LoadRefusesAnEmptyId) {
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load(""));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 174, "invalid parameter, empty session id")));
}

TEST_F(Sessions, LoadFailsForWhatIsNoDirectory) {
  const TestFolder scratch;
  std::filesystem::create_directories(kSessionRoot);
  writeFile(linkOf("sess.file"), "text");
  std::filesystem::create_directory_symlink(scratch.path(), linkOf("sess.link"));
  for (const char *id : {"sess.missing", "sess.file", "sess.link"}) {
    Session session;
    LogCapture log;
    EXPECT_FALSE(session.load(id));
    expectEmpty(session);
    EXPECT_THAT(log.take(),
                ElementsAre(errLine(kModule, 180, "failed to lstat session[" + linkOf(id) + "]")));
  }
}

TEST_F(Sessions, LoadOfAMissingLinkNamesAnEmptyPath) {
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 180, "failed to lstat session[]")));
}

TEST_F(Sessions, LoadOfWhatIsNoLinkLogsThatToo) {
  std::filesystem::create_directories(linkOf("seln.AAAAAA"));
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load("seln.AAAAAA"));
  EXPECT_THAT(log.take(), ElementsAre(errLine(kModule, 259,
                                              "failed to read link[" + linkOf("seln.AAAAAA") + "]"),
                                      errLine(kModule, 180, "failed to lstat session[]")));
}

TEST_F(Sessions, LoadOfALinkToALinkFails) {
  const TestFolder scratch;
  std::filesystem::create_directories(kSessionRoot);
  std::filesystem::create_directory_symlink(volume.path, scratch / "link");
  std::filesystem::create_symlink(scratch / "link", linkOf("seln.AAAAAA"));
  Session session;
  LogCapture log;
  EXPECT_FALSE(session.load("seln.AAAAAA"));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 180, "failed to lstat session[/tmp/scratch/link]")));
}

TEST_F(Sessions, LoadNeedsAccessAndSetsTheTimes) {
  Session made;
  ASSERT_TRUE(made.create());
  struct Case {
    const char *function;
    int number;
    const char *text;
  };
  const Case cases[] = {{"lstat", 180, "failed to lstat session["},
                        {"access", 184, "failed to access session["},
                        {"utime", 188, "failed to touch session["}};
  for (const Case &one : cases) {
    forEachFailure(one.function, EACCES, [&](Fault &fault) {
      LogCapture log;
      Session session;
      const bool loaded = session.load(made.getId());
      EXPECT_EQ(!fault.fired(), loaded);
      if (loaded) {
        EXPECT_THAT(log.take(), IsEmpty());
        EXPECT_EQ(made.getPath(), session.getPath());
      } else {
        EXPECT_THAT(log.take(),
                    ElementsAre(errLine(kModule, one.number, one.text + made.getPath() + "]")));
        expectEmpty(session);
      }
    });
  }
}

TEST_F(Sessions, LoadAsksWhetherTheDirectoryMayBeWrittenAndEntered) {
  Session made;
  ASSERT_TRUE(made.create());
  Session session;
  EXPECT_TRUE(session.load(made.getId()));
  EXPECT_EQ(W_OK | X_OK, accessAskedFor);
}

TEST_F(Sessions, LoadFailsWhenTheLinkCannotBeRead) {
  FakeVolumes platform(volume.path);
  Session made;
  ASSERT_TRUE(made.create(anyVolume()));
  forEachFailure("readlink", EIO, [&](Fault &fault) {
    LogCapture log;
    Session session;
    const bool loaded = session.load(made.getId());
    EXPECT_EQ(!fault.fired(), loaded);
    if (!loaded) {
      EXPECT_THAT(
          log.take(),
          ElementsAre(errLine(kModule, 259, "failed to read link[" + linkOf(made.getId()) + "]"),
                      errLine(kModule, 180, "failed to lstat session[]")));
    }
  });
}
