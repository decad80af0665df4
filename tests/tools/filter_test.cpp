#include "tests/tools/run_tool.h"

#include "base/unique_fd.h"

#include <algorithm>
#include <fcntl.h>
#include <gmock/gmock.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
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

// The byte belongs to the pattern, which then matches nothing that its writer meant.
TEST(ToolFilterTest, RemarksOnPatternsThatEndInACarriageReturn) {
  const TestFolder folder;
  writeFile(folder / "rules", "- /a\r\n- /b\n- /c\r\n");
  const ToolResult result =
      runTool({"filter", "test", "--patterns", folder / "rules"}, {"/a\n/b\n/c\n"});
  EXPECT_EQ(0, result.exitCode);
  EXPECT_EQ("/a\n/c\n", result.out);
  EXPECT_EQ("kovabackup: " + (folder / "rules") +
                ", line 1: the pattern ends in a carriage return; does the file have DOS line "
                "endings?\n",
            result.messages);
}

TEST(ToolFilterTest, TakesAnEmptyPatternOfAFile) {
  const TestFolder folder;
  writeFile(folder / "rules", "- \n");
  const ToolResult result = runTool({"filter", "test", "--patterns", folder / "rules"}, {"/a\n"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("/a\n", result.out);
  EXPECT_THAT(result.messages, HasSubstr(", line 1: '': matches only an empty path\n"));
}

// What is written to standard error for one pattern.
std::string warningOf(const std::string &pattern) {
  const ToolResult result = runTool({"filter", "test", "--exclude", pattern}, {"/kept\n"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("/kept\n", result.out);
  return result.messages;
}

TEST(ToolFilterTest, WarnsOfAPatternThatNeverMatches) {
  EXPECT_EQ("kovabackup: --exclude: '/a\\': never matches: the backslash at its end escapes "
            "nothing\n",
            warningOf("/a\\"));
  EXPECT_EQ("kovabackup: --exclude: '': matches only an empty path\n", warningOf(""));
  EXPECT_EQ("kovabackup: --exclude: '/a/': matches only paths that end in a slash; end it in /** "
            "for what is in the folder\n",
            warningOf("/a/"));
  EXPECT_EQ("kovabackup: --exclude: '*.tmp': matches only paths without a slash; begin it with **/ "
            "for any depth\n",
            warningOf("*.tmp"));
}

TEST(ToolFilterTest, WarnsOfAPatternThatMatchesNoAbsolutePath) {
  for (const char *pattern : {"photo/**", "a/b", "photo**", "\\!/a", "./a"}) {
    EXPECT_EQ(std::string("kovabackup: --exclude: '") + pattern +
                  "': never matches an absolute path: begin it with / or **/\n",
              warningOf(pattern));
  }
}

TEST(ToolFilterTest, WarnsOfAPatternThatMatchesNoNormalisedPath) {
  for (const char *pattern : {"/a//b", "/a/./b", "/a/../b", "/a/..", "**//x"}) {
    EXPECT_EQ(std::string("kovabackup: --exclude: '") + pattern +
                  "': never matches a normalised path: leave out //, /./ and /../\n",
              warningOf(pattern));
  }
}

TEST(ToolFilterTest, WarnsOfTheSyntaxOfOtherTools) {
  EXPECT_EQ("kovabackup: --exclude: '/*.[ch]': '[' matches itself, there are no bracket classes; "
            "write \\[ if it is meant\n",
            warningOf("/*.[ch]"));
  EXPECT_EQ("kovabackup: --exclude: '/{a,b}': '{' matches itself, there are no alternatives in "
            "braces; write \\{ if it is meant\n",
            warningOf("/{a,b}"));
  EXPECT_EQ("kovabackup: --exclude: '!/a': '!' does not negate, it matches itself; use an include "
            "pattern, or write \\! if it is meant\n",
            warningOf("!/a"));
}

TEST(ToolFilterTest, WarnsOfNoOrdinaryPattern) {
  for (const char *pattern : {"/a/**", "**.tmp", "**/core", "/a\\[b\\{c", "/\\!a", "/a!", "/a\\\\",
                              "/a/b", "/a]}", "?a/b", "\\/a/b", "/a/.b", "/a/..b/c", "/a./b"}) {
    EXPECT_EQ("", warningOf(pattern)) << pattern;
  }
}

TEST(ToolFilterTest, WarnsWithTheLineOfAPattern) {
  const TestFolder folder;
  writeFile(folder / "rules", "# rules\n- /a[b]\n");
  EXPECT_EQ("kovabackup: " + (folder / "rules") +
                ", line 2: '/a[b]': '[' matches itself, there are no bracket classes; write \\[ if "
                "it is meant\n",
            runTool({"filter", "test", "--patterns", folder / "rules"}, {"/a\n"}).messages);
}

TEST(ToolFilterTest, LeavesOutWarningsThatWouldFillTheScreen) {
  const TestFolder folder;
  std::string rules;
  for (int i = 0; i < 12; ++i) {
    rules += "- /a[" + std::to_string(i) + "]\n";
  }
  writeFile(folder / "rules", rules);
  const std::string messages =
      runTool({"filter", "test", "--patterns", folder / "rules"}, {"/a\n"}).messages;
  EXPECT_EQ(11, std::count(messages.begin(), messages.end(), '\n')) << messages;
  EXPECT_THAT(messages,
              testing::EndsWith("kovabackup: 2 more warnings about patterns are left out\n"));
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

TEST(ToolFilterTest, DocumentsNamesOfAnyBytes) {
  const std::string names[] = {"/a\"b\\c", "/a\nb\tc\x1b", "/\x7f\xc2\x9b", "/\xff",
                               "",         "/\xe2\x82\xac"};
  std::string input;
  for (const std::string &name : names) {
    input += name + '\0';
  }
  const ToolResult result = runTool({"filter", "test", "-0", "--json"}, {input});
  const Json::Value kept = document(result)["kept"];
  ASSERT_EQ(6U, kept.size()) << result;
  for (const Json::ArrayIndex i : {0U, 1U, 2U, 4U, 5U}) {
    EXPECT_EQ(names[i], kept[i].asString());
  }
  EXPECT_EQ("L/8=", kept[3]["base64"].asString());
  EXPECT_THAT(result.out, HasSubstr(R"("/\u007f\u009b")")) << "what a terminal would obey";
  EXPECT_EQ(1, std::count(result.out.begin(), result.out.end(), '\n')) << "not one line";
  const Json::Value paths = document(runTool(
      {"filter", "test", "-0", "--json", "--explain", "--exclude", "/a\"b*", "--exclude", names[3]},
      {input}))["paths"];
  ASSERT_EQ(6U, paths.size());
  EXPECT_EQ("/a\"b*", paths[0]["pattern"].asString());
  EXPECT_EQ("L/8=", paths[3]["pattern"]["base64"].asString());
}

TEST(ToolFilterTest, DocumentsNothingAsAnEmptyList) {
  const Json::Value value = document(runTool({"filter", "test", "--json"}));
  EXPECT_TRUE(value["kept"].isArray());
  EXPECT_EQ(0U, value["kept"].size());
}

TEST(ToolFilterTest, EndsTheDocumentWhenReadingFails) {
  const UniqueFd folder(::open("/tmp", O_RDONLY | O_CLOEXEC));
  ToolSetup setup;
  setup.inFd = folder.get();
  const ToolResult result = runTool({"filter", "test", "--json"}, setup);
  EXPECT_EQ(1, result.exitCode);
  const Json::Value value = document(result);
  EXPECT_EQ(0U, value["kept"].size());
  EXPECT_EQ("cannot read standard input: Is a directory", value["errors"][0]["message"].asString());
}

// A document that was held until its end took 1.5 kB a path.
TEST(ToolFilterTest, DocumentsMorePathsThanMemoryWouldHold) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "skipped: the sanitizer reserves memory without end";
#endif
  std::string input;
  for (int i = 0; i < 300000; ++i) {
    input += "/volume1/share/folder/file" + std::to_string(i) + "\n";
  }
  ToolSetup setup{input};
  setup.memoryLimit = std::size_t{200} << 20;
  const ToolResult result =
      runTool({"filter", "test", "--json", "--explain", "--exclude", "/x"}, setup);
  EXPECT_EQ(0, result.exitCode) << result.messages;
  EXPECT_EQ(300000U, document(result)["paths"].size());
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
