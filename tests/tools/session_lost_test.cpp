// Lost sessions, users that cannot be known, and what destroy leaves alone.
#include "tests/tools/run_tool.h"
#include "tests/tools/session_support.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "tests/support/machine_mounts.h"

#include <fcntl.h>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Session;
using KOVA::Base::UniqueFd;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;
namespace fs = std::filesystem;

// One volume, on a file system of the test.
class ToolSessionLost : public testing::Test {
protected:
  void SetUp() override {
    if (::mount("tmpfs", "/mnt", "tmpfs", 0, "mode=0755") != 0) {
      GTEST_SKIP() << "skipped: no file system can be mounted on /mnt";
    }
    mounted_ = true;
    fs::create_directory("/mnt/data");
    writeFile(conf_, "[volume data]\npath=\"/mnt/data\"\nfsType=2\nsize=1000\n[mounts]\nexclude=" +
                         machineMounts() + "\n");
    ::chmod(conf_.c_str(), 0644);   // whatever the umask
    (void)run({"session", "list"}); // the platform creates the share temporary directory
  }
  void TearDown() override {
    if (mounted_) {
      ::umount2("/mnt", MNT_DETACH);
    }
  }

  ToolResult run(const std::vector<std::string> &arguments) const {
    return runTool(arguments, {"", {{"KOVA_PLATFORM_CONF", conf_}}});
  }

  static std::string makeLost(const std::string &name, int ageSeconds) {
    std::string path = "/mnt/data/.kova_tmp/" + name;
    EXPECT_TRUE(fs::create_directory(path));
    EXPECT_EQ(0, ::chmod(path.c_str(), 0700));
    writeFile(path + "/file", "1234567");
    setAge(path, ageSeconds);
    return path;
  }

  TestFolder folder_;
  std::string conf_ = folder_ / "platform.conf";

private:
  bool mounted_ = false;
};

