// The path functions that call libc: dirname, basename and absPath.

#include "kovabackup/path_util.h"

#include "tests/support/fault.h"
#include "tests/support/files.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <gtest/gtest.h>
#include <new>
#include <unistd.h>

namespace {

using KovaTest::Fault;
using KovaTest::ScopedWorkingDir;
using KovaTest::TestFolder;
namespace Path = KOVA::Backup::Path;

struct OnePath {
  const char *path;
  const char *expected;
};

// What getcwd below was last called with.
struct {
  std::size_t size = 0;
  bool bufferWasZero = false;
} lastGetcwd;

// A folder that is the working directory for the object's lifetime.
class CurrentFolder {
public:
  const std::string &path() const { return folder_.path(); }

private:
  const TestFolder folder_;
  const ScopedWorkingDir here_{folder_.path()};
};

TEST(PathDirname, GivesTheFolderAsLibcDoes) {
  // "//" is what libc returns; POSIX leaves it open.
  const OnePath cases[] = {
      {"", "."},    {"/", "/"},    {"//", "//"},  {"a", "."},       {"a/", "."},      {"/a", "/"},
      {"/a/", "/"}, {"a/b", "a"},  {"a/b/", "a"}, {"/a/b", "/a"},   {".", "."},       {"..", "."},
      {"a/.", "a"}, {"a/..", "a"}, {"a//b", "a"}, {"/a/b//", "/a"}, {"a/b/c", "a/b"},
  };
  for (const OnePath &one : cases) {
    EXPECT_EQ(one.expected, Path::dirname(one.path)) << one.path;
  }
}

TEST(PathBasename, GivesTheLastNameAsPosixDoes) {
  const OnePath cases[] = {
      {"", "."},      {"/", "/"},  {"//", "/"},  {"///", "/"}, {"a", "a"},
      {"a/", "a"},    {"/a", "a"}, {"/a/", "a"}, {"a/b", "b"}, {"a/b/", "b"},
      {"a/b//", "b"}, {".", "."},  {"..", ".."}, {"a/.", "."},
  };
  for (const OnePath &one : cases) {
    EXPECT_EQ(one.expected, Path::basename(one.path)) << one.path;
  }
}

TEST(PathDirname, LeavesItsArgumentAlone) {
  const std::string path = "/a/b/";
  const std::string before(path.data(), path.size());
  Path::dirname(path);
  Path::basename(path);
  EXPECT_EQ(before, path);
}

TEST(PathDirname, EndsThePathAtANulByte) {
  const std::string path("/a/b\0/c", 7);
  EXPECT_EQ("/a", Path::dirname(path));
  EXPECT_EQ("b", Path::basename(path));
}

TEST(PathDirname, ThrowsBadAllocWhenThePathCannotBeCopied) {
  Fault fault("strdup", 1, ENOMEM);
  EXPECT_THROW(Path::dirname("/a/b"), std::bad_alloc);
  EXPECT_TRUE(fault.fired());
}

TEST(PathBasename, ThrowsBadAllocWhenThePathCannotBeCopied) {
  Fault fault("strdup", 1, ENOMEM);
  EXPECT_THROW(Path::basename("/a/b"), std::bad_alloc);
  EXPECT_TRUE(fault.fired());
}

TEST(PathAbsPath, ReturnsAnAbsolutePathAsItStands) {
  for (const char *path : {"/", "//", "/x/../y", "/x//y/", "/."}) {
    EXPECT_EQ(path, Path::absPath(path));
  }
}

TEST(PathAbsPath, JoinsARelativePathToTheCurrentDirectory) {
  const CurrentFolder dir;
  EXPECT_EQ(dir.path(), Path::absPath(""));
  EXPECT_EQ(dir.path(), Path::absPath("."));
  EXPECT_EQ(dir.path() + "/x", Path::absPath("x"));
  EXPECT_EQ(dir.path() + "/x/", Path::absPath("x/"));
  EXPECT_EQ(dir.path() + "/./x", Path::absPath("./x"));
  EXPECT_EQ(dir.path() + "/x/../y", Path::absPath("x/../y"));
}

TEST(PathAbsPath, LeavesARelativePathRelativeWhenThereIsNoCurrentDirectory) {
  const CurrentFolder dir;
  ASSERT_EQ(0, ::rmdir(dir.path().c_str()));
  EXPECT_EQ("x/y", Path::absPath("x/y"));
  EXPECT_EQ("", Path::absPath(""));
}

TEST(PathAbsPath, LeavesARelativePathRelativeWhenGetcwdFails) {
  Fault fault("getcwd", 1, EACCES, true); // the one below writes into the buffer all the same
  EXPECT_EQ("x", Path::absPath("x"));
  EXPECT_EQ("", Path::absPath(""));
  EXPECT_EQ("", Path::absPath("."));
  EXPECT_TRUE(fault.fired());
}

TEST(PathAbsPath, OffersGetcwdAZeroedBufferOf4095Bytes) {
  Path::absPath("x");
  EXPECT_EQ(4095U, lastGetcwd.size);
  EXPECT_TRUE(lastGetcwd.bufferWasZero);
}

TEST(PathAbsPath, DoesNotAskForTheCurrentDirectoryOfAnAbsolutePath) {
  Fault fault("getcwd", 1, EACCES);
  EXPECT_EQ("/x", Path::absPath("/x"));
  EXPECT_EQ(0, fault.calls());
}

} // namespace

extern "C" char *getcwd(char *buf, std::size_t size) noexcept {
  static auto *const real = KovaTest::realFunction<char *(char *, std::size_t)>("getcwd");
  lastGetcwd.size = size;
  lastGetcwd.bufferWasZero = std::count(buf, buf + size, '\0') == static_cast<long>(size);
  if (KovaTest::failsNow("getcwd")) {
    std::strcpy(buf, "/half/of/the"); // as libc's own search upwards may leave it
    return nullptr;
  }
  return real(buf, size);
}
