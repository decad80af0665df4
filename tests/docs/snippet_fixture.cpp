#include "tests/docs/snippet_fixture.h"

#include "tests/support/machine_mounts.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <sys/mount.h>
#include <sys/stat.h>

namespace KovaTest {
namespace {

namespace fs = std::filesystem;

constexpr char kScratch[] = "/tmp/snippet";
constexpr char kVolume[] = "/mnt/volume1";

// Outside /tmp, since a session there would be a local one. In the test program's own mount
// namespace, so the machine's /mnt stays as it is.
bool mounted = false;

void emptyVolume() {
  for (const fs::directory_entry &entry : fs::directory_iterator(kVolume)) {
    // The library caches the volume's temporary directory for the life of the process.
    if (entry.path().filename() != ".kova_tmp") {
      fs::remove_all(entry.path());
      continue;
    }
    for (const fs::directory_entry &inner : fs::directory_iterator(entry.path())) {
      fs::remove_all(inner.path());
    }
  }
}

void writeConfiguration() {
  const std::string path = std::string(kScratch) + "/platform.conf";
  std::ofstream(path) << "[volume data]\npath=\"" << kVolume
                      << "\"\nfsType=2\nsize=1000000000\n[mounts]\nexclude=" << machineMounts()
                      << "\n[secret]\nkeyFile=\"" << kScratch << "/secret.key\"\n";
  fs::permissions(path, fs::perms(0644));
  ::setenv("KOVA_PLATFORM_CONF", path.c_str(), 1);
}

// The message of a line, without PID and tag.
std::string messageOf(const std::string &line) {
  const std::size_t tag = line.find("] ");
  return line.front() == '(' && tag != std::string::npos ? line.substr(tag + 2) : line;
}

} // namespace

void snippetFailed(const char *claim, int line) {
  throw std::runtime_error("line " + std::to_string(line) + " of the document: " + claim);
}

void SnippetTest::SetUpTestSuite() {
  mounted = mounted || ::mount("tmpfs", "/mnt", "tmpfs", 0, "mode=0755") == 0;
}

void SnippetTest::SetUp() {
  if (!mounted) {
    GTEST_SKIP() << "skipped: no file system can be mounted on /mnt";
  }
  ::sigaction(SIGINT, nullptr, &intBefore_);
  ::sigaction(SIGTERM, nullptr, &termBefore_);
  directoryBefore_ = fs::current_path().string();
  for (const char *share : {"photo", "music"}) {
    fs::create_directories(fs::path(kVolume) / share);
  }
  fs::create_directories(fs::path(kScratch) / "work");
  writeConfiguration();
  fs::current_path(fs::path(kScratch) / "work");
}

void SnippetTest::TearDown() {
  if (directoryBefore_.empty()) {
    return;
  }
  // signal(2) does not restore the flags of an action, and neither does Execv; blocks may ignore
  // that.
  ::sigaction(SIGINT, &intBefore_, nullptr);
  ::sigaction(SIGTERM, &termBefore_, nullptr);
  fs::current_path(directoryBefore_);
  ::unsetenv("KOVA_PLATFORM_CONF");
  fs::remove_all(kScratch);
  emptyVolume();
}

void SnippetTest::run(bool (*block)(), const std::vector<std::string> &messages) {
  LogCapture log;
  EXPECT_TRUE(block()) << "the block returned false";
  std::vector<std::string> written;
  for (const LogLine &line : log.take()) {
    written.push_back(messageOf(line.text));
  }
  EXPECT_EQ(messages, written);
}

} // namespace KovaTest
