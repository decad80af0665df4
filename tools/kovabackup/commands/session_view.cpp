#include "tools/kovabackup/commands/session_view.h"

#include "tools/kovabackup/frame/text.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {

const char *kindName(const SessionInfo &session) {
  return session.onVolume ? "volume" : "local";
}

const char *stateName(SessionInfo::State state) {
  switch (state) {
  case SessionInfo::State::Complete:
    return "whole";
  case SessionInfo::State::Dangling:
    return "dangling";
  case SessionInfo::State::Lost:
    return "lost";
  case SessionInfo::State::Broken:
    return "broken";
  case SessionInfo::State::Foreign:
    break;
  }
  return "foreign";
}

// The text must fit into one line. One process is enough for the reader to start looking.
std::string describeUsers(const SessionUsers &users) {
  if (!users || users->empty()) {
    return users ? "none" : "unknown";
  }
  const Service::SessionUser &first = users->front();
  const std::string text = fmt::format("{} ({})", first.pid, first.command);
  return users->size() == 1 ? text : fmt::format("{} and {} more", text, users->size() - 1);
}

// The name of a process may contain any bytes; jsonName encodes those that are not UTF-8.
Json::Value jsonUsers(const SessionUsers &users) {
  if (!users) {
    return {};
  }
  Json::Value list(Json::arrayValue);
  for (const Service::SessionUser &user : *users) {
    Json::Value entry(Json::objectValue);
    entry["pid"] = user.pid;
    entry["command"] = jsonName(user.command);
    list.append(entry);
  }
  return list;
}

Json::Value jsonSession(const SessionInfo &session, const TreeSize &size) {
  Json::Value value(Json::objectValue);
  value["id"] = session.id.empty() ? Json::Value() : Json::Value(session.id);
  value["kind"] = kindName(session);
  value["state"] = stateName(session.state);
  value["problem"] = session.problem.empty() ? Json::Value() : jsonName(session.problem);
  value["path"] = session.path.empty() ? Json::Value() : jsonName(session.path);
  value["files"] = Json::UInt64{size.files};
  value["bytes"] = Json::UInt64{size.bytes};
  value["counted"] = size.complete;
  value["ageSeconds"] = Json::Int64{session.age.count()};
  return value;
}

// The path comes last because it is the only cell that may contain a tab: scripts take everything
// after the sixth tab.
Rows sessionRows() {
  Rows rows;
  rows.column("ID").column("KIND").column("STATE").column("FILES", Align::Right);
  rows.column("BYTES", Align::Right).column("AGE", Align::Right).column("PATH");
  return rows;
}

std::vector<std::string> sessionRow(const Context &context, const SessionInfo &session,
                                    const TreeSize &size) {
  const bool terminal = context.out.terminal();
  return {session.id.empty() ? "-" : session.id,
          kindName(session),
          stateName(session.state),
          std::to_string(size.files) +
              (size.complete ? "" : "+"), // "+": at least this many; a part could not be examined
          terminal ? humanBytes(size.bytes) : std::to_string(size.bytes),
          terminal ? humanAge(session.age) : std::to_string(session.age.count()),
          session.path};
}

} // namespace KOVA::Backup::Tool
