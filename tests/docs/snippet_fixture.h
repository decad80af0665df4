#ifndef KOVABACKUP_TESTS_SNIPPET_FIXTURE_H
#define KOVABACKUP_TESTS_SNIPPET_FIXTURE_H

/// @file The environment in which the code blocks of the documents run: a machine with one volume,
/// and an empty working directory.
///
/// The volume is /mnt/volume1, a directory that the configuration of the stand-ins names, with the
/// shares "photo" and "music". The working directory is an empty folder in the private /tmp; the
/// key of secrets is next to it.

#include "tests/support/log_capture.h"

#include <csignal>
#include <gtest/gtest.h>
#include <string>
#include <vector>

namespace KovaTest {

/// Ends a block with a failure that shows the claim and its line in the document.
[[noreturn]] void snippetFailed(const char *claim, int line);

class SnippetTest : public testing::Test {
protected:
  static void SetUpTestSuite();
  void SetUp() override;
  void TearDown() override;

  /// Runs a block, which must log these messages, "MODULE:NUMBER TEXT", in this order.
  static void run(bool (*block)(), const std::vector<std::string> &messages);

private:
  std::string directoryBefore_;
  struct sigaction intBefore_ = {};
  struct sigaction termBefore_ = {};
};

} // namespace KovaTest

#endif
