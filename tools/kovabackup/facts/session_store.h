#ifndef KOVABACKUP_TOOLS_SESSION_STORE_H
#define KOVABACKUP_TOOLS_SESSION_STORE_H

/// @file The sessions on disk, as a stranger finds them: some whole, some left behind.
///
/// Looking changes nothing: the age of a session is taken from its directory's modification time,
/// which a load sets to now and a reader does not touch.

#include "tools/kovabackup/facts/processes.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

namespace KOVA::Backup::Tool {

/// What became of a session.
enum class SessionState {
  Whole,
  Dangling, ///< its link leads to nothing
  Broken,   ///< something else stands in its place: a file, a link in place of a directory
  Foreign,  ///< its link leads to what is no session directory; never touched
};

struct SessionEntry {
  std::string id;
  bool volume = false; ///< on a volume rather than local
  std::string path;    ///< "" when its link cannot be read
  SessionState state = SessionState::Broken;
  std::string problem; ///< why it is not whole, in words
  std::chrono::seconds age{0};
};

struct TreeSize {
  std::uint64_t files = 0; ///< all that is no directory
  std::uint64_t bytes = 0; ///< of the regular files
  bool whole = true;       ///< false when a part could not be looked at
};

/// What lies directly in a session's directory, with all below it.
struct TreePart {
  std::string name;
  std::uint64_t bytes = 0;
};

std::string sessionRoot();

/// "sess." or "seln." and exactly six letters or digits.
bool isSessionId(const std::string &id);

/// Errors: throws a Failure (wrong usage) for what is no id.
void requireSessionId(const std::string &id);

/// Reads the age that makes a session stale: "90s", "15m", "36h", "7d" or "2w".
/// Errors: throws a Failure (wrong usage) for any other text.
std::chrono::seconds requireAge(const std::string &text);

/// All sessions in order of their ids. None when there is no session root.
/// Errors: throws a Failure when the root cannot be read.
std::vector<SessionEntry> listSessions();

/// Returns: false when there is no session of that id. Errors: throws a Failure when the root
/// cannot be looked into.
bool lookUpSession(const std::string &id, SessionEntry &entry);

/// One session. Errors: throws a Failure when there is none of that id.
SessionEntry findSession(const std::string &id);

/// Counts what lies in a session's directory: no link is followed, no other file system entered.
/// With parts, tells them apart as well.
TreeSize measure(const SessionEntry &session, std::vector<TreePart> *parts = nullptr);

/// The processes that have something of a session open or work in it.
std::vector<Process> usersOf(const OpenPaths &open, const SessionEntry &entry);

} // namespace KOVA::Backup::Tool

#endif
