// Locks and local sessions when the file system of /tmp/kovabackup is full.
#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "kovabackup/service/run_lock.h"
#include "kovabackup/session.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <string>
#include <sys/mount.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;
using KOVA::Backup::Session;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::LockHolder;
using KOVA::Backup::Service::RunLock;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

constexpr const char *kArea = "/tmp/kovabackup";
constexpr const char *kFiller = "/tmp/kovabackup/filler";

class FullTmp : public testing::Test {
protected:
  void SetUp() override {
    fs::create_directory(kArea);
    if (::mount("tmpfs", kArea, "tmpfs", 0, "mode=0755,size=64k,nr_inodes=16") != 0) {
      fs::remove(kArea);
      GTEST_SKIP() << "skipped: a tmpfs cannot be mounted";
    }
    (void)KOVA::Backup::Path::createIpcTempPath("lock", 0700);
    (void)KOVA::Backup::Path::createIpcTempPath("session", 0700);
    fs::create_directory(kFiller);
  }

  void TearDown() override {
    (void)::umount2(kArea, MNT_DETACH);
    fs::remove(kArea);
  }

  static void fillBlocks() {
    const int fd = ::open("/tmp/kovabackup/filler/blocks", O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
    const std::string block(4096, 'x');
    while (::write(fd, block.data(), block.size()) > 0) {
    }
    EXPECT_EQ(ENOSPC, errno);
    ::close(fd);
  }

  static void fillInodes() {
    for (int number = 0, fd = 0; fd >= 0; ++number) {
      const std::string path = std::string(kFiller) + "/" + std::to_string(number);
      fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0600);
      ::close(fd);
    }
  }

  static void makeRoom() { fs::remove_all(kFiller); }

  LogCapture log;
  Error error;
};

// The note of the holder has no place in a block, so its time is not known.
TEST_F(FullTmp, ARunLockIsTakenWithoutBlocks) {
  fillBlocks();
  RunLock lock("nightly");
  EXPECT_TRUE(lock.take(error));
  RunLock second("nightly");
  EXPECT_FALSE(second.take(error));
  EXPECT_EQ(EWOULDBLOCK, error.code);
  LockHolder holder;
  EXPECT_TRUE(RunLock::holder("nightly", holder));
  EXPECT_EQ(::getpid(), holder.taker);
  EXPECT_EQ(0, holder.since);
}

TEST_F(FullTmp, ANewRunLockReportsThatThereIsNoSpaceForItsFile) {
  fillInodes();
  RunLock lock("nightly");
  EXPECT_FALSE(lock.take(error));
  EXPECT_EQ(ENOSPC, error.code);
  makeRoom();
  EXPECT_TRUE(lock.take(error));
}

TEST_F(FullTmp, ALockThatWasTakenBeforeIsTakenAgain) {
  RunLock lock("nightly");
  ASSERT_TRUE(lock.take(error));
  lock.release();
  fillInodes();
  EXPECT_TRUE(lock.take(error));
}

// Nothing is written without the lock that was asked for.
TEST_F(FullTmp, AMapWithoutItsLockDoesNotSave) {
  const TestFolder folder;
  const std::string file = writeFile(folder / "task.conf", "[task1]\nname=\"old\"\n");
  OptionMap map;
  ASSERT_TRUE(map.setLockToken("task.conf") && map.optSectionLoad(file, "task", 1));
  map.optSet("name", "new");
  fillInodes();
  EXPECT_FALSE(map.optSectionSave());
  EXPECT_THAT(log.take(), ElementsAre(errLine("option_map", 951, "lock: open lock token failed.")));
  EXPECT_THAT(readFile(file), HasSubstr("\"old\""));
  makeRoom();
  EXPECT_TRUE(map.optSectionSave());
  EXPECT_THAT(readFile(file), HasSubstr("\"new\""));
}

TEST_F(FullTmp, ALocalSessionIsNotMadeWithoutInodes) {
  fillInodes();
  Session session;
  EXPECT_FALSE(session.create());
  EXPECT_EQ("", session.getId());
  EXPECT_THAT(log.take().back().text, HasSubstr("session:99 "));
  EXPECT_THAT(namesIn("/tmp/kovabackup/session"), IsEmpty());
  makeRoom();
  EXPECT_TRUE(session.create());
  EXPECT_TRUE(session.destroy());
}

} // namespace
