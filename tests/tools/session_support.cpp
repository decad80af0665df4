#include "tests/tools/session_support.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"

#include <ctime>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <utime.h>

namespace KovaTest {

namespace fs = std::filesystem;
using KOVA::Backup::Session;
using KOVA::Backup::Path::createIpcTempPath;
using KOVA::Base::UniqueFd;

const std::string kRoot = "/tmp/kovabackup/session";

void setAge(const std::string &path, int seconds) {
  const std::time_t then = std::time(nullptr) - seconds;
  const struct utimbuf times = {then, then};
  ASSERT_EQ(0, ::utime(path.c_str(), &times));
}

std::string makeLocal(int ageSeconds) {
  Session session;
  EXPECT_TRUE(session.create());
  writeFile(session.getPath() + "/file", "12345");
  setAge(session.getPath(), ageSeconds);
  return session.getId();
}

std::string makeVolume(const TestFolder &volume, const std::string &id, int ageSeconds) {
  std::string folder = volume / id;
  createIpcTempPath("session", 0700);
  fs::create_directory(folder);
  writeFile(folder + "/file", "1234567");
  fs::create_symlink(folder, kRoot + "/" + id);
  setAge(folder, ageSeconds);
  return folder;
}

UniqueFd openFileOf(const std::string &id) {
  UniqueFd fd(::open((kRoot + "/" + id + "/file").c_str(), O_RDONLY | O_CLOEXEC));
  EXPECT_TRUE(fd);
  return fd;
}

std::string makeDangling(const std::string &id, int ageSeconds) {
  createIpcTempPath("session", 0700);
  const std::string link = kRoot + "/" + id;
  fs::create_symlink("/tmp/gone/seln.Zz9Zz9", link);
  const timespec then = {std::time(nullptr) - ageSeconds, 0};
  const timespec times[] = {then, then};
  EXPECT_EQ(0, ::utimensat(AT_FDCWD, link.c_str(), times, AT_SYMLINK_NOFOLLOW));
  return id;
}

} // namespace KovaTest
