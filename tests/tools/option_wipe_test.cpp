// The command overwrites the secrets that it reads. Its libraries overwrite what they copy of them,
// which a test of the complete process would take for that.

#include "tests/tools/option_support.h"

#include <filesystem>

namespace {

using namespace KovaTest;

const std::string kSecret = "open sesame, all of it";
const std::string kWiped = "wiped\n"; // for each text

class ToolOptionWipe : public ToolOption {
protected:
  ToolSetup watching(const std::string &input = "") const {
    ToolSetup watched = setup(input);
    watched.environment["LD_PRELOAD"] = KOVA_WIPE_WATCH;
    watched.environment["KOVA_WATCHED"] = kSecret;
    watched.environment["KOVA_WIPED"] = wiped_;
    return watched;
  }

  // What the user types twice.
  ToolResult type(const std::string &first, const std::string &again) const {
    TerminalTool tool({"option", "set", file_, "s", "pw", "--secret"}, watching());
    tool.expect("Secret for pw: ");
    tool.send(first + "\n");
    tool.expect("Once more: ");
    tool.send(again + "\n");
    return tool.wait();
  }

  const std::string wiped_ = folder_ / "wiped";
};

TEST_F(ToolOptionWipe, CoversASecretFromStandardInput) {
  const ToolResult result =
      runTool({"option", "set", file_, "s", "pw", "--secret"}, watching(kSecret + "\n"));
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ(kWiped, readFile(wiped_));
}

TEST_F(ToolOptionWipe, CoversBothEntriesAtThePrompt) {
  const ToolResult result = type(kSecret, kSecret);
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ(kWiped + kWiped, readFile(wiped_));
}

TEST_F(ToolOptionWipe, CoversTheSecondEntryWhenTheyDiffer) {
  EXPECT_EQ(1, type("something else", kSecret).exitCode);
  EXPECT_EQ(kWiped, readFile(wiped_));
}

// The watch itself: without it the tests above would count nothing, or what libraries overwrite.
TEST_F(ToolOptionWipe, IsNotCountedForAnotherText) {
  const ToolResult result =
      runTool({"option", "set", file_, "s", "pw", "--secret"}, watching("another secret\n"));
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_FALSE(std::filesystem::exists(wiped_));
}

} // namespace
