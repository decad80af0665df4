// Walks through trees and their removal, of the second library.

#include "kovabackup/path_filter.h"
#include "kovabackup/service/tree_removal.h"
#include "kovabackup/service/tree_walk.h"
#include "tests/faults/report.h"
#include "tests/faults/scenario.h"
#include "tests/faults/world.h"

#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/stat.h>

namespace KovaTest::Faults {
namespace {

using KOVA::Backup::PathFilter;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::TreeRemoval;
using KOVA::Backup::Service::TreeWalk;
using KOVA::Backup::Service::WalkEntry;
using KOVA::Backup::Service::WalkOptions;

const std::string kTree = std::string(kWork) + "/tree";

void prepareTree() {
  for (const std::string folder : {"/a/deep/deeper", "/b", "/cache"}) {
    std::filesystem::create_directories(kTree + folder);
    std::ofstream(kTree + folder + "/file") << "12345";
  }
  std::filesystem::create_symlink("target", kTree + "/link");
  std::ofstream(kTree + "/cache/CACHEDIR.TAG") << "Signature: 8a477f597d28d172789f06886806bc55\n";
}

void walk() {
  PathFilter filter;
  (void)filter.addExcludePattern(kTree + "/b/**");
  WalkOptions options;
  options.skipCaches = true;
  TreeWalk walk(kTree, filter, options);
  WalkEntry entry;
  std::string kept;
  int failures = 0;
  while (walk.next(entry)) {
    failures += entry.error.code != 0 ? 1 : 0;
    std::string target;
    Error error;
    if (S_ISLNK(entry.mode) && !walk.linkTarget(target, error)) {
      ++failures;
    }
    kept += entry.kept ? entry.path.substr(kTree.size()) + target + " " : "";
  }
  say("kept", kept);
  say("complete", failures == 0);
}

// A cache folder whose tag cannot be read is walked like any other.
void checkWalk(const Seen &seen, Findings &findings) {
  if (!seen.isTrue("complete") || seen.clean == nullptr) {
    return;
  }
  const std::string kept = " " + seen.valueOf("kept");
  std::istringstream wanted(seen.clean->valueOf("kept"));
  for (std::string path; wanted >> path;) {
    findings.expect(kept.find(" " + path + " ") != std::string::npos,
                    "no failure, but missing: " + path);
  }
}

void remove() {
  int failures = 0;
  const bool removed = TreeRemoval::remove(kTree, [&failures](const Error &) { ++failures; });
  say("failures", failures);
  say("removed", removed);
}

void checkRemoval(const Seen &seen, Findings &findings) {
  findings.expect(!seen.isTrue("removed") || !seen.exists(kTree), "removed, but there");
  findings.expect(!seen.isFalse("removed") || seen.valueOf("failures") != "0",
                  "not removed, but no failure was reported");
}

} // namespace

void addTreeScenarios(Scenarios &all) {
  all.push_back({"tree walk", prepareTree, walk, checkWalk, {}});
  all.push_back({"tree removal", prepareTree, remove, checkRemoval, {}});
}

} // namespace KovaTest::Faults
