// removeAll when memory runs out. Its walk runs through C code, which would leave its directories
// open if the callback threw, so the memory for the path of a failure is allocated before. This is
// a separate program because the process keeps that memory, so only the first call allocates.

#include "kovabackup/path_util.h"

#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"

#include <gtest/gtest.h>
#include <new>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using KOVA::Backup::removeAll;

TEST(RemoveAllMemory, IsTakenBeforeTheWalkBegins) {
  const std::string tree = "/tmp/tree";
  ASSERT_EQ(0, ::mkdir(tree.c_str(), 0700));
  const int before = KovaTest::countOpenDescriptors();
  {
    const KovaTest::AllocFailure failure(1);
    EXPECT_THROW((void)removeAll(tree), std::bad_alloc);
  }
  EXPECT_EQ(before, KovaTest::countOpenDescriptors());
  EXPECT_EQ(0, ::access(tree.c_str(), F_OK));
  EXPECT_TRUE(removeAll(tree));
  EXPECT_NE(0, ::access(tree.c_str(), F_OK));
}

} // namespace
