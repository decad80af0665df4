#ifndef BACKUP_SERVICE_PROGRESS_H
#define BACKUP_SERVICE_PROGRESS_H

/// @file Shows the progress of a run on standard error, one line for each stage. On a terminal the
/// line is updated in place; elsewhere it is written once, when the stage begins.

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

  /// Returns: true if at least 200 ms have passed since it last returned true. A caller that gets
  /// true is expected to call show.
  bool isDue();

  /// Ends the line of the stage, so that other output can follow.
  void endLine();

private:
  bool onTerminal_;
  bool inLine_ = false;
  std::string stage_;
  std::chrono::steady_clock::time_point lastDue_; ///< when isDue last returned true
};

/// While the object exists, a forked process repeatedly shows what currentDetail returns. A
/// separate process is needed because the caller is blocked in SubProcess::call. currentDetail
/// therefore sees the caller's memory as it was at construction, and reads changing facts from the
/// file system. The destructor ends the process and shows the detail once more. Unless standard
/// error is a terminal, the object does nothing.
class ProgressTicker {
public:
  /// progress must outlive the object.
  ProgressTicker(Progress &progress, std::function<std::string()> currentDetail);
  ~ProgressTicker();
  ProgressTicker(const ProgressTicker &) = delete;
  ProgressTicker &operator=(const ProgressTicker &) = delete;

private:
  Progress &progress_;
  std::function<std::string()> currentDetail_;
  pid_t child_ = -1;
};

#endif
