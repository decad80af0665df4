#ifndef KOVABACKUP_TOOLS_SESSION_STORE_H
#define KOVABACKUP_TOOLS_SESSION_STORE_H

/// @file The sessions on disk: those in use and those that crashed processes left behind.
///
/// Nothing here changes a session. Its age is the age of its directory's modification time, which
/// the library sets when a session is loaded and which reading leaves alone.

#include "tools/kovabackup/facts/processes.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

enum class SessionState {
  Intact,
  Dangling, ///< the target of its link does not exist
  Broken,   ///< something else has its name, such as a file, or a link instead of a directory
  Foreign,  ///< its link points to something that is not a session directory; never touched
};

struct SessionEntry {
  std::string id;
  bool volume = false; ///< on a volume rather than local
  std::string path;    ///< "" when its link cannot be read
  SessionState state = SessionState::Broken;
  std::string problem; ///< why it is not intact; "" when it is
  std::chrono::seconds age{0};
};

struct TreeSize {
  std::uint64_t files = 0; ///< everything except directories
  std::uint64_t bytes = 0; ///< of the regular files
  bool complete = true;    ///< false when a part could not be examined
};

/// An entry of a session's directory, with everything below it.
struct TreePart {
  std::string name;
  std::uint64_t bytes = 0;
};

std::string sessionRoot();

/// "sess." or "seln." and exactly six letters or digits.
bool isSessionId(const std::string &id);

/// Errors: throws a Failure (wrong usage) unless id is a session id.
void requireSessionId(const std::string &id);

/// Reads the age that makes a session stale: "90s", "15m", "36h", "7d" or "2w".
/// Errors: throws a Failure (wrong usage) for any other text.
std::chrono::seconds requireAge(const std::string &text);

/// All sessions in order of their ids; an empty list when the session root does not exist.
/// Errors:  throws a Failure when the root cannot be read.
std::vector<SessionEntry> listSessions();

/// Returns: false when there is no session with that id.
/// Errors:  throws a Failure when the root cannot be searched.
bool lookUpSession(const std::string &id, SessionEntry &entry);

/// One session.
/// Errors: throws a Failure when there is none with that id.
SessionEntry findSession(const std::string &id);

/// Counts what is in a session's directory. Follows no link and enters no other file system. With
/// parts it lists each entry of the directory as well.
TreeSize measure(const SessionEntry &session, std::vector<TreePart> *parts = nullptr);

/// The processes that have a file of a session open or use its directory.
std::vector<Process> usersOf(const OpenPaths &open, const SessionEntry &entry);

} // namespace KOVA::Backup::Tool

#endif
