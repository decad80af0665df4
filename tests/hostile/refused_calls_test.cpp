// System calls that a container refuses, because its filter is older than they are or stricter than
// needed. Another way is taken, or the failure is reported; nothing is lost.
#include "tests/hostile/refused_calls.h"
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/command.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/service/run_lock.h"
#include "kovabackup/service/session_store.h"
#include "kovabackup/service/tree_removal.h"
#include "kovabackup/session.h"
#include "kovabackup/subprocess.h"
#include "kovabackup/temp_manager.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::HasSubstr;
using testing::IsEmpty;
namespace fs = std::filesystem;

/// The parameter is the errno of the refusal: newer filters say ENOSYS, older ones EPERM.
class HostileCalls : public HostileTest, public testing::WithParamInterface<int> {
protected:
  static Step refusing(const std::vector<long> &numbers) {
    return [numbers] { refuseCalls(numbers, GetParam()); };
  }

  static std::string makeSession() {
    Session session;
    EXPECT_TRUE(session.create());
    writeFile(session.getPath() + "/file", "data");
    return session.getId();
  }
};

TEST_P(HostileCalls, WithoutRenameat2ASessionIsRemovedOrStaysComplete) {
  const std::string id = makeSession();
  const Outcome outcome = runCommand({"session", "destroy", id}, refusing({SYS_renameat2}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_P(HostileCalls, WithoutOpenat2ATreeIsRemoved) {
  fs::create_directories(stage() + "/tree/a/b");
  writeFile(stage() + "/tree/a/b/file", "x");
  const Outcome outcome = runLibrary(
      [] { return Service::TreeRemoval::remove(stage() + "/tree", [](const Service::Error &) {}); },
      refusing({SYS_openat2}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_FALSE(isThere(stage() + "/tree"));
}

TEST_P(HostileCalls, WithoutCloseRangeAChildHasNoStrayDescriptor) {
  const std::string file = stage() + "/out";
  const Outcome outcome = runLibrary(
      [&] {
        const int stray =
            ::open("/dev/null", O_RDONLY); // NOLINT(android-cloexec-open): a stray one
        SubProcess command("/bin/sh");
        command.addArgList("-c", "cd /proc/self/fd && echo [0-9]*", nullptr);
        command.setStdOutput(file, 0600);
        const bool done = command.call() == 0;
        ::close(stray);
        return done;
      },
      refusing({SYS_close_range}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("0 1 2 3\n", readFile(file)) << "3 is the shell's own, of the folder";
}

TEST_P(HostileCalls, WithoutCloseRangeTheServicesCommandHasNoStrayDescriptorEither) {
  const Outcome outcome = runLibrary(
      [] {
        const int stray =
            ::open("/dev/null", O_RDONLY); // NOLINT(android-cloexec-open): a stray one
        Service::Command command({"/bin/sh", "-c", "cd /proc/self/fd && echo [0-9]*"});
        command.capture(Service::Stream::Out, 100);
        const Service::Result result = command.run();
        ::close(stray);
        std::fputs(result.out.text.c_str(), stdout);
        return result.ok();
      },
      refusing({SYS_close_range}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("0 1 2 3\n", outcome.out);
}

TEST_P(HostileCalls, WithoutPidfdsACommandRunsAndIsStoppedInTime) {
  const Outcome outcome = runLibrary(
      [] {
        Service::Command late({"/bin/sleep", "600"});
        late.limit(Service::Millis(50), Service::Millis(50));
        return Service::Command({"/bin/true"}).run().ok() && late.run().timedOut;
      },
      refusing({SYS_pidfd_open, SYS_pidfd_send_signal}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_P(HostileCalls, WithoutClone3ACommandRuns) {
  const Outcome outcome = runLibrary(
      [] {
        return SubProcess("/bin/true").call() == 0 && Service::Command({"/bin/true"}).run().ok();
      },
      refusing({SYS_clone3}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_P(HostileCalls, WithoutStatxNoTreeCountsAsRemovedThatIsThere) {
  fs::create_directories(stage() + "/tree/a");
  const Outcome outcome = runLibrary(
      [] { return Service::TreeRemoval::remove(stage() + "/tree", [](const Service::Error &) {}); },
      refusing({SYS_statx}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  // Seen from here, since stat of a 32-bit libc is refused, too.
  EXPECT_EQ(outcome.exitCode == 0, !isThere(stage() + "/tree")) << outcome;
  EXPECT_THAT(outcome.exitCode, testing::AnyOf(0, 1)) << outcome;
}

TEST_P(HostileCalls, WithoutGetrandomNamesAreStillChosen) {
  const Outcome outcome = runCommand({"session", "create"}, refusing({SYS_getrandom}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(1U, namesIn(kSessionRoot).size());
}

TEST_P(HostileCalls, WithoutGetrandomTheKeyIsMadeFromTheDevice) {
  const Outcome outcome = runLibrary(
      [] {
        OptionMap map;
        return map.optSet("secret", "open sesame", true) &&
               map.optSecret("secret", "") == "open sesame";
      },
      refusing({SYS_getrandom}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(32U, readFile(keyFile()).size());
}

TEST_P(HostileCalls, WithoutLinksNoFileIsPublishedAndNoneIsLeft) {
  const Outcome outcome = runLibrary(
      [] {
        Service::PublishedFile file(stage() + "/archive");
        Service::Error error;
        return file.create(error) && ::write(file.fd(), "data", 4) == 4 && !file.publish(error) &&
               error.step == "linkat";
      },
      refusing({SYS_linkat, SYS_link}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(left(), IsEmpty());
}

TEST_P(HostileCalls, WithoutLinksASectionIsReplaced) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome =
      runCommand({"option", "set", file, "task1", "name", "b"}, refusing({SYS_linkat, SYS_link}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"b\"\n", readFile(file));
  EXPECT_EQ(std::set<std::string>{file}, left());
}

TEST_P(HostileCalls, WithoutUnnamedFilesASectionIsReplaced) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome = runCommand({"option", "set", file, "task1", "name", "b"},
                                     [] { refuseUnnamedFiles(GetParam()); });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"b\"\n", readFile(file));
  EXPECT_EQ(std::set<std::string>{file}, left());
}

TEST_P(HostileCalls, WithoutUnnamedFilesAFileIsPublished) {
  const Outcome outcome = runLibrary(
      [] {
        Service::PublishedFile file(stage() + "/archive");
        Service::Error error;
        return file.create(error) && ::write(file.fd(), "data", 4) == 4 && file.publish(error);
      },
      [] { refuseUnnamedFiles(GetParam()); });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(std::set<std::string>{stage() + "/archive"}, left());
}

TEST_P(HostileCalls, WithoutUnnamedFilesTheKeyIsMade) {
  const Outcome outcome = runLibrary(
      [] {
        OptionMap map;
        return map.optSet("secret", "open sesame", true) &&
               map.optSecret("secret", "") == "open sesame";
      },
      [] { refuseUnnamedFiles(GetParam()); });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ(std::set<std::string>{keyFile()}, left());
}

TEST_P(HostileCalls, WithoutExtendedAttributesASectionIsReplacedOrAsItWas) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome =
      runCommand({"option", "set", file, "task1", "name", "b"},
                 refusing({SYS_flistxattr, SYS_fgetxattr, SYS_fsetxattr, SYS_listxattr}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(outcome.exitCode == 0 ? "[task1]\nname=\"b\"\n" : "[task1]\nname=\"a\"\n",
            readFile(file))
      << outcome;
  EXPECT_EQ(std::set<std::string>{file}, left());
}

TEST_P(HostileCalls, WithoutLocksNothingIsWrittenUnderOne) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome = runCommand(
      {"option", "set", file, "task1", "name", "b", "--lock", "task.conf"}, refusing({SYS_flock}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("cannot take the lock 'task.conf'"));
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
}

TEST_P(HostileCalls, WithoutUnshareAndNamespacesTheDoctorWorks) {
  const Outcome outcome =
      runCommand({"doctor", "--json"}, refusing({SYS_unshare, SYS_setns, SYS_mount, SYS_bpf}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_P(HostileCalls, WithoutSyncAChangeIsNotReportedAsSaved) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome =
      runCommand({"option", "set", file, "task1", "name", "b"}, refusing({SYS_fsync}));
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
  EXPECT_EQ(std::set<std::string>{file}, left());
}

INSTANTIATE_TEST_SUITE_P(Refused, HostileCalls, testing::Values(EPERM, ENOSYS));

} // namespace
