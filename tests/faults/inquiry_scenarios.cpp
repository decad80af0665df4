// What exists and who uses it: sessions, trees, and sections that are reserved.

#include "kovabackup/option_map.h"
#include "kovabackup/path_filter.h"
#include "kovabackup/service/session_store.h"
#include "kovabackup/service/tree_walk.h"
#include "tests/faults/attempt.h"
#include "tests/faults/sessions.h"
#include "tests/faults/world.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::OptionMap;
using KOVA::Backup::PathFilter;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::SessionInfo;
using KOVA::Backup::Service::SessionPart;
using KOVA::Backup::Service::SessionStore;
using KOVA::Backup::Service::SessionUser;
using KOVA::Backup::Service::TreeWalk;
using KOVA::Backup::Service::WalkEntry;

void sayUsers(SessionStore &store, const SessionInfo &session) {
  attempt("users", [&] {
    std::vector<SessionUser> users{SessionUser()};
    const bool known = store.users(session, users);
    return known ? static_cast<int>(users.size()) : users.empty() ? -1 : -2;
  });
}

void saySize(SessionStore &store, const SessionInfo &session) {
  attempt("bytes", [&] {
    std::uint64_t files = 0;
    std::uint64_t bytes = 0;
    std::vector<SessionPart> parts;
    Error error;
    const bool counted = store.size(session, files, bytes, error, &parts);
    say("parts", static_cast<int>(parts.size()));
    say("counted", counted || error.code != 0);
    return counted ? static_cast<int>(bytes) : -1;
  });
}

void inspect() {
  SessionStore store;
  SessionInfo session;
  Error error;
  attempt("id", [] { return SessionStore::isId("sess.Aa1Bb2") && !SessionStore::isId("sess"); });
  attempt("root", [] { return SessionStore::root(); });
  say("trusted", store.trusted(error) || error.code != 0);
  if (store.find("sess.Aa1Bb2", session, error) && session.state == SessionInfo::State::Complete) {
    sayUsers(store, session);
    saySize(store, session);
  }
}

void checkInspected(const Seen &seen, Findings &findings) {
  checkAttempt(seen, findings, "id");
  checkAttempt(seen, findings, "root");
  findings.expect(!seen.isFalse("trusted"), "not trusted, but there is no error");
  findings.expect(!seen.isFalse("counted"), "not counted, but there is no error");
  const std::string users = seen.valueOf("users");
  findings.expect(users.empty() || users == "0" || users == "-1" || users == kBadAlloc,
                  "users: " + users);
  const std::string bytes = seen.valueOf("bytes");
  findings.expect(bytes.empty() || bytes == "6" || bytes == "-1" || bytes == kBadAlloc,
                  "bytes: " + bytes);
}

const std::string kTree = std::string(kWork) + "/tree";

void prepareTree() {
  for (const std::string folder : {"/a/deep", "/b"}) {
    fs::create_directories(kTree + folder);
    std::ofstream(kTree + folder + "/file") << "12345";
  }
}

void walkWithReasons() {
  PathFilter filter;
  (void)filter.addExcludePattern(kTree + "/b/**");
  (void)filter.addIncludePattern(kTree + "/b/f*");
  TreeWalk walk(kTree, filter);
  WalkEntry entry;
  std::string text;
  bool complete = true;
  while (walk.next(entry)) {
    complete = complete && entry.error.code == 0;
    std::string pattern;
    if (walk.decidedBy(pattern)) {
      text += (entry.kept ? "+" : "-") + pattern.substr(kTree.size()) + " ";
    }
    if (entry.path == kTree + "/a") {
      walk.skipFolder();
    }
    complete = complete && entry.path.find("deep") == std::string::npos;
  }
  say("reasons", text);
  say("complete", complete);
}

void checkReasons(const Seen &seen, Findings &findings) {
  if (seen.isTrue("complete")) {
    checkAttempt(seen, findings, "reasons");
  }
}

const std::string kFile = std::string(kWork) + "/task.conf";
constexpr const char *kBefore = "[task1]\nname=\"old\"\n[other]\nx=1"; // without a line end

void prepareFile() {
  std::ofstream(kFile) << kBefore;
}

void reserve() {
  say("new", OptionMap::optSectionGetUniqueId(kFile, "task"));
  say("seven", OptionMap::optSectionCreateUniqueId(kFile, "task", 7));
  say("named", OptionMap::optSectionCreateUniqueName(kFile, "more"));
  say("taken", !OptionMap::optSectionCreateUniqueName(kFile, "other"));
}

void createById() {
  OptionMap map;
  (void)map.setLockToken("task.conf");
  say("seven", map.optSectionCreate(kFile, "task", 7));
  say("id", map.optSectionGetId());
}

// Each header is added to the end, and only where that is said to have succeeded.
void checkReserved(const Seen &seen, Findings &findings) {
  const std::string content = seen.contentOf(kFile);
  std::string reserved = std::string(kBefore) + "\n";
  reserved += seen.valueOf("new") == "2" ? "[task2]\n" : "";
  reserved += seen.isTrue("seven") ? "[task7]\n" : "";
  reserved += seen.isTrue("named") ? "[more]\n" : "";
  findings.expect(!seen.isFalse("taken"), "a name that is taken was reserved");
  if (seen.killed() || seen.failedIn("flock close memory")) {
    findings.expect(content.rfind(kBefore, 0) == 0, "torn:\n" + content);
    return;
  }
  findings.expect(content == reserved || (content == kBefore && reserved == content + "\n"),
                  "another content:\n" + content);
}

} // namespace

void addInquiryScenarios(Scenarios &all) {
  all.push_back({"session store users and sizes", makeLocalSessions, inspect, checkInspected, {}});
  all.push_back({"tree walk with reasons", prepareTree, walkWithReasons, checkReasons, {}});
  all.push_back({"option reserve", prepareFile, reserve, checkReserved, {}});
  all.push_back({"option create by id", prepareFile, createById, checkReserved, {}});
  all.back().keepsDescriptorsIf = "flock"; // the map then still holds its lock
}

} // namespace KovaTest::Faults
