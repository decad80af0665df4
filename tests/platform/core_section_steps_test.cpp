// The steps in which the section-file services replace a file: what a failing read leaves, what is
// on the disk before the name changes, and what children and planted files notice of it.

#include "tests/platform/core_support.h"
#include "tests/support/lease.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <fcntl.h>
#include <functional>
#include <gmock/gmock.h>
#include <sys/file.h>
#include <sys/inotify.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

using namespace KovaTest;
using testing::Contains;
using testing::ElementsAre;

namespace {

const std::string kOld = "# top\n[s]\nk=0\n[t]\nz=1\n";
const std::string kNew = "# top\n[s]\nk=1\n[t]\nz=1\n";
constexpr const char *kSlot = ".kovacore.0.tmp";

std::size_t mostRead = SIZE_MAX;        // bytes that one read returns
std::function<void(int)> beforeSync;    // runs before each fsync
std::function<void(int)> beforeLocking; // runs before each flock

int setK(const std::string &path) {
  return setSection(path, "s", {{"k", "1"}});
}

struct stat statusOf(int fd) {
  struct stat status {};
  EXPECT_EQ(0, ::fstat(fd, &status));
  return status;
}

// Runs the body with a file system that has unnamed files, and with one that has none.
void withBothKinds(const std::function<void(const TestFolder &dir)> &body) {
  for (const bool unnamedFiles : {true, false}) {
    SCOPED_TRACE(unnamedFiles ? "unnamed files" : "named files");
    const TestFolder dir;
    writeFile(dir / "conf", kOld);
    const Fault fault("O_TMPFILE", unnamedFiles ? INT_MAX : 1, EOPNOTSUPP, true);
    body(dir);
  }
}

} // namespace

extern "C" ssize_t read(int fd, void *buf, size_t size) {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("read");
  return failsNow("read") ? -1 : real(fd, buf, std::min(size, mostRead));
}

extern "C" int fsync(int fd) {
  static auto *const real = realFunction<int(int)>("fsync");
  if (beforeSync) {
    beforeSync(fd);
  }
  return failsNow("fsync") ? -1 : real(fd);
}

extern "C" int flock(int fd, int operation) noexcept {
  static auto *const real = realFunction<int(int, int)>("flock");
  if (beforeLocking) {
    beforeLocking(fd);
  }
  return failsNow("flock") ? -1 : real(fd, operation);
}

// What was read before the failure looks like a shorter file, which must not replace the complete
// one.
TEST(SectionSteps, LeaveTheFileWhenAReadFailsInItsMiddle) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  const std::function<int()> changes[] = {
      [&] { return setK(dir / "conf"); },
      [&] {
        return addSection(dir / "conf", "u", {{"k", "1"}});
      },
      [&] { return removeSection(dir / "conf", "s"); },
  };
  for (const auto &change : changes) {
    for (int nth = 1; nth <= 4; ++nth) {
      clearError();
      const Fault fault("read", nth, EIO);
      mostRead = 8;
      EXPECT_GT(0, change());
      mostRead = SIZE_MAX;
      EXPECT_TRUE(fault.fired()) << nth;
      EXPECT_EQ(KLIBC_ERR_READ, errorCode()) << nth;
    }
    EXPECT_EQ(kOld, readFile(dir / "conf"));
  }
}

// After a power cut, attributes that were set later may be missing: the file would be another
// user's, or open to others.
TEST(SectionSteps, GiveTheFileItsAttributesBeforeItIsSynced) {
  withBothKinds([](const TestFolder &dir) {
    (void)::chown((dir / "conf").c_str(), 1234, 2345); // where that is possible
    ASSERT_EQ(0, ::chmod((dir / "conf").c_str(), 0640));
    const bool hasAttribute = ::setxattr((dir / "conf").c_str(), "user.test", "1", 1, 0) == 0;
    struct stat old {};
    ASSERT_EQ(0, ::stat((dir / "conf").c_str(), &old));
    int synced = 0;
    beforeSync = [&](int fd) {
      const struct stat status = statusOf(fd);
      if (!S_ISREG(status.st_mode)) {
        return;
      }
      ++synced;
      EXPECT_EQ(old.st_mode, status.st_mode);
      EXPECT_EQ(old.st_uid, status.st_uid);
      EXPECT_EQ(old.st_gid, status.st_gid);
      EXPECT_EQ(hasAttribute ? 1 : -1, ::fgetxattr(fd, "user.test", nullptr, 0));
    };
    EXPECT_EQ(1, setK(dir / "conf"));
    beforeSync = nullptr;
    EXPECT_EQ(1, synced);
  });
}

