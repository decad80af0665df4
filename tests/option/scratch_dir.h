#ifndef KOVABACKUP_TESTS_SCRATCH_DIR_H
#define KOVABACKUP_TESTS_SCRATCH_DIR_H

/// @file A directory of the test's own, removed with all that is in it. Files are written and read
/// by system calls, so that a stream function which is to fail is the library's.

#include "base/unique_fd.h"

#include <cstdlib>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <string>
#include <unistd.h>

namespace KovaTest {

class ScratchDir {
public:
  ScratchDir() { EXPECT_NE(nullptr, ::mkdtemp(dir_)); }
  ~ScratchDir() {
    const std::string command = std::string("rm -rf ") + dir_;
    EXPECT_EQ(0, std::system(command.c_str()));
  }
  ScratchDir(const ScratchDir &) = delete;
  ScratchDir &operator=(const ScratchDir &) = delete;

  std::string path(const std::string &name) const { return std::string(dir_) + "/" + name; }

  /// Makes a file with that content and gives its path.
  std::string file(const std::string &name, const std::string &content) const {
    const KOVA::Base::UniqueFd fd(
        ::open(path(name).c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0600));
    EXPECT_EQ(static_cast<ssize_t>(content.size()),
              ::write(fd.get(), content.data(), content.size()));
    return path(name);
  }

private:
  char dir_[32] = "/tmp/option.XXXXXX";
};

inline std::string contentOf(const std::string &path) {
  const KOVA::Base::UniqueFd fd(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_TRUE(fd) << "no " << path;
  std::string content;
  char part[65536];
  for (ssize_t size = ::read(fd.get(), part, sizeof part); size > 0;
       size = ::read(fd.get(), part, sizeof part)) {
    content.append(part, static_cast<std::size_t>(size));
  }
  return content;
}

} // namespace KovaTest

#endif
