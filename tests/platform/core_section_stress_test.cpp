// Crashes and concurrent writers.

#include "tests/platform/core_support.h"
#include "tests/support/child_process.h"
#include "tests/support/kill_at_stop.h"

#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <random>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;

namespace {

// Waits for all children. Returns how many of them failed.
int failedChildren() {
  int failed = 0;
  int status = 0;
  while (::wait(&status) > 0) {
    failed += WIFEXITED(status) && WEXITSTATUS(status) == 0 ? 0 : 1;
  }
  return failed;
}

const std::string kAround = "# top\n[first]\na=1\n[s]\n";
const Pairs kSmall = {{"k", "0"}};
const Pairs kLarge = {{"k", std::string(100000, '1')}, {"l", "2"}};

std::string fileOf(const Pairs &pairs) {
  std::string text = kAround;
  for (const auto &[key, value] : pairs) {
    text += key + "=" + value + "\n";
  }
  return text + "[last]\nz=1"; // without a line end at its end
}

bool isWhole(const std::string &text) {
  static const std::string small = fileOf(kSmall);
  static const std::string large = fileOf(kLarge);
  return text == small || text == large;
}

// A lock among the callers, like the library's lock token.
class Locked {
public:
  explicit Locked(const std::string &path)
      : fd_(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600)) {
    while (::flock(fd_, LOCK_EX) != 0 && errno == EINTR) {
    }
  }
  ~Locked() { ::close(fd_); }
  Locked(const Locked &) = delete;
  Locked &operator=(const Locked &) = delete;

private:
  int fd_;
};

} // namespace

TEST(SectionCrash, LeavesAWholeFileAndWhatTheNextWriterClears) {
  constexpr int kRounds = 300;
  std::mt19937 random(20240611); // NOLINT(cert-msc51-cpp): the rounds must be the same each time
  const TestFolder dir;
  for (int round = 0; round < kRounds; ++round) {
    SCOPED_TRACE(round);
    // Every second round runs without unnamed files, where a killed writer leaves something more
    // often.
    const Fault fault("O_TMPFILE", round % 2 == 0 ? INT_MAX : 1, EOPNOTSUPP, true);
    writeFile(dir / "conf", fileOf(kSmall));
    SharedCounter begun;
    const pid_t writer = startWork([&] {
      for (;;) {
        ++*begun;
        setSection(dir / "conf", "s", *begun % 2 == 0 ? kSmall : kLarge);
      }
    });
    const int changes = 1 + static_cast<int>(random() % 5);
    volatile unsigned spin = static_cast<unsigned>(random() % 20000);
    while (*begun < changes) {
    }
    while (spin > 0) {
      spin = spin - 1;
    }
    ASSERT_EQ(0, ::kill(writer, SIGKILL));
    ASSERT_EQ(1, failedChildren());
    ASSERT_TRUE(isWhole(readFile(dir / "conf")));
    ASSERT_EQ(1, setSection(dir / "conf", "s", kLarge));
    ASSERT_EQ(fileOf(kLarge), readFile(dir / "conf"));
    ASSERT_THAT(dir.names(), ElementsAre("conf"));
  }
}

TEST(SectionCrash, LeavesAWholeFileAtEverySystemCall) {
  const std::string why = whyNoStops();
  if (!why.empty()) {
    GTEST_SKIP() << why;
  }
  for (const bool unnamedFiles : {true, false}) {
    SCOPED_TRACE(unnamedFiles ? "unnamed files" : "named files");
    const TestFolder dir;
    const Fault fault("O_TMPFILE", unnamedFiles ? INT_MAX : 1, EOPNOTSUPP, true);
    int nth = 1;
    int old = 0;
    int leftovers = 0;
    for (bool killed = true; killed; ++nth) {
      SCOPED_TRACE(nth);
      writeFile(dir / "conf", fileOf(kSmall));
      killed = killAtStop(nth, [&] { setSection(dir / "conf", "s", kLarge); });
      const std::string text = readFile(dir / "conf");
      ASSERT_TRUE(isWhole(text));
      old += text == fileOf(kSmall) ? 1 : 0;
      leftovers += dir.names().size() > 1 ? 1 : 0;
      ASSERT_EQ(1, setSection(dir / "conf", "s", kLarge));
      ASSERT_EQ(fileOf(kLarge), readFile(dir / "conf"));
      ASSERT_THAT(dir.names(), ElementsAre("conf"));
    }
    std::printf("%d stops: %d left the old file, %d a leftover that was cleared\n", nth - 1, old,
                leftovers);
    EXPECT_LT(0, old);
    EXPECT_LT(old, nth - 1);
    EXPECT_LT(0, leftovers);
    // Only between link and rename.
    EXPECT_TRUE(!unnamedFiles || leftovers == 2) << leftovers;
  }
}

