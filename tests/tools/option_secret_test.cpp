#include "tests/tools/option_support.h"

#include "kovabackup/option_map.h"

#include <csignal>
#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::OptionMap;
using testing::HasSubstr;
using testing::Not;
namespace fs = std::filesystem;

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
  EXPECT_THAT(result.messages,
              HasSubstr("cannot encrypt option 'pw': the key file " + (folder_ / "key/secret.key") +
                        " is not trusted: check its owner, mode and size (platform error 0xf404"));
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

// No service must wait for a user who types.
TEST_F(ToolOption, SecretsAreAskedForBeforeTheLockIsTaken) {
  OptionMap holder;
  ASSERT_TRUE(holder.setLockToken("t"));
  ASSERT_TRUE(holder.lock());
  TerminalTool tool(
      {"option", "set", file_, "s", "pw", "--secret", "--lock", "t", "--lock-timeout", "0"},
      setup());
  tool.expect("Secret for pw: ");
  tool.send("open sesame\n");
  tool.expect("Once more: ");
  tool.send("open sesame\n");
  EXPECT_EQ(4, tool.wait().exitCode) << "the lock is tried afterwards";
  EXPECT_FALSE(fs::exists(file_));
  ASSERT_TRUE(holder.unlock());
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
