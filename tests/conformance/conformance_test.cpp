// The conformance program passes the stand-ins, and notices a platform with a fault.

#include "tests/session/volume_mount.h"
#include "tests/support/child_process.h"

#include <algorithm>
#include <cctype>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <iterator>
#include <sstream>
#include <string>

namespace {

using namespace KovaTest;
using testing::AnyOf;
using testing::HasSubstr;

ShellResult run(const std::string &arguments, const std::string &fault = "") {
  std::string command = "KOVA_PLATFORM_CONF=/tmp/platform.conf ";
  if (!fault.empty()) {
    command += "KOVA_FAULT=" + fault + " LD_PRELOAD=" KOVA_FAULTY_PLATFORM " ";
  }
  command += KOVA_CONFORMANCE " " + arguments + " 2>&1";
  return runShell(command);
}

// A machine with one volume and a share on it.
class Conformance : public testing::Test {
protected:
  void SetUp() override {
    if (!mount.failure.empty()) {
      GTEST_SKIP() << mount.failure;
    }
    std::filesystem::create_directories(mount.path + "/volume1/photo/2024");
    std::ofstream("/tmp/platform.conf") << "[volume data]\npath=\"" << mount.path
                                        << "/volume1\"\n[secret]\nkeyFile=\"/tmp/secret.key\"\n";
    std::filesystem::permissions("/tmp/platform.conf", std::filesystem::perms(0644));
  }
  void TearDown() override {
    std::filesystem::remove("/tmp/platform.conf");
    std::filesystem::remove("/tmp/secret.key");
  }

