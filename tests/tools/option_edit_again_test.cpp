// Edits that the user repeats or interrupts.
#include "kovabackup/option_map.h"
#include "tests/tools/option_edit_support.h"

#include <csignal>
#include <filesystem>
#include <gmock/gmock.h>

namespace {

using namespace KovaTest;
using testing::HasSubstr;

TEST_F(ToolOptionEdit, OffersToEditAgain) {
  writeFile(file_, "[s]\na=1\n");
  const std::string editor = script("if grep -q '^a=oops' \"$1\"; then sed -i s/oops/2/ \"$1\"; "
                                    "else sed -i s/1/oops/ \"$1\"; fi");
  TerminalTool tool(words({file_, "s"}), with(editor));
  tool.expect("line 6: the value of option 'a' is not JSON");
  tool.expect("text is kept in /tmp/kovabackup-edit.");
  tool.expect("Edit it again? [y/N] ");
  tool.send("y\n");
  const ToolResult result = tool.wait();
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("[s]\na=2\n", content());
}

TEST_F(ToolOptionEdit, WithoutAnotherEditTheTextIsKept) {
  writeFile(file_, "[s]\na=1\n");
  ToolSetup wide = with(script("sed -i s/1/oops/ \"$1\""));
  wide.columns = 500;
  TerminalTool tool(words({file_, "s"}), wide);
  tool.expect("Edit it again? [y/N] ");
  tool.send("n\n");
  ToolResult result = tool.wait();
  EXPECT_EQ(1, result.exitCode) << result;
  result.messages = result.out;
  EXPECT_THAT(takeKept(result), HasSubstr("\na=oops\n"));
  EXPECT_EQ("[s]\na=1\n", content());
}

TEST_F(ToolOptionEdit, TextThatTheSecondEditRestoredIsNotKept) {
  writeFile(file_, "[s]\na=1\n");
  const std::string editor = script("echo \"$1\" >" + file("place") +
                                    "; if grep -q '^a=oops' \"$1\"; then sed -i s/oops/1/ \"$1\"; "
                                    "exit 5; else sed -i s/a=1/a=oops/ \"$1\"; fi");
  TerminalTool tool(words({file_, "s"}), with(editor));
  tool.expect("Edit it again? [y/N] ");
  tool.send("y\n");
  tool.expect("nothing was changed");
  EXPECT_EQ(1, tool.wait().exitCode);
  const std::string place = readFile(file("place"));
  EXPECT_FALSE(std::filesystem::exists(place.substr(0, place.find("/section.conf")))) << place;
}

TEST_F(ToolOptionEdit, NamesTheKeptTextBeforeItWaitsForTheLock) {
  writeFile(file_, "[s]\na=1\n");
  KOVA::Backup::OptionMap holder;
  ASSERT_TRUE(holder.setLockToken("task.conf"));
  ASSERT_TRUE(holder.lock());
  ToolSetup wide = with(script("sed -i s/1/2/ \"$1\""));
  wide.columns = 500;
  TerminalTool tool(words({file_, "s", "--lock", "task.conf"}), wide);
  tool.expect("waiting for the lock 'task.conf'");
  tool.expect("until then the edited text is kept in /tmp/kovabackup-edit.");
  tool.expect("section.conf\r\n");
  tool.send("\x03");
  ToolResult result = tool.wait();
  EXPECT_EQ(SIGINT, result.signal) << result;
  result.messages = result.out;
  EXPECT_THAT(takeKept(result), HasSubstr("\na=2\n"));
  ASSERT_TRUE(holder.unlock());
}

// The terminal sends the signal to the command and the shell between them as well.
TEST_F(ToolOptionEdit, InterruptsBelongToTheEditor) {
  writeFile(file_, "[s]\na=1\n");
  TerminalTool tool(words({file_, "s"}), with(script("trap 'echo interrupted' INT\necho ready\n"
                                                     "read -r line\nread -r line\n"
                                                     "sed -i s/1/2/ \"$1\"")));
  tool.expect("ready");
  tool.send("\x03");
  tool.expect("interrupted");
  tool.send("on\non\n");
  const ToolResult result = tool.wait();
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("[s]\na=2\n", content());
}

} // namespace
