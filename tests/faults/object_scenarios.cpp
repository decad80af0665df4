// Objects that own something for a while: temporary files and folders, volumes, locks, signals.

#include "kovabackup/exec.h"
#include "kovabackup/option_map.h"
#include "kovabackup/service/run_lock.h"
#include "kovabackup/session.h"
#include "kovabackup/signal.h"
#include "kovabackup/temp_manager.h"
#include "tests/faults/attempt.h"
#include "tests/faults/sessions.h"
#include "tests/faults/world.h"

#include <filesystem>
#include <string>
#include <unistd.h>
#include <vector>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::FilterVolume;
using KOVA::Backup::OptionMap;
using KOVA::Backup::ScopedTempFile;
using KOVA::Backup::ScopedTempFolder;
using KOVA::Backup::ScopedVolumeTempFolder;
using KOVA::Backup::Session;
using KOVA::Backup::TempManager;
using KOVA::Backup::VolumePathManager;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::LockUser;
using KOVA::Backup::Service::RunLock;

const std::string kName = std::string(kWork) + "/a temporary name that is long";

void keepTemporaries() {
  attempt("file", [] {
    ScopedTempFile file(0);
    const bool made = file.create(kName) && file.create(kName + ".second");
    file.close();
    return made ? file.preserve() : "";
  });
  attempt("folder", [] {
    ScopedTempFolder folder(0);
    return folder.create(kName) ? folder.preserve() : "";
  });
  attempt("unlinked", [] {
    ScopedTempFile file(kName + ".gone", true);
    const std::string path = file.getPath();
    file.unlink();
    return path;
  });
}

// A path that was returned exists; what threw or failed leaves nothing, except what has the wrong
// mode or could not be removed.
void checkTemporaries(const Seen &seen, Findings &findings) {
  std::size_t kept = 0;
  for (const std::string key : {"file", "folder"}) {
    const std::string path = seen.valueOf(key);
    const bool isPath = path.rfind('/', 0) == 0;
    findings.expect(!isPath || seen.exists(path), "returned, but not there: " + path);
    kept += isPath ? 1 : 0;
  }
  findings.expect(!seen.exists(seen.valueOf("unlinked")) || seen.failedIn("unlink chmod"),
                  "unlinked, but there");
  findings.expect(seen.killed() || seen.failedIn("unlink rmdir chmod") ||
                      seen.matching(kName + "*").size() == kept,
                  "more stays than was kept");
}

void onVolume() {
  attempt("folder", [] {
    const ScopedVolumeTempFolder folder(TempManager::maxExtVolume(), "piece");
    return folder.getPath();
  });
  attempt("kept", [] {
    ScopedVolumeTempFolder folder(TempManager::sameVolume(volume()), "piece");
    return folder.preserve();
  });
}

void checkOnVolume(const Seen &seen, Findings &findings) {
  const std::string kept = seen.valueOf("kept");
  const bool isKept = kept.rfind('/', 0) == 0;
  findings.expect(!isKept || seen.exists(kept), "kept, but not there");
  findings.expect(seen.killed() || seen.failedIn("unlink unlinkat rmdir chmod") ||
                      seen.failedIn(kWalkCalls) ||
                      seen.matching(volume() + "/.kova_tmp/piece.*").size() == (isKept ? 1U : 0U),
                  "more stays than was kept");
}

void chooseVolumes() {
  using Filter = boost::shared_ptr<FilterVolume>;
  const std::vector<Filter (*)()> makers = {
      [] { return TempManager::maxVolume(true); },
      [] { return TempManager::maxExtBtrfsVolume(1, 1, false); },
      [] { return TempManager::sameVolume(volume()); },
      [] { return TempManager::maxVolume(); },
      [] { return TempManager::maxVolume(1, 1, true); },
      [] { return TempManager::maxExtVolume(true); },
      [] { return TempManager::maxExtVolume(1, 1, true); },
      [] { return TempManager::maxExtBtrfsVolume(); },
      [] { return TempManager::maxExtBtrfsVolume(true); },
  };
  constexpr std::size_t kResolved = 3; // a look at the volumes makes many calls
  for (std::size_t index = 0; index < makers.size(); ++index) {
    const std::string digit(1, static_cast<char>('0' + index));
    attempt(("signature " + digit).c_str(), [&] { return makers[index]()->getSignature(); });
    if (index < kResolved) {
      attempt(("path " + digit).c_str(), [&] {
        std::string path = "none";
        (void)VolumePathManager::getInstance().getVolumePath(makers[index](), path);
        return path;
      });
    }
  }
}

// A platform that does not answer supports no location and no volume.
bool isUnknown(const std::string &signature) {
  const std::string none = ":0:0:";
  return signature.back() == ':' || signature.rfind(none) == signature.size() - none.size() - 1;
}

