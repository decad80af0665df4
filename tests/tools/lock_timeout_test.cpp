// How long a command may wait for a lock.

#include "tests/tools/option_support.h"

#include <filesystem>
#include <gmock/gmock.h>

namespace {

using namespace KovaTest;
using testing::HasSubstr;

class ToolLockTimeout : public ToolOption {
protected:
  ToolResult setWithin(const std::string &seconds) const {
    return option({"set", file_, "s", "k", "v", "--lock", "t", "--lock-timeout", seconds});
  }
};

TEST_F(ToolLockTimeout, IsAtMostAnHour) {
  for (const char *seconds : {"0", "3600"}) {
    const ToolResult result = setWithin(seconds);
    EXPECT_EQ(0, result.exitCode) << result;
  }
}

TEST_F(ToolLockTimeout, IsRefusedBeyond) {
  for (const char *seconds : {"-1", "3601", "1.5", "", "5s"}) {
    const ToolResult result = setWithin(seconds);
    EXPECT_EQ(2, result.exitCode) << result;
    EXPECT_THAT(result.messages, HasSubstr("is not a valid time limit"));
  }
  EXPECT_FALSE(std::filesystem::exists(file_));
}

TEST_F(ToolLockTimeout, RequiresALock) {
  const ToolResult result = option({"set", file_, "s", "k", "v", "--lock-timeout", "5"});
  EXPECT_EQ(2, result.exitCode) << result;
  EXPECT_FALSE(std::filesystem::exists(file_));
}

} // namespace
