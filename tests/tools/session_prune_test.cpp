#include "tests/tools/run_tool.h"
#include "tests/tools/session_support.h"

#include "base/unique_fd.h"
#include "kovabackup/session.h"

#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/fanotify.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Session;
using KOVA::Base::UniqueFd;
using testing::HasSubstr;
using testing::StartsWith;
namespace fs = std::filesystem;

// Blocks processes that open a directory until the gate is opened or destroyed.
class Gate {
public:
  explicit Gate(const std::string &directory)
      : fd_(::fanotify_init(FAN_CLASS_CONTENT | FAN_CLOEXEC, O_RDONLY | O_CLOEXEC)) {
    closed_ = fd_ && ::fanotify_mark(fd_.get(), FAN_MARK_ADD, FAN_OPEN_PERM | FAN_ONDIR, AT_FDCWD,
                                     directory.c_str()) == 0;
  }
  bool closed() const { return closed_; }
  void open() { fd_.reset(); } // the kernel lets waiting processes pass

private:
  UniqueFd fd_;
  bool closed_ = false;
};

TEST(ToolSessionPrune, RemovesTheOldAndKeepsTheYoung) {
  const TestFolder volume;
  const std::string young = makeLocal(6 * kDay);
  const std::string old = makeLocal(8 * kDay);
  const std::string folder = makeVolume(volume, "seln.Abc123", 8 * kDay);
  makeDangling("seln.Aaaaa1", 8 * kDay);
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d", "--yes"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("kovabackup: removed 3 sessions, 12 B\n", result.messages);
  EXPECT_THAT(result.out, HasSubstr(old + "\tlocal\twhole\t1\t5\t"));
  EXPECT_THAT(result.out, HasSubstr("seln.Aaaaa1\tvolume\tdangling\t0\t0\t"));
  EXPECT_FALSE(fs::exists(folder));
  EXPECT_FALSE(fs::exists(kRoot + "/" + old));
  EXPECT_TRUE(fs::exists(kRoot + "/" + young));
}

// Its volume may only be unmounted for a while.
TEST(ToolSessionPrune, KeepsAYoungLinkThatLeadsToNothing) {
  const std::string link = kRoot + "/" + makeDangling("seln.Aaaaa1", 6 * kDay);
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d", "--yes"});
  EXPECT_EQ("kovabackup: there is nothing to prune\n", result.messages);
  EXPECT_TRUE(fs::is_symlink(link));
}

TEST(ToolSessionPrune, RemovesTreesAndSpecialFiles) {
  const std::string id = makeLocal();
  const std::string path = kRoot + "/" + id;
  fs::create_directories(path + "/a/b/c");
  writeFile(path + "/a/b/c/file", std::string(1000, 'x'));
  fs::create_directory_symlink("/usr", path + "/link");
  ASSERT_EQ(0, ::mkfifo((path + "/fifo").c_str(), 0600));
  setAge(path, 8 * kDay);
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d", "--yes"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, HasSubstr("\t4\t1005\t"));
  EXPECT_FALSE(fs::exists(path));
  EXPECT_TRUE(fs::exists("/usr/bin"));
}

// Removing the parts of a session one by one begins at each of them, a mount point among them.
TEST(ToolSessionPrune, DoesNotEnterWhatIsMountedInASession) {
  const std::string id = makeLocal();
  const std::string path = kRoot + "/" + id;
  fs::create_directory(path + "/mounted");
  if (::mount("tmpfs", (path + "/mounted").c_str(), "tmpfs", 0, "") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted";
  }
  writeFile(path + "/mounted/precious", "x");
  setAge(path, 8 * kDay);
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d", "--yes"});
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("could not be removed completely"));
  EXPECT_TRUE(fs::exists(path + "/mounted/precious"));
  EXPECT_FALSE(fs::exists(path + "/file"));
  ::umount2((path + "/mounted").c_str(), MNT_DETACH);
}

