#ifndef KOVABACKUP_TOOLS_PROGRESS_H
#define KOVABACKUP_TOOLS_PROGRESS_H

/// @file A progress bar on a terminal, drawn only when the work takes long.
///
///     Progress progress(context.messages.terminal() ? 2 : -1, "removing", total, Unit::Bytes);
///     for (...) { ...; progress.add(bytes); }
///
/// Threads: a thread of its own draws, even while the work is inside one long call. It uses only
/// the
///          descriptor and the counter.

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>

namespace KOVA::Backup::Tool {

/// What is counted.
enum class Unit { Bytes, Things };

class Progress {
public:
  /// Draws on fd once the delay has passed; never with a negative fd.
  Progress(int fd, const std::string &what, std::uint64_t total, Unit unit,
           std::chrono::milliseconds delay = std::chrono::seconds(1));
  /// Erases the bar.
  ~Progress();
  Progress(const Progress &) = delete;
  Progress &operator=(const Progress &) = delete;

  void add(std::uint64_t amount) { done_ += amount; }

private:
  void run(std::chrono::milliseconds delay);
  void draw(int turn);

  int fd_;
  std::string what_;
  std::uint64_t total_;
  Unit unit_;
  std::atomic<std::uint64_t> done_{0};
  std::size_t drawn_ = 0; ///< columns of the bar that is on the terminal
  bool ended_ = false;
  std::mutex mutex_;
  std::condition_variable end_;
  std::thread thread_;
};

} // namespace KOVA::Backup::Tool

#endif
