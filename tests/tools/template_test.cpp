#include "tests/tools/run_tool.h"

#include <gmock/gmock.h>

namespace {

using namespace KovaTest;
using testing::HasSubstr;

TEST(ToolTemplateFill, PutsValuesIn) {
  const ToolResult result =
      runTool({"template", "fill", "-", "--set", "task=photos", "--set", "n="},
              {"Backup of {{task}}{{n}} ended.\n"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("Backup of photos ended.\n", result.out);
  EXPECT_EQ("", result.messages);
}

TEST(ToolTemplateFill, ReadsTemplateAndValuesFromFiles) {
  const TestFolder folder;
  writeFile(folder / "template", "{{a}}|{{n}}|{{z}}|{{o}}");
  writeFile(folder / "values", R"({"a": "{{n}}", "n": 5, "z": null, "o": {"x": true}})");
  const ToolResult result =
      runTool({"template", "fill", folder / "template", "--json", folder / "values"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("{{n}}|5||{\"x\":true}", result.out);
}

TEST(ToolTemplateFill, PrefersValuesOfTheCommandLine) {
  const TestFolder folder;
  writeFile(folder / "values", R"({"a": "file"})");
  const ToolResult result =
      runTool({"template", "fill", "-", "--json", folder / "values", "--set=a=line"}, {"{{a}}"});
  EXPECT_EQ("line", result.out) << result;
}

TEST(ToolTemplateFill, KeepsEveryByte) {
  const std::string text("a\0b\x1b\xff{{x}}", 10);
  EXPECT_EQ(std::string("a\0b\x1b\xff[1,2]", 10),
            runTool({"template", "fill", "-", "--set", "x=[1,2]"}, {text}).out);
}

TEST(ToolTemplateFill, RemarksOnNamesWithoutAValueOnceEach) {
  const ToolResult result = runTool({"template", "fill", "-"}, {"a{{x}}b{{x}}c"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("abc", result.out);
  EXPECT_EQ("kovabackup: no value for 'x': it is left out\n", result.messages);
}

TEST(ToolTemplateFill, StrictRefusesNamesWithoutAValue) {
  const ToolResult result = runTool({"template", "fill", "-", "--strict"}, {"a{{x}}b"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: no value for 'x'\n", result.messages);
}

TEST(ToolTemplateFill, PrintsADocumentWhenJsonComesFirst) {
  const ToolResult result =
      runTool({"--json", "template", "fill", "-", "--set", "a=1"}, {"{{a}}{{b}}\xff"});
  EXPECT_EQ(0, result.exitCode) << result;
  const Json::Value value = document(result);
  EXPECT_EQ("Mf8=", value["text"]["base64"].asString()) << "bytes that are no UTF-8";
  ASSERT_EQ(1U, value["missing"].size());
  EXPECT_EQ("b", value["missing"][0].asString());
}

TEST(ToolTemplateFill, TellsAMissingFile) {
  const ToolResult result = runTool({"template", "fill", "/nowhere/x"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: cannot read /nowhere/x: No such file or directory\n", result.messages);
}

TEST(ToolTemplateFill, TellsAFileThatCannotBeRead) {
  const ToolResult result = runTool({"--json", "template", "fill", "/tmp"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("", result.messages);
  EXPECT_EQ("cannot read /tmp: Is a directory",
            document(result)["errors"][0]["message"].asString());
}

TEST(ToolTemplateFill, RefusesValuesThatAreNoObject) {
  const TestFolder folder;
  for (const std::string text : {"[1]", "{\"a\":1} x", "{", "", "5"}) {
    writeFile(folder / "values", text);
    const ToolResult result = runTool({"template", "fill", "-", "--json", folder / "values"});
    EXPECT_EQ(1, result.exitCode) << text << result;
    EXPECT_THAT(result.messages, HasSubstr("does not contain a JSON object")) << text;
    EXPECT_THAT(result.messages, testing::Not(HasSubstr("*"))) << "the reader's own layout";
    EXPECT_EQ("", result.out);
  }
}

TEST(ToolTemplateFill, RefusesValuesNestedWithoutEnd) {
  const TestFolder folder;
  writeFile(folder / "values", "{\"a\":" + std::string(100000, '['));
  EXPECT_EQ(1, runTool({"template", "fill", "-", "--json", folder / "values"}).exitCode);
}

TEST(ToolTemplateFill, RefusesWrongUsage) {
  EXPECT_EQ(2, runTool({"template", "fill"}).exitCode);
  EXPECT_EQ(2, runTool({"template", "fill", "a", "b"}).exitCode);
  EXPECT_EQ(2, runTool({"template", "fill", "-", "--set", "novalue"}).exitCode);
  EXPECT_EQ(2, runTool({"template", "fill", "-", "--json", "-"}).exitCode);
  const ToolResult result = runTool({"template", "fill", "x", "--json"});
  EXPECT_EQ(2, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("--json needs a value: --json FILE"));
}

TEST(ToolTemplateFill, EscapesControlBytesOnATerminalOnly) {
  const TestFolder folder;
  writeFile(folder / "t", "a\x1b[31mb\n");
  TerminalTool tool({"template", "fill", folder / "t"});
  EXPECT_EQ("a\\x1b[31mb\r\n", tool.wait().out);
}

} // namespace
