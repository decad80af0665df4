// The classes of the second library: locks, published files and the store of sessions.

#include "kovabackup/service/published_file.h"
#include "kovabackup/service/run_lock.h"
#include "kovabackup/service/session_store.h"
#include "tests/faults/report.h"
#include "tests/faults/scenario.h"
#include "tests/faults/sessions.h"
#include "tests/faults/world.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::LockHolder;
using KOVA::Backup::Service::PublishedFile;
using KOVA::Backup::Service::RunLock;
using KOVA::Backup::Service::SessionInfo;
using KOVA::Backup::Service::SessionRemoval;
using KOVA::Backup::Service::SessionStore;

const std::string kTarget = std::string(kWork) + "/index.json";
constexpr std::string_view kText = "the new content";

void takeLock() {
  Error error;
  RunLock first("nightly");
  const bool taken = first.take(error);
  say("first", taken);
  say("error", error.code);
  RunLock second("nightly");
  say("exclusive", !taken || !second.take(error));
  LockHolder holder;
  if (taken && RunLock::holder("nightly", holder)) {
    say("holder", holder.taker == ::getpid());
  }
}

void checkLock(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isFalse("exclusive"), "two objects hold the lock");
  findings.expect(!seen.isFalse("holder"), "another process is said to hold the lock");
  findings.expect(!seen.isFalse("first") || seen.valueOf("error") != "0",
                  "not taken, but there is no error");
}

// The bytes that the scenario itself writes; a failure of its own write ends it.
bool writeText(int fd) {
  return ::write(fd, kText.data(), kText.size()) == static_cast<ssize_t>(kText.size());
}

void publish() {
  PublishedFile file(kTarget);
  Error error;
  const bool created = file.create(error, kText.size());
  const bool published = created && writeText(file.fd()) && file.publish(error);
  say("step", error.step + " " + error.path);
  say("published", published);
}

void prepareTarget() {
  std::ofstream(kTarget) << "old";
}

void checkPublished(const Seen &seen, Findings &findings) {
  const bool isNew = seen.contentOf(kTarget) == kText;
  const bool isOld = seen.exists(kTarget) == (seen.before.count(kTarget) != 0) &&
                     (!seen.exists(kTarget) || seen.contentOf(kTarget) == "old");
  findings.expect(isNew || isOld, "torn: " + seen.contentOf(kTarget));
  findings.expect(isNew || !seen.isTrue("published"), "published, but not there");
  findings.expect(isOld || !seen.isFalse("published") ||
                      seen.valueOf("step") == "fsync " + std::string(kWork),
                  "not published, but there");
}

const std::string kRoot = kSessionRoot;
const std::string kLink = kRoot + "/seln.Cc3Dd4";
const std::string kDangling = kRoot + "/seln.Gg7Hh8";

std::string onVolume(const std::string &name) {
  return volume() + "/.kova_tmp/" + name;
}

void prepareSessions() {
  makeLocalSessions();
  fs::create_directory(volume() + "/.kova_tmp");
  ::chmod((volume() + "/.kova_tmp").c_str(), 01777);
  makeSession(onVolume("seln.Cc3Dd4"), 7200);
  fs::create_symlink(onVolume("seln.Cc3Dd4"), kLink);
  makeSession(onVolume("seln.Ii9Jj0"), 7200); // lost
}

void prune() {
  SessionStore store;
  std::vector<SessionInfo> removed;
  std::vector<Error> failed;
  const bool all = store.prune(std::chrono::seconds(3600), false, removed, failed);
  for (const SessionInfo &session : removed) {
    say(("removed " + session.path).c_str(), true);
  }
  say("failures", static_cast<int>(failed.size()));
  say("pruned", all);
}

// A volume whose folder the platform does not name is left out, which is logged. One that the
// configuration names and that cannot be resolved counts as not mounted.
bool mayMissVolume(const Seen &seen) {
  return seen.failedIn("access readlink statx memory") ||
         std::any_of(seen.log.begin(), seen.log.end(), [](const std::string &line) {
           return line.find("volume_path_manager") != std::string::npos;
         });
}

// Content is complete, or gone with a session that is being removed; the young one stays as it is.
void checkPruned(const Seen &seen, Findings &findings) {
  findings.expect(seen.contentOf(kYoung + "/file") == "12345" && seen.exists(kYoung + "/below"),
                  "the young session is not complete");
  for (const std::string &path : {kOld, onVolume("seln.Cc3Dd4"), onVolume("seln.Ii9Jj0")}) {
    findings.expect(!seen.exists(path) || !seen.isTrue("removed " + path),
                    "said to be removed: " + path);
    const bool unknown = path == onVolume("seln.Ii9Jj0") && mayMissVolume(seen);
    findings.expect(!seen.exists(path) || !seen.isTrue("pruned") || unknown,
                    "pruned, but there: " + path);
  }
  findings.expect(!seen.isTrue("pruned") || !seen.exists(kLink), "pruned, but the link is there");
  findings.expect(!seen.isFalse("pruned") || seen.valueOf("failures") != "0",
                  "not pruned, but there is no error");
}

