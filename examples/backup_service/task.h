#ifndef BACKUP_SERVICE_TASK_H
#define BACKUP_SERVICE_TASK_H

/// @file A task of the service: one section of the task file, with the lock that keeps two runs of
/// it apart.

#include <boost/shared_ptr.hpp>
#include <kovabackup/option_map.h>
#include <kovabackup/path_filter.h>
#include <kovabackup/volume_path_manager.h>
#include <list>
#include <string>

/// Sections are named "task<id>"; writers of the file meet at this lock token.
constexpr char kTaskPrefix[] = "task";
constexpr char kTaskLockToken[] = "backup_service.tasks";

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
  std::string volumeRule; ///< max, max-ext, max-ext-btrfs or same:PATH
  std::string reportTemplate;
  std::string passphrase; ///< empty: the archive is not encrypted
};

class Task {
public:
  /// Makes a section of a new id for the settings. Throws std::runtime_error when that fails.
  static int create(const std::string &file, const TaskSettings &settings);

  /// Loads a task. Throws std::runtime_error when there is none of this id.
  Task(const std::string &file, int id);

  int id() const { return options_.optSectionGetId(); }
  std::string text(const std::string &key) const { return options_.optString(key, ""); }
  int number(const std::string &key) const { return options_.optInt(key, 0); }
  std::string passphrase() const { return options_.optSecret("passphrase", ""); }
  std::list<std::string> list(const std::string &key) const;

  /// Sets a value in memory; save writes all of them.
  template <typename Value>
  void set(const std::string &key, const Value &value) {
    options_.optSet(key, value);
  }
  void save();

  void fillFilter(KOVA::Backup::PathFilter &filter) const;
  boost::shared_ptr<KOVA::Backup::FilterVolume> volumeFilter() const;

  /// The lock that a run of this task holds from its beginning to its end. Whoever gets it knows
  /// that no run is going on, and that a session still recorded is one of a run that died.
  /// Returns: the locked descriptor, -1 when a run holds it. Children do not inherit it.
  int tryRunLock() const;

private:
  KOVA::Backup::OptionMap options_;
};

#endif
