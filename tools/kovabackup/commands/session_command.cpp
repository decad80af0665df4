#include "tools/kovabackup/commands/groups.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/session_prune.h"
#include "tools/kovabackup/commands/session_removal.h"
#include "tools/kovabackup/commands/session_view.h"
#include "tools/kovabackup/facts/volume_rule.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fmt/format.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct ListOptions {
  bool null = false;
};

struct IdOptions {
  std::string id;
  bool null = false;
};

struct CreateOptions {
  std::optional<std::string> volume;
};

struct DestroyOptions {
  std::vector<std::string> ids;
};

int list(Context &context, const ListOptions &options) {
  Json::Value documents(Json::arrayValue);
  Rows rows = sessionRows();
  for (const SessionEntry &entry : listSessions()) {
    const TreeSize size = measure(entry);
    documents.append(jsonSession(entry, size));
    rows.add(sessionRow(context, entry, size));
  }
  context.document["sessions"] = documents;
  if (!context.json && rows.empty()) {
    context.remark("there are no sessions");
  } else if (!context.json) {
    rows.print(context.out, options.null);
  }
  return kDone;
}

// One field per line: users and the description of a problem are too long for a table row.
void printOne(Context &context, const SessionEntry &entry, const TreeSize &size,
              const std::vector<Process> &users, bool null) {
  const bool terminal = context.out.terminal();
  const std::string state = stateName(entry.state);
  const std::vector<std::pair<std::string, std::string>> lines = {
      {"id", entry.id},
      {"kind", kindName(entry)},
      {"state", entry.problem.empty() ? state : fmt::format("{}: {}", state, entry.problem)},
      {"files", std::to_string(size.files) + (size.complete ? "" : "+")},
      {"bytes", terminal ? humanBytes(size.bytes) : std::to_string(size.bytes)},
      {"age", terminal ? humanAge(entry.age) : std::to_string(entry.age.count())},
      {"users", describeUsers(users)},
      {"path", entry.path}};
  for (const auto &[name, value] : lines) {
    context.out.write(terminal ? fmt::format("{:<7}", name) : name + "\t");
    context.out.name(value, null ? '\0' : '\n');
  }
}

int show(Context &context, const IdOptions &options) {
  const SessionEntry entry = findSession(options.id);
  const TreeSize size = measure(entry);
  const std::vector<Process> users = usersOf(OpenPaths(), entry);
  context.document["session"] = jsonSession(entry, size);
  context.document["session"]["users"] = jsonUsers(users);
  if (!context.json) {
    printOne(context, entry, size, users, options.null);
  }
  return entry.state == SessionState::Intact ? kDone : kNegative; // scripts test for it
}

// For use in $(...): prints the path of an existing directory, or fails without output.
int path(Context &context, const IdOptions &options) {
  const SessionEntry entry = findSession(options.id);
  if (entry.state != SessionState::Intact) {
    throw Failure(kNegative, fmt::format("session {}: {}", entry.id, entry.problem));
  }
  context.document["id"] = entry.id;
  context.document["path"] = jsonName(entry.path);
  if (!context.json) {
    context.out.name(entry.path, options.null ? '\0' : '\n');
  }
  return kDone;
}

// Session::create reports only that it failed. Resolving the rule first distinguishes "no volume
// qualifies" from every other failure.
bool createOn(const std::string &ruleText, Session &session) {
  const VolumeRule rule(ruleText);
  const boost::shared_ptr<FilterVolume> filter = rule.filter(false);
  std::string folder;
  if (!VolumePathManager::getInstance().getVolumePath(filter, folder)) {
    throw Failure(kNegative, fmt::format("no volume qualifies for '{}'; 'kovabackup volume pick "
                                         "{}' shows why",
                                         ruleText, ruleText));
  }
  return session.create(filter);
}

// The library reports the reason only to the system log. The usual one is a directory to which the
// caller cannot write. This function names the innermost such directory.
std::string whyNotCreated() {
  for (const std::string &folder : {sessionRoot(), Path::getIpcTempPath(), std::string("/tmp")}) {
    if (::access(folder.c_str(), W_OK | X_OK) != 0 && errno != ENOENT) {
      return fmt::format(": {}: {}", folder, reason(errno));
    }
  }
  return "; see the system log";
}

int create(Context &context, const CreateOptions &options) {
  Session session;
  const bool created = options.volume ? createOn(*options.volume, session) : session.create();
  if (!created) {
    throw Failure(kFailed, "cannot create a session" + whyNotCreated());
  }
  const SessionEntry entry = findSession(session.getId());
  // If the id cannot be printed, the session is removed again, because no process would know of it.
  // The library logs a failure to remove it.
  context.undo = [id = entry.id] { (void)Session::destroyById(id); };
  context.document["session"] = jsonSession(entry, TreeSize());
  if (!context.json) {
    context.out.line(entry.id);
  }
  return kDone;
}

