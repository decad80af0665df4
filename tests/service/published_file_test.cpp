// What readers find before and after a file is published, and what is left otherwise.

#include "tests/service/published_file_support.h"

#include "base/unique_fd.h"
#include "tests/support/census.h"
#include "tests/support/child_process.h"

#include <fcntl.h>
#include <filesystem>
#include <functional>
#include <sys/stat.h>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

namespace fs = std::filesystem;
using KOVA::Base::UniqueFd;

std::function<void(int)> beforeSync; // runs before each fsync

} // namespace

extern "C" int fsync(int fd) {
  static auto *const real = realFunction<int(int)>("fsync");
  if (beforeSync) {
    beforeSync(fd);
  }
  return failsNow("fsync") ? -1 : real(fd);
}

TEST_F(PublishedFileTest, AppearsWithItsContent) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    PublishedFile file(target_);
    EXPECT_EQ(-1, file.fd());
    ASSERT_TRUE(file.create(error_));
    writeTo(file.fd(), "content");
    EXPECT_FALSE(isThere(target_));
    EXPECT_EQ(kind == Files::Named, isThere(folder_ / ".target.kova.0.tmp"));
    EXPECT_TRUE(file.publish(error_));
    EXPECT_EQ(-1, file.fd());
    EXPECT_EQ("content", readFile(target_));
    EXPECT_THAT(folder_.names(), ElementsAre("target"));
    EXPECT_EQ(0, ::unlink(target_.c_str()));
  }
  expectError(error_, 0, "", "");
}

TEST_F(PublishedFileTest, HasItsModeWhateverTheUmask) {
  for (const mode_t umask : {0000U, 0022U, 0777U}) {
    const ScopedUmask scoped(umask);
    for (const Files kind : {Files::Unnamed, Files::Named}) {
      const Fault fault = files(kind);
      for (const mode_t mode : {0640U, 0600U, 0444U, 0666U, 0000U, 06755U}) {
        PublishedFile file(target_, mode);
        ASSERT_TRUE(file.create(error_));
        struct stat status = {};
        ASSERT_EQ(0, ::fstat(file.fd(), &status));
        EXPECT_EQ(0U, status.st_mode & 077U) << "others must not read it yet";
        writeTo(file.fd(), "x"); // which takes the set-id bits from an executable file
        ASSERT_TRUE(file.publish(error_));
        EXPECT_EQ(static_cast<int>(mode), modeOf(target_));
      }
    }
  }
}

// A power cut must find neither a name without the content nor a file that others may read.
TEST_F(PublishedFileTest, IsOnTheDiskWithItsModeBeforeItHasItsName) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    for (const bool replaces : {false, true}) {
      const Fault fault = files(kind);
      (void)::unlink(target_.c_str());
      if (replaces) {
        writeFile(target_, "old");
      }
      PublishedFile file(target_, 0604);
      ASSERT_TRUE(file.create(error_));
      writeTo(file.fd(), "new");
      int synced = 0;
      beforeSync = [&](int fd) {
        struct stat status = {};
        EXPECT_EQ(0, ::fstat(fd, &status));
        if (S_ISREG(status.st_mode)) {
          ++synced;
          EXPECT_EQ(0604U, status.st_mode & 07777U);
          EXPECT_EQ(replaces ? "old" : "none", isThere(target_) ? readFile(target_) : "none");
        }
      };
      EXPECT_TRUE(file.publish(error_));
      beforeSync = nullptr;
      EXPECT_EQ(1, synced);
    }
  }
}

TEST_F(PublishedFileTest, HasItsNameBeforeTheFolderIsSynced) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    (void)::unlink(target_.c_str());
    PublishedFile file(target_);
    ASSERT_TRUE(file.create(error_));
    int synced = 0;
    beforeSync = [&](int fd) {
      struct stat status = {};
      EXPECT_EQ(0, ::fstat(fd, &status));
      if (S_ISDIR(status.st_mode)) {
        ++synced;
        EXPECT_TRUE(isThere(target_));
      }
    };
    EXPECT_TRUE(file.publish(error_));
    beforeSync = nullptr;
    EXPECT_EQ(1, synced);
  }
}

TEST_F(PublishedFileTest, HasMode0640UnlessToldOtherwise) {
  PublishedFile file(target_);
  ASSERT_TRUE(file.create(error_) && file.publish(error_));
  EXPECT_EQ(0640, modeOf(target_));
  EXPECT_EQ("", readFile(target_));
}

TEST_F(PublishedFileTest, ReplacesAFileThatReadersKeep) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    writeFile(target_, "old");
    const UniqueFd reader(::open(target_.c_str(), O_RDONLY | O_CLOEXEC));
    PublishedFile file(target_);
    ASSERT_TRUE(file.create(error_));
    writeTo(file.fd(), "new");
    EXPECT_EQ("old", readFile(target_));
    ASSERT_TRUE(file.publish(error_));
    EXPECT_EQ("new", readFile(target_));
    EXPECT_EQ("old", readFile("/proc/self/fd/" + std::to_string(reader.get())));
    EXPECT_THAT(folder_.names(), ElementsAre("target"));
  }
}