TEST(SectionReader, SeesTheOldFileOrTheNewWhole) {
  for (const bool unnamedFiles : {true, false}) {
    const TestFolder dir;
    const Fault fault("O_TMPFILE", unnamedFiles ? INT_MAX : 1, EOPNOTSUPP, true);
    writeFile(dir / "conf", fileOf(kSmall));
    SharedCounter stop;
    for (int writer = 0; writer < 2; ++writer) {
      startWork([&] {
        for (int i = writer; *stop == 0; ++i) {
          ASSERT_EQ(1, setSection(dir / "conf", "s", i % 2 == 0 ? kSmall : kLarge));
        }
      });
    }
    int changes = 0;
    std::string last;
    for (int look = 0; look < 5000 || changes < 50; ++look) {
      const std::string text = readFile(dir / "conf");
      ASSERT_TRUE(isWhole(text)) << text.size() << " bytes";
      ASSERT_THAT(sectionNames(dir / "conf"), ElementsAre("first", "s", "last"));
      changes += text == last ? 0 : 1;
      last = text;
    }
    *stop = 1;
    EXPECT_EQ(0, failedChildren());
    EXPECT_THAT(dir.names(), ElementsAre("conf"));
  }
}

TEST(SectionWriters, NeverTearAFileNorFailWithoutALock) {
  for (const bool unnamedFiles : {true, false}) {
    const TestFolder dir;
    const Fault fault("O_TMPFILE", unnamedFiles ? INT_MAX : 1, EOPNOTSUPP, true);
    writeFile(dir / "conf", fileOf(kSmall));
    for (int writer = 0; writer < 8; ++writer) {
      startWork([&] {
        for (int i = 0; i < 60; ++i) {
          ASSERT_EQ(1, setSection(dir / "conf", "s", (writer + i) % 2 == 0 ? kSmall : kLarge))
              << KLIBCErrGet() << " " << std::strerror(errno);
        }
      });
    }
    EXPECT_EQ(0, failedChildren());
    EXPECT_TRUE(isWhole(readFile(dir / "conf")));
    EXPECT_THAT(dir.names(), ElementsAre("conf"));
  }
}

TEST(SectionWriters, LoseNothingUnderALockOfTheirs) {
  const TestFolder dir;
  writeFile(dir / "conf", "# kept");
  for (int writer = 0; writer < 8; ++writer) {
    startWork([&] {
      for (int i = 0; i < 50; ++i) {
        const std::string name = std::to_string(writer) + "-" + std::to_string(i);
        const Locked locked(dir / "lock");
        ASSERT_LE(0, addSection(dir / "conf", name, {{"k", "0"}}));
      }
      for (int i = 0; i < 50; ++i) {
        const std::string name = std::to_string(writer) + "-" + std::to_string(i);
        const Locked locked(dir / "lock");
        ASSERT_EQ(1, i % 2 == 0 ? setSection(dir / "conf", name, {{"k", "1"}})
                                : removeSection(dir / "conf", name));
      }
    });
  }
  EXPECT_EQ(0, failedChildren());
  const std::string text = readFile(dir / "conf");
  EXPECT_EQ(8U * 25U, sectionNames(dir / "conf").size());
  EXPECT_EQ(0U, text.find("# kept\n"));
  for (int writer = 0; writer < 8; ++writer) {
    for (int i = 0; i < 50; i += 2) {
      const std::string section =
          "[" + std::to_string(writer) + "-" + std::to_string(i) + "]\nk=1\n";
      EXPECT_NE(std::string::npos, text.find(section)) << section;
    }
  }
}

TEST(SectionFile, MayBeLarge) {
  constexpr std::size_t kBytes = 100 << 20;
  const TestFolder dir;
  const std::string line = "key" + std::string(92, 'v') + "=\"x\"\n";
  std::string text = "[first]\n";
  while (text.size() < kBytes / 2) {
    text += line;
  }
  text += "[s]\nlong=" + std::string(kBytes / 2, 'x') + "\n[t]\n";
  writeFile(dir / "conf", text);
  const std::size_t middle = text.find("long=");
  const std::string expected = text.substr(0, middle) + "k=1\n[t]\n";
  text.clear();
  text.shrink_to_fit();
  EXPECT_THAT(sectionNames(dir / "conf"), ElementsAre("first", "s", "t"));
  EXPECT_EQ(1, setSection(dir / "conf", "s", {{"k", "1"}}));
  EXPECT_TRUE(expected == readFile(dir / "conf"));
}
