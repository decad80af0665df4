// Processes create and destroy sessions, locally and on a volume, and the command prunes old ones
// meanwhile.

#include "kovabackup/service/session_store.h"
#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"
#include "tests/crash/files.h"
#include "tests/crash/programs.h"
#include "tests/crash/shared.h"
#include "tests/crash/workload.h"
#include "tests/faults/world.h"

#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <map>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest::Crash {
namespace {

namespace fs = std::filesystem;
using Faults::kSessionRoot;
using KOVA::Backup::Session;
using KOVA::Backup::TempManager;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::SessionInfo;
using KOVA::Backup::Service::SessionStore;
using State = KOVA::Backup::Service::SessionInfo::State;

constexpr int kActors = 2; // and the command
constexpr int kPerActor = 4;
constexpr int kOld = 4;
constexpr std::size_t kIdBytes = 16;
constexpr const char *kLockName = "__sess__.lock"; // documented to stay
constexpr const char *kData = "the data of a session";

struct Entry {
  enum class Phase { None, Creating, Complete, Destroying, Destroyed };
  std::atomic<Phase> phase{Phase::None};
  std::array<char, kIdBytes> id{};
  std::array<char, 256> path{};
};

using Entries = std::array<std::array<Entry, kPerActor>, kActors>;

std::string sharedFolder() {
  return Faults::volume() + "/.kova_tmp";
}

void makeOld(const std::string &path) {
  const timespec then = {std::time(nullptr) - 24L * 3600, 0};
  const std::array<timespec, 2> times = {then, then};
  (void)::utimensat(AT_FDCWD, path.c_str(), times.data(), AT_SYMLINK_NOFOLLOW);
}

bool create(Session &session, bool onVolume) {
  return onVolume ? session.create(TempManager::maxVolume()) : session.create();
}

// A session that no process has loaded for a day, with enough in it that its removal takes a while.
std::string makeOldSession(bool onVolume) {
  Session session;
  mustHold(create(session, onVolume), "creating an old session");
  for (int folder = 0; folder < 10; ++folder) {
    const std::string path = session.getPath() + "/" + std::to_string(folder);
    fs::create_directory(path);
    std::ofstream(path + "/file") << kData;
  }
  std::ofstream(session.getPath() + "/data") << kData;
  makeOld(session.getPath());
  return session.getPath();
}

class Sessions : public Workload {
public:
  Sessions() {
    const auto start = std::chrono::steady_clock::now();
    mustHold(runProgram(pruneArguments()) == 0, "pruning nothing");
    pruning_ = 2 * std::chrono::duration_cast<std::chrono::microseconds>(
                       std::chrono::steady_clock::now() - start);
  }

  const char *name() const override { return "sessions"; }
  int actors() const override { return kActors + 1; }
  bool isProgram(int actor) const override { return actor == kActors; }
  // 1: a session is in use.
  bool mayExitWith(int status) const override { return status == 0 || status == 1; }

  std::chrono::microseconds span(int actor) const override {
    return actor == kActors ? pruning_ : Workload::span(actor);
  }

  void prepare(Random & /*random*/) override {
    for (int made = 0; made < kOld; ++made) {
      (void)makeOldSession(made % 2 == 0);
    }
    const std::string used = makeOldSession(false);
    used_ = ::open((used + "/data").c_str(), O_RDONLY | O_CLOEXEC);
  }

  void act(int actor, Random &random) override {
    if (actor == kActors) {
      becomeProgram(pruneArguments());
    }
    Entry &entry = entries_->at(static_cast<std::size_t>(actor))
                       .at(static_cast<std::size_t>(below(random, kPerActor)));
    if (entry.phase != Entry::Phase::Complete) {
      createOne(entry, actor == 1);
    } else {
      destroyOne(entry);
    }
  }

