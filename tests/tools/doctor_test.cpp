#include "tests/tools/run_tool.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "tests/support/machine_mounts.h"

#include <ctime>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>
#include <utime.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Session;
using KOVA::Backup::Path::createIpcLockFile;
using testing::HasSubstr;
namespace fs = std::filesystem;

class ToolDoctor : public testing::Test {
protected:
  void SetUp() override { configure(""); }

  // Excludes what the machine itself has mounted.
  void configure(const std::string &text) const { writeConfiguration(conf_, text); }

  void writeConfiguration(const std::string &file, const std::string &text) const {
    writeFile(file, "[mounts]\nexclude=" + machineMounts() + "\n[secret]\nkeyFile=\"" + key_ +
                        "\"\n" + text);
    ::chmod(file.c_str(), 0644); // whatever the umask
  }

  ToolResult doctor(std::vector<std::string> arguments = {}) const {
    arguments.insert(arguments.begin(), "doctor");
    return runTool(arguments, {"", {{"KOVA_PLATFORM_CONF", conf_}}});
  }

  // "<verdict> <detail>" of a check.
  static std::string finding(const ToolResult &result, const std::string &check) {
    const Json::Value findings = document(result)["findings"];
    for (const Json::Value &entry : findings) {
      if (entry["check"] == check) {
        return entry["verdict"].asString() + " " + entry["detail"].asString();
      }
    }
    return "";
  }

  TestFolder folder_;
  std::string conf_ = folder_ / "platform.conf";
  std::string key_ = folder_ / "secret.key";
};

TEST_F(ToolDoctor, IsContentWithAMachineThatWasNeverUsed) {
  const ToolResult result = doctor();
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, HasSubstr("ok\tipc root\t/tmp/kovabackup does not exist yet"));
  EXPECT_THAT(result.out, HasSubstr("note\tkey file\t" + key_ + " does not exist yet"));
  EXPECT_EQ("", result.messages);
  EXPECT_FALSE(fs::exists("/tmp/kovabackup"));
  EXPECT_FALSE(fs::exists(key_)) << "looking creates no key";
}