TEST(SectionSteps, SyncTheDirectoryAfterTheNewFileHasItsName) {
  withBothKinds([](const TestFolder &dir) {
    int synced = 0;
    beforeSync = [&](int fd) {
      const bool isDirectory = S_ISDIR(statusOf(fd).st_mode);
      EXPECT_EQ(isDirectory ? kNew : kOld, readFile(dir / "conf"));
      synced += isDirectory ? 1 : 0;
    };
    EXPECT_EQ(1, setK(dir / "conf"));
    beforeSync = nullptr;
    EXPECT_EQ(1, synced);
  });
}

// A child that is started meanwhile would keep the lock, and with it the slot.
TEST(SectionSteps, HideTheNewFileAndLeftoversFromChildren) {
  withBothKinds([](const TestFolder &dir) {
    writeFile(dir / kSlot, "left");
    int locked = 0;
    beforeLocking = [&](int fd) {
      ++locked;
      EXPECT_EQ(FD_CLOEXEC, ::fcntl(fd, F_GETFD));
    };
    EXPECT_EQ(1, setK(dir / "conf"));
    beforeLocking = nullptr;
    EXPECT_EQ(2, locked) << "the leftover and the new file";
  });
}

// An open that a signal interrupts is repeated, not taken for a file system without such files.
TEST(SectionSteps, AreTheSameThoughASignalInterruptsAnOpen) {
  withBothKinds([](const TestFolder &dir) {
    int usual = 0;
    {
      const Fault links("linkat", INT_MAX, EIO);
      EXPECT_EQ(1, setK(dir / "conf"));
      usual = links.calls();
    }
    countFailures("openat", Failing::Once, [&](int nth, bool) {
      const Fault links("linkat", INT_MAX, EIO);
      const Fault fault("openat", nth, EINTR);
      EXPECT_EQ(1, setK(dir / "conf"));
      EXPECT_EQ(usual, links.calls());
      return fault.fired();
    });
  });
}

TEST(SectionSteps, OpenNoFileToWhichAPlantedLinkLeads) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  writeFile(dir / "victim", "victim");
  ASSERT_EQ(0, ::symlink("victim", (dir / kSlot).c_str()));
  const int watch = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  ASSERT_LE(0, ::inotify_add_watch(watch, (dir / "victim").c_str(), IN_OPEN));
  EXPECT_EQ(1, setK(dir / "conf"));
  char event[sizeof(struct inotify_event)];
  EXPECT_EQ(-1, ::read(watch, event, sizeof event)) << "it was opened";
  EXPECT_EQ(EAGAIN, errno);
  ::close(watch);
  EXPECT_THAT(dir.names(), Contains(kSlot));
}

// The holder of a lease would hold up the writer for as long as it likes, up to a limit of the
// system.
TEST(SectionSteps, WaitForNoLeaseOnALeftover) {
  const TestFolder dir;
  writeFile(dir / "conf", kOld);
  writeFile(dir / kSlot, "left");
  LeaseHolder holder(dir / kSlot);
  if (!holder.held()) {
    GTEST_SKIP() << "skipped: no leases on this file system";
  }
  EXPECT_EQ(1, setK(dir / "conf"));
  EXPECT_THAT(dir.names(), ElementsAre(kSlot, "conf")) << "an open that waits would clear it";
  EXPECT_TRUE(holder.wasAsked());
}
