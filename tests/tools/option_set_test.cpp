#include "tests/tools/option_support.h"

#include "kovabackup/option_map.h"

#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::OptionMap;
using testing::HasSubstr;
namespace fs = std::filesystem;

TEST_F(ToolOption, SetMakesFileSectionAndOption) {
  const ToolResult result = option({"set", file_, "task1", "name", "my photos"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: created section 'task1' in " + file_ + "\n", result.messages);
  EXPECT_EQ("[task1]\nname=\"my photos\"\n", content());
}

TEST_F(ToolOption, SetStoresEachType) {
  writeFile(file_, "[s]\n");
  EXPECT_EQ(0, option({"set", file_, "s", "a", "5"}).exitCode);
  EXPECT_EQ(0, option({"set", file_, "s", "b", "--type", "int", "-5"}).exitCode);
  EXPECT_EQ(0, option({"set", file_, "s", "c", "--type", "bool", "true"}).exitCode);
  EXPECT_EQ(0, option({"set", file_, "s", "d", "--type=list", "[x,y]", "--", "-z"}).exitCode);
  EXPECT_EQ(0, option({"set", file_, "s", "e", "--type", "list"}).exitCode);
  EXPECT_EQ("[s]\na=\"5\"\nb=-5\nc=true\nd=[\"[x,y]\",\"-z\"]\ne=[]\n", content());
}

TEST_F(ToolOption, SetKeepsTheTypeOfAnOption) {
  writeFile(file_, "[s]\na=\"x\"\nb=5\nc=true\n");
  EXPECT_EQ(0, option({"set", file_, "s", "a", "7"}).exitCode);
  EXPECT_EQ(0, option({"set", file_, "s", "b", "7"}).exitCode);
  const ToolResult result = option({"set", file_, "s", "c", "false"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.messages);
  EXPECT_EQ("[s]\na=\"7\"\nb=7\nc=false\n", content());
}

// A service that reads a list from a text gets no elements, and reports nothing.
TEST_F(ToolOption, SetMakesNoTextOfAList) {
  const std::string before = "[task1]\nexclude=[\"/etc/a**\",\"/var/**\"]\n";
  writeFile(file_, before);
  const ToolResult result = option({"set", file_, "task1", "exclude", "/etc/a**"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: option 'exclude' is a list: pass --type list and all its elements, or "
            "--type string to make it a string\n",
            result.messages);
  EXPECT_EQ(before, content());
}

TEST_F(ToolOption, SetRefusesTextThatDoesNotFitTheType) {
  const std::string before = "[s]\nn=5\nt=true\n";
  writeFile(file_, before);
  const ToolResult number = option({"set", file_, "s", "n", "many"});
  EXPECT_EQ(1, number.exitCode);
  EXPECT_EQ("kovabackup: option 'n' is an int, but 'many' is not: expected an integer from "
            "-2147483648 to 4294967295; pass --type to change its type\n",
            number.messages);
  EXPECT_EQ("kovabackup: option 't' is a bool, but 'yes' is not: expected true or false; pass "
            "--type to change its type\n",
            option({"set", file_, "s", "t", "yes"}).messages);
  EXPECT_EQ(before, content());
}

TEST_F(ToolOption, SetRefusesAnyValueForWhatOnlyAHandCanWrite) {
  writeFile(file_, "[s]\nr=1.5\n");
  const ToolResult result = option({"set", file_, "s", "r", "2"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: option 'r' is a real: pass --type to change its type\n", result.messages);
  EXPECT_EQ(0, option({"set", file_, "s", "r", "2", "--type", "int"}).exitCode);
  EXPECT_EQ("[s]\nr=2\n", content());
}

TEST_F(ToolOption, SetReportsAChangeOfType) {
  writeFile(file_, "[s]\nl=[\"a\"]\nn=5\n");
  const ToolResult result = option({"set", file_, "s", "l", "b", "--type", "string"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("kovabackup: option 'l' was a list and is a string now\n", result.messages);
  const Json::Value value =
      document(option({"set", file_, "s", "n", "--secret", "--json"}, "sesame"));
  EXPECT_EQ("int", value["previousType"].asString());
  EXPECT_EQ("string", value["type"].asString());
  EXPECT_TRUE(document(option({"set", file_, "s", "new", "x", "--json"}))["previousType"].isNull());
  EXPECT_EQ("", option({"set", file_, "s", "l", "c", "--type", "string"}).messages);
}

// A service that reads an integer from the text fails, and the file looks right at first sight.
TEST_F(ToolOption, SetRemarksThatANewOptionIsAStringWhereItsTextReadsAsAnotherType) {
  writeFile(file_, "[s]\n");
  EXPECT_EQ("kovabackup: option 'keep' was stored as a string; pass --type int if a number is "
            "meant\n",
            option({"set", file_, "s", "keep", "3"}).messages);
  EXPECT_EQ("kovabackup: option 'on' was stored as a string; pass --type bool if true or false is "
            "meant\n",
            option({"set", file_, "s", "on", "true"}).messages);
  EXPECT_EQ("kovabackup: option 'paths' was stored as a string; pass --type list and each "
            "element as an argument if a list is meant\n",
            option({"set", file_, "s", "paths", "[\"a\"]"}).messages);
  EXPECT_EQ("[s]\nkeep=\"3\"\non=\"true\"\npaths=\"[\\\"a\\\"]\"\n", content());
}

TEST_F(ToolOption, SetRemarksOnAListThatIsPassedAsOneElement) {
  writeFile(file_, "[s]\n");
  EXPECT_EQ("kovabackup: option 'paths' was stored as a list of one element, which reads as a list "
            "itself; to store its elements, pass each as an argument\n",
            option({"set", file_, "s", "paths", "[\"a\",\"b\"]", "--type", "list"}).messages);
  for (const std::vector<std::string> &elements :
       std::vector<std::vector<std::string>>{{"a"}, {"[a"}, {"[1]", "[2]"}, {}, {"3"}}) {
    std::vector<std::string> words{"set", file_, "s", "paths", "--type", "list"};
    words.insert(words.end(), elements.begin(), elements.end());
    EXPECT_EQ("", option(words).messages) << testing::PrintToString(elements);
  }
}

TEST_F(ToolOption, SetRemarksNothingOnATextThatIsMeant) {
  writeFile(file_, "[s]\nold=\"x\"\n");
  for (const std::vector<std::string> &rest :
       std::vector<std::vector<std::string>>{{"old", "3"},
                                             {"a", "three"},
                                             {"b", "3", "--type", "string"},
                                             {"c", "3", "--type", "int"},
                                             {"d", "3", "-q"},
                                             {"e", "3", "--json"},
                                             {"f", "True"},
                                             {"g", "null"}}) {
    std::vector<std::string> arguments = {"set", file_, "s"};
    arguments.insert(arguments.end(), rest.begin(), rest.end());
    EXPECT_EQ("", option(arguments).messages) << rest.front();
  }
  EXPECT_EQ("", option({"set", file_, "s", "h", "--secret"}, "3").messages);
}

TEST_F(ToolOption, SetNamesTheOptionWhoseValueCannotBeConverted) {
  EXPECT_EQ("kovabackup: option 'retries': 'x' is not a valid int: expected an integer from "
            "-2147483648 to 4294967295\nTry 'kovabackup option set --help'.\n",
            option({"set", file_, "s", "retries", "x", "--type", "int"}).messages);
  EXPECT_EQ("kovabackup: option 'on': 'yes' is not a valid bool: expected true or false\n"
            "Try 'kovabackup option set --help'.\n",
            option({"set", file_, "s", "on", "yes", "--type", "bool"}).messages);
}

TEST_F(ToolOption, SetKeepsEverythingElse) {
  writeFile(file_, "# top\n[s]\n# about a\na=\"old\"\nb=2\n[t]\na=3\n");
  EXPECT_EQ(0, option({"set", file_, "s", "a", "new"}).exitCode);
  EXPECT_EQ("# top\n[s]\n# about a\na=\"new\"\nb=2\n[t]\na=3\n", content());
}

TEST_F(ToolOption, SetRefusesWrongUsage) {
  writeFile(file_, "[s]\n");
  const std::vector<std::vector<std::string>> wrong = {
      {"set", file_, "s"},
      {"set", file_, "s", "a"},
      {"set", file_, "s", "a", "b", "c"},
      {"set", file_, "s", "a", "1", "--type", "number"},
      {"set", file_, "s", "a", "x", "--type", "int"},
      {"set", file_, "s", "a", "4294967296", "--type", "int"},
      {"set", file_, "s", "a", "yes", "--type", "bool"},
      {"set", file_, "s", "", "x"},
      {"set", file_, "s", "a=b", "x"},
      {"set", file_, "s", "#a", "x"},
      {"set", file_, "s", "[a", "x"},
      {"set", file_, "s", " a", "x"},
      {"set", file_, "s", "a\n[t]", "x"},
      {"set", file_, "s\n[t", "a", "x"},
      {"set", file_, "", "a", "x"},
      {"set", file_, "s", "a", "x", "--lock", "../x"},
      {"set", file_, "s", "a", "x", "--secret"},
      {"set", file_, "s", "a", "--secret", "--type", "int"}};
  for (const std::vector<std::string> &arguments : wrong) {
    const ToolResult result = option(arguments);
    EXPECT_EQ(2, result.exitCode) << result << testing::PrintToString(arguments);
    EXPECT_EQ("[s]\n", content());
  }
}

TEST_F(ToolOption, SetLosesNoOptionThatTheLoaderSkips) {
  writeFile(file_, "[s]\nbad=oops\nb=1\n");
  const ToolResult result = option({"set", file_, "s", "b", "2"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("the value of option 'bad' is not JSON"));
  EXPECT_EQ("[s]\nbad=oops\nb=1\n", content());
  EXPECT_EQ(1, option({"unset", file_, "s", "b"}).exitCode);
}

// With two such options, neither can be set or unset alone.
TEST_F(ToolOption, SetNamesTheCommandThatCorrectsSeveralOptions) {
  writeFile(file_, "[s]\nbad={\npath=/srv\n");
  const std::string advice =
      "kovabackup: the value of option 'path' is not JSON and would be lost: "
      "correct it with 'kovabackup option edit " +
      file_ + " s' first\n";
  EXPECT_EQ(advice, option({"unset", file_, "s", "bad"}).messages);
  EXPECT_EQ(advice, option({"set", file_, "s", "bad", "x"}).messages);
  writeFile(file_, "[s]\nreal=1.5\n");
  EXPECT_THAT(
      option({"set", file_, "s", "b", "x"}).messages,
      HasSubstr("cannot hold: correct it with 'kovabackup option edit " + file_ + " s' first\n"));
}

TEST_F(ToolOption, SetTellsWhatNoSectionCanHold) {
  writeFile(file_, "[s]\nreal=1.5\n");
  const ToolResult result = option({"set", file_, "s", "b", "2"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages,
              HasSubstr("option 'real' has a value of a type that a section cannot hold"));
  EXPECT_EQ("[s]\nreal=1.5\n", content());
}

TEST_F(ToolOption, SetTellsThatItCannotWrite) {
  const ToolResult result = option({"set", "/nowhere/task.conf", "s", "a", "b"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: cannot create /nowhere/task.conf: No such file or directory\n",
            result.messages);
  EXPECT_EQ("kovabackup: cannot create /proc/t.conf: No such file or directory\n",
            option({"set", "/proc/t.conf", "s", "a", "b"}).messages);
}

// A section file of a mounted file system, which the test may fill or make read-only.
class ToolOptionMounted : public ToolOption {
protected:
  void SetUp() override {
    ToolOption::SetUp();
    fs::create_directory(mount_);
    if (::mount("tmpfs", mount_.c_str(), "tmpfs", 0, "size=8k") != 0) {
      GTEST_SKIP() << "skipped: no file system can be mounted";
    }
    writeFile(mounted_, "[s]\na=\"1\"\n");
  }
  void TearDown() override { ::umount2(mount_.c_str(), MNT_DETACH); }

  std::string mount_ = folder_ / "mount";
  std::string mounted_ = mount_ + "/task.conf";
};

TEST_F(ToolOptionMounted, SetSaysThatTheFileSystemIsReadOnly) {
  ASSERT_EQ(0, ::mount(nullptr, mount_.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr));
  const ToolResult result = option({"set", mounted_, "s", "a", "2"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: cannot write section 's' of " + mounted_ + ": Read-only file system\n",
            result.messages);
}

TEST_F(ToolOptionMounted, SetSaysThatTheFileSystemIsFull) {
  std::ofstream(mount_ + "/filler") << std::string(8192, 'x');
  const ToolResult result = option({"set", mounted_, "s", "a", std::string(5000, 'x')});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: cannot write section 's' of " + mounted_ + ": " + mount_ +
                ": No space left on device\n",
            result.messages);
  EXPECT_EQ("[s]\na=\"1\"\n", readFile(mounted_));
}

// Reading a device might never end.
TEST_F(ToolOption, SetReadsRegularFilesOnly) {
  ASSERT_EQ(0, ::mkfifo((folder_ / "fifo").c_str(), 0600));
  for (const std::string &file : {std::string("/dev/zero"), folder_ / "fifo", folder_.path()}) {
    const ToolResult result = option({"set", file, "s", "a", "b"});
    EXPECT_EQ(1, result.exitCode);
    EXPECT_EQ("kovabackup: " + file + " is not a regular file\n", result.messages);
  }
}

TEST_F(ToolOption, SetSaysWhyTheFileCannotBeRead) {
  fs::create_symlink("loop", folder_ / "loop");
  EXPECT_EQ("kovabackup: cannot read " + (folder_ / "loop") +
                ": Too many levels of symbolic links\n",
            option({"set", folder_ / "loop", "s", "a", "b"}).messages);
  writeFile(file_, "");
  const ToolResult result = option({"set", file_ + "/x", "s", "a", "b"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: cannot create " + file_ + "/x: Not a directory\n", result.messages);
}

TEST_F(ToolOption, SetSaysThatALockTokenHasNoSlash) {
  const ToolResult result = option({"set", file_, "s", "a", "b", "--lock", "x/y"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: cannot take the lock 'x/y': /tmp/kovabackup/lock/x/y: No such file or "
            "directory; a lock token usually has no slash\n",
            result.messages);
}

TEST_F(ToolOption, SetNamesThePathOfALockThatCannotBeTaken) {
  fs::remove_all("/tmp/kovabackup");
  writeFile("/tmp/kovabackup", "in the way");
  const ToolResult result = option({"set", file_, "s", "a", "b", "--lock", "t"});
  fs::remove("/tmp/kovabackup");
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages,
              testing::StartsWith("kovabackup: cannot take the lock 't': /tmp/kovabackup"));
}

TEST_F(ToolOption, SetWaitsForTheLock) {
  writeFile(file_, "[s]\na=1\n");
  OptionMap holder;
  ASSERT_TRUE(holder.setLockToken("task.conf"));
  ASSERT_TRUE(holder.lock());
  TerminalTool tool({"option", "set", file_, "s", "b", "2", "--lock", "task.conf"}, setup());
  tool.expect("waiting for the lock 'task.conf', which process " + std::to_string(::getpid()));
  writeFile(file_, "[s]\na=1\nmeanwhile=3\n");
  ASSERT_TRUE(holder.unlock());
  EXPECT_EQ(0, tool.wait().exitCode);
  EXPECT_EQ("[s]\na=1\nb=\"2\"\nmeanwhile=3\n", content());
}

TEST_F(ToolOption, SetWaitsNoLongerThanAsked) {
  writeFile(file_, "[s]\na=1\n");
  OptionMap holder;
  ASSERT_TRUE(holder.setLockToken("task.conf"));
  ASSERT_TRUE(holder.lock());
  const ToolResult result = option(
      {"set", file_, "s", "a", "2", "--lock", "task.conf", "--lock-timeout", "1", "--quiet"});
  EXPECT_EQ(4, result.exitCode) << result;
  EXPECT_EQ("kovabackup: the lock 'task.conf' was not free within 1 s\n", result.messages);
  EXPECT_EQ(4,
            option({"unset", file_, "s", "a", "--lock", "task.conf", "--lock-timeout=0"}).exitCode);
  EXPECT_EQ("[s]\na=1\n", content());
  ASSERT_TRUE(holder.unlock());
  EXPECT_EQ(
      0,
      option({"set", file_, "s", "a", "2", "--lock", "task.conf", "--lock-timeout", "0"}).exitCode);
  EXPECT_EQ(2, option({"set", file_, "s", "a", "2", "--lock-timeout", "1"}).exitCode);
  EXPECT_EQ(2,
            option({"set", file_, "s", "a", "2", "--lock", "t", "--lock-timeout", "x"}).exitCode);
}

TEST_F(ToolOption, SetUnderALockLosesNoUpdate) {
  constexpr int kWriters = 6;
  writeFile(file_, "[s]\n");
  std::vector<pid_t> children;
  for (int i = 0; i < kWriters; ++i) {
    children.push_back(::fork());
    if (children.back() == 0) {
      const std::string name = "n" + std::to_string(i);
      ::execl(KOVA_TOOL_PATH, "kovabackup", "option", "set", file_.c_str(), "s", name.c_str(), "x",
              "--lock", "t", nullptr);
      ::_exit(126);
    }
  }
  for (const pid_t child : children) {
    int status = -1;
    EXPECT_EQ(child, ::waitpid(child, &status, 0));
    EXPECT_EQ(0, status);
  }
  EXPECT_EQ("[s]\nn0=\"x\"\nn1=\"x\"\nn2=\"x\"\nn3=\"x\"\nn4=\"x\"\nn5=\"x\"\n", content());
}

TEST_F(ToolOption, UnsetRemovesOneOption) {
  writeFile(file_, "[s]\na=1\nb=null\nc=\"x\"\n");
  EXPECT_EQ(0, option({"unset", file_, "s", "b", "--lock", "t"}).exitCode);
  EXPECT_EQ("[s]\na=1\nc=\"x\"\n", content());
  EXPECT_EQ("a", document(option({"unset", file_, "s", "a", "--json"}))["name"].asString());
  EXPECT_EQ("[s]\nc=\"x\"\n", content());
}

TEST_F(ToolOption, ABrokenOptionCanBeReplacedOrRemoved) {
  writeFile(file_, "[s]\na=oops\nb=1.5\n");
  EXPECT_EQ(1, option({"unset", file_, "s", "a"}).exitCode) << "b would fail the export";
  EXPECT_EQ(1, option({"set", file_, "s", "b", "2", "--type", "int"}).exitCode)
      << "a would be lost";
  writeFile(file_, "[s]\na=oops\nb=1\n");
  EXPECT_EQ(0, option({"set", file_, "s", "a", "mended"}).exitCode);
  EXPECT_EQ("[s]\na=\"mended\"\nb=1\n", content());
  writeFile(file_, "[s]\na=oops\nb=1\n");
  EXPECT_EQ(0, option({"unset", file_, "s", "a"}).exitCode);
  EXPECT_EQ("[s]\nb=1\n", content());
}

TEST_F(ToolOption, UnsetTellsWhatIsMissing) {
  writeFile(file_, "[s]\na=1\n");
  EXPECT_EQ(3, option({"unset", file_, "s", "b"}).exitCode);
  EXPECT_EQ(3, option({"unset", file_, "t", "a"}).exitCode);
  EXPECT_EQ(3, option({"unset", folder_ / "none", "s", "a"}).exitCode);
  EXPECT_FALSE(fs::exists(folder_ / "none"));
  EXPECT_EQ("[s]\na=1\n", content());
}

} // namespace