TEST_F(PublishedFileTest, IsGoneWithoutPublish) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    {
      PublishedFile file(target_);
      ASSERT_TRUE(file.create(error_));
      writeTo(file.fd(), "content");
    }
    EXPECT_THAT(folder_.names(), IsEmpty());
  }
}

TEST_F(PublishedFileTest, ReplacesALinkAndNotItsTarget) {
  const std::string other = writeFile(folder_ / "other", "other");
  for (const std::string &to : {other, folder_ / "missing"}) {
    fs::create_symlink(to, target_);
    PublishedFile file(target_);
    ASSERT_TRUE(file.create(error_));
    ASSERT_TRUE(file.publish(error_));
    EXPECT_TRUE(fs::is_regular_file(fs::symlink_status(target_)));
    EXPECT_EQ("other", readFile(other));
    EXPECT_THAT(folder_.names(), ElementsAre("other", "target"));
    fs::remove(target_);
  }
}

TEST_F(PublishedFileTest, RefusesAFolderBeforeAnythingIsWritten) {
  fs::create_directory(target_);
  PublishedFile file(target_);
  EXPECT_FALSE(file.create(error_));
  expectError(error_, EISDIR, "fstatat", target_);
  EXPECT_EQ(-1, file.fd());
  for (const char *name : {".", ".."}) {
    EXPECT_FALSE(PublishedFile(target_ + "/" + name).create(error_));
    expectError(error_, EISDIR, "fstatat", target_ + "/" + name);
  }
}

TEST_F(PublishedFileTest, LeavesAFolderThatAppearsMeanwhile) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    PublishedFile file(target_);
    ASSERT_TRUE(file.create(error_));
    fs::create_directory(target_);
    EXPECT_FALSE(file.publish(error_));
    expectError(error_, EISDIR, "renameat", target_);
    EXPECT_THAT(folder_.names(), ElementsAre("target"));
    EXPECT_TRUE(fs::remove(target_));
  }
}

TEST_F(PublishedFileTest, RefusesWhatNamesNoFile) {
  for (const std::string &target :
       {std::string(), std::string("/"), target_ + "/", target_ + '\0', target_ + '\0' + "x"}) {
    error_ = Error();
    EXPECT_FALSE(PublishedFile(target).create(error_));
    expectError(error_, EINVAL, "openat", target);
  }
  EXPECT_FALSE(PublishedFile(folder_ / "missing/target").create(error_));
  expectError(error_, ENOENT, "open", folder_ / "missing");
  writeFile(target_, "");
  EXPECT_FALSE(PublishedFile(target_ + "/x").create(error_));
  expectError(error_, ENOTDIR, "open", target_);
  const std::string longName(256, 'n');
  EXPECT_FALSE(PublishedFile(folder_ / longName).create(error_));
  expectError(error_, ENAMETOOLONG, "fstatat", folder_ / longName);
  EXPECT_THAT(folder_.names(), ElementsAre("target"));
}

TEST_F(PublishedFileTest, MayBeRelative) {
  const ScopedWorkingDir working(folder_.path());
  for (const char *target : {"target", "./target", "../scratch/target"}) {
    PublishedFile file(target);
    ASSERT_TRUE(file.create(error_)) << error_.step << error_.code;
    const ScopedWorkingDir elsewhere("/");
    ASSERT_TRUE(file.publish(error_));
    EXPECT_THAT(folder_.names(), ElementsAre("target"));
    fs::remove(target_);
  }
}

TEST_F(PublishedFileTest, StaysInItsFolderWhereverThatGoes) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    fs::create_directory(folder_ / "a");
    PublishedFile file(folder_ / "a/target");
    ASSERT_TRUE(file.create(error_));
    fs::rename(folder_ / "a", folder_ / "b");
    fs::create_directory(folder_ / "a");
    EXPECT_TRUE(file.publish(error_));
    EXPECT_THAT(namesIn(folder_ / "a"), IsEmpty());
    EXPECT_THAT(namesIn(folder_ / "b"), ElementsAre("target"));
    fs::remove_all(folder_ / "a");
    fs::remove_all(folder_ / "b");
  }
}

TEST_F(PublishedFileTest, FailsInAFolderThatWasRemoved) {
  fs::create_directory(folder_ / "a");
  PublishedFile file(folder_ / "a/target");
  ASSERT_TRUE(file.create(error_));
  fs::remove(folder_ / "a");
  EXPECT_FALSE(file.publish(error_));
  expectError(error_, ENOENT, "linkat", folder_ / "a/target");
  EXPECT_EQ(-1, file.fd());
}

TEST_F(PublishedFileTest, DoesItsWorkOnce) {
  PublishedFile file(target_);
  EXPECT_FALSE(file.publish(error_));
  expectError(error_, EINVAL, "renameat", target_);
  ASSERT_TRUE(file.create(error_));
  error_ = Error();
  EXPECT_FALSE(file.create(error_));
  expectError(error_, EINVAL, "openat", target_);
  EXPECT_LE(0, file.fd()) << "the file stays";
  ASSERT_TRUE(file.publish(error_));
  EXPECT_FALSE(file.publish(error_));
  expectError(error_, EINVAL, "renameat", target_);
  EXPECT_FALSE(file.create(error_));
  expectError(error_, EINVAL, "openat", target_);
}