TEST_F(ToolSessionLost, IsListedWithoutAnId) {
  const std::string path = makeLost("seln.Abc123", 2 * kDay);
  makeLost("seln.young1", 60);
  makeLost("other.abc12", 2 * kDay);
  const ToolResult result = run({"session", "list"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, StartsWith("-\tvolume\tlost\t1\t7\t1728"));
  EXPECT_THAT(result.out, testing::EndsWith("\t" + path + "\n"));
  EXPECT_EQ(1, std::count(result.out.begin(), result.out.end(), '\n'));
  const Json::Value session = document(run({"session", "list", "--json"}))["sessions"][0];
  EXPECT_TRUE(session["id"].isNull());
  EXPECT_EQ("lost", session["state"].asString());
  EXPECT_EQ("no link leads to it", session["problem"].asString());
}

TEST_F(ToolSessionLost, IsAdopted) {
  const std::string path = makeLost("seln.Abc123", 2 * kDay);
  const ToolResult result = run({"session", "adopt", path});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("seln.Abc123\n", result.out);
  EXPECT_EQ(path, Session::getPathById("seln.Abc123"));
  const Json::Value session =
      document(run({"session", "show", "seln.Abc123", "--json"}))["session"];
  EXPECT_EQ("whole", session["state"].asString());
  EXPECT_GE(session["ageSeconds"].asInt(), 2 * kDay);
  const ToolResult again = run({"session", "adopt", path});
  EXPECT_EQ(3, again.exitCode);
  EXPECT_EQ(
      "kovabackup: " + path +
          " is not a lost session; 'kovabackup session list' shows them; one younger than ten "
          "minutes may still be in creation\n",
      again.messages);
}

TEST_F(ToolSessionLost, IsAdoptedByARelativePathAsJson) {
  makeLost("seln.Abc123", 2 * kDay);
  const Json::Value session =
      document(runTool({"session", "adopt", "seln.Abc123/", "--json"},
                       {"", {{"KOVA_PLATFORM_CONF", conf_}}, "/mnt/data/.kova_tmp"}))["session"];
  EXPECT_EQ("seln.Abc123", session["id"].asString());
  EXPECT_EQ(7, session["bytes"].asInt());
}

TEST_F(ToolSessionLost, IsCountedByDoctorByItsAge) {
  makeLost("seln.Young1", kDay);
  makeLost("seln.Abc123", 9 * kDay);
  const ToolResult result = run({"doctor"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_THAT(result.out,
              HasSubstr("wrong\tsessions\t2 in all, 0 damaged, 2 lost, 1 not loaded for 7d\tsee "
                        "'kovabackup session list'; 'kovabackup session adopt PATH' keeps a lost "
                        "one; 'kovabackup session prune --older-than 7d' removes all that were not "
                        "loaded for 7d, lost ones as well\n"));
}

TEST_F(ToolSessionLost, IsNotOfferedForRemovalByDoctorWhileItIsYoung) {
  makeLost("seln.Young1", kDay);
  EXPECT_THAT(run({"doctor"}).out,
              HasSubstr("1 lost, 0 not loaded for 7d\tsee 'kovabackup session list'; 'kovabackup "
                        "session adopt PATH' keeps a lost one\n"));
}

TEST_F(ToolSessionLost, IsNotSoughtWhereTheVolumesCannotBeListed) {
  const std::string path = makeLost("seln.Abc123", 2 * kDay);
  writeFile(conf_, "[volume data]\npath=\"srv\"\n");
  const std::vector<std::vector<std::string>> searches = {
      {"session", "list"},
      {"session", "prune", "--older-than", "7d", "--dry-run"},
      {"session", "adopt", path}};
  for (const std::vector<std::string> &search : searches) {
    const ToolResult result = run(search);
    EXPECT_EQ(1, result.exitCode) << result;
    EXPECT_THAT(result.messages, StartsWith("kovabackup: cannot list the volumes: " + conf_ +
                                            ":2: the value of 'path' must be "));
  }
}

TEST_F(ToolSessionLost, IsNotCountedByADryRunWhenTheSearchFails) {
  writeFile(conf_, "[volume data]\npath=\"srv\"\n");
  const ToolResult result = run({"session", "prune", "--older-than", "7d", "--dry-run"});
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_THAT(result.messages, Not(HasSubstr("would remove")));
}

TEST_F(ToolSessionLost, IsPrunedByItsAge) {
  const std::string young = makeLost("seln.Young1", 6 * kDay);
  const std::string old = makeLost("seln.Abc123", 8 * kDay);
  const ToolResult dry = run({"session", "prune", "--older-than", "7d", "--dry-run"});
  EXPECT_EQ(0, dry.exitCode) << dry;
  EXPECT_THAT(dry.out, StartsWith("-\tvolume\tlost\t1\t7\t"));
  EXPECT_EQ("kovabackup: would remove 1 session, 7 B\n", dry.messages);
  EXPECT_FALSE(fs::exists("/tmp/kovabackup")) << "a dry run makes nothing";
  const ToolResult result = run({"session", "prune", "--older-than", "7d", "--yes"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("kovabackup: removed 1 session, 7 B\n", result.messages);
  EXPECT_FALSE(fs::exists(old));
  EXPECT_TRUE(fs::exists(young));
  EXPECT_TRUE(fs::is_empty(kRoot));
}

// The name is its own: tests that run at the same time see this process in a mount of theirs.
TEST_F(ToolSessionLost, IsSparedWhileAProcessUsesIt) {
  const std::string path = makeLost("seln.InUse1", 8 * kDay);
  const UniqueFd open(::open((path + "/file").c_str(), O_RDONLY | O_CLOEXEC));
  const ToolResult result = run({"session", "prune", "--older-than", "7d", "--yes", "--json"});
  EXPECT_EQ(0, result.exitCode) << result;
  const Json::Value used = document(result)["inUse"][0];
  EXPECT_TRUE(used["id"].isNull());
  EXPECT_EQ(path, used["path"].asString());
  EXPECT_EQ(::getpid(), used["users"][0]["pid"].asInt());
  EXPECT_TRUE(fs::exists(path + "/file"));
}

TEST_F(ToolSessionLost, IsMentionedByTheDoctor) {
  makeLost("seln.Abc123", kDay);
  EXPECT_THAT(run({"doctor"}).out, HasSubstr("1 in all, 0 damaged, 1 lost, 0 not loaded for 7d"));
}

TEST_F(ToolSessionLost, IsOfferedToAdopt) {
  const std::string path = makeLost("seln.Abc123", kDay);
  EXPECT_THAT(run({"__complete", "session", "adopt", ""}).out, HasSubstr(path));
}

TEST(ToolSessionDestroy, SparesASessionThatAProcessUses) {
  const std::string id = makeLocal();
  const UniqueFd open = openFileOf(id);
  const ToolResult result = runTool({"session", "destroy", id});
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_EQ("kovabackup: session " + id + " is left alone: in use by " +
                std::to_string(::getpid()) +
                " (tool_session_lo); end that process, or pass --force\n",
            result.messages);
  EXPECT_TRUE(fs::exists(kRoot + "/" + id + "/file"));
  EXPECT_EQ(0, runTool({"session", "destroy", "--force", id}).exitCode);
  EXPECT_FALSE(fs::exists(kRoot + "/" + id));
}

TEST(ToolSessionDestroy, SaysWhatIsLeft) {
  const std::string id = makeLocal(kDay);
  const std::string path = kRoot + "/" + id;
  fs::create_directory(path + "/mounted");
  if (::mount("tmpfs", (path + "/mounted").c_str(), "tmpfs", 0, "") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted";
  }
  const ToolResult result = runTool({"session", "destroy", id});
  ::umount2((path + "/mounted").c_str(), MNT_DETACH);
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("session " + id + " could not be removed completely: " +
                                         path + "/mounted: "));
}

// An empty /proc, in a mount namespace that ends with the test.
class NoProc {
public:
  NoProc() : mounted(::mount("tmpfs", "/proc", "tmpfs", 0, "") == 0) {}
  ~NoProc() {
    if (mounted) {
      ::umount2("/proc", MNT_DETACH);
    }
  }
  const bool mounted;
};

TEST(ToolSessionPrune, RemovesNothingWithoutProc) {
  const std::string id = makeLocal(8 * kDay);
  ToolResult pruned;
  ToolResult destroyed;
  ToolResult shown;
  {
    const NoProc noProc;
    if (!noProc.mounted) {
      GTEST_SKIP() << "skipped: no file system can be mounted on /proc";
    }
    pruned = runTool({"session", "prune", "--older-than", "7d", "--yes"});
    destroyed = runTool({"session", "destroy", id});
    shown = runTool({"session", "show", id});
  }
  EXPECT_EQ(1, pruned.exitCode);
  EXPECT_THAT(pruned.messages,
              HasSubstr("sessions are left alone: their users are unknown: /proc/self: "));
  EXPECT_EQ(1, destroyed.exitCode);
  EXPECT_THAT(destroyed.messages,
              HasSubstr("session " + id + " is left alone: its users are unknown: /proc/self: "));
  EXPECT_THAT(shown.out, HasSubstr("\nusers\tunknown\n"));
  EXPECT_TRUE(fs::exists(kRoot + "/" + id + "/file"));
}

} // namespace