TEST_F(ToolDoctor, IsContentWithAMachineInUse) {
  Session session;
  ASSERT_TRUE(session.create());
  ::close(createIpcLockFile("x"));
  writeFile(key_, std::string(32, 'k'));
  ::chmod(key_.c_str(), 0600);
  const ToolResult result = doctor({"--json"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_TRUE(document(result)["healthy"].asBool());
  EXPECT_EQ("ok /tmp/kovabackup", finding(result, "ipc root"));
  EXPECT_EQ("ok /tmp/kovabackup/session", finding(result, "session root"));
  EXPECT_EQ("ok /tmp/kovabackup/lock", finding(result, "lock folder"));
  EXPECT_EQ("ok 1 in all", finding(result, "sessions"));
  EXPECT_EQ("ok " + key_, finding(result, "key file"));
  EXPECT_EQ("ok encrypted and decrypted", finding(result, "secrets"));
  EXPECT_TRUE(session.destroy());
}

TEST_F(ToolDoctor, FindsWrongModes) {
  ::close(createIpcLockFile("x"));
  ::chmod("/tmp/kovabackup", 0777);
  ::chmod("/tmp/kovabackup/lock", 0700);
  const ToolResult result = doctor({"--json"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_FALSE(document(result)["healthy"].asBool());
  EXPECT_EQ("wrong /tmp/kovabackup has mode 0777 instead of 0755", finding(result, "ipc root"));
  EXPECT_EQ("wrong /tmp/kovabackup/lock has mode 0700 instead of 0770",
            finding(result, "lock folder"));
}

TEST_F(ToolDoctor, FindsASessionRootThatOthersMaySee) {
  Session session;
  ASSERT_TRUE(session.create());
  ASSERT_EQ(0, ::chmod("/tmp/kovabackup/session", 0755));
  EXPECT_EQ("wrong /tmp/kovabackup/session has mode 0755 instead of 0700",
            finding(doctor({"--json"}), "session root"));
  EXPECT_TRUE(session.destroy());
}

TEST_F(ToolDoctor, SaysWhatToDo) {
  ::close(createIpcLockFile("x"));
  ::chmod("/tmp/kovabackup", 0777);
  const std::string row = "wrong\tipc root\t/tmp/kovabackup has mode 0777 instead of 0755\tchmod "
                          "0755 /tmp/kovabackup";
  EXPECT_THAT(doctor().out, HasSubstr(row + "\n"));
  EXPECT_THAT(doctor({"-0"}).out, HasSubstr(row + '\0'));
  for (const Json::Value &entry : document(doctor({"--json"}))["findings"]) {
    EXPECT_EQ(entry["verdict"] != "ok", entry["hint"].isString()) << entry;
  }
  TerminalTool tool({"doctor", "--no-color"}, {"", {{"KOVA_PLATFORM_CONF", conf_}}});
  EXPECT_THAT(tool.wait().out,
              HasSubstr("\r\n                     chmod 0755 /tmp/kovabackup\r\n"));
}

// Whether every user may search the folders above a file, as not those in root's home.
bool canBeReached(const fs::path &file) {
  for (fs::path folder = file.parent_path(); folder != "/"; folder = folder.parent_path()) {
    if ((fs::status(folder).permissions() & fs::perms::others_exec) == fs::perms::none) {
      return false;
    }
  }
  return true;
}

TEST_F(ToolDoctor, TakesNothingForWrongThatOnlyRootMaySee) {
  if (!canBeReached(KOVA_TOOL_PATH)) {
    GTEST_SKIP() << "skipped: an ordinary user cannot run the command that was built here";
  }
  // The user namespace of an ordinary user maps no other user.
  if (::chown(folder_.path().c_str(), 65534, 65534) != 0) {
    GTEST_SKIP() << "skipped: no other user is known here";
  }
  ASSERT_EQ(0, ::chown(folder_.path().c_str(), 0, 0));
  Session session;
  ASSERT_TRUE(session.create());
  fs::create_directory(folder_ / "keys");
  key_ = folder_ / "keys/secret.key";
  configure("");
  writeFile(key_, std::string(32, 'k'));
  ::chmod(key_.c_str(), 0600);
  ::chmod((folder_ / "keys").c_str(), 0700);
  ::chmod(folder_.path().c_str(), 0755);
  ToolSetup setup{"", {{"KOVA_PLATFORM_CONF", conf_}}};
  setup.asNobody = true;
  const ToolResult result = runTool({"doctor", "--json"}, setup);
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("note cannot access " + key_ + ": Permission denied", finding(result, "key file"));
  EXPECT_EQ("note cannot read /tmp/kovabackup/session: Permission denied",
            finding(result, "sessions"));
  EXPECT_THAT(runTool({"doctor"}, setup).out,
              HasSubstr("session: Permission denied\trun this command as root\n"));
  EXPECT_TRUE(session.destroy());
}

TEST_F(ToolDoctor, FindsALinkInTheRootsPlace) {
  fs::create_symlink(folder_.path(), "/tmp/kovabackup");
  const ToolResult result = doctor({"--json"});
  fs::remove("/tmp/kovabackup");
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("wrong /tmp/kovabackup is not a directory", finding(result, "ipc root"));
}

TEST_F(ToolDoctor, FindsAnotherOwner) {
  ::close(createIpcLockFile("x"));
  if (::chown("/tmp/kovabackup", 65534, 65534) != 0) {
    GTEST_SKIP() << "skipped: owners cannot be changed here";
  }
  EXPECT_EQ("wrong /tmp/kovabackup belongs to user 65534, who is neither root nor you",
            finding(doctor({"--json"}), "ipc root"));
}

TEST_F(ToolDoctor, FindsATmpThatOthersMayEmpty) {
  ::chmod("/tmp", 0777);
  const ToolResult result = doctor({"--json"});
  ::chmod("/tmp", 01777);
  EXPECT_EQ("wrong /tmp has mode 0777: any user may replace what is in it", finding(result, "tmp"));
}

TEST_F(ToolDoctor, FindsATmpThatItsGroupMayEmpty) {
  ::chmod("/tmp", 0770);
  const ToolResult result = doctor({"--json"});
  ::chmod("/tmp", 01777);
  EXPECT_EQ("wrong /tmp has mode 0770: any user may replace what is in it", finding(result, "tmp"));
}

TEST_F(ToolDoctor, FindsATmpThatOnlyRootMayUse) {
  ::chmod("/tmp", 0755);
  const ToolResult result = doctor({"--json"});
  const ToolResult repair = doctor({"--fix"});
  const int mode = modeOf("/tmp");
  ::chmod("/tmp", 01777);
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("wrong /tmp has mode 0755 instead of 1777", finding(result, "tmp"));
  EXPECT_THAT(repair.out, testing::StartsWith("fixed\ttmp\t/tmp has mode 0755 instead of 1777\n"));
  EXPECT_EQ(01777, mode);
}

TEST_F(ToolDoctor, FindsStaleSessions) {
  Session session;
  ASSERT_TRUE(session.create());
  const std::time_t then = std::time(nullptr) - 2 * 86400;
  const struct utimbuf times = {then, then};
  ::utime(session.getPath().c_str(), &times);
  EXPECT_EQ("ok 1 in all", finding(doctor({"--json"}), "sessions"));
  const ToolResult result = doctor({"--json", "--older-than", "1d"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_THAT(finding(result, "sessions"),
              testing::StartsWith("wrong 1 in all, 0 damaged, 1 not loaded for 1d"));
  fs::create_symlink("/tmp/gone/seln.Zz9Zz9", "/tmp/kovabackup/session/seln.Aaaaa1");
  EXPECT_THAT(finding(doctor({"--json"}), "sessions"), HasSubstr("2 in all, 1 damaged"));
}

TEST_F(ToolDoctor, TakesNoSessionForStaleThatIsInUse) {
  Session session;
  ASSERT_TRUE(session.create());
  const std::time_t then = std::time(nullptr) - 9 * 86400;
  const struct utimbuf times = {then, then};
  ::utime(session.getPath().c_str(), &times);
  const fs::path before = fs::current_path();
  fs::current_path(session.getPath());
  EXPECT_EQ("ok 1 in all", finding(doctor({"--json"}), "sessions"));
  fs::current_path(before);
  EXPECT_THAT(finding(doctor({"--json"}), "sessions"), HasSubstr("1 not loaded for 7d"));
  EXPECT_TRUE(session.destroy());
}

TEST_F(ToolDoctor, TriesEachVolume) {
  fs::create_directory(folder_ / "good");
  fs::create_directory(folder_ / "bad");
  writeFile(folder_ / "bad/.kova_tmp", "a file in its place");
  configure("[volume a]\npath=\"" + (folder_ / "good") + "\"\n[volume b]\npath=\"" +
            (folder_ / "bad") + "\"\n");
  const ToolResult result = doctor();
  EXPECT_EQ(3, result.exitCode);
  EXPECT_THAT(result.out, HasSubstr("ok\tvolume\t" + (folder_ / "good") + "\n"));
  EXPECT_THAT(result.out,
              HasSubstr("wrong\tvolume\t" + (folder_ / "bad") + ": has no temporary directory: "));
}

TEST_F(ToolDoctor, NotesAVolumeWhoseSessionsAreLocal) {
  fs::create_directory("/tmp/vol");
  configure("[volume a]\npath=\"/tmp/vol\"\n");
  const ToolResult result = doctor();
  fs::remove_all("/tmp/vol");
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(
      result.out,
      HasSubstr("note\tvolume\t/tmp/vol: its path begins with /tmp, so sessions that a rule "
                "places there are local\t"));
}

TEST_F(ToolDoctor, SaysHowToGetAVolume) {
  EXPECT_THAT(doctor().out, HasSubstr("note\tvolumes\tthe platform reports none\tmount a data "
                                      "volume, or name a directory as one: see platform.conf(5);"));
  configure("[volume a]\npath=\"" + (folder_ / "gone") + "\"\n");
  EXPECT_THAT(doctor().out, HasSubstr("gone: does not exist\tcreate it, or correct its path in " +
                                      conf_ + "; until then no service uses it\n"));
  fs::create_directory(folder_ / "bad");
  writeFile(folder_ / "bad/.kova_tmp", "a file in its place");
  configure("[volume a]\npath=\"" + (folder_ / "bad") + "\"\n");
  EXPECT_THAT(doctor().out, HasSubstr("\tno service uses it: correct that, or mount a data volume, "
                                      "or name a directory as one: see platform.conf(5)\n"));
}

TEST_F(ToolDoctor, FindsABrokenConfiguration) {
  configure("[volume a]\n");
  const ToolResult result = doctor({"--json"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("wrong cannot list the volumes: " + conf_ +
                ":5: volume 'a' has no path (platform error 0x3107)",
            finding(result, "volumes"));
}

TEST_F(ToolDoctor, BlamesTheConfigurationWhereItHidesTheLostSessions) {
  configure("[volume a]\npath=\"srv\"\n");
  const ToolResult result = doctor();
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_THAT(result.out,
              testing::ContainsRegex("note\tsessions\tcannot list the volumes: [^\t]*platform"
                                     "[.]conf:6: the value of 'path' must [^\t]*\tcorrect " +
                                     conf_ + "; until then lost sessions are not found\n"));
}

// The platform refuses the file, so it uses no key file either, whichever the file names.
TEST_F(ToolDoctor, LooksAtNoKeyFileOfABrokenConfiguration) {
  writeFile(key_, std::string(32, 'k'));
  ::chmod(key_.c_str(), 0600);
  configure("[volume a]\n");
  const ToolResult result = doctor({"--json"});
  EXPECT_EQ("wrong " + conf_ + ":5: volume 'a' has no path (platform error 0x3107)",
            finding(result, "key file"));
  EXPECT_EQ("", finding(result, "secrets"));
  configure("");
  ::chmod(conf_.c_str(), 0666);
  EXPECT_EQ("wrong " + conf_ + ": group or others may write it (platform error 0x3102)",
            finding(doctor({"--json"}), "key file"));
}

TEST_F(ToolDoctor, TakesAnEmptyNameOfTheConfigurationForNone) {
  if (::mount("tmpfs", "/etc", "tmpfs", 0, "mode=0755") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted on /etc";
  }
  fs::create_directory("/etc/kovaplatform");
  writeConfiguration("/etc/kovaplatform/platform.conf", "");
  const ToolResult result = runTool({"doctor", "--json"}, {"", {{"KOVA_PLATFORM_CONF", ""}}});
  ::umount2("/etc", MNT_DETACH);
  EXPECT_EQ("note " + key_ + " does not exist yet; it is created with the first secret",
            finding(result, "key file"));
}

TEST_F(ToolDoctor, FindsAKeyThatOthersMayRead) {
  writeFile(key_, std::string(32, 'k'));
  ::chmod(key_.c_str(), 0640);
  EXPECT_EQ("wrong " + key_ + " has mode 0640: other users may use it",
            finding(doctor({"--json"}), "key file"));
  writeFile(key_, "short");
  ::chmod(key_.c_str(), 0600);
  const ToolResult result = doctor({"--json"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("wrong " + key_ + " is not a regular file of 32 bytes", finding(result, "key file"));
}

TEST_F(ToolDoctor, FindsEveryBitThatLetsOthersUseTheKey) {
  writeFile(key_, std::string(32, 'k'));
  for (const char *mode : {"0610", "0620", "0640", "0601", "0602", "0604"}) {
    ::chmod(key_.c_str(), static_cast<mode_t>(std::stoi(mode, nullptr, 8)));
    EXPECT_EQ("wrong " + key_ + " has mode " + mode + ": other users may use it",
              finding(doctor({"--json"}), "key file"));
  }
}

TEST_F(ToolDoctor, FindsAKeyOfAnotherUser) {
  writeFile(key_, std::string(32, 'k'));
  ::chmod(key_.c_str(), 0600);
  if (::chown(key_.c_str(), 65534, 65534) != 0) {
    GTEST_SKIP() << "skipped: owners cannot be changed here";
  }
  EXPECT_EQ("wrong " + key_ + " belongs to user 65534, who is neither root nor you",
            finding(doctor({"--json"}), "key file"));
}

// Gives /tmp, which is a file system of the test's own, other flags while it exists.
class RemountedTmp {
public:
  explicit RemountedTmp(unsigned long flags) {
    done_ = ::mount(nullptr, "/tmp", nullptr, MS_REMOUNT | MS_BIND | flags, nullptr) == 0;
  }
  ~RemountedTmp() { (void)::mount(nullptr, "/tmp", nullptr, MS_REMOUNT | MS_BIND, nullptr); }
  RemountedTmp(const RemountedTmp &) = delete;
  RemountedTmp &operator=(const RemountedTmp &) = delete;
  bool done() const { return done_; }

private:
  bool done_ = false;
};

TEST_F(ToolDoctor, FindsATmpThatCannotBeWritten) {
  ::close(createIpcLockFile("x"));
  const RemountedTmp tmp(MS_RDONLY);
  if (!tmp.done()) {
    GTEST_SKIP() << "skipped: /tmp cannot be mounted again";
  }
  const ToolResult result = doctor({"--json"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("wrong /tmp cannot be written: Read-only file system", finding(result, "tmp"));
  EXPECT_EQ("wrong /tmp/kovabackup cannot be written: Read-only file system",
            finding(result, "ipc root"));
  EXPECT_EQ("wrong /tmp/kovabackup/session does not exist and cannot be created: Read-only file "
            "system",
            finding(result, "session root"));
  EXPECT_EQ("wrong /tmp/kovabackup/lock cannot be written: Read-only file system",
            finding(result, "lock folder"));
}

TEST_F(ToolDoctor, FindsAKeyFileThatIsADanglingLink) {
  fs::create_symlink(folder_ / "gone", key_);
  const ToolResult result = doctor({"--json"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("wrong " + key_ + " is a link whose target does not exist",
            finding(result, "key file"));
}

TEST_F(ToolDoctor, WarnsOfVolumesWithLittleRoom) {
  if (::mount("tmpfs", "/mnt", "tmpfs", 0, "mode=0755,size=1m") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted on /mnt";
  }
  fs::create_directory("/mnt/data");
  configure("[volume a]\npath=\"/mnt/data\"\n");
  const ToolResult roomy = doctor({"--json"});
  writeFile("/mnt/fill", std::string(std::size_t{1000} << 10, 'x'));
  const ToolResult little = doctor({"--json"});
  const ToolResult enough = doctor({"--json", "--min-free", "1"});
  writeFile("/mnt/fill", std::string(std::size_t{1020} << 10, 'x'));
  fs::create_directory("/mnt/data/more");
  writeFile("/mnt/data/more/fill", std::string(std::size_t{4} << 10, 'x'));
  const ToolResult full = doctor({"--json"});
  ::umount2("/mnt", MNT_DETACH);
  EXPECT_EQ("ok /mnt/data", finding(roomy, "volume"));
  EXPECT_EQ("note /mnt/data: 24.0 KiB free (2%)", finding(little, "volume"));
  EXPECT_EQ(0, little.exitCode);
  EXPECT_EQ("ok /mnt/data", finding(enough, "volume"));
  EXPECT_EQ("wrong /mnt/data: full", finding(full, "volume"));
}

TEST_F(ToolDoctor, WarnsBelowFivePercent) {
  if (::mount("tmpfs", "/mnt", "tmpfs", 0, "mode=0755,size=1m") != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted on /mnt";
  }
  fs::create_directory("/mnt/data");
  configure("[volume a]\npath=\"/mnt/data\"\n");
  writeFile("/mnt/fill", std::string(std::size_t{972} << 10, 'x'));
  const ToolResult five = doctor({"--json"});
  writeFile("/mnt/fill", std::string(std::size_t{980} << 10, 'x'));
  const ToolResult four = doctor({"--json"});
  ::umount2("/mnt", MNT_DETACH);
  EXPECT_EQ("ok /mnt/data", finding(five, "volume"));
  EXPECT_EQ("note /mnt/data: 44.0 KiB free (4%)", finding(four, "volume"));
}

TEST_F(ToolDoctor, EndsWithASummary) {
  ::close(createIpcLockFile("x"));
  ::chmod("/tmp/kovabackup", 0777);
  EXPECT_THAT(doctor().out, testing::ContainsRegex(
                                "\nsummary\tall checks\t[0-9]+ ok, [0-9]+ to note, 1 wrong\n$"));
  TerminalTool tool({"doctor", "--no-color"}, {"", {{"KOVA_PLATFORM_CONF", conf_}}});
  EXPECT_THAT(tool.wait().out,
              testing::ContainsRegex("\r\n\r\n[0-9]+ ok, [0-9]+ to note, 1 wrong\r\n$"));
}

TEST_F(ToolDoctor, FixesModes) {
  ::close(createIpcLockFile("x"));
  ::chmod("/tmp/kovabackup", 0777);
  writeFile(key_, std::string(32, 'k'));
  ::chmod(key_.c_str(), 0640);
  const ToolResult result = doctor({"--fix"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out,
              testing::StartsWith("fixed\tipc root\t/tmp/kovabackup has mode 0777 instead of 0755\n"
                                  "fixed\tkey file\t" +
                                  key_ + " has mode 0640: other users may use it\n"));
  EXPECT_THAT(result.out, HasSubstr("ok\tipc root\t/tmp/kovabackup\n"));
  EXPECT_EQ(0755, modeOf("/tmp/kovabackup"));
  EXPECT_EQ(0600, modeOf(key_));
}

TEST_F(ToolDoctor, FixesNoModeBehindALink) {
  fs::create_symlink(folder_.path(), "/tmp/kovabackup");
  const int before = modeOf(folder_.path());
  const ToolResult result = doctor({"--fix", "--json"});
  fs::remove("/tmp/kovabackup");
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_EQ("wrong /tmp/kovabackup is not a directory", finding(result, "ipc root"));
  EXPECT_EQ(before, modeOf(folder_.path()));
}

TEST_F(ToolDoctor, RefusesWhatIsNoAge) {
  EXPECT_EQ(2, doctor({"--min-free", "101"}).exitCode);
  EXPECT_EQ(2, doctor({"--older-than", "x"}).exitCode);
  EXPECT_EQ(2, doctor({"now"}).exitCode);
}

TEST_F(ToolDoctor, PaintsVerdictsOnATerminal) {
  TerminalTool tool({"doctor"}, {"", {{"KOVA_PLATFORM_CONF", conf_}}});
  EXPECT_THAT(tool.wait().out, HasSubstr("\x1b[32mok   \x1b[0m  ipc root      /tmp/kovabackup"));
}

} // namespace
