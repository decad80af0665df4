// Sessions on volumes that are read-only, full or gone, and with file systems mounted in them.
#include "tests/service/session_store_support.h"

#include <cerrno>
#include <fcntl.h>
#include <sys/mount.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using testing::IsEmpty;
namespace fs = std::filesystem;

class SessionStoreMount : public SessionStoreTest {
protected:
  // The flag of the mount, because a user namespace may not change that of the file system.
  bool remount(bool readOnly) const {
    unsigned long flags = MS_REMOUNT | MS_BIND;
    if (readOnly) {
      flags |= MS_RDONLY;
    }
    return ::mount(nullptr, volume.path.c_str(), nullptr, flags, nullptr) == 0;
  }
};

TEST_F(SessionStoreMount, AReadOnlyVolumeKeepsItsSessionsAndSaysSo) {
  const std::string id = makeOnVolume(kDay);
  const std::string path = makeLost(kDay);
  const SessionInfo lost = findLost(path);
  if (!remount(true)) {
    GTEST_SKIP() << "skipped: the volume cannot be remounted";
  }
  EXPECT_FALSE(remove(find(id)));
  EXPECT_EQ("renameat2 " + folderOf(id) + ": " + std::to_string(EROFS), failuresOf({error})[0]);
  EXPECT_FALSE(remove(lost));
  EXPECT_FALSE(prune(kHour));
  EXPECT_EQ(1U, failed.size()); // the platform offers no volume on which nothing can be written
  EXPECT_EQ(1U, namesIn(kSessionRoot).size());
  EXPECT_TRUE(isThere(folderOf(id) + "/file"));
  EXPECT_TRUE(isThere(path + "/file"));
  ASSERT_TRUE(remount(false));
  EXPECT_TRUE(prune(kHour));
  EXPECT_THAT(list(), IsEmpty());
}

TEST_F(SessionStoreMount, AnUnmountedVolumeLeavesLinksThatDangle) {
  const std::string id = makeOnVolume(kDay);
  ASSERT_EQ(0, ::mount("tmpfs", volume.path.c_str(), "tmpfs", 0, "mode=1777"));
  EXPECT_EQ(State::Dangling, find(id).state);
  EXPECT_TRUE(prune(kHour)) << "the link is new";
  EXPECT_EQ(State::Dangling, find(id).state);
  EXPECT_TRUE(remove(find(id)));
  ASSERT_EQ(0, ::umount2(volume.path.c_str(), MNT_DETACH));
  const SessionInfo lost = findLost(folderOf(id));
  std::string adopted;
  EXPECT_TRUE(store.adopt(lost, adopted, error));
  EXPECT_EQ(id, adopted);
}

TEST_F(SessionStoreMount, AFullVolumeIsEmptied) {
  ASSERT_EQ(0, ::mount(nullptr, volume.path.c_str(), "tmpfs", MS_REMOUNT, "size=64k,nr_inodes=8"));
  const std::string id = makeOnVolume(kDay);
  const int full = ::open((folderOf(id) + "/full").c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
  const std::string block(4096, 'x');
  while (::write(full, block.data(), block.size()) > 0) {
  }
  EXPECT_EQ(ENOSPC, errno);
  ::close(full);
  EXPECT_TRUE(remove(find(id))) << error.step << " " << error.path;
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

// What is mounted in a session is never removed, also not when it is one of the parts.
TEST_F(SessionStoreMount, AMountPointInASessionRemainsWithItsContents) {
  for (const bool onVolume : {false, true}) {
    const std::string id = onVolume ? makeOnVolume() : makeLocal();
    const SessionInfo session = find(id);
    const std::string inner = session.path + "/mounted";
    fs::create_directory(inner);
    setAge(session.path, kDay);
    const timespec before = modifiedOf(session.path);
    ASSERT_EQ(0, ::mount("tmpfs", inner.c_str(), "tmpfs", 0, ""));
    writeFile(inner + "/precious", "x");
    SessionRemoval how;
    how.parts = {{"file", 5}, {"mounted", 0}};
    EXPECT_FALSE(remove(session, how));
    EXPECT_EQ(inner, error.path) << error.step;
    EXPECT_TRUE(isThere(inner + "/precious"));
    EXPECT_FALSE(isThere(session.path + "/file"));
    EXPECT_EQ(session.path, find(id).path);
    EXPECT_EQ(before.tv_sec, modifiedOf(session.path).tv_sec);
    EXPECT_FALSE(prune(kHour));
    EXPECT_EQ(1U, failed.size());
    ASSERT_EQ(0, ::umount2(inner.c_str(), MNT_DETACH));
    EXPECT_TRUE(prune(kHour));
    EXPECT_THAT(list(), IsEmpty());
  }
}

TEST_F(SessionStoreMount, WhatIsMountedInASessionIsNotCounted) {
  const SessionInfo session = find(makeLocal());
  const std::string inner = session.path + "/mounted";
  ASSERT_EQ(0, ::mkdir(inner.c_str(), 0700));
  ASSERT_EQ(0, ::mount("tmpfs", inner.c_str(), "tmpfs", 0, ""));
  std::uint64_t files = 0;
  std::uint64_t bytes = 0;
  EXPECT_TRUE(store.size(session, files, bytes, error));
  writeFile(inner + "/others", std::string(1000, 'x'));
  std::uint64_t filesAfter = 0;
  std::uint64_t bytesAfter = 0;
  EXPECT_TRUE(store.size(session, filesAfter, bytesAfter, error));
  EXPECT_EQ(files, filesAfter);
  EXPECT_EQ(bytes, bytesAfter);
  ASSERT_EQ(0, ::umount2(inner.c_str(), MNT_DETACH));
}

// Not the last one, which depends on the order of the names in the folder.
TEST_F(SessionStoreMount, TheFirstOfSeveralFailuresIsReported) {
  const SessionInfo session = find(makeLocal(kDay));
  for (const char *name : {"/one", "/two"}) {
    fs::create_directories(session.path + name + "/mounted");
    ASSERT_EQ(0, ::mount("tmpfs", (session.path + name + "/mounted").c_str(), "tmpfs", 0, ""));
  }
  for (const auto &[first, second] : {std::pair("one", "two"), {"two", "one"}}) {
    SessionRemoval how;
    how.parts = {{first, 0}, {second, 0}};
    EXPECT_FALSE(remove(session, how));
    EXPECT_EQ(session.path + "/" + first + "/mounted", error.path);
  }
  for (const char *name : {"/one", "/two"}) {
    ASSERT_EQ(0, ::umount2((session.path + name + "/mounted").c_str(), MNT_DETACH));
  }
}

TEST_F(SessionStoreMount, ASessionThatIsAMountPointRemains) {
  const SessionInfo session = find(makeLocal(kDay));
  ASSERT_EQ(0, ::mount("tmpfs", session.path.c_str(), "tmpfs", 0, ""));
  writeFile(session.path + "/precious", "x");
  EXPECT_FALSE(remove(find(session.id)));
  EXPECT_EQ("renameat2 " + session.path + ": " + std::to_string(EBUSY), failuresOf({error})[0]);
  EXPECT_TRUE(isThere(session.path + "/precious"));
  ASSERT_EQ(0, ::umount2(session.path.c_str(), MNT_DETACH));
}

} // namespace
