#ifndef KOVABACKUP_SERVICE_SESSION_LOST_H
#define KOVABACKUP_SERVICE_SESSION_LOST_H

/// @file The search for session directories on volumes to which no link leads.
///
///     LostSearch lost;
///     if (lost.addLinks(entries, error)) lost.searchVolumes(entries, error);

#include "service/session_scan.h"

#include <chrono>
#include <set>
#include <string>
#include <utility>
#include <vector>

namespace KOVA::Backup::Service {

/// The age of a modification time. The clock may have been set back: a time in the future counts as
/// now.
std::chrono::seconds ageOf(const struct stat &status);

class LostSearch {
public:
  /// Notes the directories to which the entries of the session root lead. They must be all.
  /// Returns: false when that is not known of a link.
  bool addLinks(const std::vector<FoundSession> &entries, Error &error);

  /// Adds the lost directories of all volumes.
  /// Returns: false with error set to the first failure; the other volumes are searched.
  bool searchVolumes(std::vector<FoundSession> &out, Error &error) const;

  /// Examines one directory. Absent: it does not exist, or it is not lost.
  Search examine(const std::string &path, FoundSession &found, Error &error) const;

private:
  using FileId = std::pair<dev_t, ino_t>;

  bool searchFolder(const std::string &folder, std::vector<FoundSession> &out, Error &error) const;
  bool isLost(const std::string &name, const struct stat &status) const;

  std::set<FileId> linked_;
  std::set<std::string> doubtful_; // names to which links lead that cannot be followed
};

} // namespace KOVA::Backup::Service

#endif
