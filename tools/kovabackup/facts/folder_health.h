#ifndef KOVABACKUP_TOOLS_FOLDER_HEALTH_H
#define KOVABACKUP_TOOLS_FOLDER_HEALTH_H

/// @file Whether the directories that services share are safe and can be written.

#include "tools/kovabackup/facts/health.h"

#include <string>
#include <sys/types.h>

namespace KOVA::Backup::Tool {

constexpr mode_t kModeBits = 07777;

/// Whether the owner may be trusted: root, because the services run as root, or the caller, because
/// a user who runs them for a test owns the files.
bool isTrustedOwner(uid_t owner);

/// A fix that gives a directory or a regular file another mode. It follows no link and changes
/// nothing that belongs to another user.
Fix modeFix(const std::string &path, mode_t mode);

/// /tmp itself: its mode, and whether it can be written and has room.
void checkTmp(Findings &findings, int minFreePercent);

/// A directory that the library creates, and sets to its mode at every use.
void checkFolder(Findings &findings, const std::string &check, const std::string &folder,
                 mode_t mode);

/// Adds a finding when the file system of a directory is full, or has less room than that.
/// Returns: whether it has enough, or that is not known.
bool checkSpace(Findings &findings, const std::string &check, const std::string &folder,
                int minFreePercent);

} // namespace KOVA::Backup::Tool

#endif
