// Callers with few privileges: ordinary users, no capabilities, user namespaces in which most ids
// are unknown.
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/command.h"
#include "kovabackup/session.h"
#include "kovabackup/subprocess.h"

#include <filesystem>
#include <fstream>
#include <linux/capability.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;
namespace fs = std::filesystem;

class HostilePrivileges : public HostileTest {};

void dropCapabilities() {
  struct __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
  struct __user_cap_data_struct none[2] = {};
  need(::syscall(SYS_capset, &header, none) == 0, "capset");
}

void gainNothingByExec() {
  need(::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) == 0, "prctl");
}

void writeMap(const char *file, const std::string &text) {
  std::ofstream out(file);
  out << text << std::flush;
  need(out.good(), std::string("writing ") + file);
}

// Root of a namespace in which no other user is known.
void enterUserNamespace() {
  const uid_t uid = ::getuid();
  need(::unshare(CLONE_NEWUSER) == 0, "unshare(CLONE_NEWUSER)");
  writeMap("/proc/self/setgroups", "deny");
  writeMap("/proc/self/uid_map", "0 " + std::to_string(uid) + " 1");
  writeMap("/proc/self/gid_map", "0 " + std::to_string(uid) + " 1");
}

// A namespace in which not even the caller's own id is known.
void enterUnmappedNamespace() {
  need(::unshare(CLONE_NEWUSER) == 0, "unshare(CLONE_NEWUSER)");
}

TEST_F(HostilePrivileges, AnOrdinaryUserMakesTheFirstSession) {
  const Outcome outcome = runCommand({"session", "create"}, becomeNobody);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(1U, namesIn(kSessionRoot).size());
}

TEST_F(HostilePrivileges, AnOrdinaryUserDoesNotUseTheFoldersOfRoot) {
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  const Outcome outcome = runLibrary([] { return Session().create(); }, becomeNobody);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.log,
              ElementsAre("[err] path/path_util:402 chmod /tmp/kovabackup path failed. Operation "
                          "not permitted",
                          "[err] session:82 failed to create temp directory []"));
}

TEST_F(HostilePrivileges, AnOrdinaryUserIsToldWhyThereIsNoSession) {
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  const Outcome outcome = runCommand({"session", "create"}, becomeNobody);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr("/tmp/kovabackup")) << outcome;
}

TEST_F(HostilePrivileges, AnOrdinaryUserCannotDestroyTheSessionOfRoot) {
  const Outcome made = runCommand({"session", "create"});
  const std::string id = made.out.substr(0, made.out.find('\n'));
  const Outcome outcome = runCommand({"session", "destroy", id}, becomeNobody);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("Permission denied"));
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(id));
}

TEST_F(HostilePrivileges, AnOrdinaryUserCannotReadTheKey) {
  ASSERT_EQ(0, runLibrary([] { return OptionMap().optSet("a", "b", true); }).exitCode);
  const Outcome outcome = runLibrary(
      [] {
        OptionMap map;
        (void)map.optSet("secret", "open sesame", true);
        return map.optString("secret", "none").empty();
      },
      becomeNobody);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << "the secret is stored as an empty text" << outcome;
  EXPECT_FALSE(outcome.log.empty());
}

TEST_F(HostilePrivileges, AnOrdinaryUserCannotChangeAForeignFile) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome = runCommand({"option", "set", file, "task1", "name", "b"}, becomeNobody);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr("Permission denied")) << outcome;
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
}

TEST_F(HostilePrivileges, RootWithoutCapabilitiesMakesAndDestroysSessions) {
  const Outcome outcome = runLibrary(
      [] {
        Session session;
        return session.create() && session.destroy();
      },
      dropCapabilities);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.log, IsEmpty());
}

TEST_F(HostilePrivileges, RootWithoutCapabilitiesKeepsASecret) {
  const Outcome outcome = runLibrary(
      [] {
        OptionMap map;
        return map.optSet("secret", "open sesame", true) &&
               map.optSecret("secret", "") == "open sesame";
      },
      dropCapabilities);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostilePrivileges, RootWithoutCapabilitiesReplacesItsFile) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome = runCommand({"option", "set", file, "task1", "name", "b"}, [] {
    dropCapabilities();
    gainNothingByExec();
  });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"b\"\n", readFile(file));
}

TEST_F(HostilePrivileges, ACommandRunsWhereExecGainsNothing) {
  const Outcome outcome = runCommand({"run", "--", "sh", "-c", "exit 6"}, gainNothingByExec);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(6, outcome.exitCode) << outcome;
}

TEST_F(HostilePrivileges, RootOfAUserNamespaceMakesAndDestroysSessions) {
  const Outcome outcome = runLibrary(
      [] {
        Session session;
        return session.create() && session.destroy();
      },
      enterUserNamespace);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostilePrivileges, ASessionRootOfAnUnknownUserIsNotTrusted) {
  if (::geteuid() != 0 || ::mkdir(kIpcRoot, 0755) != 0 || ::mkdir(kSessionRoot, 0700) != 0 ||
      ::chown(kSessionRoot, 12345, 12345) != 0) {
    GTEST_SKIP() << "skipped: no other user is known here";
  }
  fs::create_directory(std::string(kSessionRoot) + "/sess.Aaaaaa");
  const Outcome outcome = runCommand({"session", "destroy", "sess.Aaaaaa"}, enterUserNamespace);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_TRUE(isThere(std::string(kSessionRoot) + "/sess.Aaaaaa"));
}

TEST_F(HostilePrivileges, WithoutAnyMappedIdTheDoctorWorksAndNamesTheOwner) {
  ASSERT_EQ(0, runCommand({"session", "create"}).exitCode);
  const Outcome outcome = runCommand({"doctor", "--json"}, enterUnmappedNamespace);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.signal) << outcome;
  EXPECT_THAT(outcome.out, HasSubstr("\"healthy\""));
}

TEST_F(HostilePrivileges, ASetUserIdProgramWithoutRootLosesNothingItHas) {
  const Outcome outcome = runLibrary(
      [] {
        SubProcess command("/usr/bin/id");
        command.addArg("-u");
        command.setStdOutput(STDOUT_FILENO);
        return command.call() == 0;
      },
      [] { need(::setresuid(kNobody, kNobody, 0) == 0, "no other user is known here"); });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ("65534\n", outcome.out) << outcome;
}

} // namespace
