#ifndef KOVABACKUP_TESTS_FILES_H
#define KOVABACKUP_TESTS_FILES_H

/// @file A scratch folder, and what tests ask about files.
///
///     const TestFolder folder;
///     writeFile(folder / "conf", "[s]\n");
///     ... run the operation ...
///     EXPECT_EQ("[s]\nk=1\n", readFile(folder / "conf"));
///     EXPECT_EQ(0640, modeOf(folder / "conf"));
///
/// Reading and writing bypass libc's functions: a Fault (fault.h) counts and fails the calls of the
/// code under test only.

#include <set>
#include <string>
#include <sys/types.h>

namespace KovaTest {

/// An empty folder for one test, removed at the end with everything in it: /tmp/scratch, or
/// /tmp/scratch2, /tmp/scratch3 and so on while others exist.
class TestFolder {
public:
  TestFolder();
  ~TestFolder();
  TestFolder(const TestFolder &) = delete;
  TestFolder &operator=(const TestFolder &) = delete;

  const std::string &path() const { return path_; }
  std::string operator/(const std::string &name) const { return path_ + "/" + name; }
  std::set<std::string> names() const;

private:
  std::string path_;
};

/// Creates the file (0644, subject to the umask) or replaces its content. Fails the test when that
/// is not possible. Returns path.
std::string writeFile(const std::string &path, const std::string &content);

/// The content of a file; of a FIFO, what arrives until its writers have closed it. Fails the test
/// when the file cannot be read.
std::string readFile(const std::string &path);

/// The names in a folder; none when the folder does not exist.
std::set<std::string> namesIn(const std::string &folder);

/// Whether anything exists at path, a dangling link included.
bool isThere(const std::string &path);

/// The permission, set-id and sticky bits, of a link its own; -1 when nothing exists at path.
int modeOf(const std::string &path);

/// Replaces the umask for its lifetime.
class ScopedUmask {
public:
  explicit ScopedUmask(mode_t mask);
  ~ScopedUmask();
  ScopedUmask(const ScopedUmask &) = delete;
  ScopedUmask &operator=(const ScopedUmask &) = delete;

private:
  const mode_t before_;
};

/// Replaces the working directory for its lifetime.
class ScopedWorkingDir {
public:
  explicit ScopedWorkingDir(const std::string &folder);
  ~ScopedWorkingDir();
  ScopedWorkingDir(const ScopedWorkingDir &) = delete;
  ScopedWorkingDir &operator=(const ScopedWorkingDir &) = delete;

private:
  const std::string before_;
};

} // namespace KovaTest

#endif
