#include "platform/config/config.h"

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovasdk.h"
#include "tests/platform/real_mounts.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <iterator>
#include <regex>
#include <string>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

extern "C" ssize_t read(int fd, void *buf, size_t size) {
  static auto *const real = KovaTest::realFunction<ssize_t(int, void *, size_t)>("read");
  return KovaTest::failsNow("read") ? -1 : real(fd, buf, size);
}

using namespace KovaPlatform;
using namespace KovaTest;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

namespace fs = std::filesystem;

namespace {

Config parsed(const std::string &text) {
  Config config;
  ConfigError error;
  EXPECT_TRUE(parseConfig(text, config, error)) << error.line << ": " << error.what;
  return config;
}

ConfigError refused(const std::string &text) {
  Config config;
  config.secretKeyFile = "kept";
  ConfigError error;
  EXPECT_FALSE(parseConfig(text, config, error)) << text;
  EXPECT_EQ("kept", config.secretKeyFile);
  EXPECT_THAT(config.volumes, IsEmpty());
  EXPECT_NE("", error.what);
  return error;
}

struct Bad {
  const char *text;
  int code;
  int line;
};

// The sample that is installed for users to copy.
std::string sample() {
  std::ifstream file(KOVA_SAMPLE);
  return {std::istreambuf_iterator<char>(file), {}};
}

// A configuration file in /tmp and the variable that names it.
class ConfigFile : public testing::Test {
protected:
  void SetUp() override {
    KLIBCErrSetEx(0, nullptr, 0);
    ::setenv("KOVA_PLATFORM_CONF", path.c_str(), 1);
  }
  void TearDown() override {
    ::unsetenv("KOVA_PLATFORM_CONF");
    std::filesystem::remove_all(path);
    KLIBCErrSetEx(0, nullptr, 0);
  }

  void write(const std::string &text, mode_t mode = 0644) {
    std::ofstream(path) << text;
    ::chmod(path.c_str(), mode);
  }

  void expectRefused(int code, int line, const std::string &what) {
    LogCapture log;
    Config config;
    config.secretKeyFile = "kept";
    EXPECT_FALSE(loadConfig(config));
    EXPECT_EQ("kept", config.secretKeyFile);
    EXPECT_EQ(code, KLIBCErrGet());
    EXPECT_EQ(path, KLIBCErrorGetFile());
    EXPECT_EQ(line, KLIBCErrorGetLine());
    const std::string place = line > 0 ? path + ":" + std::to_string(line) : path;
    EXPECT_THAT(log.take(), ElementsAre(LogLine{LOG_ERR, "kovaplatform: " + place + ": " + what}));
  }

  const std::string path = "/tmp/platform.conf";
};

} // namespace

TEST(PlatformConfSample, ChangesNothingAsItIs) {
  const Config config = parsed(sample());
  EXPECT_THAT(config.volumes, IsEmpty());
  EXPECT_THAT(config.mountExcludes, IsEmpty());
  EXPECT_EQ("", config.secretKeyFile);
}

TEST(PlatformConfSample, HasEverySettingBehindANumberSign) {
  const Config config = parsed(std::regex_replace(sample(), std::regex("#([\\[a-zA-Z])"), "$1"));
  ASSERT_EQ(1U, config.volumes.size());
  EXPECT_EQ("backup", config.volumes[0].name);
  EXPECT_EQ("/srv/backup", config.volumes[0].path);
  EXPECT_EQ(KOVA_VOL_FS_EXT4, config.volumes[0].fsType);
  EXPECT_EQ(500000000000U, config.volumes[0].size);
  EXPECT_EQ(false, config.volumes[0].removable);
  EXPECT_THAT(config.mountExcludes, ElementsAre("/mnt/scratch", "/media/camera"));
  EXPECT_EQ("/etc/kovaplatform/secret.key", config.secretKeyFile);
}

