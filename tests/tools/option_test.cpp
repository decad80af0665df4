#include "tests/tools/option_support.h"

#include <gmock/gmock.h>

namespace {

using namespace KovaTest;
using testing::HasSubstr;

TEST_F(ToolOption, SectionsListsNames) {
  writeFile(file_, "x=1\n[task1]\n[task 2]\r\na=\"b\"\n");
  const ToolResult result = option({"sections", file_});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("task1\ntask 2\n", result.out);
  EXPECT_EQ(std::string("task1\0task 2\0", 13), option({"sections", file_, "-0"}).out);
  const Json::Value names = document(option({"sections", file_, "--json"}))["sections"];
  EXPECT_EQ("task 2", names[1].asString());
}

TEST_F(ToolOption, SectionsTellsAMissingFile) {
  const ToolResult result = option({"sections", folder_ / "none"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("No such file or directory"));
  EXPECT_EQ(1, option({"sections", folder_.path()}).exitCode);
  writeFile(file_, "");
  EXPECT_EQ("kovabackup: " + file_ + " has no sections\n", option({"sections", file_}).messages);
  const ToolResult listed = option({"list", file_});
  EXPECT_EQ(0, listed.exitCode) << listed;
  EXPECT_EQ("", listed.out);
  EXPECT_EQ("kovabackup: " + file_ + " has no sections\n", listed.messages);
}

TEST_F(ToolOption, ListShowsOptionsAsTheyStandInTheFile) {
  writeFile(file_, "[task1]\nb = 5\na=\"x y\"\nl=[\"p\",\"q\"]\nt=true\n#c=1\n[task2]\nz=1\n");
  const ToolResult result = option({"list", file_, "task1"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("a=\"x y\"\nb=5\nl=[\"p\",\"q\"]\nt=true\n", result.out);
  EXPECT_THAT(option({"list", file_, "task1", "-0"}).out, testing::EndsWith(std::string("e\0", 2)));
}

TEST_F(ToolOption, ListIsSortedAndCut) {
  writeFile(file_, "[s]\na=\"x\"\nb=5\nc=true\n");
  EXPECT_EQ("c=true\nb=5\na=\"x\"\n", option({"list", file_, "s", "--sort", "-name"}).out);
  EXPECT_EQ("c=true\nb=5\na=\"x\"\n", option({"list", file_, "s", "--sort", "type"}).out);
  const ToolResult result = option({"list", file_, "s", "--limit", "2"});
  EXPECT_EQ("a=\"x\"\nb=5\n", result.out);
  EXPECT_EQ("kovabackup: --limit leaves out 1 of 3\n", result.messages);
  EXPECT_EQ(2, option({"list", file_, "--limit", "2"}).exitCode) << "a section is required";
}

TEST_F(ToolOption, ListTellsTypesAsJson) {
  writeFile(file_, "[s]\na=\"x\xff\"\nb=5\nc=1.5\n");
  const Json::Value options = document(option({"list", file_, "s", "--json"}))["options"];
  ASSERT_EQ(3U, options.size());
  EXPECT_EQ("eP8=", options[0]["value"]["base64"].asString()) << "text that is no UTF-8";
  EXPECT_EQ("string", options[0]["type"].asString());
  EXPECT_EQ("int", options[1]["type"].asString());
  EXPECT_EQ("real", options[2]["type"].asString());
}

TEST_F(ToolOption, ListTellsOptionsThatItCannotRead) {
  writeFile(file_, "[s]\na=oops\nb=1\n#c=oops\n");
  const ToolResult result = option({"list", file_, "s"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("b=1\n", result.out);
  EXPECT_EQ("kovabackup: option 'a' is left out: its value is not JSON, so no service sees it; set "
            "it again or unset it\n",
            result.messages);
  const Json::Value value = document(option({"list", file_, "s", "--json"}));
  ASSERT_EQ(1U, value["unread"].size());
  EXPECT_EQ("a", value["unread"][0].asString());
}

TEST_F(ToolOption, ListShowsAllSections) {
  writeFile(file_, "[task2]\nb=5\na=\"x\"\n[empty]\n[task1]\nc=[]\n");
  const ToolResult result = option({"list", file_});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("task2\ta=\"x\"\ntask2\tb=5\ntask1\tc=[]\n", result.out);
  const Json::Value sections = document(option({"list", file_, "--json"}))["sections"];
  ASSERT_EQ(3U, sections.size());
  EXPECT_EQ("empty", sections[1]["name"].asString());
  EXPECT_EQ(0U, sections[1]["options"].size());
  EXPECT_EQ("c", sections[2]["options"][0]["name"].asString());
}

TEST_F(ToolOption, DiffComparesTwoFiles) {
  const std::string other = folder_ / "other.conf";
  writeFile(file_, "[task1]\na=1\nb=2\nbad=x\n[gone]\nz=0\n");
  writeFile(other, "[new]\n[task1]\n# moved\nb=3\n a = 1\nc=\"x\"\nbad=y\n");
  const ToolResult result = option({"diff", file_, other, "-q"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("-\tgone\t\n-\tgone\tz=0\n+\tnew\t\n-\ttask1\tb=2\n+\ttask1\tb=3\n"
            "-\ttask1\tbad=x\n+\ttask1\tbad=y\n+\ttask1\tc=\"x\"\n",
            result.out);
}

TEST_F(ToolOption, DiffComparesTwoSections) {
  const std::string other = folder_ / "other.conf";
  writeFile(file_, "[task1]\na=1\n[task2]\na=2\n");
  writeFile(other, "[task1]\na=1\n[task2]\na=3\n");
  EXPECT_EQ("-\ttask1\ta=1\n+\ttask2\ta=2\n",
            option({"diff", file_, "--section", "task1", "--section", "task2"}).out);
  EXPECT_EQ("-\ttask1\ta=1\n+\ttask2\ta=3\n",
            option({"diff", file_, other, "--section", "task1", "--section", "task2"}).out);
  EXPECT_EQ(0, option({"diff", file_, other, "--section", "task1"}).exitCode);
  EXPECT_TRUE(document(option({"diff", file_, file_, "--json"}))["same"].asBool());
  EXPECT_EQ(3, option({"diff", file_, other, "--section", "none"}).exitCode);
  EXPECT_EQ(2, option({"diff", file_}).exitCode);
}

TEST_F(ToolOption, DiffSaysHowToCompareTwoSectionsOfOneFile) {
  writeFile(file_, "[task1]\na=1\n[task2]\na=2\n");
  const ToolResult names = option({"diff", file_, "task1", "task2"});
  EXPECT_EQ(2, names.exitCode);
  EXPECT_THAT(names.messages, HasSubstr("unexpected argument 'task2'; to compare two sections of "
                                        "one file, pass --section SECTION twice\n"));
  const ToolResult name = option({"diff", file_, "task1"});
  EXPECT_EQ(2, name.exitCode);
  EXPECT_THAT(name.messages, HasSubstr("there is no file task1; to compare section 'task1' of " +
                                       file_ + " with another one, pass --section SECTION twice"));
  EXPECT_THAT(option({"diff", file_}).messages,
              HasSubstr("to compare two of its sections, pass --section SECTION twice; else pass a "
                        "second file"));
  EXPECT_EQ(3, option({"diff", file_, "none"}).exitCode);
}

TEST_F(ToolOption, GetTellsAnOptionThatItCannotRead) {
  writeFile(file_, "[s]\na=oops\n");
  const ToolResult result = option({"get", file_, "s", "a"});
  EXPECT_EQ(1, result.exitCode) << "it is there";
  EXPECT_EQ(
      "kovabackup: the value of option 'a' is not JSON, so no service sees it; set it again or "
      "unset it\n",
      result.messages);
}

TEST_F(ToolOption, ShowsAnEmptyFileName) {
  EXPECT_EQ("kovabackup: cannot read '': No such file or directory\n",
            option({"sections", ""}).messages);
  EXPECT_EQ("kovabackup: cannot read '': No such file or directory\n",
            runTool({"template", "fill", ""}).messages);
}

TEST_F(ToolOption, ListTellsAMissingSection) {
  writeFile(file_, "[task12]\n");
  const ToolResult result = option({"list", file_, "task1"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("kovabackup: " + file_ + " has no section 'task1'\n", result.messages);
}

TEST_F(ToolOption, GetPrintsEachType) {
  writeFile(file_, "[s]\ntext=\"a \\\"b\\\"\"\nn=-7\nt=false\nl=[\"x\",\"y z\"]\nz=null\n");
  EXPECT_EQ("a \"b\"\n", option({"get", file_, "s", "text"}).out);
  EXPECT_EQ("-7\n", option({"get", file_, "s", "n"}).out);
  EXPECT_EQ("false\n", option({"get", file_, "s", "t"}).out);
  EXPECT_EQ("x\ny z\n", option({"get", file_, "s", "l"}).out);
  EXPECT_EQ(std::string("x\0y z\0", 6), option({"get", file_, "s", "l", "-0"}).out);
  EXPECT_EQ("null\n", option({"get", file_, "s", "z"}).out);
  EXPECT_EQ("int",
            document(option({"get", file_, "s", "n", "--json"}))["option"]["type"].asString());
}

TEST_F(ToolOption, GetTellsWhatIsMissing) {
  writeFile(file_, "[s]\na=1\n");
  const ToolResult result = option({"get", file_, "s", "b"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("has no option 'b'"));
  EXPECT_EQ(3, option({"get", file_, "t", "a"}).exitCode);
  EXPECT_EQ(3, option({"get", folder_ / "none", "s", "a"}).exitCode);
  EXPECT_EQ(2, option({"get", file_, "s"}).exitCode);
}

TEST_F(ToolOption, GetEscapesControlBytesOnATerminalOnly) {
  writeFile(file_, "[s]\na=\"x\\u001b[2Jy\"\n");
  EXPECT_EQ("x\x1b[2Jy\n", option({"get", file_, "s", "a"}).out);
  TerminalTool tool({"option", "get", file_, "s", "a"}, setup());
  EXPECT_EQ("x\\x1b[2Jy\r\n", tool.wait().out);
}

} // namespace
