#ifndef BACKUP_SERVICE_TASK_H
#define BACKUP_SERVICE_TASK_H

/// @file A task of the service: one section of the task file, and the lock that allows only one run
/// of the task at a time. Failures throw std::runtime_error with a message for the user.

#include <boost/shared_ptr.hpp>
#include <functional>
#include <kovabackup/option_map.h>
#include <kovabackup/path_filter.h>
#include <kovabackup/volume_path_manager.h>
#include <list>
#include <string>
#include <sys/types.h>

constexpr char kTaskPrefix[] = "task"; // sections are named "task<id>"

/// The settings that the user gives for a new task.
struct TaskSettings {
  std::string name;
  std::list<std::string> sources;
  std::list<std::string> includes;
  std::list<std::string> excludes;
  std::string destination;
  std::string probeHost; ///< host that must answer before a run starts; empty for none
  int probePort = 22;
  int probeTimeoutSec = 5;
  std::string volumeRule = "max-ext-btrfs";
  std::string reportTemplate = "task {{task}}: {{result}}; {{files}} files, {{bytes}} bytes -> "
                               "{{archive}} ({{archiveBytes}} bytes)";
  std::string passphrase; ///< empty if archives are not to be encrypted
};

/// The rule that chooses the volume for a run: max, max-ext, max-ext-btrfs or same:PATH.
boost::shared_ptr<KOVA::Backup::FilterVolume> volumeFilterFor(const std::string &rule);

class Task {
public:
  /// Creates a section with a new id and saves the settings in it. Returns: the id.
  static int create(const std::string &file, const TaskSettings &settings);

  Task(const std::string &file, int id);

  /// Reads the task again.
  void load();

  int id() const { return id_; }
  std::string text(const std::string &key) const { return options_.optString(key, ""); }
  int number(const std::string &key) const { return options_.optInt(key, 0); }
  std::list<std::string> list(const std::string &key) const;

  /// The sources, without those that are inside another one, so that no tree is walked twice.
  std::list<std::string> sources() const;

  /// The passphrase; "" for a task without one. Throws if it cannot be decrypted: otherwise the
  /// archives of this task would not be encrypted.
  std::string passphrase() const;

  void fillFilter(KOVA::Backup::PathFilter &filter) const;

  /// Changes the task in the file and in this object. Changes that other processes have saved in
  /// the file in the meantime are kept.
  void change(const std::function<void(KOVA::Backup::OptionMap &options)> &set);

  /// Takes the lock that a run holds from start to finish. The process that holds it knows that a
  /// session that is still recorded in the task belongs to a crashed run.
  /// Returns: a descriptor, which the caller closes after the run; -1 if another process holds the
  ///          lock.
  int takeRunLock() const;

  /// The PID of the process that is running the task; 0 if none is.
  pid_t runner() const;

private:
  int openRunLock() const;

  std::string file_;
  int id_;
  KOVA::Backup::OptionMap options_;
};

#endif
