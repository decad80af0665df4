// Roots in which /proc, /dev or /etc is missing or not the expected one, as in rescue systems and
// small containers.
#include "tests/hostile/refused_calls.h"
#include "tests/hostile/small_root.h"
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "kovabackup/service/command.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/session.h"
#include "kovabackup/subprocess.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <sched.h>
#include <sys/mount.h>
#include <sys/syscall.h>
#include <sys/wait.h>
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

class HostileRoot : public HostileTest {
protected:
  static Step in(const std::set<std::string> &folders) {
    return [folders] { SmallRoot(folders).enter(); };
  }

  static std::string makeSession() {
    Session session;
    EXPECT_TRUE(session.create());
    writeFile(session.getPath() + "/file", "data");
    return session.getId();
  }
};

bool keepsASecret() {
  OptionMap map;
  return map.optSet("secret", "open sesame", true) && map.optSecret("secret", "") == "open sesame";
}

TEST_F(HostileRoot, WithoutProcHoldsSessions) {
  const Outcome outcome = runLibrary(
      [] {
        Session session;
        return session.create() && session.destroy();
      },
      in({"/tmp", "/dev"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithoutProcNoSessionCountsAsUnused) {
  const std::string id = makeSession();
  const Outcome outcome =
      runCommand({"session", "prune", "--older-than", "0s", "--yes"}, in({"/tmp", "/dev"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("/proc"));
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(id));
}

TEST_F(HostileRoot, WithoutProcASectionIsReplaced) {
  const Outcome outcome =
      runCommand({"option", "set", keyFile() + ".conf", "s", "k", "v"}, in({"/tmp", "/dev"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[s]\nk=\"v\"\n", readFile(keyFile() + ".conf"));
  EXPECT_EQ(left().count(keyFile() + ".conf"), 1U);
}

TEST_F(HostileRoot, WithoutProcAFileIsPublished) {
  const Outcome outcome = runLibrary(
      [] {
        Service::PublishedFile file(volume() + "/archive");
        Service::Error error;
        return file.create(error) && ::write(file.fd(), "data", 4) == 4 && file.publish(error);
      },
      in({"/tmp", "/dev"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(volume()), ElementsAre("archive"));
}

TEST_F(HostileRoot, WithoutProcSecretsAreKept) {
  const Outcome outcome = runLibrary(keepsASecret, in({"/tmp", "/dev"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithoutProcTheDoctorSaysWhatItSees) {
  const Outcome outcome = runCommand({"doctor"}, in({"/tmp", "/dev"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.signal) << outcome;
  EXPECT_THAT(outcome.out, HasSubstr("ok\ttmp\t/tmp\n"));
}

TEST_F(HostileRoot, WithoutProcNobodyIsKnownToHoldALock) {
  runCommand({"option", "set", stage() + "/f", "s", "k", "v", "--lock", "t"});
  const Outcome outcome = runCommand({"lock", "show", "t"}, in({"/tmp", "/dev"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_NE(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("/proc/locks"));
}

TEST_F(HostileRoot, WithAnEmptyProcNoSessionCountsAsUnused) {
  const std::string id = makeSession();
  const Outcome outcome = runCommand({"session", "destroy", id}, [] {
    const SmallRoot root({"/tmp", "/dev"});
    fs::create_directory(root / "/proc");
    root.enter();
  });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(id));
}

TEST_F(HostileRoot, WithAProcOfAnotherNamespaceNoSessionCountsAsUnused) {
  const std::string id = makeSession();
  const Outcome outcome = runCommand({"session", "destroy", id}, [] {
    need(::unshare(CLONE_NEWPID) == 0, "unshare(CLONE_NEWPID)");
    const pid_t child = ::fork();
    if (child == 0) { // the first process of the namespace; /proc still shows the machine's
      return;
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    ::_exit(WIFEXITED(status) ? WEXITSTATUS(status) : 99);
  });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_TRUE(outcome.exitCode == 0 || outcome.exitCode == 1) << outcome;
  EXPECT_EQ(outcome.exitCode == 0 ? 0U : 1U, namesIn(kSessionRoot).size());
}

TEST_F(HostileRoot, WhoseProcHidesProcessesKeepsASessionOfAnotherUser) {
  const std::string id = makeSession();
  KOVA_OR_SKIP(
      need(::mount("proc", "/proc", "proc", 0, "hidepid=2") == 0, "a proc cannot be mounted"));
  if (::chown((std::string(kSessionRoot) + "/" + id).c_str(), kNobody, kNobody) != 0 ||
      ::chown(kSessionRoot, kNobody, kNobody) != 0 || ::chown(kIpcRoot, kNobody, kNobody) != 0) {
    GTEST_SKIP() << "skipped: no other user is known here";
  }
  const Outcome outcome = runCommand({"session", "destroy", id}, becomeNobody);
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(kSessionRoot), ElementsAre(id));
}

TEST_F(HostileRoot, WithoutDevTheLibraryStartsNothingAndSaysWhy) {
  const Outcome outcome = runLibrary(
      [] {
        SubProcess command("/bin/true");
        const int status = command.call();
        return WIFEXITED(status) && WEXITSTATUS(status) == 127;
      },
      in({"/tmp", "/proc"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithoutDevAServicesCommandIsNotStarted) {
  const Outcome outcome = runLibrary(
      [] {
        const Service::Result result = Service::Command({"/bin/true"}).run();
        return result.end == Service::Result::End::NotStarted && result.error.code == ENOENT &&
               result.error.path == "/dev/null";
      },
      in({"/tmp", "/proc"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithoutDevSecretsAndSessionsServe) {
  const Outcome outcome = runLibrary(
      [] {
        Session session;
        return keepsASecret() && session.create() && session.destroy();
      },
      in({"/tmp", "/proc"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithoutDevTheCommandIsUsableWithClosedDescriptors) {
  const Outcome outcome = runCommand({"session", "create"}, [] {
    SmallRoot({"/tmp"}).enter();
    ::close(STDIN_FILENO);
  });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithAFileInThePlaceOfDevNullIsNotWrittenInto) {

  const Outcome outcome = runLibrary(
      [] {
        SubProcess command("/bin/sh");
        command.addArgList("-c", "cat; echo said", nullptr);
        return command.call() == 0;
      },
      [] {
        const SmallRoot root({"/tmp", "/proc"});
        fs::create_directory(root / "/dev");
        writeFile(root / "/dev/null", "");
        root.enter();
      });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << "a plain file serves as well" << outcome;
}

TEST_F(HostileRoot, WithoutEtcEverythingServes) {
  const Outcome outcome = runCommand({"doctor"}, in({"/tmp", "/dev", "/proc"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithoutAConfigurationHasNoVolumesAndSaysHowToGetThem) {
  const Outcome outcome = runProgram({{"kovabackup", "volume", "pick", "max"}, {"PATH=/usr/bin"}},
                                     in({"/tmp", "/dev", "/proc"}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(3, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("platform.conf(5)"));
}

TEST_F(HostileRoot, WithoutAnyFolderAddressesAreStillAddresses) {
  const Outcome outcome = runCommand({"net", "probe", "127.0.0.1:1"}, in({}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(3, outcome.exitCode) << outcome;
}

TEST_F(HostileRoot, WithoutRandomnessNoKeyIsMadeAndNobodyIsEnded) {
  const Outcome outcome = runLibrary(
      [] {
        OptionMap map;
        (void)map.optSet("secret", "open sesame", true);
        return map.optString("secret", "none").empty();
      },
      [] {
        SmallRoot({"/tmp", "/proc"}).enter();
        refuseCalls({SYS_getrandom}, ENOSYS);
      });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.signal) << outcome;
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_FALSE(isThere(keyFile()));
}

} // namespace
