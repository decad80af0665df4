#ifndef KOVABACKUP_TOOLS_SESSIONS_H
#define KOVABACKUP_TOOLS_SESSIONS_H

/// @file What the commands ask the session store, with its failures as sentences.

#include "kovabackup/service/session_store.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

using Service::SessionInfo;
using Service::SessionStore;
using SessionUsers = std::optional<std::vector<Service::SessionUser>>; ///< nullopt: unknown

/// What is in a session, counted.
struct TreeSize {
  std::uint64_t files = 0; ///< everything except directories
  std::uint64_t bytes = 0; ///< of the regular files
  bool complete = true;    ///< false when a part could not be examined
  std::vector<Service::SessionPart> parts;
};

/// Errors: throws a Failure (wrong usage) unless id is a session id.
void requireSessionId(const std::string &id);

/// Reads the age that makes a session stale: "90s", "15m", "36h", "7d" or "2w".
/// Errors: throws a Failure (wrong usage) for any other text.
std::chrono::seconds requireAge(const std::string &text);

/// Checks that no other user could have placed what a removal would follow.
/// Errors: throws a Failure when the session root, or the directory above it, belongs to another
///         user or may be written by one.
void requireTrustedRoot();

/// One session.
/// Errors: throws a Failure when there is none with that id.
SessionInfo findSession(const std::string &id);

/// The processes that use a session.
SessionUsers usersOf(const SessionInfo &session);

TreeSize measure(const SessionInfo &session);

/// The id, or the path of a lost session.
std::string nameOf(const SessionInfo &session);

/// A failure of the store as a phrase: "/tmp/x: Permission denied".
std::string reasonOf(const Service::Error &error);

/// Whether the store found no lost sessions because the platform could not list the volumes.
bool isVolumesUnknown(const Service::Error &error);

/// Why a list of sessions is not complete. Call it before another function of the platform.
std::string whyIncomplete(const Service::Error &error);

/// Whether the store could not learn who uses a session.
bool isUsersUnknown(const Service::Error &error);

/// Whether the store left a session alone because it is in use, or is no longer what it was.
bool isSpared(const Service::Error &error);

} // namespace KOVA::Backup::Tool

#endif
