// The steps in which the first key is made: what must be in place before it is synced to the disk.

#include "tests/platform/core_support.h"
#include "tests/support/fault.h"

#include <array>
#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

using namespace KovaTest;
namespace fs = std::filesystem;

namespace {

std::function<void(const struct stat &status)> beforeSync;

class FirstKey : public testing::Test {
protected:
  FirstKey() { ::setenv("KOVA_PLATFORM_CONF", (folder_ / "conf").c_str(), 1); }
  ~FirstKey() override {
    beforeSync = nullptr;
    ::unsetenv("KOVA_PLATFORM_CONF");
  }

  std::string keyFile(const std::string &name) {
    writeFile(folder_ / "conf", "[secret]\nkeyFile=\"" + (folder_ / name) + "\"\n");
    return folder_ / name;
  }

  static bool make() {
    std::array<char, 64> cipher{};
    return KLIBCCryptSzEncrypt("text", cipher.data(), static_cast<int>(cipher.size())) != 0;
  }

  static bool isSame(const struct stat &status, const std::string &path) {
    struct stat named {};
    return ::stat(path.c_str(), &named) == 0 && named.st_dev == status.st_dev &&
           named.st_ino == status.st_ino;
  }

  TestFolder folder_;
};

} // namespace

extern "C" int fsync(int fd) {
  static auto *const real = realFunction<int(int)>("fsync");
  struct stat status {};
  EXPECT_EQ(0, ::fstat(fd, &status));
  if (beforeSync) {
    beforeSync(status);
  }
  return real(fd);
}

// After a power cut, a mode that was set later may be missing. Then only root could read the key.
TEST_F(FirstKey, HasItsModeBeforeItIsSynced) {
  (void)keyFile("secret.key");
  int synced = 0;
  beforeSync = [&synced](const struct stat &status) {
    if (S_ISREG(status.st_mode)) {
      ++synced;
      EXPECT_EQ(S_IFREG | 0600U, status.st_mode);
    }
  };
  const mode_t old = ::umask(0777);
  EXPECT_TRUE(make());
  ::umask(old);
  EXPECT_EQ(1, synced);
}

TEST_F(FirstKey, IsMadeAndReadWhicheverCallASignalInterrupts) {
  for (const char *function : {"open", "openat", "read", "write"}) {
    countFailures(function, Failing::Once, [&](int nth, bool /*lasting*/) {
      (void)keyFile("keys/secret.key");
      fs::remove_all(folder_ / "keys");
      const Fault fault(function, nth, EINTR);
      EXPECT_TRUE(make());
      return fault.fired();
    });
  }
}

TEST_F(FirstKey, HasItsNameBeforeItsFolderIsSynced) {
  const std::string file = keyFile("keys/secret.key");
  int synced = 0;
  beforeSync = [&](const struct stat &status) {
    if (isSame(status, folder_ / "keys")) {
      ++synced;
      EXPECT_TRUE(fs::exists(file));
    }
  };
  EXPECT_TRUE(make());
  EXPECT_EQ(1, synced);
}

TEST_F(FirstKey, HasItsFolderBeforeTheFolderAboveIsSynced) {
  (void)keyFile("keys/secret.key");
  int synced = 0;
  beforeSync = [&](const struct stat &status) {
    if (isSame(status, folder_.path())) {
      ++synced;
      EXPECT_TRUE(fs::exists(folder_ / "keys"));
    }
  };
  EXPECT_TRUE(make());
  EXPECT_EQ(1, synced);
}
