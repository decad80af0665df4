#include "tests/tools/run_tool.h"
#include "tests/tools/session_support.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"
#include "kovabackup/session.h"

#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Session;
using KOVA::Backup::Path::createIpcTempPath;
using KOVA::Base::UniqueFd;
using testing::HasSubstr;
using testing::StartsWith;
namespace fs = std::filesystem;

TEST(ToolSessionList, IsEmptyWithoutSessions) {
  const ToolResult result = runTool({"session", "list"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: there are no sessions\n", result.messages);
  EXPECT_EQ(0U, document(runTool({"session", "list", "--json"}))["sessions"].size());
  EXPECT_FALSE(fs::exists("/tmp/kovabackup")) << "looking makes nothing";
}

TEST(ToolSessionList, ShowsEachKindWithSizeAndAge) {
  const TestFolder volume;
  const std::string id = makeLocal(3 * kDay);
  const std::string folder = makeVolume(volume, "seln.Abc123", 2 * kDay);
  fs::create_directory(kRoot + "/" + id + "/sub");
  writeFile(kRoot + "/" + id + "/sub/more", std::string(95, 'x'));
  setAge(kRoot + "/" + id, 3 * kDay);
  const Json::Value sessions = document(runTool({"session", "list", "--json"}))["sessions"];
  ASSERT_EQ(2U, sessions.size());
  const Json::Value &onVolume = sessions[0];
  const Json::Value &local = sessions[1];
  EXPECT_EQ(id, local["id"].asString());
  EXPECT_EQ("local", local["kind"].asString());
  EXPECT_EQ("whole", local["state"].asString());
  EXPECT_EQ(2, local["files"].asInt());
  EXPECT_EQ(100, local["bytes"].asInt());
  EXPECT_GE(local["ageSeconds"].asInt(), 3 * kDay);
  EXPECT_LT(local["ageSeconds"].asInt(), 3 * kDay + 600);
  EXPECT_EQ("volume", onVolume["kind"].asString());
  EXPECT_EQ(folder, onVolume["path"].asString());
  EXPECT_EQ(7, onVolume["bytes"].asInt());
  EXPECT_GE(onVolume["ageSeconds"].asInt(), 2 * kDay);
}

TEST(ToolSessionList, PrintsPlainRows) {
  const TestFolder volume;
  const std::string folder = makeVolume(volume, "seln.Abc123", 0);
  const ToolResult result = runTool({"session", "list"});
  EXPECT_THAT(result.out, StartsWith("seln.Abc123\tvolume\twhole\t1\t7\t"));
  EXPECT_THAT(result.out, testing::EndsWith("\t" + folder + "\n"));
  EXPECT_THAT(runTool({"session", "list", "-0"}).out, testing::EndsWith(folder + '\0'));
}

// The ids of a list, in its order.
std::vector<std::string> listedIds(const std::vector<std::string> &more) {
  std::vector<std::string> words = {"session", "list", "--json"};
  words.insert(words.end(), more.begin(), more.end());
  std::vector<std::string> ids;
  const Json::Value sessions = document(runTool(words))["sessions"];
  for (const Json::Value &session : sessions) {
    ids.push_back(session["id"].asString());
  }
  return ids;
}

TEST(ToolSessionList, IsSortedByAKey) {
  const std::string small = makeLocal(2 * kDay);
  const std::string large = makeLocal(3 * kDay);
  const std::string middle = makeLocal(kDay);
  writeFile(kRoot + "/" + large + "/more", std::string(1000, 'x'));
  writeFile(kRoot + "/" + middle + "/more", std::string(90, 'x'));
  setAge(kRoot + "/" + large, 3 * kDay);
  setAge(kRoot + "/" + middle, kDay);
  using testing::ElementsAre;
  EXPECT_THAT(listedIds({"--sort", "bytes"}), ElementsAre(small, middle, large));
  EXPECT_THAT(listedIds({"--sort", "-bytes"}), ElementsAre(large, middle, small));
  EXPECT_THAT(listedIds({"--sort=age"}), ElementsAre(middle, small, large));
  EXPECT_THAT(runTool({"session", "list", "--sort", "-age"}).out, StartsWith(large + "\t"));
}

TEST(ToolSessionList, IsCutAtALimit) {
  const std::string young = makeLocal(kDay);
  const std::string old = makeLocal(3 * kDay);
  const ToolResult result = runTool({"session", "list", "--sort", "-age", "--limit", "1"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, StartsWith(old + "\t"));
  EXPECT_EQ(std::string::npos, result.out.find(young));
  EXPECT_EQ("kovabackup: --limit leaves out 1 of 2\n", result.messages);
  const Json::Value cut = document(runTool({"session", "list", "--limit", "1", "--json"}));
  EXPECT_EQ(1, cut["omitted"].asInt());
  EXPECT_EQ(1U, cut["sessions"].size());
  EXPECT_EQ("", runTool({"session", "list", "--limit", "2"}).messages);
  EXPECT_EQ(0, document(runTool({"session", "list", "--json"}))["omitted"].asInt());
}

TEST(ToolSessionList, RefusesAKeyOrALimitThatIsNotValid) {
  const ToolResult result = runTool({"session", "list", "--sort", "size"});
  EXPECT_EQ(2, result.exitCode);
  EXPECT_THAT(result.messages,
              HasSubstr("'size' is not a sort key: use id, kind, state, files, bytes, age or path, "
                        "with - before it for the reverse order\n"));
  EXPECT_EQ(2, runTool({"session", "list", "--sort", ""}).exitCode);
  for (const std::string limit : {"0", "-1", "x", "2147483648"}) {
    EXPECT_EQ(2, runTool({"session", "list", "--limit", limit}).exitCode) << limit;
  }
}

TEST(ToolSessionList, TellsWhatIsNotWhole) {
  makeDangling("seln.Aaaaa1");
  writeFile(kRoot + "/seln.Aaaaa2", "");
  writeFile(kRoot + "/sess.Aaaaa3", "");
  fs::create_symlink("/etc", kRoot + "/seln.Aaaaa4");
  writeFile(kRoot + "/__sess__.lock", "");
  fs::create_directory(kRoot + "/sess.toolongname");
  const Json::Value sessions = document(runTool({"session", "list", "--json"}))["sessions"];
  ASSERT_EQ(4U, sessions.size());
  EXPECT_EQ("dangling", sessions[0]["state"].asString());
  EXPECT_EQ("broken", sessions[1]["state"].asString());
  EXPECT_EQ("foreign", sessions[2]["state"].asString());
  EXPECT_EQ("broken", sessions[3]["state"].asString());
  EXPECT_THAT(sessions[2]["problem"].asString(), HasSubstr("'/etc'"));
}

TEST(ToolSessionList, FollowsNoLinkInASession) {
  const std::string id = makeLocal();
  fs::create_directory_symlink("/usr", kRoot + "/" + id + "/usr");
  const Json::Value session = document(runTool({"session", "list", "--json"}))["sessions"][0];
  EXPECT_EQ(2, session["files"].asInt());
  EXPECT_EQ(5, session["bytes"].asInt());
}

TEST(ToolSessionList, LeavesTheAgeAlone) {
  const std::string id = makeLocal(9 * kDay);
  runTool({"session", "list"});
  runTool({"session", "show", id});
  EXPECT_GE(document(runTool({"session", "list", "--json"}))["sessions"][0]["ageSeconds"].asInt(),
            9 * kDay);
}

TEST(ToolSessionList, AlignsRowsOnATerminal) {
  makeLocal();
  TerminalTool tool({"session", "list"}, {"", {{"NO_COLOR", "1"}}});
  const std::string shown = tool.wait().out;
  EXPECT_THAT(shown, StartsWith("ID           KIND   STATE  FILES  BYTES  AGE  PATH\r\n"));
  EXPECT_THAT(shown, HasSubstr("  5 B  "));
}

TEST(ToolSessionShow, ShowsOne) {
  const std::string id = makeLocal();
  const ToolResult result = runTool({"session", "show", id});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out,
              HasSubstr("id\t" + id + "\nkind\tlocal\nstate\twhole\nfiles\t1\nbytes\t5\n"));
  EXPECT_EQ(id, document(runTool({"session", "show", id, "--json"}))["session"]["id"].asString());
}

TEST(ToolSessionShow, EndsLinesInNulBytesWhenAsked) {
  const std::string id = makeLocal();
  const std::string shown = runTool({"session", "show", id, "-0"}).out;
  EXPECT_THAT(shown, StartsWith("id\t" + id + '\0'));
  EXPECT_THAT(shown, testing::EndsWith("\0path\t" + kRoot + "/" + id + '\0'));
}

TEST(ToolSessionShow, TellsWhoUsesIt) {
  const std::string id = makeLocal();
  EXPECT_THAT(runTool({"session", "show", id}).out, HasSubstr("\nusers\tnone\n"));
  const UniqueFd open = openFileOf(id);
  const std::string self = std::to_string(::getpid()) + " (tool_session_te)";
  EXPECT_THAT(runTool({"session", "show", id}).out, HasSubstr("\nusers\t" + self + "\n"));
  const Json::Value users =
      document(runTool({"session", "show", id, "--json"}))["session"]["users"];
  ASSERT_EQ(1U, users.size());
  EXPECT_EQ(::getpid(), users[0]["pid"].asInt());
  EXPECT_EQ("tool_session_te", users[0]["command"].asString());
}

TEST(ToolSessionShow, Says3ForOneThatIsNotWhole) {
  makeDangling("seln.Aaaaa1");
  const ToolResult result = runTool({"session", "show", "seln.Aaaaa1"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_THAT(result.out, HasSubstr("state\tdangling: the target of the link does not exist\n"));
}

TEST(ToolSessionShow, Says3ForOneThatIsNotThere) {
  const ToolResult result = runTool({"session", "show", "sess.Aaaaa1"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("kovabackup: there is no session sess.Aaaaa1\n", result.messages);
  const Json::Value error =
      document(runTool({"session", "show", "sess.Aaaaa1", "--json"}))["errors"][0];
  EXPECT_EQ(3, error["exitCode"].asInt());
}

TEST(ToolSession, RefusesWhatIsNoId) {
  const std::string bad[] = {"",
                             "sess.",
                             "sess.abcde",
                             "sess.abcdefg",
                             "sess.abc/ef",
                             "sess.abc..",
                             "../session/sess.abcdef",
                             "SESS.abcdef",
                             "sesx.abcdef",
                             "sess.abcde\n",
                             "sess.abcd\xc3\xa9",
                             "__sess__.lock",
                             ".",
                             "sess.ab*def"};
  for (const std::string &id : bad) {
    for (const std::string verb : {"show", "path", "destroy"}) {
      const ToolResult result = runTool({"session", verb, id});
      EXPECT_EQ(2, result.exitCode) << verb << " " << id;
      EXPECT_EQ("", result.out);
    }
  }
}

TEST(ToolSessionPath, PrintsTheDirectory) {
  const TestFolder volume;
  const std::string folder = makeVolume(volume, "seln.Abc123");
  EXPECT_EQ(folder + "\n", runTool({"session", "path", "seln.Abc123"}).out);
  EXPECT_EQ(folder + '\0', runTool({"session", "path", "-0", "seln.Abc123"}).out);
  EXPECT_EQ(folder,
            document(runTool({"session", "path", "seln.Abc123", "--json"}))["path"].asString());
}

TEST(ToolSessionPath, Says3ForALinkToNothing) {
  const ToolResult result = runTool({"session", "path", makeDangling("seln.Aaaaa1")});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: session seln.Aaaaa1: the target of the link does not exist\n",
            result.messages);
}

TEST(ToolSessionCreate, MakesASessionThatTheLibraryFinds) {
  const ToolResult result = runTool({"session", "create"});
  EXPECT_EQ(0, result.exitCode) << result;
  const std::string id = result.out.substr(0, result.out.size() - 1);
  Session session;
  EXPECT_TRUE(session.load(id)) << id;
  EXPECT_TRUE(session.destroy());
  const Json::Value made = document(runTool({"session", "create", "--json"}))["session"];
  EXPECT_EQ(kRoot + "/" + made["id"].asString(), made["path"].asString());
  EXPECT_TRUE(Session::destroyById(made["id"].asString()));
}

// No process would know its id, and none would ever remove it.
TEST(ToolSessionCreate, LeavesNoSessionWhoseIdCouldNotBeTold) {
  const UniqueFd full(::open("/dev/full", O_WRONLY | O_CLOEXEC));
  for (const char *flag : {"--no-color", "--json"}) {
    const ToolResult result = runTool({"session", "create", flag}, {"", {}, "/", full.get()});
    EXPECT_EQ(1, result.exitCode) << result;
    EXPECT_TRUE(fs::is_empty(kRoot));
  }
}

TEST(ToolSessionCreate, TellsWhyItCannot) {
  writeFile("/tmp/kovabackup", "a file in the root's place");
  const ToolResult result = runTool({"session", "create"});
  fs::remove("/tmp/kovabackup");
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("cannot create a session: /tmp/kovabackup/session: Not a "
                                         "directory"));
}

TEST(ToolSessionCreate, WarnsOfARootThatBelongsToAnotherUser) {
  fs::create_directory("/tmp/kovabackup");
  if (::chown("/tmp/kovabackup", 65534, 65534) != 0) {
    GTEST_SKIP() << "skipped: owners cannot be changed here";
  }
  const ToolResult result = runTool({"session", "create"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("kovabackup: another user may read or replace the session, because /tmp/kovabackup "
            "cannot be trusted; see 'kovabackup doctor'\n",
            result.messages);
  EXPECT_TRUE(Session::destroyById(result.out.substr(0, result.out.size() - 1)));
}

TEST(ToolSessionCreate, RefusesUnknownRules) {
  for (const char *rule : {"", "biggest", "max ", "same:", "same"}) {
    const ToolResult result = runTool({"session", "create", "--volume", rule});
    EXPECT_EQ(2, result.exitCode) << rule;
    EXPECT_THAT(result.messages, HasSubstr("use max, max-ext, max-ext-btrfs or same:PATH"));
  }
}

TEST(ToolSessionDestroy, RemovesDirectoriesAndLinks) {
  const TestFolder volume;
  const std::string folder = makeVolume(volume, "seln.Abc123");
  const std::string id = makeLocal();
  const ToolResult result =
      runTool({"session", "destroy", id, "seln.Abc123", makeDangling("seln.Aaaaa1")});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_FALSE(fs::exists(folder));
  EXPECT_TRUE(fs::is_empty(kRoot));
}

TEST(ToolSessionDestroy, GoesOnPastOneThatIsNotThere) {
  const std::string id = makeLocal();
  const ToolResult result = runTool({"session", "destroy", "sess.Aaaaa1", id, "--json"});
  EXPECT_EQ(3, result.exitCode) << result;
  const Json::Value value = document(result);
  EXPECT_FALSE(value["sessions"][0]["removed"].asBool());
  EXPECT_TRUE(value["sessions"][1]["removed"].asBool());
  EXPECT_EQ("there is no session sess.Aaaaa1", value["errors"][0]["message"].asString());
  EXPECT_TRUE(fs::is_empty(kRoot));
}

TEST(ToolSessionDestroy, RemovesNothingWhenOneIdIsNone) {
  const std::string id = makeLocal();
  EXPECT_EQ(2, runTool({"session", "destroy", id, "../x"}).exitCode);
  EXPECT_EQ(2, runTool({"session", "destroy"}).exitCode);
  EXPECT_TRUE(fs::exists(kRoot + "/" + id));
}

TEST(ToolSessionDestroy, LeavesAloneWhatALinkLeadsToElsewhere) {
  const TestFolder precious;
  writeFile(precious / "file", "x");
  createIpcTempPath("session", 0700);
  fs::create_symlink(precious.path(), kRoot + "/seln.Abc123");
  fs::create_symlink("seln.Abc124", kRoot + "/seln.Abc125");
  const ToolResult result = runTool({"session", "destroy", "seln.Abc123", "seln.Abc125"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages,
              HasSubstr("session seln.Abc123 is left alone: the link points to '"));
  EXPECT_THAT(result.messages, HasSubstr("remove the link " + kRoot + "/seln.Abc125 by hand"));
  EXPECT_TRUE(fs::exists(precious / "file"));
  EXPECT_EQ(0, runTool({"session", "prune", "--older-than", "0s", "--yes"}).exitCode);
  EXPECT_TRUE(fs::exists(precious / "file"));
}

TEST(ToolSessionDestroy, RefusesARootThatOthersMayChange) {
  const std::string id = makeLocal();
  ASSERT_EQ(0, ::chmod("/tmp/kovabackup/session", 0777));
  const ToolResult result = runTool({"session", "destroy", id});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("cannot be trusted"));
  EXPECT_EQ(1, runTool({"session", "prune", "--older-than", "0s", "--yes"}).exitCode);
  EXPECT_TRUE(fs::exists(kRoot + "/" + id));
}

} // namespace
