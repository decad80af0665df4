#include "tests/tools/run_tool.h"

#include "kovabackup/session.h"
#include "tests/support/machine_mounts.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <sys/statvfs.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Session;
using testing::HasSubstr;
using testing::StartsWith;
namespace fs = std::filesystem;

// Three directories that a configuration file declares as volumes. They are below /mnt, where each
// test has a file system of its own: a volume below /tmp would get local sessions.
class ToolVolume : public testing::Test {
protected:
  void SetUp() override {
    if (::mount("tmpfs", "/mnt", "tmpfs", 0, "mode=0755,size=1m") != 0) {
      GTEST_SKIP() << "skipped: no file system can be mounted on /mnt";
    }
    mounted_ = true;
    for (const char *name : {"/mnt/small", "/mnt/big", "/mnt/wide"}) {
      fs::create_directory(name);
    }
    configure(volume("small", 2, 1000) + volume("big", 3, 9000) + volume("wide", 4, 50000));
  }
  void TearDown() override {
    if (mounted_) {
      ::umount2("/mnt", MNT_DETACH);
    }
  }

  static std::string volume(const std::string &name, int fsType, int size) {
    return "[volume " + name + "]\npath=\"/mnt/" + name + "\"\nfsType=" + std::to_string(fsType) +
           "\nsize=" + std::to_string(size) + "\n";
  }

  // What is free on the file system of the volumes: bytes, a tab, a percentage.
  static std::string room() {
    struct statvfs info = {};
    EXPECT_EQ(0, ::statvfs("/mnt", &info));
    return std::to_string(info.f_bavail * info.f_frsize) + "\t" +
           std::to_string(info.f_bavail * 100 / info.f_blocks);
  }

  // Excludes what the machine itself has mounted.
  void configure(const std::string &text) const {
    writeFile(conf_, text + "[mounts]\nexclude=" + machineMounts() + "\n");
    ::chmod(conf_.c_str(), 0644); // whatever the umask
  }

  ToolResult run(const std::vector<std::string> &arguments) const {
    return runTool(arguments, {"", {{"KOVA_PLATFORM_CONF", conf_}}});
  }

  ToolResult runAsNobody(const std::vector<std::string> &arguments) const {
    ::chmod(folder_.path().c_str(), 0755); // the configuration is in it
    ToolSetup setup{"", {{"KOVA_PLATFORM_CONF", conf_}}};
    setup.asNobody = true;
    return runTool(arguments, setup);
  }

  // The user namespace of an ordinary user maps no other user.
  bool knowsNobody() const { return ::chown("/mnt/wide", 65534, 65534) == 0; }

  // What an ordinary user reads about a volume that root owns.
  void expectDenied(const std::string &path, mode_t mode) const {
    ASSERT_EQ(0, ::chown(path.c_str(), 0, 0));
    ASSERT_EQ(0, ::chmod(path.c_str(), mode));
    EXPECT_THAT(runAsNobody({"volume", "pick", "max"}).messages,
                testing::ContainsRegex("passed over " + path +
                                       ": has no temporary directory: cannot write to " + path +
                                       ": Permission denied [(]platform error 0x3008 at [^)]*[)]; "
                                       "try as root\n"));
  }

  TestFolder folder_;
  std::string conf_ = folder_ / "platform.conf";

private:
  bool mounted_ = false;
};

