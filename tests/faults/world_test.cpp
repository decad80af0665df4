// The disk on which scenarios run must never reach what belongs to the machine.
#include "tests/faults/world.h"

#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/mount.h>

namespace {

using namespace KovaTest::Faults;
namespace fs = std::filesystem;

void makeFile(const std::string &path) {
  std::ofstream(path) << "x";
}

TEST(World, IsEmptiedWithoutWhatIsMountedDeepInIt) {
  ASSERT_FALSE(volume().empty());
  fs::create_directories("/tmp/home/project");
  if (::mount("tmpfs", volume().c_str(), "tmpfs", 0, nullptr) != 0 ||
      ::mount("tmpfs", "/tmp/home/project", "tmpfs", 0, nullptr) != 0) {
    GTEST_SKIP() << "skipped: a tmpfs cannot be mounted";
  }
  makeFile("/tmp/home/project/source");
  makeFile("/tmp/home/other");
  makeFile(volume() + "/file");
  resetWorld();
  EXPECT_TRUE(fs::exists("/tmp/home/project/source"));
  EXPECT_FALSE(fs::exists("/tmp/home/other"));
  EXPECT_FALSE(fs::exists(volume() + "/file"));
  EXPECT_EQ(0, ::umount2("/tmp/home/project", MNT_DETACH));
  EXPECT_EQ(0, ::umount2(volume().c_str(), MNT_DETACH));
  fs::remove_all("/tmp/home");
  fs::remove_all(kWork);
  fs::remove("/tmp/platform.conf");
}

} // namespace
