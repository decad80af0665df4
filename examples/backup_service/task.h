#pragma once

/// @file The tasks of the service: sections of one file, which users also edit by hand. Failures
/// throw std::runtime_error with a message for the user.

#include "support.h"

class TaskFile {
public:
  explicit TaskFile(const std::string &path);

  std::list<int> ids() const;

  /// Loads a task as it is, including what its runs have recorded.
  KOVA::Backup::OptionMap load(int id) const;

  /// Throws if a setting of a task is missing, has the wrong type or cannot be used.
  void check(const KOVA::Backup::OptionMap &task, int id) const;

  /// Stores a new task; settings that are not given get their initial values. Returns: its id.
  int add(const KOVA::Backup::OptionMap &given);

  /// Changes options of a task. What other processes have saved in the meantime is kept.
  void change(int id, const std::function<void(KOVA::Backup::OptionMap &)> &set);

  /// Changes the given settings of a task, if the result can be used.
  void edit(int id, const KOVA::Backup::OptionMap &given);

  void remove(int id);

  /// The name of the lock that a run of the task holds from start to finish.
  std::string runLock(int id) const;

private:
  std::string path_;
};

/// A list in byte order, without repetitions.
std::list<std::string> listOf(const KOVA::Backup::OptionMap &task, const std::string &key);

/// Whether an archive of the task may have that name.
bool isArchiveName(const KOVA::Backup::OptionMap &task, const std::string &fileName);

/// The paths of the archives of a task, in the order of the times in their names.
std::vector<std::string> archivesOf(const KOVA::Backup::OptionMap &task);
