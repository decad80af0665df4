// Resource limits that are far too small. An operation fails with its reason or works; it never
// leaves half of its work, and no signal ends it.
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "kovabackup/service/command.h"
#include "kovabackup/service/published_file.h"
#include "kovabackup/service/tree_removal.h"
#include "kovabackup/session.h"
#include "kovabackup/subprocess.h"
#include "kovabackup/temp_manager.h"

#include <csignal>
#include <filesystem>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::MatchesRegex;
namespace fs = std::filesystem;

class HostileLimits : public HostileTest {};

constexpr unsigned long kStandardOnly = 3;

// As a service that handles the signal itself.
void noFileGrows() {
  (void)std::signal(SIGXFSZ, SIG_IGN);
  limit(RLIMIT_FSIZE, 0);
}

TEST_F(HostileLimits, WithoutDescriptorsTheCommandSaysSo) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome = runCommand({"option", "set", file, "task1", "name", "b"},
                                     [] { limit(RLIMIT_NOFILE, kStandardOnly + 1); });
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("the file cannot be opened")) << outcome;
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
}

TEST_F(HostileLimits, WithoutDescriptorsNoSessionIsMade) {
  const Outcome outcome = runLibrary([] { return !Session().create(TempManager::maxVolume()); },
                                     [] { limit(RLIMIT_NOFILE, kStandardOnly); });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileLimits, WithoutDescriptorsALocalSessionNeedsNone) {
  const Outcome outcome = runLibrary(
      [] {
        Session session;
        return session.create() && session.destroy();
      },
      [] { limit(RLIMIT_NOFILE, kStandardOnly); });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileLimits, WithoutDescriptorsNoTreeCountsAsRemoved) {
  fs::create_directories(stage() + "/tree/a/b");
  const Outcome outcome = runLibrary(
      [] { return Service::TreeRemoval::remove(stage() + "/tree", [](const Service::Error &) {}); },
      [] { limit(RLIMIT_NOFILE, kStandardOnly); });
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_TRUE(isThere(stage() + "/tree/a/b"));
}

TEST_F(HostileLimits, WithoutDescriptorsAServicesCommandIsNotStarted) {
  const Outcome outcome = runLibrary(
      [] {
        Service::Command command({"/bin/echo", "a"});
        command.capture(Service::Stream::Out, 100);
        const Service::Result result = command.run();
        return result.end == Service::Result::End::NotStarted && result.error.code == EMFILE;
      },
      [] { limit(RLIMIT_NOFILE, kStandardOnly); });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileLimits, WhereNoFileMayGrowTheSectionStaysAsItWas) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome = runLibrary(
      [&] {
        OptionMap task;
        return task.optSectionLoad(file, "task", 1) && task.optSet("name", "b") &&
               !task.optSectionSave();
      },
      noFileGrows);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
  EXPECT_THAT(outcome.log, ElementsAre(HasSubstr("option_map:")));
}

TEST_F(HostileLimits, WhereNoFileMayGrowTheCommandSaysSoAndIsNotKilled) {
  const std::string file = writeFile(stage() + "/task.conf", "[task1]\nname=\"a\"\n");
  const Outcome outcome =
      runCommand({"option", "set", file, "task1", "name", "b"}, [] { limit(RLIMIT_FSIZE, 0); });
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_EQ("[task1]\nname=\"a\"\n", readFile(file));
  EXPECT_EQ(left(), std::set<std::string>{file});
}

TEST_F(HostileLimits, WhereNoFileMayGrowNoFileIsPublished) {
  const Outcome outcome = runLibrary(
      [] {
        Service::PublishedFile file(stage() + "/archive");
        Service::Error error;
        return file.create(error) && ::write(file.fd(), "a", 1) == -1;
      },
      noFileGrows);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(left(), IsEmpty());
}

TEST_F(HostileLimits, WhereNoFileMayGrowNoKeyIsMade) {
  const Outcome outcome = runLibrary(
      [] {
        OptionMap map;
        (void)map.optSet("secret", "open sesame", true);
        return map.optSecret("secret", "").empty();
      },
      noFileGrows);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(left(), IsEmpty());
}

TEST_F(HostileLimits, TheCommandThatIsRunHasTheLimitAndTheUsualSignal) {
  const Outcome outcome = runCommand({"run", "--", "sh", "-c", "echo a > " + stage() + "/f"},
                                     [] { limit(RLIMIT_FSIZE, 0); });
  EXPECT_EQ(128 + SIGXFSZ, outcome.exitCode) << outcome;
}

TEST_F(HostileLimits, WithoutProcessesNoCommandIsStarted) {
  const Outcome outcome = runLibrary([] { return SubProcess("/bin/true").call() == -1; },
                                     [] {
                                       becomeNobody();
                                       limit(RLIMIT_NPROC, 0);
                                     });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.log, ElementsAre(HasSubstr("Resource temporarily unavailable")));
}

TEST_F(HostileLimits, WithoutProcessesTheCommandSaysSo) {
  const Outcome outcome = runCommand({"run", "--", "true"}, [] {
    becomeNobody();
    limit(RLIMIT_NPROC, 0);
  });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(1, outcome.exitCode) << outcome;
  EXPECT_THAT(outcome.messages, HasSubstr("could not be started"));
}

TEST_F(HostileLimits, AServicesCommandNeedsAProcessToo) {
  const Outcome outcome = runLibrary(
      [] {
        const Service::Result result = Service::Command({"/bin/true"}).run();
        return result.end == Service::Result::End::NotStarted && result.error.code == EAGAIN;
      },
      [] {
        becomeNobody();
        limit(RLIMIT_NPROC, 0);
      });
  KOVA_SKIP_WHERE_LACKING(outcome);
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

TEST_F(HostileLimits, ASmallStackIsEnoughForTheCommand) {
  const Outcome outcome =
      runCommand({"doctor", "--json"}, [] { limit(RLIMIT_STACK, 256 * 1024UL); });
  EXPECT_EQ(0, outcome.signal) << outcome;
  EXPECT_THAT(outcome.out, HasSubstr("\"healthy\""));
}

TEST_F(HostileLimits, ASmallStackIsEnoughForADeepSession) {
  const Outcome made = runCommand({"session", "create"});
  const std::string id = made.out.substr(0, made.out.find('\n'));
  std::string deep = std::string(kSessionRoot) + "/" + id;
  for (int level = 0; level < 400; ++level) {
    deep += "/12345678";
  }
  fs::create_directories(deep);
  const Outcome outcome =
      runCommand({"session", "destroy", id}, [] { limit(RLIMIT_STACK, 256 * 1024UL); });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_THAT(namesIn(kSessionRoot), IsEmpty());
}

TEST_F(HostileLimits, ACoreIsNotWrittenWhereItMustNotBe) {
  const Outcome outcome =
      runCommand({"run", "--", "sh", "-c", "ulimit -c"}, [] { limit(RLIMIT_CORE, 0); });
  EXPECT_EQ("0\n", outcome.out) << "the limit reaches the command that is run";
}

TEST_F(HostileLimits, NoLockedMemoryIsNeededForSecrets) {
  const Outcome outcome = runCommand({"doctor", "--json"}, [] { limit(RLIMIT_MEMLOCK, 0); });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
}

} // namespace
