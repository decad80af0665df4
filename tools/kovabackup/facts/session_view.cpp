#include "tools/kovabackup/facts/session_view.h"

#include "kovabackup/session.h"
#include "tools/kovabackup/frame/text.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {

std::vector<Process> usersOf(const OpenPaths &open, const SessionEntry &entry) {
  return entry.state == SessionState::Whole ? open.usersOf(entry.path) : std::vector<Process>();
}

Json::Value jsonUsers(const std::vector<Process> &users) {
  Json::Value list(Json::arrayValue);
  for (const Process &user : users) {
    Json::Value entry(Json::objectValue);
    entry["pid"] = user.pid;
    entry["command"] = jsonName(user.command);
    list.append(entry);
  }
  return list;
}

const char *kindName(const SessionEntry &entry) {
  return entry.volume ? "volume" : "local";
}

Json::Value jsonSession(const SessionEntry &entry, const TreeSize &size) {
  Json::Value value(Json::objectValue);
  value["id"] = entry.id;
  value["kind"] = kindName(entry);
  value["state"] = stateName(entry.state);
  value["problem"] = entry.problem.empty() ? Json::Value() : jsonName(entry.problem);
  value["path"] = entry.path.empty() ? Json::Value() : jsonName(entry.path);
  value["files"] = Json::UInt64{size.files};
  value["bytes"] = Json::UInt64{size.bytes};
  value["counted"] = size.whole;
  value["ageSeconds"] = Json::Int64{entry.age.count()};
  return value;
}

Rows sessionRows() {
  Rows rows;
  rows.column("ID").column("KIND").column("STATE").column("FILES", Align::Right);
  rows.column("BYTES", Align::Right).column("AGE", Align::Right).column("PATH");
  return rows;
}

std::vector<std::string> sessionRow(const Context &context, const SessionEntry &entry,
                                    const TreeSize &size) {
  const bool terminal = context.out.terminal();
  return {entry.id,
          kindName(entry),
          stateName(entry.state),
          std::to_string(size.files) + (size.whole ? "" : "+"),
          terminal ? humanBytes(size.bytes) : std::to_string(size.bytes),
          terminal ? humanAge(entry.age) : std::to_string(entry.age.count()),
          entry.path};
}

void removeSession(const SessionEntry &entry) {
  if (!Session::destroyById(entry.id)) {
    throw Failure(kFailed, fmt::format("session {} could not be removed whole from {}; the system "
                                       "log tells the first file that stayed",
                                       entry.id, entry.path));
  }
}

} // namespace KOVA::Backup::Tool