  void check(Findings &findings) override {
    makeLostOnesOld();
    SessionStore store;
    std::vector<SessionInfo> all;
    Error error;
    findings.expect(store.list(all, error), "the sessions cannot be listed");
    checkListed(all, findings);
    checkEntries(all, findings);
    checkUsed(all, findings);
    std::vector<SessionInfo> removed;
    std::vector<Error> failed;
    findings.expect(store.prune(std::chrono::seconds(0), false, removed, failed),
                    "the sessions cannot be pruned");
    for (const std::string &folder : {std::string(kSessionRoot), sharedFolder()}) {
      for (const std::string &name : namesIn(folder)) {
        findings.expect(name == kLockName, "left behind: " + folder + "/" + name);
      }
    }
  }

private:
  static std::vector<std::string> pruneArguments() {
    return {KOVA_TOOL_PATH, "session", "prune", "--older-than", "1h", "--yes"};
  }

  static void createOne(Entry &entry, bool onVolume) {
    entry.phase = Entry::Phase::Creating;
    Session session;
    require(create(session, onVolume), "Session::create");
    std::strncpy(entry.id.data(), session.getId().c_str(), entry.id.size() - 1);
    std::strncpy(entry.path.data(), session.getPath().c_str(), entry.path.size() - 1);
    std::ofstream data(session.getPath() + "/data");
    data << kData << std::flush;
    require(data.good(), "writing to a session");
    entry.phase = Entry::Phase::Complete;
  }

  static void destroyOne(Entry &entry) {
    Session session;
    require(session.load(entry.id.data()), "Session::load");
    require(session.getPath() == entry.path.data(), "the path of a session");
    entry.phase = Entry::Phase::Destroying;
    require(session.destroy(), "Session::destroy");
    entry.phase = Entry::Phase::Destroyed;
  }

  // The store takes a young folder without a link for one that is being created.
  static void makeLostOnesOld() {
    for (const std::string &name : namesIn(sharedFolder())) {
      if (!fs::is_symlink(std::string(kSessionRoot) + "/" + name)) {
        makeOld(sharedFolder() + "/" + name);
      }
    }
  }

  // The store knows everything that looks like a session, and finds it as users left it.
  static void checkListed(const std::vector<SessionInfo> &all, Findings &findings) {
    std::set<std::string> known;
    for (const SessionInfo &session : all) {
      known.insert(session.path);
      known.insert(std::string(kSessionRoot) + "/" + session.id);
      findings.expect(session.state != State::Broken && session.state != State::Foreign,
                      "damaged: " + session.path + " " + session.problem);
    }
    for (const std::string &folder : {std::string(kSessionRoot), sharedFolder()}) {
      for (const std::string &name : namesIn(folder)) {
        const std::string path = folder + "/" + name;
        findings.expect(known.count(path) == 1 || name == kLockName, "not listed: " + path);
      }
    }
  }

  void checkEntries(const std::vector<SessionInfo> &all, Findings &findings) {
    std::map<std::string, SessionInfo> byId;
    for (const SessionInfo &session : all) {
      byId[session.id] = session;
    }
    for (auto &ofActor : *entries_) {
      for (Entry &entry : ofActor) {
        const std::string id = entry.id.data();
        const std::string path = entry.path.data();
        if (entry.phase == Entry::Phase::Complete) {
          findings.expect(byId[id].state == State::Complete && byId[id].path == path &&
                              contentOf(path + "/data") == kData,
                          "a session is lost: " + id);
          addPromises(1);
        } else if (entry.phase == Entry::Phase::Destroyed) {
          findings.expect(!fs::exists(path) && byId.count(id) == 0, "not destroyed: " + id);
          addPromises(1);
        }
        entry.phase = Entry::Phase::None;
      }
    }
  }

  // Pruning may have renamed it.
  void checkUsed(const std::vector<SessionInfo> &all, Findings &findings) {
    struct stat used = {};
    (void)::fstat(used_, &used);
    bool isThere = false;
    for (const SessionInfo &session : all) {
      struct stat data = {};
      isThere = isThere || (::stat((session.path + "/data").c_str(), &data) == 0 &&
                            data.st_ino == used.st_ino && data.st_dev == used.st_dev);
    }
    findings.expect(isThere, "a session in use was removed");
    addPromises(1);
    ::close(used_);
    used_ = -1;
  }

  Entries *const entries_ = makeShared<Entries>();
  std::chrono::microseconds pruning_{0};
  int used_ = -1;
};

} // namespace

std::unique_ptr<Workload> makeSessions() {
  return std::make_unique<Sessions>();
}

} // namespace KovaTest::Crash
