// Temporary names beside the file: cleared where only writers get a lock, and left to the writer
// who takes one over.

#include "tests/platform/core_support.h"
#include "tests/support/fault.h"

#include <cerrno>
#include <fcntl.h>
#include <functional>
#include <gmock/gmock.h>
#include <string>
#include <sys/file.h>

using namespace KovaTest;
using testing::ElementsAre;

namespace {

constexpr const char *kSlot = ".kovacore.0.tmp";

bool isNetworkFileSystem = false;
std::function<void(const std::string &oldName)> afterRename;

int setK(const std::string &path) {
  return setSection(path, "s", {{"k", "1"}});
}

} // namespace

// Network file systems take an exclusive lock for a lock of bytes, which only writers get.
extern "C" int flock(int fd, int operation) noexcept {
  static auto *const real = realFunction<int(int, int)>("flock");
  if (isNetworkFileSystem && (operation & LOCK_EX) != 0 &&
      (::fcntl(fd, F_GETFL) & O_ACCMODE) == O_RDONLY) {
    errno = EBADF;
    return -1;
  }
  return real(fd, operation);
}

extern "C" int renameat(int oldDir, const char *oldName, int newDir, const char *newName) noexcept {
  static auto *const real = realFunction<int(int, const char *, int, const char *)>("renameat");
  const int result = real(oldDir, oldName, newDir, newName);
  if (result == 0 && afterRename) {
    afterRename(oldName);
  }
  return result;
}

TEST(SectionLeftovers, AreClearedWhereOnlyWritersGetALock) {
  const TestFolder dir;
  writeFile(dir / "conf", "[s]\nk=0\n");
  writeFile(dir / kSlot, "left");
  isNetworkFileSystem = true;
  EXPECT_EQ(1, setK(dir / "conf"));
  isNetworkFileSystem = false;
  EXPECT_THAT(dir.names(), ElementsAre("conf"));
}

TEST(SectionLeftovers, AreNotWhatAnotherWriterMadeOfAFreedName) {
  const TestFolder dir;
  writeFile(dir / "conf", "[s]\nk=0\n");
  afterRename = [&dir](const std::string &oldName) { writeFile(dir / oldName, "at work"); };
  EXPECT_EQ(1, setK(dir / "conf"));
  afterRename = nullptr;
  EXPECT_THAT(dir.names(), ElementsAre(kSlot, "conf"));
  EXPECT_EQ("at work", readFile(dir / kSlot));
}
