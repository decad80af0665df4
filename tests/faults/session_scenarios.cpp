// Sessions: created, loaded and destroyed, locally and on a volume.

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"
#include "tests/faults/report.h"
#include "tests/faults/scenario.h"
#include "tests/faults/world.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <sys/stat.h>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;
using KOVA::Backup::Session;
using KOVA::Backup::TempManager;

const std::string kLocal = std::string(kSessionRoot) + "/sess.Aa1Bb2";
const std::string kLink = std::string(kSessionRoot) + "/seln.Cc3Dd4";

std::string volumeFolder() {
  return volume() + "/.kova_tmp/seln.Cc3Dd4";
}

void fill(const std::string &folder) {
  fs::create_directories(folder + "/below");
  ::chmod(folder.c_str(), 0700);
  std::ofstream(folder + "/file") << "12345";
  std::ofstream(folder + "/below/file") << "1";
}

void prepareRoot() {
  (void)KOVA::Backup::Path::createIpcTempPath("session", 0700);
}

void prepareLocal() {
  prepareRoot();
  fill(kLocal);
}

void prepareVolume() {
  prepareRoot();
  fill(volumeFolder());
  fs::create_symlink(volumeFolder(), kLink);
}

void saySession(bool created, const Session &session) {
  say("created", created);
  say("id", session.getId());
  say("path", session.getPath());
}

void createLocal() {
  Session session;
  const bool created = session.create();
  saySession(created, session);
}

void createOnVolume() {
  Session session;
  const bool created = session.create(TempManager::maxVolume());
  saySession(created, session);
}

// After a session was created, memory ran out before it was named.
bool hasThrown(const Seen &seen) {
  return !seen.valueOf("threw").empty();
}

// A folder whose mode cannot be set remains, as temp_manager.h says.
void checkCreated(const Seen &seen, Findings &findings, const std::string &pattern) {
  const std::vector<std::string> found = seen.matching(pattern);
  if (seen.isTrue("created")) {
    findings.expect(found.size() == 1 && (found[0] == seen.valueOf("path") || hasThrown(seen)),
                    "created, but the folder is not there");
  } else if (!seen.killed()) {
    const bool mayStay = seen.failedIn("chmod rmdir unlink " + std::string(kWalkCalls));
    findings.expect(found.empty() || mayStay, "not created, but a folder is there");
    findings.expect(seen.valueOf("id").empty(), "not created, but the object has an id");
  }
}

void checkLocal(const Seen &seen, Findings &findings) {
  checkCreated(seen, findings, std::string(kSessionRoot) + "/sess.*");
}

void checkVolume(const Seen &seen, Findings &findings) {
  checkCreated(seen, findings, volume() + "/.kova_tmp/seln.*");
  const std::string link = std::string(kSessionRoot) + "/" + seen.valueOf("id");
  if (seen.isTrue("created") && !hasThrown(seen)) {
    findings.expect(seen.contentOf(link) == "-> " + seen.valueOf("path"),
                    "created, but the link does not lead to the folder");
  } else if (!seen.isTrue("created") && !seen.killed()) {
    findings.expect(seen.matching(std::string(kSessionRoot) + "/seln.*").empty() ||
                        seen.failedIn("flock unlink"),
                    "not created, but a link is there");
  }
}

void loadAndDestroy(const char *id) {
  Session session;
  say("loaded", session.load(id));
  say("destroyed", session.destroy());
}

void checkDestroyed(const Seen &seen, Findings &findings, const std::string &folder,
                    const std::string &link) {
  if (seen.isTrue("loaded") && seen.isTrue("destroyed")) {
    findings.expect(!seen.exists(folder) || seen.failedIn(kWalkCalls),
                    "destroyed, but the folder is there");
    findings.expect(!seen.exists(link), "destroyed, but the link is there");
  } else if (seen.isFalse("loaded")) {
    findings.expect(seen.contentOf(folder + "/file") == "12345",
                    "not loaded, but its content is lost");
  }
}

void addCreation(Scenarios &all) {
  const std::string root = kSessionRoot;
  all.push_back({"session create", [] {}, createLocal, checkLocal, {root + "/sess.*"}});
  all.push_back({"session create on a volume",
                 [] {},
                 createOnVolume,
                 checkVolume,
                 {root + "/seln.*", volume() + "/.kova_tmp/seln.*"}});
}

} // namespace

void addSessionScenarios(Scenarios &all) {
  addCreation(all);
  all.push_back(
      {"session destroy",
       prepareLocal,
       [] { loadAndDestroy("sess.Aa1Bb2"); },
       [](const Seen &seen, Findings &findings) { checkDestroyed(seen, findings, kLocal, ""); },
       {}});
  all.push_back({"session destroy on a volume",
                 prepareVolume,
                 [] { loadAndDestroy("seln.Cc3Dd4"); },
                 [](const Seen &seen, Findings &findings) {
                   checkDestroyed(seen, findings, volumeFolder(), kLink);
                 },
                 {}});
  all.push_back({"session destroy by id",
                 prepareVolume,
                 [] {
                   say("loaded", true);
                   say("destroyed", Session::destroyById("seln.Cc3Dd4"));
                 },
                 [](const Seen &seen, Findings &findings) {
                   checkDestroyed(seen, findings, volumeFolder(), kLink);
                 },
                 {}});
}

} // namespace KovaTest::Faults
