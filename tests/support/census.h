#ifndef KOVABACKUP_TESTS_CENSUS_H
#define KOVABACKUP_TESTS_CENSUS_H

/// @file What a test may not leave behind: descriptors, children, signal actions, mask,
/// environment, working directory, umask and files in /tmp.

#include <gtest/gtest.h>
#include <map>
#include <string>

namespace KovaTest {

/// The state of the process, each item by name: "fd 4" -> "/dev/null".
using Census = std::map<std::string, std::string>;

Census takeCensus();

/// The number of open descriptors.
int countOpenDescriptors();

/// Fails a test after which the census differs from the one before it. The IPC root /tmp/kovabackup
/// may stay; it is removed between tests.
class CensusGuard : public testing::EmptyTestEventListener {
  void OnTestStart(const testing::TestInfo &info) override;
  void OnTestEnd(const testing::TestInfo &info) override;

  Census before_;
};

} // namespace KovaTest

#endif
