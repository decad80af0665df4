#ifndef BACKUP_SERVICE_BACKUP_RUN_H
#define BACKUP_SERVICE_BACKUP_RUN_H

/// @file One run of a task, from the probe of its destination to the report.

#include "filtered_tree.h"
#include "task.h"

#include <json/value.h>
#include <kovabackup/session.h>
#include <kovabackup/subprocess.h>
#include <kovabackup/temp_manager.h>
#include <list>
#include <memory>
#include <string>

/// The names of a run's files in its session directory; another process may read them there.
constexpr char kSessionLog[] = "errors.log";
constexpr char kSessionProgress[] = "progress.json";

class BackupRun {
public:
  explicit BackupRun(Task &task);
  ~BackupRun();
  BackupRun(const BackupRun &) = delete;
  BackupRun &operator=(const BackupRun &) = delete;

  /// Runs the task and records the outcome in it.
  /// Returns: the process's exit status: 0 done, 1 failed, 3 interrupted by a signal.
  int run();

private:
  void execute();
  void clearDeadRun();
  void probeDestination() const;
  void openSession();
  void listFiles();
  void archive();
  void encrypt();
  void publish();
  int record(const std::string &result, int status);

  void startStage(const std::string &stage);
  void noteProgress() const;
  void supervise(KOVA::Backup::SubProcess &command, int highestGoodStatus) const;
  std::unique_ptr<KOVA::Backup::ScopedTempFile> makePartial(const std::string &name);
  Json::Value summary(const std::string &result) const;

  Task &task_;
  int runLock_;
  KOVA::Backup::Session session_;
  std::unique_ptr<KOVA::Backup::ScopedTempFile> fileList_;
  std::unique_ptr<KOVA::Backup::ScopedTempFile> partial_; ///< the archive until it is whole
  std::list<std::string> partials_;
  std::string stage_;
  std::string archivePath_;
  TreeTotals totals_;
  std::uint64_t archiveBytes_ = 0;
};

#endif
