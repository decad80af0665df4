#ifndef BACKUP_SERVICE_PROGRESS_H
#define BACKUP_SERVICE_PROGRESS_H

/// @file Shows the progress of a run on standard error: one line for each stage. On a terminal the
/// line is updated in place.

#include <chrono>
#include <functional>
#include <string>
#include <sys/types.h>

class Progress {
public:
  Progress();
  ~Progress() { endLine(); }
  Progress(const Progress &) = delete;
  Progress &operator=(const Progress &) = delete;

  bool onTerminal() const { return onTerminal_; }

  /// Begins a stage, for example "archiving", with a detail, for example "12 files".
  void begin(const std::string &stage, const std::string &detail);

  /// Updates the detail of the stage. Does nothing unless standard error is a terminal.
  void show(const std::string &detail);

  /// Whether it is time for an update; at most five times a second.
  bool isDue();

  /// Ends the line of the stage, so that other output can follow.
  void endLine();

private:
  bool onTerminal_;
  bool inLine_ = false;
  std::string stage_;
  std::chrono::steady_clock::time_point shown_;
};

/// While the object exists, a separate process shows the detail that currentDetail returns, because
/// a process that waits for a child in SubProcess::call can do nothing else. Does nothing unless
/// standard error is a terminal.
class ProgressWatcher {
public:
  ProgressWatcher(Progress &progress, std::function<std::string()> currentDetail);
  ~ProgressWatcher();
  ProgressWatcher(const ProgressWatcher &) = delete;
  ProgressWatcher &operator=(const ProgressWatcher &) = delete;

private:
  Progress &progress_;
  std::function<std::string()> currentDetail_;
  pid_t child_ = -1;
};

#endif