// A volume that cannot be examined is passed over.
void checkVolumes(const Seen &seen, Findings &findings) {
  for (const auto &[key, value] : seen.said) {
    if (key.rfind("path ", 0) == 0) {
      findings.expect(value.empty() || value == "/tmp" || value == kBadAlloc ||
                          value == volume() + "/.kova_tmp",
                      key + " is " + value);
    } else {
      findings.expect(value == kBadAlloc || seen.clean == nullptr ||
                          value == seen.clean->valueOf(key) || isUnknown(value),
                      key + " is " + value);
    }
  }
}

void findSession() {
  attempt("local", [] { return Session::getPathById("sess.Aa1Bb2"); });
  attempt("on a volume", [] { return Session::getPathById("seln.Cc3Dd4"); });
}

void prepareLink() {
  makeLocalSessions();
  fs::create_symlink(volume() + "/.kova_tmp/seln.Cc3Dd4",
                     std::string(kSessionRoot) + "/seln.Cc3Dd4");
}

void checkFound(const Seen &seen, Findings &findings) {
  checkAttempt(seen, findings, "local");
  if (!seen.failedIn("readlink")) {
    checkAttempt(seen, findings, "on a volume");
  }
}

void lockMap() {
  OptionMap map;
  Error error;
  say("token", map.setLockToken("task.conf"));
  const bool locked = map.lock();
  say("locked", locked);
  RunLock other("task.conf");
  say("exclusive", !locked || !other.take(error));
  const bool unlocked = map.unlock();
  say("unlocked", unlocked);
  say("free", !unlocked || other.take(error) || error.code != EWOULDBLOCK);
}

void checkLocked(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isFalse("exclusive"), "two objects hold the lock");
  findings.expect(!seen.isFalse("free"), "unlocked, but it is held");
}

void lookAtLock() {
  Error error;
  RunLock lock("nightly");
  const bool taken = lock.take(error);
  say("taken", taken);
  attempt("path", [] { return RunLock::path("nightly"); });
  attempt("users", [&] {
    std::vector<LockUser> users;
    error = Error();
    const bool known = RunLock::users("nightly", users, error);
    return known && taken ? static_cast<int>(users.size()) : error.code != 0 || !taken ? -1 : -2;
  });
  lock.release();
  say("released", lock.fd() == -1);
}

void checkLookedAt(const Seen &seen, Findings &findings) {
  checkAttempt(seen, findings, "path");
  const std::string users = seen.valueOf("users");
  findings.expect(users.empty() || users == "1" || users == "-1" || users == kBadAlloc,
                  "users: " + users);
  findings.expect(!seen.isFalse("released"), "it is not released");
}

void onSignal(int) {}

// All of it is put back.
void handleSignals() {
  using namespace KOVA::Backup;
  int flags = 0;
  say("handler", signalHandlerSet(SIGUSR1, onSignal));
  say("added", signalHandlerAddFlags(SIGUSR1, SA_NODEFER, flags));
  say("removed", signalHandlerRemoveFlags(SIGUSR1, SA_NODEFER, flags));
  say("flags", signalHandlerSetFlags(SIGUSR1, 0));
  {
    ScopedTempSigHandler handler;
    say("scoped", handler.setSignalHandler(SIGUSR2, 0, onSignal));
  }
  UtilExec exec;
  exec.SetSigHandler();
  exec.RestoreSigHandler();
  say("default", signalHandlerSet(SIGUSR1, SIG_DFL));
}

void askAboutProcess() {
  namespace Process = KOVA::Backup::Process;
  say("alive", Process::isAlive(::getpid()));
  say("state", Process::getStatus(::getpid()));
  say("running", !Process::isZombie(::getpid()));
}

// The state of a process whose file cannot be read is unknown.
void checkState(const Seen &seen, Findings &findings) {
  const std::string state = seen.valueOf("state");
  findings.expect(state.empty() || state == "0" || state == std::to_string('R'),
                  "the state is " + state);
  findings.expect(!seen.isFalse("alive") && !seen.isFalse("running"), "it is said to have ended");
}

} // namespace

void addObjectScenarios(Scenarios &all) {
  all.push_back({"temporaries kept", [] {}, keepTemporaries, checkTemporaries, {kName + "*"}});
  all.push_back({"temporary folder on a volume",
                 [] {},
                 onVolume,
                 checkOnVolume,
                 {volume() + "/.kova_tmp", volume() + "/.kova_tmp/piece.*"}});
  all.push_back({"volumes chosen", [] {}, chooseVolumes, checkVolumes, {volume() + "/.kova_tmp"}});
  all.push_back({"session found", prepareLink, findSession, checkFound, {}});
  all.push_back({"option lock", [] {}, lockMap, checkLocked, {}});
  all.back().keepsDescriptorsIf = "flock memory mmap brk"; // the map then still holds it
  all.push_back({"run lock looked at", [] {}, lookAtLock, checkLookedAt, {}});
  all.push_back({"process state", [] {}, askAboutProcess, checkState, {}});
  all.push_back({"signals", [] {}, handleSignals, checkAttempts, {}});
}

} // namespace KovaTest::Faults
