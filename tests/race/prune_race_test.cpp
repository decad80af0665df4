// Stores and the command prune, remove and adopt sessions that other processes make, enter and
// leave meanwhile. Who has entered a session keeps it.

#include "kovabackup/service/session_store.h"
#include "tests/race/own_processes.h"
#include "tests/race/race_support.h"
#include "tests/race/session_users.h"
#include "tests/support/child_process.h"
#include "tests/support/machine_mounts.h"
#include "tests/tools/run_tool.h"

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <gmock/gmock.h>
#include <sys/stat.h>

using namespace KovaTest;
using testing::IsEmpty;

namespace {

using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::SessionInfo;
using KOVA::Backup::Service::SessionStore;

constexpr std::chrono::hours kOld(1);

// The configuration of the stand-ins for its lifetime, here and in the command.
class Configuration {
public:
  explicit Configuration(std::string path) : path_(std::move(path)) {
    before_ = std::getenv(kName) != nullptr ? std::getenv(kName) : "";
    EXPECT_EQ(0, ::setenv(kName, path_.c_str(), 1));
  }
  ~Configuration() {
    (void)(before_.empty() ? ::unsetenv(kName) : ::setenv(kName, before_.c_str(), 1));
  }
  Configuration(const Configuration &) = delete;
  Configuration &operator=(const Configuration &) = delete;

  void write(const std::string &text) const {
    writeFile(path_, text);
    EXPECT_EQ(0, ::chmod(path_.c_str(), 0644)); // whatever the umask
  }
  const std::string &path() const { return path_; }

private:
  static constexpr const char *kName = "KOVA_PLATFORM_CONF";
  std::string path_;
  std::string before_;
};

class PruneRace : public Sessions {
protected:
  void SetUp() override {
    Sessions::SetUp();
    if (IsSkipped()) {
      return;
    }
    std::filesystem::create_directory(volume.path + "/data");
    conf.write("[volume data]\npath=\"" + volume.path + "/data\"\nfsType=2\nsize=1000\n" +
               "[mounts]\nexclude=" + machineMounts() + "\n");
    std::vector<SessionInfo> none;
    Error error;
    EXPECT_TRUE(store.list(none, error)); // the platform makes the folder for sessions
    play.folder = volume.path + "/data/.kova_tmp";
    play.complaints = writeFile(scratch / "complaints", "");
  }

  // Runs the users to the end of their rounds, and meanwhile the others, again and again.
  // Returns: why not, or "".
  std::string race(int users, int rounds, const std::vector<std::function<void()>> &others) {
    const std::size_t count = static_cast<std::size_t>(users) + others.size();
    return runAmongOwnProcesses([&] {
      runInChildren(static_cast<int>(count), [&](int number) {
        LogCapture log; // of sessions that are gone
        if (number < users) {
          SessionUsers(play, play.seed + static_cast<unsigned>(number)).run(rounds);
          ++*play.finished;
          return true;
        }
        const auto &work = others[static_cast<std::size_t>(number - users)];
        while (*play.finished < users) {
          work();
        }
        return true;
      });
    });
  }

  void expectNothingLeft() {
    std::vector<SessionInfo> removed;
    std::vector<Error> failed;
    EXPECT_TRUE(store.prune(std::chrono::seconds(0), false, removed, failed));
    EXPECT_THAT(failed, IsEmpty());
    EXPECT_THAT(namesIn(play.folder), IsEmpty());
    EXPECT_THAT(namesIn(kSessionRoot), testing::IsSubsetOf({"__sess__.lock"}));
    EXPECT_EQ("", readFile(play.complaints));
  }

  // Refusals and sessions that another store has just removed are right answers.
  void judge(const std::string &what, const Error &error) const {
    const bool right = (error.step == "refused" &&
                        (error.code == EBUSY || error.code == EAGAIN || error.code == ESTALE)) ||
                       error.code == ENOENT;
    if (!right) {
      play.complain(what + ": " + error.step + " " + error.path + ": " +
                    std::to_string(error.code));
    }
  }

  void prune() {
    std::vector<SessionInfo> removed;
    std::vector<Error> failed;
    const bool complete = store.prune(kOld, false, removed, failed);
    *play.removed += static_cast<int>(removed.size());
    for (const Error &error : failed) {
      judge("prune", error);
      *play.refused += error.code == EBUSY ? 1 : 0;
    }
    if (complete != failed.empty()) {
      play.complain("prune succeeds with failures");
    }
  }

  void remove() {
    SessionInfo session;
    Error error;
    const std::string id = play.known->any();
    if (id.empty() || !store.find(id, session, error)) {
      return;
    }
    if (store.remove(session, error)) {
      ++*play.removed;
    } else {
      judge("remove " + id, error);
      *play.refused += error.code == EBUSY ? 1 : 0;
    }
  }

  void adopt() {
    std::vector<SessionInfo> sessions;
    Error error;
    (void)store.list(sessions, error); // one that is being removed is in the way
    for (const SessionInfo &session : sessions) {
      std::string id;
      if (session.state != SessionInfo::State::Lost) {
        continue;
      }
      if (store.adopt(session, id, error)) {
        ++*play.adopted;
        play.known->add(id);
      } else if (error.code != EINVAL && error.code != EEXIST) { // another process was faster
        play.complain("adopt: " + error.step + " " + std::to_string(error.code));
      }
    }
  }

  // 3: the session is gone.
  void command(const std::vector<std::string> &arguments) const {
    const ToolResult result = runTool(arguments, {"", {{"KOVA_PLATFORM_CONF", conf.path()}}});
    ++*play.commands;
    const int code = result.exitCode;
    if (code != 0 && code != 1 && code != 3) {
      play.complain(arguments[1] + ": exit code " + std::to_string(code) + " " + result.messages);
    }
  }

  void removeByCommand() const {
    const std::string id = play.known->any();
    if (!id.empty()) {
      command({"session", "destroy", id});
    }
  }

  void print(const char *what) const {
    std::printf("%s: %d entered, %d of them while stores were at them, %d removed, %d refused, %d "
                "adopted, %d commands\n",
                what, play.entered->load(), play.moved->load(), play.removed->load(),
                play.refused->load(), play.adopted->load(), play.commands->load());
  }

  const TestFolder scratch;
  const Configuration conf{scratch / "platform.conf"};
  SessionStore store;
  SessionPlay play;
};

} // namespace

// prune spares what has been loaded lately, too.
TEST_F(PruneRace, LosesNoSessionThatIsEnteredOrLoaded) {
  play.loads = true;
  race(6, share(60, 2000),
       {[&] { prune(); }, [&] { prune(); }, [&] { adopt(); },
        [&] {
          command({"session", "prune", "--older-than", "1h", "--yes"});
        }});
  print("prune");
  EXPECT_LT(0, *play.entered);
  EXPECT_LT(0, *play.removed);
  expectNothingLeft();
}

TEST_F(PruneRace, RemovalLosesNoSessionThatIsEntered) {
  const std::string why = race(6, share(60, 2000),
                               {[&] { remove(); }, [&] { remove(); }, [&] { prune(); },
                                [&] { adopt(); }, [&] { removeByCommand(); }});
  if (!why.empty()) {
    GTEST_SKIP() << why;
  }
  print("remove");
  EXPECT_LT(0, *play.entered);
  EXPECT_LT(0, *play.removed);
  expectNothingLeft();
}