  KovaTest::VolumeMount mount;
};

TEST_F(Conformance, PassesTheStandIns) {
  const ShellResult result = run("");
  EXPECT_EQ(0, result.exitCode) << result.output;
  EXPECT_THAT(result.output, HasSubstr("\n33 passed, 0 failed, 0 noted, 0 skipped\n"));
}

TEST_F(Conformance, SkipsWhatTheMachineHasNot) {
  std::ofstream("/tmp/platform.conf", std::ios::trunc) << "[secret]\nkeyFile=\"/tmp/secret.key\"\n";
  const ShellResult result = run("sdk.share.of-path sdk.tmp.folder");
  EXPECT_EQ(0, result.exitCode) << result.output;
  EXPECT_THAT(result.output, HasSubstr("SKIP sdk.tmp.folder: this machine has no data volume"));
}

TEST_F(Conformance, LeavesNothingBehind) {
  (void)run("core.section --scratch " + mount.path);
  for (const auto &entry : std::filesystem::directory_iterator(mount.path)) {
    EXPECT_EQ("volume1", entry.path().filename());
  }
}

TEST_F(Conformance, TellsWrongUse) {
  EXPECT_EQ(2, run("--unknown").exitCode);
  EXPECT_EQ(2, run("no.such.check").exitCode);
  EXPECT_EQ(2, run("--scratch").exitCode);
  EXPECT_EQ(0, run("--help").exitCode);
  EXPECT_THAT(run("--list core.fork").output, HasSubstr("core.fork: fork answers 0"));
}

TEST_F(Conformance, HasEveryCheckInThePortingGuide) {
  std::ifstream page(KOVA_PORTING_PAGE);
  const std::string text(std::istreambuf_iterator<char>(page), {});
  std::istringstream list(run("--list").output);
  int checks = 0;
  for (std::string line; std::getline(list, line); ++checks) {
    const std::string name = line.substr(0, line.find(':'));
    const std::string last = name.substr(name.rfind('.') + 1);
    EXPECT_THAT(text, AnyOf(HasSubstr("`" + name + "`"), HasSubstr("`" + last + "`")));
  }
  EXPECT_EQ(33, checks);
}

struct Fault {
  const char *name;
  const char *line; ///< how the verdict begins
};

std::string checkOf(const Fault &fault) {
  const std::string line = fault.line;
  return line.substr(5, line.find(':') - 5);
}

class ConformanceFault : public Conformance, public testing::WithParamInterface<Fault> {};

TEST_P(ConformanceFault, IsNoticed) {
  const std::string line = GetParam().line;
  const std::string check = checkOf(GetParam());
  ASSERT_THAT(run(check).output, HasSubstr("PASS " + check));
  const ShellResult result = run(check, GetParam().name);
  EXPECT_THAT(result.output, HasSubstr(line));
  EXPECT_EQ(line[0] == 'F' ? 1 : 0, result.exitCode);
}

const Fault kFaults[] = {
    {"no-error-codes", "FAIL core.error.round-trip: "},
    {"no-error-codes", "FAIL core.section.no-file: "},
    {"no-error-codes", "FAIL sdk.volume.of-no-path: "},
    {"no-error-codes", "FAIL netsdk.lookup-none: "},
    {"wrong-line", "FAIL core.error.round-trip: the line is not 56"},
    {"one-error-record", "NOTE core.error.threads: "},
    {"list-not-empty", "FAIL core.list.empty: "},
    {"full-hash", "FAIL core.hash.many: "},
    {"hash-without-copies", "FAIL core.section.set: "},
    {"section-left-out", "FAIL core.section.list: "},
    {"headers-untrimmed", "FAIL core.section.list: "},
    {"section-left-out", "FAIL core.section.list-many: 2999 of 3000"},
    {"missing-file-is-empty", "FAIL core.section.no-file: "},
    {"set-gives-2", "FAIL core.section.set: "},
    {"torn-files", "FAIL core.section.atomic: a reader saw"},
    {"link-replaced", "NOTE core.section.attributes: "},
    {"nothing-added", "FAIL core.section.add: "},
    {"header-glued", "FAIL core.section.add: adding behind a line without an end"},
    {"names-by-beginning", "FAIL core.section.names: "},
    {"names-without-case", "FAIL core.section.names: "},
    {"nothing-removed", "FAIL core.section.remove: KLIBCFileRemoveSection left the section"},
    {"no-encryption", "FAIL core.secret.round-trip: "},
    {"no-encryption", "NOTE core.secret.changed: "},
    {"cipher-overflow", "FAIL core.secret.round-trip: the cipher text of 0 bytes"},
    {"clear-overflow", "FAIL core.secret.round-trip: KLIBCCryptSzDecrypt wrote past"},
    {"key-of-process", "FAIL core.secret.other-process: "},
    {"crash", "FAIL core.secret.round-trip: ended by signal 6"},
    {"no-fork", "FAIL core.fork: "},
    {"no-volumes", "SKIP sdk.volume.records: "},
    {"wrong-type", "FAIL sdk.volume.types: "},
    {"size-0", "FAIL sdk.volume.records: "},
    {"never-writable", "NOTE sdk.volume.records: "},
    {"mount-paths-only", "FAIL sdk.volume.of-path: "},
    {"long-record", "FAIL sdk.volume.of-path: KOVAMountVolInfoGet wrote past byte 112"},
    {"volume-anywhere", "FAIL sdk.volume.of-no-path: "},
    {"tmp-elsewhere", "FAIL sdk.tmp.folder: "},
    {"tmp-anywhere", "FAIL sdk.tmp.no-volume: "},
    {"last-name", "FAIL sdk.share.of-path: "},
    {"nameless-share", "FAIL sdk.share.of-path: "},
    {"share-anywhere", "FAIL sdk.share.of-no-path: "},
    {"any-ipv4", "FAIL netsdk.ipv4: "},
    {"no-ipv6", "FAIL netsdk.ipv6: "},
    {"lookup-overflow", "FAIL netsdk.lookup: KOVANetLookupIP wrote past 52 bytes"},
    {"lookup-always", "FAIL netsdk.lookup-none: "},
};

// What the framework shows of a fault; left to itself it shows addresses.
void PrintTo(const Fault &fault, std::ostream *out) {
  *out << fault.name;
}

// Of letters, digits and "_" only.
std::string nameOf(const testing::TestParamInfo<Fault> &info) {
  std::string name = std::string(info.param.name) + "_in_" + checkOf(info.param);
  std::replace_if(
      name.begin(), name.end(), [](unsigned char c) { return std::isalnum(c) == 0; }, '_');
  return name;
}

INSTANTIATE_TEST_SUITE_P(EachFault, ConformanceFault, testing::ValuesIn(kFaults), nameOf);

} // namespace
