// Whose directories and files can be trusted by root and by an ordinary user.

#include "tools/kovabackup/facts/folder_health.h"

#include <gtest/gtest.h>
#include <sys/auxv.h>
#include <unistd.h>

namespace {

using KOVA::Backup::Tool::isTrustedOwner;

constexpr uid_t kReal = 0xffffffff;

uid_t user = kReal; // who runs the command

class ToolTrustedOwner : public testing::Test {
protected:
  void TearDown() override { user = kReal; }
};

} // namespace

extern "C" uid_t geteuid() noexcept {
  return user != kReal ? user : static_cast<uid_t>(::getauxval(AT_EUID));
}

namespace {

TEST_F(ToolTrustedOwner, IsRootForEveryUser) {
  for (const uid_t runs : {0U, 1000U}) {
    user = runs;
    EXPECT_TRUE(isTrustedOwner(0)) << runs;
  }
}

TEST_F(ToolTrustedOwner, IsTheUserWhoRunsTheCommand) {
  user = 1000;
  EXPECT_TRUE(isTrustedOwner(1000));
}

TEST_F(ToolTrustedOwner, IsNoOtherUser) {
  for (const uid_t runs : {0U, 1000U}) {
    user = runs;
    EXPECT_FALSE(isTrustedOwner(1001)) << runs;
  }
}

} // namespace
