// Sessions, temporary files and published files on a full disk, and a run of the example service.
#include "tests/crash/full_disk.h"

#include "kovabackup/path_util.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/service/session_store.h"
#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"
#include "tests/crash/programs.h"

#include <sys/stat.h>

namespace {

using namespace KovaTest;
namespace fs = std::filesystem;
using KOVA::Backup::Session;
using KOVA::Backup::TempManager;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::PublishedFile;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

const std::string kShared = "/mnt/disk/.kova_tmp";
constexpr const char *kSessionRoot = "/tmp/kovabackup/session";

bool writes(int fd, const std::string &text) {
  return ::write(fd, text.data(), text.size()) == static_cast<ssize_t>(text.size());
}

class FullDiskStorage : public FullDisk {
protected:
  void SetUp() override {
    FullDisk::SetUp();
    if (!IsSkipped()) {
      // As the first session of a volume makes it. A process looks for it only once.
      ASSERT_EQ(0, ::mkdir(kShared.c_str(), 0700));
      ASSERT_EQ(0, ::chmod(kShared.c_str(), 01777));
      (void)KOVA::Backup::Path::createIpcTempPath("session", 0700);
    }
  }

  void TearDown() override {
    fs::remove_all("/tmp/kovabackup");
    FullDisk::TearDown();
  }

  static boost::shared_ptr<KOVA::Backup::FilterVolume> volume() {
    return TempManager::sameVolume(kDisk);
  }

  // Its blocks hold the inodes, too, so a file may already be too much when there is no block.
  static bool isXfs() { return std::string(GetParam().fileSystem) == "xfs"; }

  LogCapture log;
};

// A folder takes an inode, and on some file systems a block.
TEST_P(FullDiskStorage, ASessionIsMadeCompletelyOrNotAtAll) {
  fill();
  Session session;
  if (session.create(volume())) {
    EXPECT_TRUE(lacksBlocks() && std::string(GetParam().fileSystem) != "ext4");
    EXPECT_TRUE(session.destroy());
  } else {
    const std::vector<LogLine> lines = log.take();
    ASSERT_FALSE(lines.empty());
    EXPECT_THAT(lines.back().text, HasSubstr("session:99 "));
    EXPECT_EQ("", session.getId());
  }
  EXPECT_THAT(namesIn(kShared), IsEmpty());
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
  makeRoom();
  EXPECT_TRUE(session.create(volume()));
  EXPECT_TRUE(session.destroy());
}

TEST_P(FullDiskStorage, ASessionCanBeFoundAndDestroyed) {
  Session session;
  ASSERT_TRUE(session.create(volume()));
  writeFile(session.getPath() + "/file", "content");
  fill();
  Session found;
  EXPECT_TRUE(found.load(session.getId()));
  EXPECT_TRUE(found.destroy());
  EXPECT_THAT(namesIn(kShared), IsEmpty());
}

TEST_P(FullDiskStorage, SessionsCanBePruned) {
  Session session;
  ASSERT_TRUE(session.create(volume()));
  writeFile(session.getPath() + "/file", "content");
  fill();
  KOVA::Backup::Service::SessionStore store;
  std::vector<KOVA::Backup::Service::SessionInfo> removed;
  std::vector<Error> failed;
  EXPECT_TRUE(store.prune(std::chrono::seconds(0), false, removed, failed));
  EXPECT_EQ(1U, removed.size());
  EXPECT_THAT(namesIn(kShared), IsEmpty());
}

TEST_P(FullDiskStorage, ATemporaryFileIsRemovedAgain) {
  fill();
  {
    KOVA::Backup::ScopedVolumeTempFile file(volume(), "report", false);
    EXPECT_TRUE(file.isValid() == lacksBlocks() || isXfs());
    EXPECT_EQ(file.isValid() ? 0U : 1U, log.take().size()); // mkstemp failed
    EXPECT_FALSE(file.isValid() && writes(file.getFileDescripter(), std::string(8192, 'x')));
  }
  EXPECT_THAT(namesIn(kShared), IsEmpty());
  makeRoom();
  KOVA::Backup::ScopedVolumeTempFile file(volume(), "report", false);
  ASSERT_TRUE(file.isValid());
  EXPECT_TRUE(writes(file.getFileDescripter(), std::string(8192, 'x')));
}

TEST_P(FullDiskStorage, APublishedFileKeepsTheOldContent) {
  const std::string target = "/mnt/disk/index";
  writeFile(target, "old");
  fill();
  Error error;
  {
    PublishedFile withRoom(target);
    EXPECT_FALSE(withRoom.create(error, 100000));
    EXPECT_EQ(ENOSPC, error.code);
    EXPECT_EQ(lacksBlocks() ? "fstatvfs" : "openat", error.step);
    PublishedFile file(target);
    const bool isCreated = file.create(error);
    EXPECT_TRUE(isCreated == lacksBlocks() || isXfs());
    EXPECT_EQ(ENOSPC, error.code);
    EXPECT_FALSE(isCreated && writes(file.fd(), std::string(8192, 'x')));
  }
  EXPECT_EQ("old", readFile(target));
  EXPECT_THAT(names(), ElementsAre(".kova_tmp", "index"));
  makeRoom();
  PublishedFile file(target);
  EXPECT_TRUE(file.create(error, 8192) && writes(file.fd(), std::string(8192, 'x')) &&
              file.publish(error));
  EXPECT_EQ(8192U, readFile(target).size());
}

class FullDiskService : public FullDisk {
protected:
  static int run(const std::vector<std::string> &words) {
    std::vector<std::string> arguments = {KOVA_EXAMPLE_PATH, "--tasks", "/tmp/tasks.conf"};
    arguments.insert(arguments.end(), words.begin(), words.end());
    return Crash::runProgram(arguments, "/tmp/output");
  }

  void TearDown() override {
    for (const char *path : {"/tmp/kovabackup", "/tmp/source", "/tmp/tasks.conf", "/tmp/output"}) {
      fs::remove_all(path);
    }
    FullDisk::TearDown();
  }
};

TEST_P(FullDiskService, ARunAnnouncesNoArchive) {
  if (std::string(KOVA_EXAMPLE_PATH).empty()) {
    GTEST_SKIP() << "skipped: the example service requires libcli11-dev";
  }
  const std::string archives = std::string(kDisk) + "/archives";
  fs::create_directory(archives);
  fs::create_directory("/tmp/source");
  writeFile("/tmp/source/file", std::string(5000, 'x'));
  ASSERT_EQ(0, run({"add", "--name", "task", "--source", "/tmp/source", "--destination", archives}))
      << readFile("/tmp/output");
  fill();
  EXPECT_EQ(1, run({"run", "1"}));
  EXPECT_THAT(readFile("/tmp/output"), HasSubstr("No space left on device"));
  EXPECT_THAT(readFile("/tmp/output"), testing::Not(HasSubstr(" -> ")));
  EXPECT_THAT(namesIn(archives), IsEmpty());
  makeRoom();
  EXPECT_EQ(0, run({"run", "1"})) << readFile("/tmp/output");
  EXPECT_THAT(namesIn(archives), ElementsAre(StartsWith("task-")));
}

INSTANTIATE_TEST_SUITE_P(On, FullDiskStorage, allFullDisks(), nameOfDisk);
INSTANTIATE_TEST_SUITE_P(On, FullDiskService, allFullDisks(), nameOfDisk);

} // namespace
