#ifndef KOVABACKUP_TESTS_TEMP_FILE_FIXTURE_H
#define KOVABACKUP_TESTS_TEMP_FILE_FIXTURE_H

/// @file Shared by the tests of temporary files.

#include "kovabackup/temp_manager.h"
#include "tests/support/files.h"

#include <cstdint>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <string>

namespace KovaTest {

/// The layout of a ScopedTempFile that is compiled into callers.
struct TempFileFields {
  void *table;
  int descriptor;
  std::string path;
  std::uint32_t pathHash;
};
static_assert(sizeof(TempFileFields) == sizeof(KOVA::Backup::ScopedTempFile),
              "descriptor, path, hash and no more");

inline TempFileFields &fieldsOf(KOVA::Backup::ScopedTempFile &file) {
  return *reinterpret_cast<TempFileFields *>(&file);
}

inline void expectOwnsNothing(const KOVA::Backup::ScopedTempFile &file) {
  EXPECT_FALSE(file.isValid());
  EXPECT_EQ("", file.getPath());
  EXPECT_EQ(-1, file.getFileDescripter());
}

inline bool isOpen(int fd) {
  return ::fcntl(fd, F_GETFD) != -1;
}

/// The fixture of tests with a scratch folder.
class TempFile : public testing::Test {
protected:
  TestFolder scratch;
};

} // namespace KovaTest

#endif
