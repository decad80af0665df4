#ifndef KOVABACKUP_TESTS_SERVICE_TREE_WALK_SUPPORT_H
#define KOVABACKUP_TESTS_SERVICE_TREE_WALK_SUPPORT_H

/// @file A tree in /tmp/walk for each test, and what a walk through it gives.

#include "kovabackup/service/tree_walk.h"

#include "tests/service/tree_support.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace KovaTest {

using KOVA::Backup::PathFilter;
using KOVA::Backup::Service::TreeWalk;
using KOVA::Backup::Service::WalkEntry;
using KOVA::Backup::Service::WalkOptions;

inline std::vector<WalkEntry> walkAll(const std::string &root, PathFilter &filter,
                                      const WalkOptions &options = {}) {
  std::vector<WalkEntry> entries;
  TreeWalk walk(root, filter, options);
  for (WalkEntry entry; walk.next(entry);) {
    entries.push_back(entry);
  }
  return entries;
}

inline std::vector<WalkEntry> walkAll(const std::string &root, const WalkOptions &options = {}) {
  PathFilter filter;
  return walkAll(root, filter, options);
}

inline Paths pathsOf(const std::vector<WalkEntry> &entries) {
  Paths paths;
  for (const WalkEntry &entry : entries) {
    EXPECT_EQ(0, entry.error.code) << entry.error.step << " " << entry.error.path;
    paths.push_back(entry.path);
  }
  return paths;
}

/// The failures of a walk as "step path: code".
inline Paths failuresOf(const std::vector<WalkEntry> &entries) {
  Paths failures;
  for (const WalkEntry &entry : entries) {
    if (entry.error.code != 0) {
      EXPECT_EQ(entry.path, entry.error.path);
      failures.push_back(failure(entry.error.step, entry.path, entry.error.code));
    }
  }
  return failures;
}

class TreeWalkTest : public testing::Test {
protected:
  void SetUp() override { std::filesystem::create_directory(kRoot); }
  void TearDown() override {
    std::filesystem::remove_all(kRoot);
    std::filesystem::remove_all(kOutside);
  }

  /// Makes a file, or a folder when the path ends in "/", with the folders above it.
  static void make(const std::string &path, const std::string &content = "") {
    makeEntry(kRoot, path, content);
  }

  static void makeAll(const Paths &paths) {
    for (const std::string &path : paths) {
      make(path);
    }
  }

  static inline const std::string kRoot = "/tmp/walk";
  static inline const std::string kOutside = "/tmp/outside";
};

} // namespace KovaTest

#endif
