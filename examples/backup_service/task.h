#ifndef BACKUP_SERVICE_TASK_H
#define BACKUP_SERVICE_TASK_H

/// @file A task of the service: one section of the task file, with the lock that keeps two runs of
/// it apart. What fails throws std::runtime_error with a text for the user.

#include <boost/shared_ptr.hpp>
#include <functional>
#include <kovabackup/option_map.h>
#include <kovabackup/path_filter.h>
#include <kovabackup/volume_path_manager.h>
#include <list>
#include <string>
#include <sys/types.h>

constexpr char kTaskPrefix[] = "task"; // sections are named "task<id>"

/// What the user says of a new task.
struct TaskSettings {
  std::string name;
  std::list<std::string> sources;
  std::list<std::string> includes;
  std::list<std::string> excludes;
  std::string destination;
  std::string probeHost; ///< host that must answer before a run; empty: none
  int probePort = 22;
  int probeTimeoutSec = 5;
  std::string volumeRule = "max-ext-btrfs";
  std::string reportTemplate = "task {{task}}: {{result}}; {{files}} files, {{bytes}} bytes -> "
                               "{{archive}} ({{archiveBytes}} bytes)";
  std::string passphrase; ///< empty: the archive is not encrypted
};

/// The rule by which a run's volume is chosen: max, max-ext, max-ext-btrfs or same:PATH.
boost::shared_ptr<KOVA::Backup::FilterVolume> volumeFilterFor(const std::string &rule);

class Task {
public:
  /// Makes a section with a new id for the settings. Returns: the id.
  static int create(const std::string &file, const TaskSettings &settings);

  Task(const std::string &file, int id);

  /// Reads the task again.
  void load();

  int id() const { return id_; }
  std::string text(const std::string &key) const { return options_.optString(key, ""); }
  int number(const std::string &key) const { return options_.optInt(key, 0); }
  std::list<std::string> list(const std::string &key) const;

  /// The sources, without those that lie in another one: no tree is walked twice.
  std::list<std::string> sources() const;

  /// "" for a task without one. A passphrase that cannot be read throws: nobody shall take the task
  /// for one whose archives may be clear.
  std::string passphrase() const;

  void fillFilter(KOVA::Backup::PathFilter &filter) const;

  /// Changes the task in the file and here. What others changed in the file meanwhile stays.
  void change(const std::function<void(KOVA::Backup::OptionMap &options)> &set);

  /// Takes the lock that a run holds from its beginning to its end. Whoever has it knows that a
  /// session still recorded in the task is one of a run that died.
  /// Returns: a descriptor, to be closed after the run; -1 when another process holds the lock.
  int takeRunLock() const;

  /// The process that runs the task, 0 for none.
  pid_t runner() const;

private:
  int openRunLock() const;

  std::string file_;
  int id_;
  KOVA::Backup::OptionMap options_;
};

#endif