// A failure does not end the command, because the other sessions do not depend on this one.
int destroyOne(Context &context, const std::string &id, Json::Value &result) {
  result["id"] = id;
  result["removed"] = false;
  try {
    const SessionEntry entry = findSession(id);
    if (entry.state == SessionState::Foreign) {
      throw Failure(kFailed, fmt::format("session {} is left alone: {}; if it is not needed, "
                                         "remove the link {} by hand",
                                         id, entry.problem, Path::join(sessionRoot(), id)));
    }
    removeSession(entry);
    result["removed"] = true;
    return kDone;
  } catch (const Failure &failure) {
    context.reportError(failure.exitCode(), failure.what());
    return failure.exitCode();
  }
}

int destroy(Context &context, const DestroyOptions &options) {
  for (const std::string &id : options.ids) {
    requireSessionId(id); // all of them, before anything is removed
  }
  requireTrustedRoot();
  int exitCode = kDone;
  for (const std::string &id : options.ids) {
    const int code = destroyOne(context, id, context.document["sessions"].append(Json::Value()));
    // The worst result counts: 1 (could not be removed), then 3 (did not exist), then 0.
    exitCode = exitCode == kDone || code == kFailed ? code : exitCode;
  }
  return exitCode;
}

void registerQueries(CommandGroup &sessions) {
  auto listOptions = std::make_shared<ListOptions>();
  sessions.command("list", "List all sessions")
      .nullFlag(listOptions->null, "end each row with a NUL byte")
      .note("A row holds id, kind, state, files, bytes, age and path. Unless the output is a "
            "terminal, tabs separate them and the age is in seconds. The age counts from the last "
            "load. The state is 'whole' when the directory exists; 'dangling' when the target of "
            "the link does not exist; 'broken' when something else has the session's name; or "
            "'foreign' when the link points to something that is not a session directory.")
      .example("kovabackup session list")
      .example("kovabackup session list | awk -F'\\t' '$3 == \"dangling\" {print $1}'")
      .action([listOptions](Context &c) { return list(c, *listOptions); });
  auto showOptions = std::make_shared<IdOptions>();
  sessions.command("show", "Show one session")
      .argument(showOptions->id, "ID", "id of the session")
      .completes(sessionIds)
      .nullFlag(showOptions->null, "end each line with a NUL byte")
      .note("The users of a session are the processes that have one of its files open or use its "
            "directory. Only root sees the processes of other users. Ends with 3 when there is no "
            "such session or its state is not 'whole'.")
      .example("kovabackup session show sess.a1B2c3")
      .action([showOptions](Context &c) { return show(c, *showOptions); });
  auto pathOptions = std::make_shared<IdOptions>();
  sessions.command("path", "Print a session's directory")
      .argument(pathOptions->id, "ID", "id of the session")
      .completes(sessionIds)
      .nullFlag(pathOptions->null, "end the path with a NUL byte")
      .note("Ends with 3 when there is no such session or its state is not 'whole'.")
      .example("ls -l \"$(kovabackup session path seln.a1B2c3)\"")
      .action([pathOptions](Context &c) { return path(c, *pathOptions); });
}

} // namespace

void registerSession(CommandGroup &root) {
  CommandGroup sessions = root.group("session", "Show, create and remove session directories");
  sessions.example("kovabackup session list")
      .example("kovabackup session prune --older-than 7d --dry-run");
  registerQueries(sessions);
  auto createOptions = std::make_shared<CreateOptions>();
  sessions.command("create", "Create a session and print its id")
      .option(createOptions->volume, "--volume", "RULE",
              std::string("create it on the volume that RULE chooses: ") + VolumeRule::names())
      .completes(volumeRules)
      .note("Without --volume the session is local, below /tmp. Every session remains until it is "
            "destroyed.")
      .example("id=$(kovabackup session create)")
      .example("kovabackup session create --volume max-ext-btrfs")
      .action([createOptions](Context &c) { return create(c, *createOptions); });
  auto destroyOptions = std::make_shared<DestroyOptions>();
  sessions.command("destroy", "Remove sessions and everything in them")
      .arguments(destroyOptions->ids, "ID", "ids of the sessions")
      .completes(sessionIds)
      .note("Every id is checked before anything is removed. Ends with 1 when a session could not "
            "be removed completely, else with 3 when one did not exist.")
      .example("kovabackup session destroy sess.a1B2c3 seln.d4E5f6")
      .action([destroyOptions](Context &c) { return destroy(c, *destroyOptions); });
  registerPrune(sessions);
}

} // namespace KOVA::Backup::Tool
