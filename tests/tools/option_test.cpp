#include "tests/tools/run_tool.h"

#include "kovabackup/option_map.h"

#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::OptionMap;
using testing::HasSubstr;
using testing::Not;
namespace fs = std::filesystem;

class ToolOption : public testing::Test {
protected:
  void SetUp() override {
    writeFile(conf_, "[secret]\nkeyFile=\"" + (folder_ / "key/secret.key") + "\"\n");
    ::chmod(conf_.c_str(), 0644); // whatever the umask
  }

  ToolSetup setup(const std::string &input = "") const {
    return {input, {{"KOVA_PLATFORM_CONF", conf_}, {"NO_COLOR", "1"}}};
  }
  ToolResult option(std::vector<std::string> arguments, const std::string &input = "") const {
    arguments.insert(arguments.begin(), "option");
    return runTool(arguments, setup(input));
  }
  std::string content() const { return readFile(file_); }

  TestFolder folder_;
  std::string conf_ = folder_ / "platform.conf";
  std::string file_ = folder_ / "task.conf";
};

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
}

TEST_F(ToolOption, ListShowsOptionsAsTheyStandInTheFile) {
  writeFile(file_, "[task1]\nb = 5\na=\"x y\"\nl=[\"p\",\"q\"]\nt=true\n#c=1\n[task2]\nz=1\n");
  const ToolResult result = option({"list", file_, "task1"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("a=\"x y\"\nb=5\nl=[\"p\",\"q\"]\nt=true\n", result.out);
  EXPECT_THAT(option({"list", file_, "task1", "-0"}).out, testing::EndsWith(std::string("e\0", 2)));
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
  EXPECT_THAT(result.messages, HasSubstr("cannot write section 's' of /nowhere/task.conf"));
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
  EXPECT_EQ(1, option({"set", file_, "s", "b", "2"}).exitCode) << "a would be lost";
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

TEST_F(ToolOption, SecretsComeFromStandardInput) {
  const ToolResult result = option({"set", file_, "s", "pw", "--secret"}, "open sesame\n");
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(content(), Not(HasSubstr("sesame")));
  EXPECT_THAT(option({"list", file_, "s"}).out, Not(HasSubstr("sesame")));
  EXPECT_THAT(option({"get", file_, "s", "pw"}).out, Not(HasSubstr("sesame")));
  EXPECT_EQ("open sesame\n", option({"get", file_, "s", "pw", "--reveal"}).out);
  EXPECT_EQ("open sesame",
            document(option({"get", file_, "s", "pw", "--reveal", "--json"}))["option"]["value"]
                .asString());
}

TEST_F(ToolOption, AnEmptySecretIsRefused) {
  EXPECT_EQ(1, option({"set", file_, "s", "pw", "--secret"}, "\n").exitCode);
  EXPECT_EQ(1, option({"set", file_, "s", "pw", "--secret"}, std::string("a\0b", 3)).exitCode);
  EXPECT_FALSE(fs::exists(file_));
}

TEST_F(ToolOption, RevealTellsWhatIsNoSecret) {
  writeFile(file_, "[s]\nplain=\"words\"\nn=5\nempty=\"\"\n");
  const ToolResult result = option({"get", file_, "s", "plain", "--reveal"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("cannot decrypt option 'plain'"));
  EXPECT_EQ(1, option({"get", file_, "s", "n", "--reveal"}).exitCode);
  EXPECT_EQ("\n", option({"get", file_, "s", "empty", "--reveal"}).out);
}

TEST_F(ToolOption, ASecretThatCannotBeEncryptedIsNotStored) {
  writeFile(file_, "[s]\npw=\"kept\"\n");
  fs::create_directory(folder_ / "key");
  writeFile(folder_ / "key/secret.key", std::string(32, 'k'));
  ::chmod((folder_ / "key/secret.key").c_str(), 0644); // others may read it
  const ToolResult result = option({"set", file_, "s", "pw", "--secret"}, "x");
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("cannot encrypt: the key file is not trusted"));
  EXPECT_EQ("[s]\npw=\"kept\"\n", content());
}

bool echoes(int terminal) {
  struct termios settings = {};
  EXPECT_EQ(0, ::tcgetattr(terminal, &settings));
  return (settings.c_lflag & ECHO) != 0;
}

TEST_F(ToolOption, SecretsAreAskedForWithoutShowingThem) {
  TerminalTool tool({"option", "set", file_, "s", "pw", "--secret"}, setup());
  tool.expect("Secret for pw: ");
  EXPECT_FALSE(echoes(tool.terminal()));
  tool.send("open sesame\n");
  tool.expect("Once more: ");
  tool.send("open sesame\n");
  const ToolResult result = tool.wait();
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, Not(HasSubstr("sesame")));
  EXPECT_EQ("open sesame\n", option({"get", file_, "s", "pw", "--reveal"}).out);
}

TEST_F(ToolOption, ASecretThatIsMistypedIsNotStored) {
  TerminalTool tool({"option", "set", file_, "s", "pw", "--secret"}, setup());
  tool.expect("Secret for pw: ");
  tool.send("one\n");
  tool.expect("Once more: ");
  tool.send("two\n");
  EXPECT_EQ(1, tool.wait().exitCode);
  EXPECT_FALSE(fs::exists(file_));
}

TEST_F(ToolOption, ThePromptPutsTheTerminalBackWhenItIsEnded) {
  for (const int sig : {SIGTERM, SIGINT, SIGHUP}) {
    // A second descriptor of the terminal keeps it alive to be looked at.
    TerminalTool tool({"option", "set", file_, "s", "pw", "--secret"}, setup());
    const std::string name = ::ptsname(tool.terminal());
    const int terminal = ::open(name.c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC);
    tool.expect("Secret for pw: ");
    EXPECT_FALSE(echoes(terminal));
    ::kill(tool.pid(), sig);
    siginfo_t info;
    EXPECT_EQ(0, ::waitid(P_PID, static_cast<id_t>(tool.pid()), &info, WEXITED | WNOWAIT));
    EXPECT_EQ(CLD_KILLED, info.si_code) << "as if the signal had not been caught";
    EXPECT_EQ(sig, info.si_status);
    EXPECT_TRUE(echoes(terminal)) << sig;
    ::close(terminal);
  }
}

// The command leads the terminal's session here, and such a process is not stopped by SIGTSTP: it
// goes on at once, as a stopped one does after SIGCONT.
TEST_F(ToolOption, ThePromptComesAgainAfterAStop) {
  TerminalTool tool({"option", "set", file_, "s", "pw", "--secret"}, setup());
  tool.expect("Secret for pw: ");
  ::kill(tool.pid(), SIGTSTP);
  tool.expect("Secret for pw: ");
  EXPECT_FALSE(echoes(tool.terminal()));
  tool.send("a\n");
  tool.expect("Once more: ");
  tool.send("a\n");
  EXPECT_EQ(0, tool.wait().exitCode);
}

} // namespace
