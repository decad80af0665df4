#include "tests/support/files.h"

#include "base/retry_on_eintr.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace KovaTest {
namespace {

namespace fs = std::filesystem;
using KOVA::Base::retryOnEintr;

// A descriptor that libc has not seen opened and will not see closed.
class RawFile {
public:
  RawFile(const std::string &path, int flags)
      : fd_(retryOnEintr([&] {
          return ::syscall(SYS_openat, AT_FDCWD, path.c_str(), flags | O_CLOEXEC, 0644);
        })) {}
  ~RawFile() {
    if (isOpen()) {
      (void)::syscall(SYS_close, fd_);
    }
  }
  RawFile(const RawFile &) = delete;
  RawFile &operator=(const RawFile &) = delete;

  bool isOpen() const { return fd_ >= 0; }
  long read(char *buffer, std::size_t size) const {
    return retryOnEintr([&] { return ::syscall(SYS_read, fd_, buffer, size); });
  }
  long write(const char *data, std::size_t size) const {
    return retryOnEintr([&] { return ::syscall(SYS_write, fd_, data, size); });
  }

private:
  const long fd_;
};

// The first of the names that is free.
std::string makeFolder() {
  const std::string first = "/tmp/scratch";
  std::string path = first;
  for (int number = 2; !fs::create_directory(path); ++number) {
    path = first + std::to_string(number);
  }
  return path;
}

} // namespace

TestFolder::TestFolder() : path_(makeFolder()) {}

TestFolder::~TestFolder() {
  std::error_code error;
  fs::remove_all(path_, error);
  EXPECT_FALSE(error) << "removing " << path_ << ": " << error.message();
}

std::set<std::string> TestFolder::names() const {
  return namesIn(path_);
}

std::string writeFile(const std::string &path, const std::string &content) {
  const RawFile file(path, O_WRONLY | O_CREAT | O_TRUNC);
  EXPECT_TRUE(file.isOpen()) << path << ": " << std::strerror(errno);
  std::size_t done = 0;
  while (file.isOpen() && done < content.size()) {
    const long wrote = file.write(content.data() + done, content.size() - done);
    if (wrote <= 0) {
      ADD_FAILURE() << "writing " << path << ": " << std::strerror(errno);
      break;
    }
    done += static_cast<std::size_t>(wrote);
  }
  return path;
}

std::string readFile(const std::string &path) {
  const RawFile file(path, O_RDONLY);
  EXPECT_TRUE(file.isOpen()) << path << ": " << std::strerror(errno);
  std::string content;
  char part[65536];
  long size = 0;
  while (file.isOpen() && (size = file.read(part, sizeof part)) > 0) {
    content.append(part, static_cast<std::size_t>(size));
  }
  EXPECT_EQ(0, size) << "reading " << path << ": " << std::strerror(errno);
  return content;
}

std::set<std::string> namesIn(const std::string &folder) {
  std::set<std::string> names;
  std::error_code ignored;
  for (const fs::directory_entry &entry : fs::directory_iterator(folder, ignored)) {
    names.insert(entry.path().filename().string());
  }
  return names;
}

bool isThere(const std::string &path) {
  struct stat info;
  return ::lstat(path.c_str(), &info) == 0;
}

int modeOf(const std::string &path) {
  struct stat info;
  return ::lstat(path.c_str(), &info) == 0 ? static_cast<int>(info.st_mode & 07777U) : -1;
}

ScopedUmask::ScopedUmask(mode_t mask) : before_(::umask(mask)) {}

ScopedUmask::~ScopedUmask() {
  ::umask(before_);
}

ScopedWorkingDir::ScopedWorkingDir(const std::string &folder)
    : before_(fs::current_path().string()) {
  fs::current_path(folder);
}

ScopedWorkingDir::~ScopedWorkingDir() {
  fs::current_path(before_);
}

} // namespace KovaTest
