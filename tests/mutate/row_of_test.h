// What scripts/mutate adds to the main function of the tests in its copy: the row of the table in
// which a test's mutants are recorded. Row 0 is for what happens outside all tests.
#ifndef KOVABACKUP_TESTS_MUTATE_ROW_OF_TEST_H
#define KOVABACKUP_TESTS_MUTATE_ROW_OF_TEST_H

#include "tests/mutate/mutants.h"

#include <gtest/gtest.h>

class KovaRowOfTest : public testing::EmptyTestEventListener {
  void OnTestStart(const testing::TestInfo & /*info*/) override {
    if (kovaReached != nullptr) {
      kovaReached->test = ++tests_;
    }
  }
  void OnTestEnd(const testing::TestInfo & /*info*/) override {
    if (kovaReached != nullptr) {
      kovaReached->test = 0;
    }
  }
  unsigned tests_ = 0;
};

inline int kovaRunAllTests() {
  testing::UnitTest::GetInstance()->listeners().Append(new KovaRowOfTest);
  return RUN_ALL_TESTS();
}

#endif
