#include "tools/kovabackup/commands/session_view.h"

#include "tools/kovabackup/frame/text.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {

const char *kindName(const SessionEntry &entry) {
  return entry.volume ? "volume" : "local";
}

const char *stateName(SessionState state) {
  switch (state) {
  case SessionState::Intact:
    return "whole";
  case SessionState::Dangling:
    return "dangling";
  case SessionState::Broken:
    return "broken";
  case SessionState::Foreign:
    break;
  }
  return "foreign";
}

// The text must fit into one line. One process is enough for the reader to start looking.
std::string describeUsers(const std::vector<Process> &users) {
  if (users.empty()) {
    return "none";
  }
  const Process &first = users.front();
  const std::string text = fmt::format("{} ({})", first.pid, first.command);
  return users.size() == 1 ? text : fmt::format("{} and {} more", text, users.size() - 1);
}

// The name of a process may contain any bytes; jsonName encodes those that are not UTF-8.
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

Json::Value jsonSession(const SessionEntry &entry, const TreeSize &size) {
  Json::Value value(Json::objectValue);
  value["id"] = entry.id;
  value["kind"] = kindName(entry);
  value["state"] = stateName(entry.state);
  value["problem"] = entry.problem.empty() ? Json::Value() : jsonName(entry.problem);
  value["path"] = entry.path.empty() ? Json::Value() : jsonName(entry.path);
  value["files"] = Json::UInt64{size.files};
  value["bytes"] = Json::UInt64{size.bytes};
  value["counted"] = size.complete;
  value["ageSeconds"] = Json::Int64{entry.age.count()};
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

std::vector<std::string> sessionRow(const Context &context, const SessionEntry &entry,
                                    const TreeSize &size) {
  const bool terminal = context.out.terminal();
  return {entry.id,
          kindName(entry),
          stateName(entry.state),
          std::to_string(size.files) +
              (size.complete ? "" : "+"), // "+": at least this many; a part could not be examined
          terminal ? humanBytes(size.bytes) : std::to_string(size.bytes),
          terminal ? humanAge(entry.age) : std::to_string(entry.age.count()),
          entry.path};
}

} // namespace KOVA::Backup::Tool