TEST(ConfigText, EmptyTextIsAnEmptyConfiguration) {
  for (const char *text : {"", "\n", " \t\r\n", "# only words", "\n\n#a=b\n  # c\n", "[mounts]",
                           "[secret]\n[mounts]\n"}) {
    const Config config = parsed(text);
    EXPECT_THAT(config.volumes, IsEmpty()) << text;
    EXPECT_THAT(config.mountExcludes, IsEmpty()) << text;
    EXPECT_EQ("", config.secretKeyFile) << text;
  }
}

TEST(ConfigText, VolumeTakesAllItsKeys) {
  const Config config = parsed("[volume data]\npath=\"/srv/data\"\nfsType=2\n"
                               "size=18446744073709551615\nremovable=true\n");
  ASSERT_EQ(1U, config.volumes.size());
  const NamedVolume &volume = config.volumes[0];
  EXPECT_EQ("data", volume.name);
  EXPECT_EQ("/srv/data", volume.path);
  EXPECT_EQ(2, volume.fsType);
  EXPECT_EQ(18446744073709551615U, volume.size);
  EXPECT_EQ(true, volume.removable);
}

TEST(ConfigText, VolumeNeedsItsPathOnly) {
  const Config config = parsed("[volume a b]\npath=\"/\"");
  ASSERT_EQ(1U, config.volumes.size());
  EXPECT_EQ("a b", config.volumes[0].name);
  EXPECT_EQ("/", config.volumes[0].path);
  EXPECT_EQ(std::nullopt, config.volumes[0].fsType);
  EXPECT_EQ(std::nullopt, config.volumes[0].size);
  EXPECT_EQ(std::nullopt, config.volumes[0].removable);
}

TEST(ConfigText, SectionsMayStandInAnyOrderAndVolumesKeepTheirs) {
  const Config config = parsed("[secret]\nkeyFile=\"/k\"\n[volume b]\npath=\"/b\"\n[mounts]\n"
                               "exclude=[\"/x\",\"/y/\"]\n[volume a]\npath=\"/a\"\n");
  EXPECT_EQ("/k", config.secretKeyFile);
  EXPECT_THAT(config.mountExcludes, ElementsAre("/x", "/y"));
  ASSERT_EQ(2U, config.volumes.size());
  EXPECT_EQ("b", config.volumes[0].name);
  EXPECT_EQ("a", config.volumes[1].name);
}

TEST(ConfigText, LinesKeysAndValuesAreTrimmed) {
  const Config config = parsed("\t[mounts] \r\n \texclude\t = [ \"/a b\" ] \r\n");
  EXPECT_THAT(config.mountExcludes, ElementsAre("/a b"));
}

TEST(ConfigText, ValueBeginsAfterTheFirstEqualsSign) {
  EXPECT_EQ("/a=b", parsed("[secret]\nkeyFile=\"/a=b\"").secretKeyFile);
}

TEST(ConfigText, JsonEscapesAreRead) {
  EXPECT_EQ("/\xc3\xa9 \"", parsed("[secret]\nkeyFile=\"/\\u00e9 \\\"\"").secretKeyFile);
}

TEST(ConfigText, LastValueOfAKeyCounts) {
  EXPECT_EQ("/2", parsed("[secret]\nkeyFile=\"/1\"\nkeyFile=\"/2\"\n").secretKeyFile);
}

TEST(ConfigText, SlashesAtTheEndOfPathsAreDropped) {
  EXPECT_EQ("/a", parsed("[volume v]\npath=\"/a//\"").volumes[0].path);
  EXPECT_EQ("/", parsed("[volume v]\npath=\"///\"").volumes[0].path);
}

TEST(ConfigText, EmptyExcludeListIsOne) {
  EXPECT_THAT(parsed("[mounts]\nexclude=[]").mountExcludes, IsEmpty());
}

