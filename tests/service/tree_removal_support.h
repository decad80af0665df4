#ifndef KOVABACKUP_TESTS_SERVICE_TREE_REMOVAL_SUPPORT_H
#define KOVABACKUP_TESTS_SERVICE_TREE_REMOVAL_SUPPORT_H

/// @file A tree in /tmp/tree for each test, what a removal of it reports, and what it leaves.

#include "kovabackup/service/tree_removal.h"

#include "tests/service/tree_support.h"

#include "base/unique_fd.h"

#include <algorithm>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <linux/fs.h>
#include <ostream>
#include <string>
#include <sys/ioctl.h>
#include <vector>

namespace KovaTest {

using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::TreeRemoval;

struct Outcome {
  bool gone = false;
  Paths failures;
  bool operator==(const Outcome &other) const {
    return gone == other.gone && failures == other.failures;
  }
};

inline const Outcome kGone = {true, {}};

inline std::ostream &operator<<(std::ostream &out, const Outcome &outcome) {
  out << (outcome.gone ? "gone" : "not gone");
  for (const std::string &one : outcome.failures) {
    out << "\n  " << one;
  }
  return out;
}

inline Outcome removeTree(const std::string &path) {
  Outcome outcome;
  outcome.gone = TreeRemoval::remove(path, [&](const Error &error) {
    outcome.failures.push_back(failure(error.step, error.path, error.code));
  });
  return outcome;
}

/// Everything at and below path, sorted; nothing when nothing is at path.
inline Paths pathsIn(const std::string &path) {
  namespace fs = std::filesystem;
  Paths paths;
  if (fs::symlink_status(path).type() != fs::file_type::not_found) {
    paths.push_back(path);
  }
  if (fs::is_directory(fs::symlink_status(path))) {
    for (const fs::directory_entry &entry : fs::recursive_directory_iterator(path)) {
      paths.push_back(entry.path());
    }
  }
  std::sort(paths.begin(), paths.end());
  return paths;
}

/// Returns: false when the file system has no immutable files.
inline bool setImmutable(const std::string &path, bool on) {
  const KOVA::Base::UniqueFd file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK));
  int flags = 0;
  if (::ioctl(file.get(), FS_IOC_GETFLAGS, &flags) != 0) {
    return false;
  }
  flags = on ? flags | FS_IMMUTABLE_FL : flags & ~FS_IMMUTABLE_FL;
  return ::ioctl(file.get(), FS_IOC_SETFLAGS, &flags) == 0;
}

class TreeRemovalTest : public testing::Test {
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

  static inline const std::string kRoot = "/tmp/tree";
  static inline const std::string kOutside = "/tmp/outside";
};

} // namespace KovaTest

#endif
