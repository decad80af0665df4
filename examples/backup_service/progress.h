#ifndef BACKUP_SERVICE_PROGRESS_H
#define BACKUP_SERVICE_PROGRESS_H

/// @file How far a run is, on standard error: on a terminal a line for each stage that is rewritten
/// in place, else one plain line for each stage.

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

  /// Begins a stage, for example "archiving" with the detail "12 files".
  void begin(const std::string &stage, const std::string &detail);

  /// Shows another detail of the stage, on a terminal.
  void show(const std::string &detail);

  /// Whether it is time to show one: five times a second is enough for any eye.
  bool isDue();

  /// Leaves the line of the stage, so that something else can be written.
  void endLine();

private:
  bool onTerminal_;
  bool inLine_ = false;
  std::string stage_;
  std::chrono::steady_clock::time_point shown_;
};

/// While it lives, a process of its own shows the detail that look returns: the one that waits for
/// a child does nothing else. Only on a terminal.
class ProgressWatcher {
public:
  ProgressWatcher(Progress &progress, std::function<std::string()> look);
  ~ProgressWatcher();
  ProgressWatcher(const ProgressWatcher &) = delete;
  ProgressWatcher &operator=(const ProgressWatcher &) = delete;

private:
  Progress &progress_;
  std::function<std::string()> look_;
  pid_t child_ = -1;
};

#endif