TEST(ConfigText, EveryErrorHasItsCodeAndLine) {
  const Bad rows[] = {
      {"words", KOVA_CONF_ERR_SYNTAX, 1},
      {"[mounts]\n\nwords\n", KOVA_CONF_ERR_SYNTAX, 3},
      {"[mounts\n", KOVA_CONF_ERR_SYNTAX, 1},
      {"[mounts] # why\n", KOVA_CONF_ERR_SYNTAX, 1},
      {"[\n", KOVA_CONF_ERR_SYNTAX, 1},
      {"; note\n", KOVA_CONF_ERR_SYNTAX, 1},
      {"[unknown]\n", KOVA_CONF_ERR_SECTION, 1},
      {"\n[]\n", KOVA_CONF_ERR_SECTION, 2},
      {"[Mounts]\n", KOVA_CONF_ERR_SECTION, 1},
      {"[ mounts ]\n", KOVA_CONF_ERR_SECTION, 1},
      {"[volume]\n", KOVA_CONF_ERR_SECTION, 1},
      {"[volume ]\n", KOVA_CONF_ERR_SECTION, 1},
      {"[volume  a]\n", KOVA_CONF_ERR_SECTION, 1},
      {"[volumes a]\n", KOVA_CONF_ERR_SECTION, 1},
      {"path=\"/a\"\n", KOVA_CONF_ERR_KEY, 1},
      {"[mounts]\nkeyFile=\"/a\"\n", KOVA_CONF_ERR_KEY, 2},
      {"[volume a]\npath=\"/a\"\nfstype=1\n", KOVA_CONF_ERR_KEY, 3},
      {"[mounts]\n=[]\n", KOVA_CONF_ERR_KEY, 2},
      {"[volume a]\npath=\"a\"\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=\"\"\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=/a\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=1\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=null\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=\"/a\" x\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=\"/a\" // x\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\npath=\"/a\\u0000b\"\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nfsType=\"ext4\"\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nfsType=-1\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nfsType=2.0\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nfsType=2147483648\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nsize=-1\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nsize=1.5\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nsize=5.0\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nsize=18446744073709551616\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nsize=\"5\"\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nsize=true\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nremovable=1\n", KOVA_CONF_ERR_VALUE, 2},
      {"[volume a]\nremovable=yes\n", KOVA_CONF_ERR_VALUE, 2},
      {"[mounts]\nexclude=\"/a\"\n", KOVA_CONF_ERR_VALUE, 2},
      {"[mounts]\nexclude=[\"/a\",1]\n", KOVA_CONF_ERR_VALUE, 2},
      {"[mounts]\nexclude=[\"/a\",]\n", KOVA_CONF_ERR_VALUE, 2},
      {"[mounts]\nexclude={\"/a\":1}\n", KOVA_CONF_ERR_VALUE, 2},
      {"[secret]\nkeyFile=[\"/a\"]\n", KOVA_CONF_ERR_VALUE, 2},
      {"[secret]\nkeyFile=\"key\"\n", KOVA_CONF_ERR_VALUE, 2},
      {"\n[volume a]\n", KOVA_CONF_ERR_NO_PATH, 2},
      {"[volume a]\nsize=1\n\n[mounts]\n", KOVA_CONF_ERR_NO_PATH, 1},
      {"[mounts]\n[mounts]\n", KOVA_CONF_ERR_TWICE, 2},
      {"[volume a]\npath=\"/a\"\n[volume a]\npath=\"/b\"\n", KOVA_CONF_ERR_TWICE, 3},
  };
  for (const Bad &row : rows) {
    const ConfigError error = refused(row.text);
    EXPECT_EQ(row.code, error.code) << row.text;
    EXPECT_EQ(row.line, error.line) << row.text;
  }
}

TEST(ConfigText, NulBytesAreRefused) {
  using namespace std::string_literals;
  EXPECT_EQ(KOVA_CONF_ERR_SYNTAX, refused("[secret]\nkeyFile=\"/k\"\0x\n"s).code);
}

