#include "progress.h"

#include <csignal>
#include <iostream>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <utility>

namespace {

constexpr std::chrono::milliseconds kInterval(200);

} // namespace

Progress::Progress() : onTerminal_(::isatty(STDERR_FILENO) == 1) {}

void Progress::begin(const std::string &stage, const std::string &detail) {
  endLine();
  stage_ = stage;
  show(detail);
  if (!onTerminal_) {
    std::cerr << stage << (detail.empty() ? "" : ": ") << detail << std::endl;
  }
}

void Progress::show(const std::string &detail) {
  if (onTerminal_) {
    const char *const eraseRest = "\033[K";
    std::cerr << '\r' + stage_ + (detail.empty() ? "" : ": ") + detail + eraseRest << std::flush;
    inLine_ = true;
  }
}

bool Progress::isDue() {
  const auto now = std::chrono::steady_clock::now();
  if (now - lastDue_ < kInterval) {
    return false;
  }
  lastDue_ = now;
  return true;
}

void Progress::endLine() {
  if (inLine_) {
    std::cerr << std::endl;
    inLine_ = false;
  }
}

ProgressTicker::ProgressTicker(Progress &progress, std::function<std::string()> currentDetail)
    : progress_(progress), currentDetail_(std::move(currentDetail)) {
  const pid_t parent = ::getpid();
  child_ = progress_.onTerminal() ? ::fork() : -1;
  if (child_ == 0) {
    while (::getppid() == parent) { // ends with the run, even if the run crashes
      progress_.show(currentDetail_());
      std::this_thread::sleep_for(kInterval);
    }
    ::_exit(0);
  }
}

ProgressTicker::~ProgressTicker() {
  if (child_ > 0) {
    (void)::kill(child_, SIGKILL);
    while (::waitpid(child_, nullptr, 0) == -1 && errno == EINTR) {
    }
    progress_.show(currentDetail_());
  }
}
