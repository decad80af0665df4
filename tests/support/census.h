#ifndef KOVABACKUP_TESTS_CENSUS_H
#define KOVABACKUP_TESTS_CENSUS_H

/// @file What a test may not leave behind: descriptors, children, signal actions, mask,
/// environment, working directory, umask and files in /tmp.

#include <gtest/gtest.h>
#include <map>
#include <string>

namespace KovaTest {

/// What the process holds, each thing under a name: "fd 4" -> "/dev/null".
using Census = std::map<std::string, std::string>;

Census takeCensus();

/// Descriptors open now.
int countOpenDescriptors();

/// Fails a test after which the census is another than before it. The fixed root /tmp/kovabackup
/// may stay; it is removed between tests.
class CensusGuard : public testing::EmptyTestEventListener {
  void OnTestStart(const testing::TestInfo &info) override;
  void OnTestEnd(const testing::TestInfo &info) override;

  Census before_;
};

} // namespace KovaTest

#endif
