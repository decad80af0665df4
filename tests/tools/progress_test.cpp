#include "tools/kovabackup/frame/progress.h"

#include <gmock/gmock.h>
#include <poll.h>
#include <pty.h>
#include <unistd.h>

namespace {

using namespace KOVA::Backup::Tool;
using testing::HasSubstr;

// A terminal that remembers what was drawn on it.
class Screen {
public:
  explicit Screen(unsigned short columns = 60) {
    struct winsize size = {};
    size.ws_col = columns;
    EXPECT_EQ(0, ::openpty(&master_, &slave_, nullptr, nullptr, &size));
  }
  ~Screen() {
    ::close(master_);
    ::close(slave_);
  }
  Screen(const Screen &) = delete;
  Screen &operator=(const Screen &) = delete;

  int fd() const { return slave_; }

  // What has been drawn, once something of it satisfies the condition.
  std::string until(const std::string &text) {
    while (shown_.find(text) == std::string::npos && readMore(60000)) {
    }
    return shown_;
  }
  std::string all() {
    while (readMore(0)) {
    }
    return shown_;
  }

private:
  bool readMore(int timeoutMs) {
    struct pollfd watched = {master_, POLLIN, 0};
    char buffer[1024];
    if (::poll(&watched, 1, timeoutMs) != 1) {
      return false;
    }
    const ssize_t got = ::read(master_, buffer, sizeof buffer);
    shown_.append(buffer, got > 0 ? static_cast<std::size_t>(got) : 0);
    return got > 0;
  }

  int master_ = -1;
  int slave_ = -1;
  std::string shown_;
};

TEST(ToolProgress, DrawsHowFarItIs) {
  Screen screen;
  Progress progress(screen.fd(), "removing", 4096, Unit::Bytes, std::chrono::milliseconds(0));
  progress.add(1024);
  EXPECT_THAT(screen.until(" 25%"), HasSubstr("removing [#######......................."));
}

TEST(ToolProgress, TellsAmountsInTheirUnit) {
  Screen bytes(100);
  Progress removing(bytes.fd(), "removing", 4096, Unit::Bytes, std::chrono::milliseconds(0));
  EXPECT_THAT(bytes.until("KiB"), HasSubstr("0 B of 4.0 KiB"));
  Screen things(100);
  Progress counting(things.fd(), "counting", 4096, Unit::Things, std::chrono::milliseconds(0));
  EXPECT_THAT(things.until("4096"), HasSubstr("0 of 4096"));
}

TEST(ToolProgress, TakesItselfOffTheTerminal) {
  Screen screen;
  {
    Progress progress(screen.fd(), "removing", 4096, Unit::Bytes, std::chrono::milliseconds(0));
    screen.until("removing");
  }
  EXPECT_THAT(screen.all(), testing::EndsWith("\r" + std::string(59, ' ') + "\r"));
}

TEST(ToolProgress, DrawsNothingWhenItIsQuick) {
  Screen screen;
  { Progress progress(screen.fd(), "removing", 10, Unit::Things, std::chrono::hours(1)); }
  EXPECT_EQ("", screen.all());
}

TEST(ToolProgress, DrawsNothingWithoutATerminal) {
  Progress progress(-1, "removing", 10, Unit::Things, std::chrono::milliseconds(0));
  progress.add(5);
}

} // namespace