TEST(ConfigText, EndlessNestingIsAWrongValueOnly) {
  const std::string deep = "[mounts]\nexclude=" + std::string(5000, '[');
  EXPECT_EQ(KOVA_CONF_ERR_VALUE, refused(deep).code);
}

TEST_F(ConfigFile, IsReadWhereTheVariableNamesIt) {
  write("[secret]\nkeyFile=\"/k\"\n");
  Config config;
  ASSERT_TRUE(loadConfig(config));
  EXPECT_EQ("/k", config.secretKeyFile);
  EXPECT_EQ(path, configPath());
  EXPECT_EQ(0, KLIBCErrGet());
}

TEST_F(ConfigFile, ReplacesWhatTheConfigurationHeld) {
  write("");
  Config config;
  config.secretKeyFile = "/old";
  ASSERT_TRUE(loadConfig(config));
  EXPECT_EQ("", config.secretKeyFile);
}

TEST_F(ConfigFile, IsReadAfreshByEveryCall) {
  Config config;
  write("[secret]\nkeyFile=\"/1\"\n");
  ASSERT_TRUE(loadConfig(config));
  write("[secret]\nkeyFile=\"/2\"\n");
  ASSERT_TRUE(loadConfig(config));
  EXPECT_EQ("/2", config.secretKeyFile);
}

TEST_F(ConfigFile, MayBeReachedThroughALink) {
  const std::string target = "/tmp/target.conf";
  std::ofstream(target) << "[secret]\nkeyFile=\"/k\"\n";
  ::chmod(target.c_str(), 0600);
  std::filesystem::create_symlink(target, path);
  Config config;
  EXPECT_TRUE(loadConfig(config));
  EXPECT_EQ("/k", config.secretKeyFile);
  std::filesystem::remove(target);
}

TEST_F(ConfigFile, LongerThanOneReadIsReadWhole) {
  write(std::string(100000, '\n') + "[secret]\nkeyFile=\"/k\"");
  Config config;
  ASSERT_TRUE(loadConfig(config));
  EXPECT_EQ("/k", config.secretKeyFile);
}

TEST_F(ConfigFile, EmptyVariableNamesNone) {
  ::setenv("KOVA_PLATFORM_CONF", "", 1);
  EXPECT_EQ("/etc/kovaplatform/platform.conf", configPath());
  ::unsetenv("KOVA_PLATFORM_CONF");
  EXPECT_EQ("/etc/kovaplatform/platform.conf", configPath());
}

TEST_F(ConfigFile, DefaultNeedNotExist) {
  ::unsetenv("KOVA_PLATFORM_CONF");
  if (std::filesystem::exists("/etc/kovaplatform/platform.conf")) {
    GTEST_SKIP() << "skipped: this machine has a configuration file";
  }
  Config config;
  config.secretKeyFile = "/old";
  EXPECT_TRUE(loadConfig(config));
  EXPECT_EQ("", config.secretKeyFile);
  EXPECT_EQ(0, KLIBCErrGet());
}

TEST_F(ConfigFile, NamedFileMustExist) {
  expectRefused(KOVA_CONF_ERR_OPEN, 0, "cannot be opened: No such file or directory");
}

// A path of a disk image, say. Reading all of it would fill the memory of every service.
TEST_F(ConfigFile, FileWithMoreThanOneMebibyteIsRefused) {
  write(std::string(std::size_t{1} << 20U, '\n'));
  Config config;
  EXPECT_TRUE(loadConfig(config));
  write("");
  for (const std::uintmax_t size : {(std::uintmax_t{1} << 20U) + 1, std::uintmax_t{10} << 30U}) {
    std::filesystem::resize_file(path, size);
    expectRefused(KOVA_CONF_ERR_OPEN, 0, "cannot be read: File too large");
  }
}