void list() {
  SessionStore store;
  std::vector<SessionInfo> sessions;
  Error error;
  const bool listed = store.list(sessions, error);
  int complete = 0;
  int explained = 0;
  for (const SessionInfo &session : sessions) {
    complete += session.state == SessionInfo::State::Complete ? 1 : 0;
    explained += session.problem.empty() ? 0 : 1;
  }
  say("complete", complete);
  say("entries", complete + explained);
  say("error", error.code);
  say("listed", listed);
}

// Each entry is either complete, or its problem is named.
void checkListed(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("listed") || seen.clean == nullptr || mayMissVolume(seen) ||
                      seen.valueOf("entries") == seen.clean->valueOf("entries"),
                  "listed, but something is missing");
  findings.expect(!seen.isFalse("listed") || seen.valueOf("error") != "0",
                  "not listed, but there is no error");
}

void removeOne(const char *id) {
  SessionStore store;
  SessionInfo session;
  Error error;
  if (store.find(id, session, error)) {
    std::uint64_t files = 0;
    std::uint64_t bytes = 0;
    const bool complete = session.state == SessionInfo::State::Complete;
    if (complete && store.size(session, files, bytes, error)) {
      say("bytes", static_cast<int>(bytes));
    }
    error = Error();
    say("removed", store.remove(session, error));
    say("error", error.code);
  }
}

auto removalCheck(const std::string &folder) {
  return [folder](const Seen &seen, Findings &findings) {
    findings.expect(!seen.isTrue("removed") || !seen.exists(folder), "removed, but there");
    findings.expect(!seen.isFalse("removed") || seen.valueOf("error") != "0",
                    "not removed, but there is no error");
    findings.expect(seen.valueOf("bytes").empty() || seen.valueOf("bytes") == "6",
                    "another size: " + seen.valueOf("bytes"));
  };
}

void adopt() {
  SessionStore store;
  std::vector<SessionInfo> sessions;
  Error error;
  if (!store.list(sessions, error)) {
    return;
  }
  for (const SessionInfo &session : sessions) {
    std::string id;
    if (session.state == SessionInfo::State::Lost) {
      error = Error();
      const bool adopted = store.adopt(session, id, error);
      say("id", id);
      say("error", error.code);
      say("adopted", adopted);
    }
  }
}

void checkAdopted(const Seen &seen, Findings &findings) {
  const std::string link = kRoot + "/" + seen.valueOf("id");
  findings.expect(!seen.isTrue("adopted") ||
                      seen.contentOf(link) == "-> " + onVolume("seln.Ii9Jj0"),
                  "adopted, but the link does not lead there");
  findings.expect(!seen.isFalse("adopted") || seen.valueOf("error") != "0",
                  "not adopted, but there is no error");
  findings.expect(seen.contentOf(onVolume("seln.Ii9Jj0") + "/file") == "12345",
                  "the content is lost");
}

} // namespace

void addServiceScenarios(Scenarios &all) {
  all.push_back({"run lock", [] {}, takeLock, checkLock, {}});
  all.push_back({"published file", [] {}, publish, checkPublished, {}});
  all.push_back({"published file, replaced", prepareTarget, publish, checkPublished, {}});
  // A session that cannot be put back keeps its fresh name, with what is left in it.
  const std::vector<std::string> fresh = {
      kRoot + "/sess.*",  kRoot + "/seln.*",    kRoot + "/sess.*/*",    kRoot + "/sess.*/*/*",
      onVolume("seln.*"), onVolume("seln.*/*"), onVolume("seln.*/*/*"), kRoot + "/__sess__.lock"};
  all.push_back({"session store prune", prepareSessions, prune, checkPruned, fresh});
  all.push_back({"session store list", prepareSessions, list, checkListed, {}});
  all.push_back({"session store remove", prepareSessions, [] { removeOne("sess.Aa1Bb2"); },
                 removalCheck(kOld), fresh});
  all.push_back({"session store remove on a volume", prepareSessions,
                 [] { removeOne("seln.Cc3Dd4"); }, removalCheck(onVolume("seln.Cc3Dd4")), fresh});
  all.push_back({"session store adopt", prepareSessions, adopt, checkAdopted, fresh});
}

} // namespace KovaTest::Faults
