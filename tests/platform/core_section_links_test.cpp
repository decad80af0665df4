// A section file at the end of links, in folders that the caller may pass through but not read.

#include "tests/platform/core_support.h"
#include "tests/support/child_process.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

using namespace KovaTest;
namespace fs = std::filesystem;

TEST(SectionLinks, MayBeInFoldersThatCannotBeRead) {
  constexpr uid_t kUser = 12345;
  const TestFolder dir;
  for (const char *name : {"locked", "open"}) {
    fs::create_directory(dir / name);
  }
  const std::string file = writeFile(dir / "open/conf", "[s]\nk=0\n");
  fs::create_symlink("../open/conf", dir / "locked/link");
  ASSERT_EQ(0, ::chmod(dir.path().c_str(), 0711));
  ASSERT_EQ(0, ::chmod((dir / "locked").c_str(), 0711));
  if (::chown(file.c_str(), kUser, kUser) != 0 ||
      ::chown((dir / "open").c_str(), kUser, kUser) != 0) {
    GTEST_SKIP() << "skipped: owners cannot be changed here";
  }
  EXPECT_EQ(1, runInChild([&dir] {
              const bool other = ::setgid(kUser) == 0 && ::setuid(kUser) == 0;
              return other ? setSection(dir / "locked/link", "s", {{"k", "1"}}) : -9;
            }));
  EXPECT_EQ("[s]\nk=1\n", readFile(file));
}
