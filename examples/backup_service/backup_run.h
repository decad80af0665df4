#ifndef BACKUP_SERVICE_BACKUP_RUN_H
#define BACKUP_SERVICE_BACKUP_RUN_H

/// @file One run of a task, from the probe of its destination to the report.

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

/// The names of a run's files in its session directory; another process may read them there.
constexpr char kSessionLog[] = "errors.log";         ///< a line for each thing not backed up
constexpr char kSessionProgress[] = "progress.json"; ///< the stage, files and bytes
constexpr char kSessionArchived[] = "archived.list"; ///< a line for each file that tar has taken

std::uint64_t countLines(const std::string &path);

class BackupRun {
public:
  /// Takes the task's run lock; throws std::runtime_error when another process holds it.
  explicit BackupRun(Task &task);
  ~BackupRun();
  BackupRun(const BackupRun &) = delete;
  BackupRun &operator=(const BackupRun &) = delete;

  /// Runs the task, records the outcome in it and prints the report.
  /// Returns: 0 done, 1 failed, 3 done but for what the task's "messages" name, 128 and the
  ///          signal's number when it was interrupted.
  int run();

private:
  using TempFile = std::unique_ptr<KOVA::Backup::ScopedTempFile>;
  using Look = std::function<std::string()>;

  void execute();
  void clearDeadRun();
  void probeDestination() const;
  void openSession();
  void listFiles();
  void walk(const std::string &source, KOVA::Backup::PathFilter &filter, std::ostream &list);
  void archive();
  void encrypt();
  void publish();
  void copyBeside(const std::string &target);

  void begin(const std::string &stage, const std::string &detail);
  void tellOthers() const;
  void supervise(KOVA::Backup::SubProcess &command, int highestGoodStatus, const Look &look);
  void warn(const std::string &path, int error) const;
  TempFile makePartial(const std::string &name);
  TempFile recorded(TempFile file);

  std::string inSession(const char *name) const;
  std::string walked() const;
  Json::Value summary(const std::string &result) const;
  int record(const std::string &failure);
  void save(const Json::Value &values, const std::list<std::string> &messages);

  Task &task_;
  int runLock_;
  KOVA::Backup::Session session_;
  Progress progress_;
  std::string passphrase_;
  TempFile fileList_;
  TempFile partial_; ///< the archive until it is whole
  std::list<std::string> partials_;
  std::string stage_;
  std::string archivePath_; ///< "" until the archive is in its place
  std::uint64_t files_ = 0;
  std::uint64_t bytes_ = 0;
  std::uint64_t archiveBytes_ = 0;
};

#endif