TEST(ToolSessionPrune, OnlyShowsInADryRun) {
  const std::string old = makeLocal(8 * kDay);
  const ToolResult result = runTool({"session", "prune", "--older-than", "1w", "--dry-run"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, StartsWith(old + "\t"));
  EXPECT_EQ("kovabackup: would remove 1 session, 5 B\n", result.messages);
  EXPECT_TRUE(fs::exists(kRoot + "/" + old));
  const Json::Value value =
      document(runTool({"session", "prune", "--older-than", "1w", "--dry-run", "--json"}));
  EXPECT_TRUE(value["dryRun"].asBool());
  EXPECT_EQ(5, value["staleBytes"].asInt());
  EXPECT_EQ(0, value["freedBytes"].asInt());
  EXPECT_FALSE(value["sessions"][0]["removed"].asBool());
}

TEST(ToolSessionPrune, EndsItsRowsWithANewlineOrWithANulByte) {
  makeLocal(8 * kDay);
  const std::vector<std::string> words = {"session", "prune", "--older-than", "7d", "--dry-run"};
  const std::string lines = runTool(words).out;
  EXPECT_EQ('\n', lines.back());
  EXPECT_EQ(std::string::npos, lines.find('\0'));
  std::vector<std::string> withNull = words;
  withNull.emplace_back("--null");
  const std::string rows = runTool(withNull).out;
  EXPECT_EQ('\0', rows.back());
  EXPECT_EQ(std::string::npos, rows.find('\n'));
}

TEST(ToolSessionPrune, RequiresYesWithoutATerminal) {
  const std::string old = makeLocal(8 * kDay);
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d"}, {"y\n"});
  EXPECT_EQ(2, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("--yes"));
  EXPECT_TRUE(fs::exists(kRoot + "/" + old));
}

TEST(ToolSessionPrune, TellsWhatItRemovedAsJson) {
  const std::string old = makeLocal(8 * kDay);
  const Json::Value value =
      document(runTool({"session", "prune", "--older-than", "7d", "--yes", "--json"}));
  EXPECT_EQ(5, value["freedBytes"].asInt());
  EXPECT_TRUE(value["sessions"][0]["removed"].asBool());
}

// A backup that has run for longer than the age may have created nothing in its session since.
TEST(ToolSessionPrune, SparesASessionThatAProcessUses) {
  const std::string id = makeLocal(8 * kDay);
  const UniqueFd open = openFileOf(id);
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d", "--yes"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("session " + id + " is old, but left alone: in use by " +
                                         std::to_string(::getpid()) + " (tool_session_pr)\n"));
  EXPECT_TRUE(fs::exists(kRoot + "/" + id));
  const Json::Value value =
      document(runTool({"session", "prune", "--older-than", "7d", "--dry-run", "--json"}));
  EXPECT_EQ(0U, value["sessions"].size());
  EXPECT_EQ(id, value["inUse"][0]["id"].asString());
  EXPECT_EQ(::getpid(), value["inUse"][0]["users"][0]["pid"].asInt());
}

TEST(ToolSessionPrune, SparesASessionOnAVolumeInWhichAProcessWorks) {
  const TestFolder volume;
  const std::string folder = makeVolume(volume, "seln.Abc123", 8 * kDay);
  const fs::path before = fs::current_path();
  fs::current_path(folder);
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d", "--yes"});
  fs::current_path(before);
  EXPECT_THAT(result.messages, HasSubstr("session seln.Abc123 is old, but left alone"));
  EXPECT_TRUE(fs::exists(folder));
}

