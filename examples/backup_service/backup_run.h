#ifndef BACKUP_SERVICE_BACKUP_RUN_H
#define BACKUP_SERVICE_BACKUP_RUN_H

/// @file One run of a task, from the probe of the destination's host to the report.

#include "progress.h"
#include "task.h"

#include <cstdint>
#include <functional>
#include <json/value.h>
#include <kovabackup/session.h>
#include <kovabackup/subprocess.h>
#include <kovabackup/temp_manager.h>
#include <list>
#include <memory>
#include <string>

/// Names of the files that a run keeps in its session folder, where other processes may read them.
constexpr char kSessionLog[] = "errors.log"; ///< one line for each path not backed up
constexpr char kSessionProgress[] =
    "progress.json"; ///< the stage and the counts of files and bytes
constexpr char kSessionArchived[] =
    "archived.list"; ///< one line for each entry that tar has archived

std::uint64_t countLines(const std::string &path);

class BackupRun {
public:
  /// Takes the task's run lock; throws std::runtime_error when another process holds it.
  explicit BackupRun(Task &task);
  ~BackupRun();
  BackupRun(const BackupRun &) = delete;
  BackupRun &operator=(const BackupRun &) = delete;

  /// Runs the task, records the outcome in it and prints the report.
  /// Returns: 0 on success; 1 on failure; 3 if the archive lacks the paths that the task's option
  ///          "messages" names; 128 plus the signal's number if a signal interrupted the run.
  int run();

private:
  using TempFile = std::unique_ptr<KOVA::Backup::ScopedTempFile>;
  using DetailSource = std::function<std::string()>;

  void execute();
  void cleanUpCrashedRun();
  void probeDestination() const;
  void openSession();
  void listFiles();
  void walk(const std::string &source, KOVA::Backup::PathFilter &filter, std::ostream &list);
  void archive();
  void encrypt();
  void publish();
  void copyNextTo(const std::string &target);

  void begin(const std::string &stage, const std::string &detail);
  void publishProgress() const;
  void supervise(KOVA::Backup::SubProcess &command, int maxSuccessStatus,
                 const DetailSource &currentDetail);
  void warn(const std::string &path, int error) const;
  TempFile makePartial(const std::string &name);
  TempFile recordPartial(TempFile file);

  std::string sessionFile(const char *name) const;
  std::string walkSummary() const;
  Json::Value summary(const std::string &result) const;
  int record(const std::string &failure);
  void save(const Json::Value &values, const std::list<std::string> &messages);

  Task &task_;
  int runLock_;
  KOVA::Backup::Session session_;
  Progress progress_;
  std::string passphrase_;
  TempFile fileList_;
  TempFile partial_; ///< the archive, under a temporary name until it is complete
  std::list<std::string> partials_;
  std::string stage_;
  std::string archivePath_; ///< "" until the archive has its final name
  std::uint64_t files_ = 0;
  std::uint64_t bytes_ = 0;
  std::uint64_t archiveBytes_ = 0;
};

#endif