TEST_F(ToolVolume, ListShowsWhatThePlatformSees) {
  const ToolResult result = run({"volume", "list"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out,
              HasSubstr("ext4\t1000\t" + room() + "\tinternal\twritable\t/mnt/small\n"));
  EXPECT_THAT(result.out, HasSubstr("btrfs\t9000\t" + room() + "\tinternal\twritable\t/mnt/big\n"));
  EXPECT_EQ("", result.messages);
  EXPECT_THAT(run({"volume", "list", "-0"}).out, testing::EndsWith(std::string("\0", 1)));
}

TEST_F(ToolVolume, ListTellsEverythingAsJson) {
  const Json::Value volumes = document(run({"volume", "list", "--json"}))["volumes"];
  ASSERT_GE(volumes.size(), 3U);
  for (const Json::Value &volume : volumes) {
    if (volume["path"] == "/mnt/big") {
      EXPECT_EQ(3, volume["fsType"].asInt());
      EXPECT_EQ("btrfs", volume["type"].asString());
      EXPECT_EQ(9000, volume["size"].asInt());
      EXPECT_EQ(room(), std::to_string(volume["free"].asUInt64()) + "\t" +
                            std::to_string(volume["freePercent"].asInt()));
      EXPECT_TRUE(volume["mounted"].asBool());
      EXPECT_TRUE(volume["writable"].asBool());
      EXPECT_EQ("internal", volume["location"].asString());
      return;
    }
  }
  FAIL() << volumes;
}

TEST_F(ToolVolume, ListIsSortedAndCut) {
  const ToolResult result = run({"volume", "list", "--sort", "-size", "--limit", "2"});
  EXPECT_THAT(result.out, HasSubstr("/mnt/wide\n"));
  EXPECT_LT(result.out.find("/mnt/wide"), result.out.find("/mnt/big"));
  EXPECT_EQ(std::string::npos, result.out.find("/mnt/small"));
  EXPECT_EQ("kovabackup: --limit leaves out 1 of 3\n", result.messages);
}

TEST_F(ToolVolume, ListMakesNothing) {
  run({"volume", "list"});
  EXPECT_TRUE(fs::is_empty("/mnt/big"));
}

TEST_F(ToolVolume, ListShowsVolumesThatAreNotUsable) {
  configure(volume("gone", 2, 5) + "removable=true\n" + volume("small", 2, 1000));
  const ToolResult result = run({"volume", "list"});
  EXPECT_THAT(result.out, HasSubstr("ext4\t5\t-\t-\tremovable\tdoes not exist\t/mnt/gone\n"))
      << result;
}

TEST_F(ToolVolume, ListTellsThatAPathThroughAFileDoesNotExist) {
  writeFile("/mnt/file", "");
  configure("[volume a]\npath=\"/mnt/file/below\"\n");
  EXPECT_THAT(run({"volume", "list"}).out, HasSubstr("\tdoes not exist\t/mnt/file/below\n"));
}

TEST_F(ToolVolume, ListSaysWhatToDoWhenNoVolumeIsUsable) {
  const std::string advice =
      "mount a data volume, or name a directory as one: see platform.conf(5)\n";
  configure(volume("gone", 2, 5));
  EXPECT_EQ("kovabackup: no volume can be written; " + advice, run({"volume", "list"}).messages);
  configure("");
  EXPECT_EQ("kovabackup: the platform reports no volumes; " + advice,
            run({"volume", "list"}).messages);
}

TEST_F(ToolVolume, ListTellsABrokenConfiguration) {
  configure("[volume x]\npath=5\n");
  const ToolResult result = run({"volume", "list"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("cannot list the volumes: "));
  EXPECT_THAT(result.messages,
              HasSubstr(conf_ + ":2: the value of 'path' must be an absolute path in double "
                                "quotes (platform error 0x3106)\n"));
  EXPECT_EQ(1, run({"volume", "pick", "max"}).exitCode);
}

TEST_F(ToolVolume, PickPrintsTheFolderAndWhyNoOther) {
  const ToolResult result = run({"volume", "pick", "max-ext-btrfs"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("/mnt/big/.kova_tmp\n", result.out);
  EXPECT_THAT(result.messages,
              HasSubstr("passed over /mnt/small: no larger than the chosen one\n"));
  EXPECT_THAT(result.messages, HasSubstr("passed over /mnt/wide: wrong type: xfs\n"));
}

TEST_F(ToolVolume, PickTellsThatTheTypeIsWrongForTheRule) {
  EXPECT_THAT(run({"volume", "pick", "max-ext"}).messages,
              testing::AllOf(HasSubstr("passed over /mnt/big: wrong type: btrfs\n"),
                             HasSubstr("passed over /mnt/wide: wrong type: xfs\n")));
}

TEST_F(ToolVolume, PickTellsThatAVolumeOfEveryTypeThatTheRuleTakesIsSmaller) {
  configure(volume("small", 3, 1000) + volume("big", 3, 9000));
  EXPECT_THAT(run({"volume", "pick", "max-ext-btrfs"}).messages,
              HasSubstr("passed over /mnt/small: no larger than the chosen one\n"));
  configure(volume("small", 2, 1000) + volume("big", 2, 9000));
  EXPECT_THAT(run({"volume", "pick", "max-ext"}).messages,
              HasSubstr("passed over /mnt/small: no larger than the chosen one\n"));
}

TEST_F(ToolVolume, PickEndsThePathInANulByteWhenAsked) {
  EXPECT_EQ(std::string("/mnt/wide/.kova_tmp\0", 20), run({"volume", "pick", "max", "-0"}).out);
}

TEST_F(ToolVolume, PickFollowsEachRule) {
  EXPECT_EQ("/mnt/small/.kova_tmp\n", run({"volume", "pick", "max-ext"}).out);
  EXPECT_EQ("/mnt/wide/.kova_tmp\n", run({"volume", "pick", "max"}).out);
  EXPECT_EQ("/mnt/small/.kova_tmp\n", run({"volume", "pick", "same:/mnt/small"}).out);
  fs::create_directory("/mnt/big/share");
  const Json::Value value = document(run({"volume", "pick", "same:/mnt/big/share", "--json"}));
  EXPECT_EQ("/mnt/big", value["volume"].asString());
  EXPECT_EQ("/mnt/big/.kova_tmp", value["folder"].asString());
  EXPECT_FALSE(value["fallback"].asBool());
}

TEST_F(ToolVolume, PickTellsWhichAreNotUsable) {
  configure(volume("gone", 2, 5) + volume("big", 3, 9000) + volume("small", 2, 10));
  writeFile("/mnt/big/.kova_tmp", "a file in its place");
  const ToolResult result = run({"volume", "pick", "max-ext-btrfs"});
  EXPECT_EQ("/mnt/small/.kova_tmp\n", result.out) << result;
  EXPECT_THAT(result.messages, HasSubstr("passed over /mnt/gone: does not exist\n"));
  EXPECT_THAT(
      result.messages,
      HasSubstr("passed over /mnt/big: has no temporary directory: /mnt/big/.kova_tmp is not "
                "a directory "))
      << result;
  EXPECT_THAT(result.messages, HasSubstr("(platform error 0x3008 at "));
}

TEST_F(ToolVolume, PickNamesNoReasonAgainstTheVolumeOfAPathWhenItIsUsable) {
  const ToolResult result = run({"volume", "pick", "same:/mnt/small"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.messages);
}

TEST_F(ToolVolume, PickSaysWhyTheVolumeOfAPathIsNotUsable) {
  writeFile("/mnt/small/.kova_tmp", "a file in its place");
  const ToolResult result = run({"volume", "pick", "same:/mnt/small"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_THAT(result.messages,
              StartsWith("kovabackup: passed over /mnt/small: has no temporary directory: "
                         "/mnt/small/.kova_tmp is not a directory (platform error 0x3008 at "));
}

TEST_F(ToolVolume, PickTellsAnOrdinaryUserThatAVolumeCannotBeWritten) {
  if (!knowsNobody()) {
    GTEST_SKIP() << "skipped: no other user is known here";
  }
  expectDenied("/mnt/wide", 0555);
}

TEST_F(ToolVolume, PickTellsAnOrdinaryUserThatAVolumeCannotBeSearched) {
  if (!knowsNobody()) {
    GTEST_SKIP() << "skipped: no other user is known here";
  }
  expectDenied("/mnt/wide", 0666);
}

TEST_F(ToolVolume, PickTellsReadOnlyVolumes) {
  ASSERT_EQ(0, ::mount("tmpfs", "/mnt/big", "tmpfs", MS_RDONLY, ""));
  EXPECT_THAT(run({"volume", "pick", "max-ext-btrfs"}).messages,
              HasSubstr("passed over /mnt/big: read-only\n"));
}

TEST_F(ToolVolume, PickSaysHowToGetAVolumeWhereThereIsNone) {
  configure("");
  const ToolResult result = run({"volume", "pick", "max"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("the platform reports no volumes; "));
  EXPECT_THAT(result.messages, HasSubstr("no volume qualifies\n"));
}

TEST_F(ToolVolume, PickSays3WhenNoneQualifies) {
  configure(volume("wide", 4, 50000));
  const ToolResult result = run({"volume", "pick", "max-ext"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("", result.out);
  EXPECT_THAT(result.messages, HasSubstr("passed over /mnt/wide: wrong type: xfs\n"));
  EXPECT_THAT(result.messages, HasSubstr("no volume qualifies\n"));
  const ToolResult json = run({"volume", "pick", "max-ext", "--json"});
  EXPECT_EQ(3, json.exitCode);
  EXPECT_TRUE(document(json)["folder"].isNull());
}

TEST_F(ToolVolume, PickChoosesNoVolumeThatIsNotUsable) {
  configure(volume("gone", 2, 5));
  const ToolResult result = run({"volume", "pick", "max", "--json"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_TRUE(document(result)["volume"].isNull());
  EXPECT_THAT(run({"volume", "pick", "max"}).messages,
              HasSubstr("passed over /mnt/gone: does not exist\n"));
}

TEST_F(ToolVolume, PickSaysThatTheVolumeHasLittleRoom) {
  const std::string reasons = run({"volume", "pick", "max"}).messages;
  EXPECT_THAT(reasons, testing::Not(HasSubstr("room")));
  writeFile("/mnt/fill", std::string(std::size_t{1000} << 10, 'x'));
  const ToolResult result = run({"volume", "pick", "max"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("/mnt/wide/.kova_tmp\n", result.out);
  EXPECT_EQ(reasons + "kovabackup: /mnt/wide/.kova_tmp is chosen, but has little room: 24.0 KiB "
                      "free (2%)\n",
            result.messages);
}

TEST_F(ToolVolume, PickFallsBackWhenAsked) {
  configure(volume("wide", 4, 50000));
  const ToolResult result = run({"volume", "pick", "max-ext", "--fallback-tmp"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("/tmp\n", result.out);
  EXPECT_THAT(result.messages, HasSubstr("no volume qualifies; this is the fallback\n"));
  const Json::Value value =
      document(run({"volume", "pick", "max-ext", "--fallback-tmp", "--json"}));
  EXPECT_TRUE(value["fallback"].asBool());
  EXPECT_TRUE(value["volume"].isNull());
}

TEST_F(ToolVolume, PickTellsPathsThatCannotBeFollowed) {
  const ToolResult missing = run({"volume", "pick", "same:/mnt/nowhere"});
  EXPECT_EQ(3, missing.exitCode);
  EXPECT_THAT(missing.messages, HasSubstr("/mnt/nowhere: No such file or directory"));
  const ToolResult none = run({"volume", "pick", "same:/proc"});
  EXPECT_EQ(3, none.exitCode) << none;
  EXPECT_THAT(none.messages,
              HasSubstr("passed over /proc: it is not on a volume (platform error 0x3005"));
}

TEST_F(ToolVolume, PickRefusesWrongUsage) {
  EXPECT_EQ(2, run({"volume", "pick"}).exitCode);
  EXPECT_EQ(2, run({"volume", "pick", "most"}).exitCode);
  EXPECT_EQ(2, run({"volume", "pick", "same:"}).exitCode);
  EXPECT_EQ(2, run({"volume", "pick", "same:/mnt", "--fallback-tmp"}).exitCode);
}

TEST_F(ToolVolume, SessionsAreMadeOnTheVolumeOfARule) {
  const Json::Value made =
      document(run({"session", "create", "--volume", "max-ext-btrfs", "--json"}))["session"];
  const std::string id = made["id"].asString();
  EXPECT_EQ("volume", made["kind"].asString());
  EXPECT_THAT(made["path"].asString(), StartsWith("/mnt/big/.kova_tmp/seln."));
  EXPECT_EQ(made["path"].asString(), Session::getPathById(id));
  EXPECT_EQ(0, run({"session", "destroy", id}).exitCode);
  EXPECT_FALSE(fs::exists(made["path"].asString()));
}

TEST_F(ToolVolume, SessionsAreNotMadeWhenNoVolumeQualifies) {
  configure(volume("wide", 4, 50000));
  const ToolResult result = run({"session", "create", "--volume", "max-ext"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("'kovabackup volume pick max-ext' shows why"));
  EXPECT_FALSE(fs::exists("/tmp/kovabackup"));
}

TEST_F(ToolVolume, ASessionOnAVolumeBelowTmpIsLocalWithAWarning) {
  fs::create_directory("/tmp/vol");
  configure("[volume a]\npath=\"/tmp/vol\"\n");
  const ToolResult result = run({"session", "create", "--volume", "max"});
  const ToolResult quiet = run({"session", "create", "--volume", "max", "-q"});
  fs::remove_all("/tmp/vol");
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, StartsWith("sess."));
  EXPECT_EQ("kovabackup: the path of the chosen volume begins with /tmp, so the session is local\n",
            result.messages);
  EXPECT_EQ("", quiet.messages);
}

} // namespace
