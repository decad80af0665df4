// Edits that the user repeats or interrupts.
#include "tests/tools/option_edit_support.h"

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
