#ifndef KOVABACKUP_TESTS_SERVICE_EXPECT_ERROR_H
#define KOVABACKUP_TESTS_SERVICE_EXPECT_ERROR_H

/// @file Expects an Error with all its members.

#include "kovabackup/service/error.h"

#include <gtest/gtest.h>

namespace KovaTest {

using KOVA::Backup::Service::Error;

inline void expectError(const Error &error, int code, const std::string &step,
                        const std::string &path) {
  EXPECT_EQ(code, error.code);
  EXPECT_EQ(step, error.step);
  EXPECT_EQ(path, error.path);
}

} // namespace KovaTest

#endif