TEST(ToolSessionPrune, IsNotMisledByAFolderOfALongerName) {
  const std::string old = makeLocal(8 * kDay);
  const std::string longer = kRoot + "/" + old + "x";
  fs::create_directory(longer);
  const UniqueFd open(::open(longer.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  EXPECT_EQ(0, runTool({"session", "prune", "--older-than", "7d", "--yes"}).exitCode);
  EXPECT_FALSE(fs::exists(kRoot + "/" + old));
}

TEST(ToolSessionPrune, SparesASessionThatIsOpenedMeanwhile) {
  const std::string old = makeLocal(8 * kDay);
  TerminalTool tool({"session", "prune", "--older-than", "7d"});
  tool.expect("[y/N] ");
  const UniqueFd open = openFileOf(old);
  tool.send("y\n");
  tool.expect("removed 0 sessions");
  EXPECT_EQ(0, tool.wait().exitCode);
  EXPECT_TRUE(fs::exists(kRoot + "/" + old));
}

TEST(ToolSessionPrune, RefusesWhatIsNoAge) {
  for (const char *age : {"7", "", "d", "-1d", "7days"}) {
    EXPECT_EQ(2, runTool({"session", "prune", "--older-than", age, "--yes"}).exitCode) << age;
  }
  EXPECT_THAT(runTool({"session", "prune", "--yes"}).messages,
              HasSubstr("--older-than is required"));
}

TEST(ToolSessionPrune, SaysWhenThereIsNothingToDo) {
  makeLocal();
  const ToolResult result = runTool({"session", "prune", "--older-than", "7d", "--yes"});
  EXPECT_EQ(0, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: there is nothing to prune\n", result.messages);
}

TEST(ToolSessionPrune, AsksOnATerminal) {
  const std::string old = makeLocal(8 * kDay);
  TerminalTool no({"session", "prune", "--older-than", "7d"});
  no.expect(old);
  no.expect("Remove 1 session, 5 B? [y/N] ");
  no.send("\n");
  EXPECT_EQ(1, no.wait().exitCode);
  EXPECT_TRUE(fs::exists(kRoot + "/" + old));
  TerminalTool yes({"session", "prune", "--older-than", "7d"});
  yes.expect("[y/N] ");
  yes.send("y\n");
  EXPECT_EQ(0, yes.wait().exitCode);
  EXPECT_FALSE(fs::exists(kRoot + "/" + old));
}

TEST(ToolSessionPrune, ShowsHowFarItIsWhenItTakesLong) {
  const std::string old = makeLocal(8 * kDay);
  Gate counting(kRoot + "/" + old);
  if (!counting.closed()) {
    GTEST_SKIP() << "skipped: opening a directory cannot be blocked here";
  }
  TerminalTool tool({"session", "prune", "--older-than", "7d"});
  tool.expect(" counting [");
  tool.expect("0 of 1");
  counting.open();
  tool.expect("[y/N] ");
  Gate removing(kRoot + "/" + old);
  tool.send("y\n");
  tool.expect(" removing [");
  tool.expect("5 B of 5 B"); // the file is gone, the directory is held
  removing.open();
  tool.expect("kovabackup: removed 1 session, 5 B");
  EXPECT_EQ(0, tool.wait().exitCode);
}

TEST(ToolSessionPrune, TakesTheEndOfTheInputForANo) {
  const std::string old = makeLocal(8 * kDay);
  TerminalTool tool({"session", "prune", "--older-than", "7d"}, {"", {{"NO_COLOR", "1"}}});
  tool.expect("[y/N] ");
  tool.send("\x04");
  tool.expect("\nkovabackup: nothing was removed\r\n");
  EXPECT_EQ(1, tool.wait().exitCode);
  EXPECT_TRUE(fs::exists(kRoot + "/" + old));
}

TEST(ToolSessionPrune, SparesASessionThatIsLoadedMeanwhile) {
  const std::string old = makeLocal(8 * kDay);
  TerminalTool tool({"session", "prune", "--older-than", "7d"});
  tool.expect("[y/N] ");
  Session session;
  ASSERT_TRUE(session.load(old));
  tool.send("y\n");
  tool.expect("removed 0 sessions");
  EXPECT_EQ(0, tool.wait().exitCode);
  EXPECT_TRUE(session.destroy());
}

} // namespace
