#ifndef KOVABACKUP_TESTS_SCRATCH_H
#define KOVABACKUP_TESTS_SCRATCH_H

/// @file A folder for one test, and what tests ask about files.

#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <string>
#include <sys/stat.h>

namespace KovaTest {

/// The folder /tmp/scratch, empty at first, gone with the object.
class Scratch {
public:
  Scratch() { std::filesystem::create_directory(path); }
  ~Scratch() { std::filesystem::remove_all(path); }
  Scratch(const Scratch &) = delete;
  Scratch &operator=(const Scratch &) = delete;

  std::string operator/(const std::string &name) const { return path + "/" + name; }

  const std::string path = "/tmp/scratch";
};

/// The names in a folder; none when there is no such folder.
inline std::set<std::string> namesIn(const std::string &dir) {
  std::set<std::string> names;
  std::error_code ignored;
  for (const auto &entry : std::filesystem::directory_iterator(dir, ignored)) {
    names.insert(entry.path().filename().string());
  }
  return names;
}

/// Whether something stands there, a dangling link too.
inline bool isThere(const std::string &path) {
  struct stat info;
  return ::lstat(path.c_str(), &info) == 0;
}

/// Permission bits, set-id and sticky bits; -1 when nothing is there.
inline int modeOf(const std::string &path) {
  struct stat info;
  return ::lstat(path.c_str(), &info) == 0 ? static_cast<int>(info.st_mode & 07777U) : -1;
}

inline void writeText(const std::string &path, const std::string &text) {
  std::ofstream(path, std::ios::binary) << text;
}

inline std::string readText(const std::string &path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

/// Sets the umask while it stands.
class ScopedUmask {
public:
  explicit ScopedUmask(mode_t mask) : before_(::umask(mask)) {}
  ~ScopedUmask() { ::umask(before_); }
  ScopedUmask(const ScopedUmask &) = delete;
  ScopedUmask &operator=(const ScopedUmask &) = delete;

private:
  mode_t before_;
};

/// Changes the working directory while it stands.
class ScopedWorkingDir {
public:
  explicit ScopedWorkingDir(const std::string &dir) { std::filesystem::current_path(dir); }
  ~ScopedWorkingDir() { std::filesystem::current_path(before_); }
  ScopedWorkingDir(const ScopedWorkingDir &) = delete;
  ScopedWorkingDir &operator=(const ScopedWorkingDir &) = delete;

private:
  const std::filesystem::path before_ = std::filesystem::current_path();
};

} // namespace KovaTest

#endif