TEST_F(ConfigFile, ReadWithoutAReportSaysWhatIsWrong) {
  write("[secret]\nkeyFile=/k\n");
  LogCapture log;
  Config config;
  ConfigError error;
  EXPECT_FALSE(readConfig(config, error));
  EXPECT_EQ(KOVA_CONF_ERR_VALUE, error.code);
  EXPECT_EQ(2, error.line);
  EXPECT_EQ("the value of 'keyFile' must be an absolute path in double quotes", error.what);
  EXPECT_EQ(0, KLIBCErrGet());
  EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(ConfigFile, ErrorStandsInTheRecordAndInTheLog) {
  write("# x\n[mounts]\nexclud=[]\n");
  expectRefused(KOVA_CONF_ERR_KEY, 3, "unknown key 'exclud'");
}

TEST_F(ConfigFile, ValueErrorSaysWhatIsExpected) {
  write("[volume a]\nsize=\"big\"\n");
  expectRefused(KOVA_CONF_ERR_VALUE, 2, "the value of 'size' must be a number of bytes");
}

TEST_F(ConfigFile, WritableByGroupOrOthersIsRefused) {
  for (const mode_t mode : {0664U, 0646U, 0666U, 0620U, 0602U}) {
    write("", mode);
    expectRefused(KOVA_CONF_ERR_UNSAFE, 0, "group or others may write it");
  }
  for (const mode_t mode : {0644U, 0600U, 0444U, 0755U}) {
    write("", mode);
    Config config;
    EXPECT_TRUE(loadConfig(config)) << mode;
  }
}

TEST_F(ConfigFile, DirectoryIsRefused) {
  std::filesystem::create_directory(path);
  expectRefused(KOVA_CONF_ERR_UNSAFE, 0, "not a regular file");
}

TEST_F(ConfigFile, FifoIsRefusedAndNotWaitedFor) {
  ASSERT_EQ(0, ::mkfifo(path.c_str(), 0600));
  expectRefused(KOVA_CONF_ERR_UNSAFE, 0, "not a regular file");
}

TEST_F(ConfigFile, DeviceIsRefused) {
  std::filesystem::create_symlink("/dev/null", path);
  expectRefused(KOVA_CONF_ERR_UNSAFE, 0, "not a regular file");
}

TEST_F(ConfigFile, FailingSystemCallsAreReported) {
  write("[secret]\nkeyFile=\"/k\"\n");
  for (const char *function : {"open", "fstat", "read"}) {
    forEachFailure(function, EIO, [&](Fault &fault) {
      LogCapture log;
      Config config;
      const bool done = loadConfig(config);
      EXPECT_EQ(!fault.fired(), done);
      if (fault.fired()) {
        EXPECT_EQ(KOVA_CONF_ERR_OPEN, KLIBCErrGet());
        const auto lines = log.take();
        ASSERT_EQ(1U, lines.size());
        EXPECT_THAT(lines[0].text, HasSubstr("Input/output error"));
      }
    });
  }
}

TEST_F(ConfigFile, InterruptedReadIsTakenUpAgain) {
  write("[secret]\nkeyFile=\"/k\"\n");
  const Fault fault("read", 1, EINTR);
  Config config;
  EXPECT_TRUE(loadConfig(config));
  EXPECT_TRUE(fault.fired());
  EXPECT_EQ("/k", config.secretKeyFile);
}

TEST_F(ConfigFile, VariableIsNotHeededWithRaisedPrivileges) {
  const std::string child = "/tmp/config_child";
  fs::copy_file(KOVA_TEST_CHILD, child);
  const auto says = [&] {
    std::string text;
    return runFor(child, text) == 0 ? text : "";
  };
  const std::string plain = says();
  const bool raised =
      ::chown(child.c_str(), 65534, 65534) == 0 && ::chmod(child.c_str(), 04755) == 0;
  const std::string secure = raised ? says() : "";
  fs::remove(child);
  EXPECT_EQ(path + "\n", plain);
  if (secure.empty()) {
    GTEST_SKIP() << "skipped: a program of another user cannot be run here";
  }
  EXPECT_EQ("/etc/kovaplatform/platform.conf\n", secure);
}