TEST_F(PublishedFileTest, MayBeCreatedAfterAFailure) {
  PublishedFile file(folder_ / "a/target");
  EXPECT_FALSE(file.create(error_));
  fs::create_directory(folder_ / "a");
  EXPECT_TRUE(file.create(error_));
  EXPECT_TRUE(file.publish(error_));
  EXPECT_THAT(namesIn(folder_ / "a"), ElementsAre("target"));
}

TEST_F(PublishedFileTest, IsNotInherited) {
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    const Census before = takeCensus();
    PublishedFile file(target_);
    ASSERT_TRUE(file.create(error_));
    int opened = 0;
    for (const auto &[name, path] : takeCensus()) {
      if (name.rfind("fd ", 0) == 0 && before.count(name) == 0) {
        ++opened;
        EXPECT_EQ(FD_CLOEXEC, ::fcntl(std::stoi(name.substr(3)), F_GETFD)) << path;
      }
    }
    EXPECT_EQ(2, opened) << "the file and its folder";
    EXPECT_EQ(O_RDWR, ::fcntl(file.fd(), F_GETFL) & O_ACCMODE);
  }
}

// Destroying the object in a forked child must not take the file away from its parent.
TEST_F(PublishedFileTest, OutlivesAChildThatDestroysIt) {
  auto file = std::make_unique<PublishedFile>(target_);
  ASSERT_TRUE(file->create(error_));
  writeTo(file->fd(), "content");
  EXPECT_EQ(0, runInChild([&] {
              file.reset();
              return 0;
            }));
  EXPECT_TRUE(file->publish(error_));
  EXPECT_EQ("content", readFile(target_));
}

TEST_F(PublishedFileTest, HidesALongNameByAShorterOne) {
  const Fault fault = files(Files::Named);
  const std::string umlaut = "\xC3\xBC";
  std::string umlauts;
  while (umlauts.size() < 254) {
    umlauts += umlaut;
  }
  for (const auto &[name, kept] : {std::pair(std::string(255, 'n'), std::string(242, 'n')),
                                   std::pair(std::string(242, 'n'), std::string(242, 'n')),
                                   std::pair("x" + umlauts, "x" + umlauts.substr(0, 240)),
                                   std::pair(umlauts + "x", umlauts.substr(0, 242)),
                                   std::pair(std::string(255, '\x80'), std::string())}) {
    PublishedFile file(folder_ / name);
    ASSERT_TRUE(file.create(error_)) << error_.code;
    EXPECT_THAT(folder_.names(), ElementsAre("." + kept + ".kova.0.tmp"));
    ASSERT_TRUE(file.publish(error_));
    EXPECT_THAT(folder_.names(), ElementsAre(name));
    fs::remove(folder_ / name);
  }
}

TEST_F(PublishedFileTest, LeavesRoomForFifteenOthers) {
  const Fault fault = files(Files::Named);
  std::vector<std::unique_ptr<PublishedFile>> all;
  for (int i = 0; i < 16; ++i) {
    all.push_back(std::make_unique<PublishedFile>(target_));
    ASSERT_TRUE(all.back()->create(error_)) << i;
    writeTo(all.back()->fd(), std::to_string(i));
  }
  EXPECT_FALSE(PublishedFile(target_).create(error_));
  expectError(error_, EBUSY, "openat", folder_.path());
  PublishedFile other(folder_ / "other");
  EXPECT_TRUE(other.create(error_)) << "each target has places of its own";
  for (int i = 0; i < 16; ++i) {
    EXPECT_TRUE(all[static_cast<std::size_t>(i)]->publish(error_));
    EXPECT_EQ(std::to_string(i), readFile(target_));
  }
  EXPECT_TRUE(other.publish(error_));
  EXPECT_THAT(folder_.names(), ElementsAre("other", "target"));
}

TEST_F(PublishedFileTest, ManyPublishOneTargetAtATime) {
  const std::string text(100000, 'x');
  for (const Files kind : {Files::Unnamed, Files::Named}) {
    const Fault fault = files(kind);
    SharedCounter published;
    runInChildren(15, [&](int number) {
      bool fine = true;
      for (int i = 0; i < 10; ++i) {
        Error error;
        PublishedFile file(target_);
        fine = fine && file.create(error);
        writeTo(file.fd(), std::string(100000, static_cast<char>('a' + number)));
        fine = fine && file.publish(error);
        const std::string found = readFile(target_);
        fine = fine && found == std::string(100000, found.empty() ? ' ' : found[0]);
        *published += fine ? 1 : 0;
      }
      return fine;
    });
    EXPECT_EQ(150, *published);
    EXPECT_THAT(folder_.names(), ElementsAre("target"));
  }
}
