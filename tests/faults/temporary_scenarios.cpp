// Temporary files and folders, in /tmp and on a volume.

#include "kovabackup/path_util.h"
#include "kovabackup/temp_manager.h"
#include "tests/faults/report.h"
#include "tests/faults/scenario.h"
#include "tests/faults/world.h"

#include <filesystem>
#include <fstream>
#include <string>

namespace KovaTest::Faults {
namespace {

using KOVA::Backup::ScopedTempFile;
using KOVA::Backup::ScopedTempFolder;
using KOVA::Backup::ScopedVolumeTempFile;
using KOVA::Backup::TempManager;

const std::string kFinal = std::string(kWork) + "/final";
const std::string kTemporary = std::string(kWork) + "/new.*";

void renameFile() {
  ScopedTempFile file(std::string(kWork) + "/new", false);
  say("made", file.isValid());
  say("renamed", file.isValid() && file.rename(kFinal));
}

void renameFolder() {
  ScopedTempFolder folder(std::string(kWork) + "/new");
  say("made", folder.isValid());
  say("renamed", folder.isValid() && folder.rename(kFinal));
}

void checkRenamed(const Seen &seen, Findings &findings) {
  findings.expect(seen.exists(kFinal) || !seen.isTrue("renamed"), "renamed, but not there");
  findings.expect(!seen.exists(kFinal) || !seen.isFalse("renamed"), "not renamed, but there");
  const bool maySilentlyStay =
      seen.killed() || seen.failedIn("chmod unlink rmdir newfstatat openat fstat getdents64 fcntl "
                                     "close brk mmap memory");
  findings.expect(seen.matching(kTemporary).empty() || maySilentlyStay, "the temporary one stays");
}

void onVolume() {
  const ScopedVolumeTempFile file(TempManager::maxVolume(), "piece", true);
  say("made", file.isValid());
  say("path", file.getPath());
}

void checkGone(const Seen &seen, Findings &findings) {
  findings.expect(seen.matching(volume() + "/.kova_tmp/piece.*").empty() || seen.killed() ||
                      seen.failedIn("chmod unlink"),
                  "the temporary file stays");
  findings.expect(!seen.isTrue("made") || !seen.valueOf("path").empty() || seen.killed() ||
                      seen.failedIn("memory"),
                  "made without a path");
}

void prepareTree() {
  std::filesystem::create_directories(kFinal + "/a/b");
  std::ofstream(kFinal + "/a/b/file") << "1";
  std::ofstream(kFinal + "/file") << "1";
}

void removeTree() {
  say("removed", KOVA::Backup::removeAll(kFinal));
}

// The walk is documented to end early without a word; a failed removal is never silent.
void checkRemoved(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("removed") || !seen.exists(kFinal) ||
                      !seen.failedIn("unlink unlinkat rmdir"),
                  "removed, but there");
  findings.expect(!seen.isFalse("removed") || !seen.log.empty(), "not removed, without a word");
}

void lockFile() {
  const int fd = KOVA::Backup::Path::createIpcLockFile("faults");
  say("opened", fd >= 0);
}

void checkLockFile(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("opened") || seen.exists("/tmp/kovabackup/lock/faults"),
                  "opened, but not there");
}

} // namespace

void addTemporaryScenarios(Scenarios &all) {
  all.push_back({"temporary file", [] {}, renameFile, checkRenamed, {kTemporary}});
  all.push_back({"temporary folder", [] {}, renameFolder, checkRenamed, {kTemporary}});
  all.push_back({"temporary file on a volume",
                 [] {},
                 onVolume,
                 checkGone,
                 {volume() + "/.kova_tmp", volume() + "/.kova_tmp/piece.*"}});
  all.push_back({"removeAll", prepareTree, removeTree, checkRemoved, {}});
  all.push_back({"lock file", [] {}, lockFile, checkLockFile, {}});
  all.back().keepsDescriptors = true; // the caller's, who closes it
}

} // namespace KovaTest::Faults
