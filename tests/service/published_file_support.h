#ifndef KOVABACKUP_TESTS_SERVICE_PUBLISHED_FILE_SUPPORT_H
#define KOVABACKUP_TESTS_SERVICE_PUBLISHED_FILE_SUPPORT_H

/// @file What the tests of PublishedFile share: a target in a scratch folder.

#include "kovabackup/service/published_file.h"

#include "tests/service/expect_error.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"

#include <cerrno>
#include <climits>
#include <gmock/gmock.h>
#include <unistd.h>

namespace KovaTest {

using KOVA::Backup::Service::PublishedFile;

inline void writeTo(int fd, const std::string &text) {
  ASSERT_EQ(static_cast<ssize_t>(text.size()), ::write(fd, text.data(), text.size()));
}

/// A file system without unnamed files, or the one that is there.
enum class Files { Unnamed, Named };

class PublishedFileTest : public testing::Test {
protected:
  /// Takes unnamed files away for the lifetime of the result.
  static Fault files(Files kind) {
    return {"O_TMPFILE", kind == Files::Named ? 1 : INT_MAX, EOPNOTSUPP, true};
  }

  const TestFolder folder_;
  const std::string target_ = folder_ / "target";
  Error error_;
};

} // namespace KovaTest

#endif
