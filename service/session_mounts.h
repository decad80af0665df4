#ifndef KOVABACKUP_SERVICE_SESSION_MOUNTS_H
#define KOVABACKUP_SERVICE_SESSION_MOUNTS_H

/// @file Mounts that show a session, or a folder in it, at another place, as those of containers
/// do. The kernel reports what a process has open there by the path in its mount namespace.

#include <string>
#include <string_view>
#include <vector>

namespace KOVA::Backup::Service {

struct SessionMount {
  std::string point; ///< where it is mounted, as links in /proc show it; "" for "/"
  std::string root;  ///< what is mounted: a path on its file system
};

/// Whether a path has a component that begins as a session name does.
bool hasSessionComponent(std::string_view path);

/// Finds such mounts in the text of /proc/PID/mountinfo, which lists those below the root directory
/// of that process. A mount of what contains sessions is not one, since their names are then in the
/// paths.
/// rootFolder: the target of /proc/PID/root, to which the points in the text are relative.
std::vector<SessionMount> findSessionMounts(std::string_view text, const std::string &rootFolder);

/// A plain prefix is not enough: /a/bc is not below /a/b.
bool isWithin(std::string_view path, std::string_view folder);

} // namespace KOVA::Backup::Service

#endif
