#include "tests/tools/run_tool.h"

#include "common/unique_fd.h"

#include <fcntl.h>
#include <gmock/gmock.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::UniqueFd;
using testing::HasSubstr;

TEST(ToolFilterTest, PrintsThePathsThatAreKept) {
  const ToolResult result = runTool({"filter", "test", "--exclude", "/a/**", "--include", "/a/b/*"},
                                    {"/a/b/c\n/a/x\n/z\n\n/a/b/c/d"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("/a/b/c\n/z\n\n", result.out);
  EXPECT_EQ("", result.messages);
}

TEST(ToolFilterTest, KeepsEverythingWithoutPatterns) {
  EXPECT_EQ("/a\n/b\n", runTool({"filter", "test"}, {"/a\n/b"}).out);
  EXPECT_EQ("", runTool({"filter", "test"}).out);
}

TEST(ToolFilterTest, TakesPatternsAsTheyAre) {
  EXPECT_EQ("/b\n", runTool({"filter", "test", "--exclude=[a,b]", "--exclude", "-x", "--exclude",
                             "{}", "--exclude="},
                            {"[a,b]\n-x\n{}\n\n/b\n"})
                        .out);
}

TEST(ToolFilterTest, ReadsAndPrintsNames) {
  EXPECT_EQ(
      std::string("a\nb\0c", 5) + '\0',
      runTool({"filter", "test", "-0", "--exclude", "x"}, {std::string("a\nb\0x\0c\0", 8)}).out);
}

TEST(ToolFilterTest, ReadsPatternsFromAFile) {
  const TestFolder folder;
  writeFile(folder / "rules", "# what to leave out\n\n- /a/**\n+ /a/keep\n-  blank");
  const ToolResult result =
      runTool({"filter", "test", "--patterns", folder / "rules"}, {"/a/x\n/a/keep\n blank\nz\n"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("/a/keep\nz\n", result.out);
}

TEST(ToolFilterTest, TellsALineThatIsNoPattern) {
  const TestFolder folder;
  writeFile(folder / "rules", "- /a\n/b\n");
  const ToolResult result = runTool({"filter", "test", "--patterns", folder / "rules"}, {"/a\n"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("line 2: neither '+ PATTERN' nor '- PATTERN': '/b'"));
}

TEST(ToolFilterTest, TellsAMissingPatternFile) {
  EXPECT_EQ(3, runTool({"filter", "test", "--patterns", "/nowhere"}).exitCode);
  EXPECT_EQ(2, runTool({"filter", "test", "--patterns", "-"}).exitCode);
}

TEST(ToolFilterTest, ExplainsWhichPatternDecided) {
  const ToolResult result = runTool({"filter", "test", "--explain", "--exclude", "/a/**",
                                     "--exclude", "/a/b/**", "--include", "/a/b/*"},
                                    {"/a/b/c\n/a/b/c/d\n/z\n"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("keep\t+ /a/b/*\t/a/b/c\ndrop\t- /a/**\t/a/b/c/d\nkeep\t\t/z\n", result.out);
}

TEST(ToolFilterTest, ExplainsAsJson) {
  const Json::Value paths = document(
      runTool({"filter", "test", "--explain", "--json", "--exclude", "/a"}, {"/a\n/b\n"}))["paths"];
  ASSERT_EQ(2U, paths.size());
  EXPECT_EQ("/a", paths[0]["path"].asString());
  EXPECT_FALSE(paths[0]["kept"].asBool());
  EXPECT_EQ("/a", paths[0]["pattern"].asString());
  EXPECT_EQ("exclude", paths[0]["list"].asString());
  EXPECT_TRUE(paths[1]["kept"].asBool());
  EXPECT_TRUE(paths[1]["pattern"].isNull());
}

TEST(ToolFilterTest, PrintsADocument) {
  const Json::Value kept = document(
      runTool({"filter", "test", "--json", "--exclude", "/a"}, {"/a\n/b\xff\n/c"}))["kept"];
  ASSERT_EQ(2U, kept.size());
  EXPECT_EQ("L2L/", kept[0]["base64"].asString()) << "a name that is no UTF-8";
  EXPECT_EQ("/c", kept[1].asString());
}

TEST(ToolFilterTest, ReadsMoreThanOneBufferful) {
  std::string input;
  std::string expected;
  for (int i = 0; i < 300000; ++i) {
    const std::string path = "/volume1/share/folder" + std::to_string(i % 97) + "/file" +
                             std::to_string(i) + (i % 3 == 0 ? ".tmp" : ".txt");
    input += path + "\n";
    expected += i % 3 == 0 ? "" : path + "\n";
  }
  const ToolResult result = runTool({"filter", "test", "--exclude", "/**/*.tmp"}, {input});
  EXPECT_EQ(0, result.exitCode) << result.messages;
  EXPECT_TRUE(expected == result.out);
}

TEST(ToolFilterTest, ReadsAPathLongerThanABuffer) {
  const std::string path = "/" + std::string(3000000, 'x');
  EXPECT_TRUE(path + "\n" == runTool({"filter", "test", "--exclude", "/y"}, {path}).out);
}

TEST(ToolFilterTest, StopsWhenNobodyReads) {
  std::string input;
  for (int i = 0; i < 100000; ++i) {
    input += "/some/path\n";
  }
  const UniqueFd full(::open("/dev/full", O_WRONLY | O_CLOEXEC));
  const ToolResult result = runTool({"filter", "test"}, {input, {}, "/", full.get()});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("No space left on device"));
}

TEST(ToolFilterTest, SaysThatItReadsATerminalAndEscapesWhatItShows) {
  TerminalTool tool({"filter", "test", "--exclude", "/a"});
  tool.expect("reading paths from standard input");
  tool.send("/a\n/b\x0f\n\x04");
  EXPECT_THAT(tool.wait().out, HasSubstr("/b\\x0f\r\n"));
}

} // namespace
