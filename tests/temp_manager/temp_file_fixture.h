#ifndef KOVABACKUP_TESTS_TEMP_FILE_FIXTURE_H
#define KOVABACKUP_TESTS_TEMP_FILE_FIXTURE_H

/// @file What the tests of temporary files share.

#include "kovabackup/temp_manager.h"
#include "tests/support/files.h"

#include <cstdint>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <string>

namespace KovaTest {

/// A ScopedTempFile as a caller's compiled code knows it.
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

/// A test with a folder of its own.
class TempFile : public testing::Test {
protected:
  TestFolder scratch;
};

} // namespace KovaTest

#endif
