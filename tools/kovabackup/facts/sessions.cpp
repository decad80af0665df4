#include "tools/kovabackup/facts/sessions.h"

#include "tools/kovabackup/facts/volumes.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {

using Service::Error;

void requireSessionId(const std::string &id) {
  if (!SessionStore::isId(id)) {
    throw Failure(kUsage, fmt::format("'{}' is not a session id: expected sess. or seln. and six "
                                      "letters or digits",
                                      id));
  }
}

std::chrono::seconds requireAge(const std::string &text) {
  const std::optional<std::chrono::seconds> age = parseAge(text);
  if (!age) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid age: expected a number and s, m, h, d "
                                      "or w, as in 7d",
                                      text));
  }
  return *age;
}

void requireTrustedRoot() {
  Error error;
  if (SessionStore().trusted(error)) {
    return;
  }
  if (error.step != "refused") {
    throw Failure(kFailed, "cannot access " + reasonOf(error));
  }
  throw Failure(kFailed,
                fmt::format("nothing was changed, because {} cannot be trusted: it must be a "
                            "directory that only root or you own and write; see "
                            "'kovabackup doctor'",
                            error.path));
}

SessionInfo findSession(const std::string &id) {
  requireSessionId(id);
  SessionInfo session;
  Error error;
  if (SessionStore().find(id, session, error)) {
    return session;
  }
  if (error.code == ENOENT) {
    throw Failure(kNegative, fmt::format("there is no session {}", id));
  }
  throw Failure(kFailed, fmt::format("cannot access session {}: {}", id, reason(error.code)));
}

SessionUsers usersOf(const SessionInfo &session) {
  std::vector<Service::SessionUser> users;
  return SessionStore().users(session, users) ? SessionUsers(users) : std::nullopt;
}

TreeSize measure(const SessionInfo &session) {
  TreeSize size;
  Error error;
  size.complete = SessionStore().size(session, size.files, size.bytes, error, &size.parts);
  return size;
}

std::string nameOf(const SessionInfo &session) {
  return session.id.empty() ? session.path : session.id;
}

std::string reasonOf(const Error &error) {
  return fmt::format("{}: {}", error.path, reason(error.code));
}

// These calls have no path, and the errno of a refused configuration says nothing.
bool isVolumesUnknown(const Error &error) {
  return error.step == "KOVAVolumeSupportLocGet" || error.step == "KOVAMountVolAllEnum";
}

std::string whyIncomplete(const Error &error) {
  return isVolumesUnknown(error) ? whyNotListed() : "cannot read " + reasonOf(error);
}

bool isUsersUnknown(const Error &error) {
  return error.path.rfind("/proc", 0) == 0;
}

bool isSpared(const Error &error) {
  return error.step == "refused" &&
         (error.code == EBUSY || error.code == EAGAIN || error.code == ESTALE);
}

} // namespace KOVA::Backup::Tool
