// A run of the example service that is killed at a certain system call.
#include "tests/crash/programs.h"
#include "tests/session/volume_mount.h"
#include "tests/support/files.h"
#include "tests/support/platform_conf.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <string>
#include <vector>

namespace {

using namespace KovaTest;
namespace fs = std::filesystem;
using testing::IsEmpty;

constexpr const char *kFolder = "/tmp/service";
const std::string kTasks = std::string(kFolder) + "/tasks.conf";

class ServiceKill : public testing::Test {
protected:
  void SetUp() override {
    if (!volume.failure.empty()) {
      GTEST_SKIP() << volume.failure;
    }
    conf.write("[volume v]\npath=\"" + volume.path + "\"\nfsType=2\nsize=1000000000000000\n");
    fs::create_directories(source);
    fs::create_directories(archives);
    writeFile(source + "/file", "content");
    ASSERT_EQ(0, Crash::runProgram({KOVA_EXAMPLE_PATH, "--tasks", kTasks, "add", "--name", "task",
                                    "--source", source, "--destination", archives}));
  }

  void TearDown() override {
    fs::remove_all(kFolder);
    fs::remove_all("/tmp/kovabackup");
  }

  const VolumeMount volume;
  const PlatformConf conf;
  const std::string source = std::string(kFolder) + "/source";
  const std::string archives = std::string(kFolder) + "/archives";
};

// The list of paths once had a name until it was unlinked. Nothing removed what a kill left of it.
TEST_F(ServiceKill, LeavesNoListOfPathsOnTheVolume) {
  const std::vector<std::string> strace = {"/usr/bin/strace", "-qq", "-f", "-o", "/dev/null"};
  if (Crash::runProgram({"/usr/bin/strace", "-qq", "-o", "/dev/null", "/bin/true"}) != 0) {
    GTEST_SKIP() << "skipped: strace cannot trace a process";
  }
  std::vector<std::string> words = strace;
  words.insert(words.end(), {"-e", "trace=unlink", "-e", "inject=unlink:signal=SIGKILL",
                             KOVA_EXAMPLE_PATH, "--tasks", kTasks, "run", "1"});
  (void)Crash::runProgram(words); // ends by itself where no file is unlinked
  EXPECT_TRUE(fs::exists(volume.path + "/.kova_tmp")) << "the run has not come to the list";
  EXPECT_THAT(namesIn(volume.path + "/.kova_tmp"), IsEmpty());
}

} // namespace
