#include "tools/kovabackup/frame/progress.h"

#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <csignal>
#include <fmt/format.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

constexpr std::chrono::milliseconds kRedraw(100);
constexpr std::size_t kBarColumns = 30;

std::string shown(std::uint64_t amount, Unit unit) {
  return unit == Unit::Bytes ? humanBytes(amount) : std::to_string(amount);
}

void show(int fd, const std::string &text) {
  (void)!::write(fd, text.data(), text.size()); // a bar that cannot be drawn is not a failure
}

} // namespace

Progress::Progress(int fd, const std::string &what, std::uint64_t total, Unit unit,
                   std::chrono::milliseconds delay)
    : fd_(fd), what_(what), total_(total), unit_(unit) {
  if (fd_ < 0) {
    return;
  }
  // Signals are left to the main thread, which may have to restore the terminal.
  sigset_t all;
  sigset_t before;
  ::sigfillset(&all);
  ::pthread_sigmask(SIG_SETMASK, &all, &before);
  thread_ = std::thread([this, delay] { run(delay); });
  ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
}

Progress::~Progress() {
  if (!thread_.joinable()) {
    return;
  }
  {
    const std::lock_guard<std::mutex> guard(mutex_);
    ended_ = true;
  }
  end_.notify_one();
  thread_.join();
  if (drawn_ > 0) {
    show(fd_, "\r" + std::string(drawn_, ' ') + "\r");
  }
}

// Work that ends before the delay draws nothing, so quick commands do not flicker.
void Progress::run(std::chrono::milliseconds delay) {
  std::unique_lock<std::mutex> guard(mutex_);
  bool ended = end_.wait_for(guard, delay, [this] { return ended_; });
  for (int turn = 0; !ended; ++turn) {
    draw(turn);
    ended = end_.wait_for(guard, kRedraw, [this] { return ended_; });
  }
}

// The old bar is overwritten rather than erased, which would flicker.
void Progress::draw(int turn) {
  static const char kSpinner[] = "|/-\\";
  const std::uint64_t done = std::min(done_.load(), total_);
  const double part = total_ == 0 ? 0 : static_cast<double>(done) / static_cast<double>(total_);
  const auto filled = static_cast<std::size_t>(part * static_cast<double>(kBarColumns));
  std::string line = fmt::format("{} {} [{}{}] {:3.0f}%  {} of {}", kSpinner[turn % 4], what_,
                                 std::string(filled, '#'), std::string(kBarColumns - filled, '.'),
                                 part * 100, shown(done, unit_), shown(total_, unit_));
  // A line that the terminal breaks cannot be redrawn. Asked each time: windows are resized.
  line.resize(std::min(line.size(), terminalColumns(fd_) - 1));
  const std::size_t rest = drawn_ > line.size() ? drawn_ - line.size() : 0;
  show(fd_, "\r" + line + std::string(rest, ' '));
  drawn_ = std::max(drawn_, line.size());
}

} // namespace KOVA::Backup::Tool
