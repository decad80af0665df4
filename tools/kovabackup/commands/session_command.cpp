#include "tools/kovabackup/commands/groups.h"

#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/session_prune.h"
#include "tools/kovabackup/commands/session_view.h"
#include "tools/kovabackup/facts/sessions.h"
#include "tools/kovabackup/facts/space.h"
#include "tools/kovabackup/facts/volume_rule.h"
#include "tools/kovabackup/frame/list_order.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct ListOptions {
  bool null = false;
  OrderOptions order;
};

SortKeys sortKeys() {
  return {{"id", "id"},       {"kind", "kind"},      {"state", "state"}, {"files", "files"},
          {"bytes", "bytes"}, {"age", "ageSeconds"}, {"path", "path"}};
}

struct IdOptions {
  std::string id;
  bool null = false;
};

struct CreateOptions {
  std::optional<std::string> volume;
};

struct DestroyOptions {
  std::vector<std::string> ids;
  bool force = false;
};

struct AdoptOptions {
  std::string path;
};

int list(Context &context, const ListOptions &options) {
  const ListOrder order(options.order, sortKeys());
  std::vector<SessionInfo> sessions;
  Service::Error error;
  const bool complete = SessionStore().list(sessions, error);
  std::vector<Listed> entries;
  for (const SessionInfo &session : sessions) {
    const TreeSize size = measure(session);
    entries.push_back({jsonSession(session, size), {sessionRow(context, session, size)}});
  }
  order.apply(context, "sessions", entries);
  if (!complete) {
    context.reportError(kFailed, whyIncomplete(error));
  } else if (!context.json && entries.empty()) {
    context.remark("there are no sessions");
  }
  if (!context.json) {
    printRows(context, sessionRows(), entries, options.null);
  }
  return complete ? kDone : kFailed;
}

// One field per line: users and the description of a problem are too long for a table row.
void printOne(Context &context, const SessionInfo &session, const TreeSize &size,
              const SessionUsers &users, bool null) {
  const bool terminal = context.out.terminal();
  const std::string state = stateName(session.state);
  const std::vector<std::pair<std::string, std::string>> lines = {
      {"id", session.id},
      {"kind", kindName(session)},
      {"state", session.problem.empty() ? state : fmt::format("{}: {}", state, session.problem)},
      {"files", std::to_string(size.files) + (size.complete ? "" : "+")},
      {"bytes", terminal ? humanBytes(size.bytes) : std::to_string(size.bytes)},
      {"age", terminal ? humanAge(session.age) : std::to_string(session.age.count())},
      {"users", describeUsers(users)},
      {"path", session.path}};
  for (const auto &[name, value] : lines) {
    constexpr std::size_t kValueColumn = 7;
    if (terminal && !null) {
      context.out.line(
          fmt::format("{:<{}}{}", name, kValueColumn,
                      wrapped(context.out.name(value), kValueColumn, context.out.width())));
    } else {
      context.out.write(name + "\t");
      context.out.name(value, null ? '\0' : '\n');
    }
  }
}

int show(Context &context, const IdOptions &options) {
  const SessionInfo session = findSession(options.id);
  const TreeSize size = measure(session);
  const SessionUsers users = usersOf(session);
  context.document["session"] = jsonSession(session, size);
  context.document["session"]["users"] = jsonUsers(users);
  if (!context.json) {
    printOne(context, session, size, users, options.null);
  }
  return session.state == SessionInfo::State::Complete ? kDone : kNegative; // scripts test for it
}

// For use in $(...): prints the path of an existing directory, or fails without output.
int path(Context &context, const IdOptions &options) {
  const SessionInfo session = findSession(options.id);
  if (session.state != SessionInfo::State::Complete) {
    throw Failure(kNegative, fmt::format("session {}: {}", session.id, session.problem));
  }
  context.document["id"] = session.id;
  context.document["path"] = jsonName(session.path);
  if (!context.json) {
    context.out.name(session.path, options.null ? '\0' : '\n');
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
// caller cannot write. This function names the innermost such directory, or a full file system.
std::string whyNotCreated() {
  struct stat info;
  for (const std::string &folder :
       {SessionStore::root(), Path::getIpcTempPath(), std::string("/tmp")}) {
    const int error = ::access(folder.c_str(), W_OK | X_OK) == 0 ? 0 : errno;
    const bool dangles = error == ENOENT && ::lstat(folder.c_str(), &info) == 0;
    if (error != 0 && (error != ENOENT || dangles)) {
      return fmt::format(": {}: {}", folder, reason(error));
    }
    if (error == 0 && isFullForThisUser(folder)) {
      return fmt::format(": {}: {}", folder, reason(ENOSPC));
    }
  }
  return "; see the system log";
}

// The session exists, and may be the wish of a user who tries services on a machine of their own.
void warnOfUntrustedRoot(Context &context) {
  Service::Error error;
  if (!SessionStore().trusted(error) && error.step == "refused") {
    context.remark(fmt::format("another user may read or replace the session, because {} cannot be "
                               "trusted; see 'kovabackup doctor'",
                               error.path));
  }
}

// A rule that chose such a volume gives a local session, as the library compares mere bytes.
void warnOfLocal(Context &context, const SessionInfo &session, const CreateOptions &options) {
  if (options.volume && !session.onVolume) {
    context.remark("the path of the chosen volume begins with /tmp, so the session is local");
  }
}

int create(Context &context, const CreateOptions &options) {
  Session session;
  const bool created = options.volume ? createOn(*options.volume, session) : session.create();
  if (!created) {
    throw Failure(kFailed, "cannot create a session" + whyNotCreated());
  }
  const SessionInfo info = findSession(session.getId());
  warnOfUntrustedRoot(context);
  warnOfLocal(context, info, options);
  // If the id cannot be printed, the session is removed again, because no process would know of it.
  // The library logs a failure to remove it.
  context.undo = [id = info.id] { (void)Session::destroyById(id); };
  context.document["session"] = jsonSession(info, TreeSize());
  if (!context.json) {
    context.out.line(info.id);
  }
  return kDone;
}

// Why a session was not removed, and what the user can do about it.
std::string refusalOf(const SessionInfo &session, const Service::Error &error) {
  if (error.step == "refused" && error.code == EBUSY) {
    return fmt::format("session {} is left alone: in use by {}; end that process, or pass --force",
                       session.id, describeUsers(usersOf(session)));
  }
  if (error.step == "refused" && error.code == ESTALE) {
    return fmt::format("session {} is left alone: it has just changed; try again", session.id);
  }
  if (isUsersUnknown(error)) {
    return fmt::format("session {} is left alone: its users are unknown: {}; run this command as "
                       "root, or pass --force",
                       session.id, reasonOf(error));
  }
  return fmt::format("session {} could not be removed completely: {}", session.id, reasonOf(error));
}

void removeSession(const SessionInfo &session, bool force) {
  if (session.state == SessionInfo::State::Foreign) {
    throw Failure(kFailed, fmt::format("session {} is left alone: {}; if it is not needed, "
                                       "remove the link {} by hand",
                                       session.id, session.problem,
                                       Path::join(SessionStore::root(), session.id)));
  }
  Service::SessionRemoval how;
  how.evenInUse = force;
  Service::Error error;
  if (!SessionStore().remove(session, error, how)) {
    throw Failure(kFailed, refusalOf(session, error));
  }
}

// A failure does not end the command, because the other sessions do not depend on this one.
int destroyOne(Context &context, const std::string &id, bool force, Json::Value &result) {
  result["id"] = id;
  result["removed"] = false;
  try {
    removeSession(findSession(id), force);
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
    const int code =
        destroyOne(context, id, options.force, context.document["sessions"].append(Json::Value()));
    // The worst result counts: 1 (could not be removed), then 3 (did not exist), then 0.
    exitCode = exitCode == kDone || code == kFailed ? code : exitCode;
  }
  return exitCode;
}

SessionInfo findLost(const std::string &path) {
  std::vector<SessionInfo> sessions;
  Service::Error error;
  const bool complete = SessionStore().list(sessions, error);
  for (const SessionInfo &session : sessions) {
    if (session.state == SessionInfo::State::Lost && session.path == path) {
      return session;
    }
  }
  throw complete ? Failure(kNegative, fmt::format("{} is not a lost session; 'kovabackup session "
                                                  "list' shows them; one younger than ten minutes "
                                                  "may still be in creation",
                                                  path))
                 : Failure(kFailed, whyIncomplete(error));
}

int adopt(Context &context, const AdoptOptions &options) {
  requireTrustedRoot();
  const std::string path = Path::absPath(options.path);
  const SessionInfo lost = findLost(path.substr(0, path.find_last_not_of('/') + 1));
  std::string id;
  Service::Error error;
  if (!SessionStore().adopt(lost, id, error)) {
    throw Failure(kFailed, error.step == "refused" && error.code == EPERM
                               ? fmt::format("{} belongs to another user than the sessions in {}",
                                             error.path, SessionStore::root())
                               : fmt::format("cannot adopt {}: {}", lost.path, reasonOf(error)));
  }
  context.document["session"] = jsonSession(findSession(id), measure(lost));
  if (!context.json) {
    context.out.line(id);
  }
  return kDone;
}

void registerQueries(CommandGroup &sessions) {
  auto listOptions = std::make_shared<ListOptions>();
  Command listing = sessions.command("list", "List all sessions");
  listing.nullFlag(listOptions->null, "end each row with a NUL byte");
  declareOrder(listing, listOptions->order, sortKeys());
  listing
      .note("A row holds id, kind, state, files, bytes, age and path. Unless the output is a "
            "terminal, tabs separate them and the age is in seconds. The age counts from the last "
            "load. The state is 'whole' when the directory exists; 'dangling' when the target of "
            "the link does not exist; 'lost' when no link leads to a directory on a volume, whose "
            "id is then '-'; 'broken' when something else has the session's name; or 'foreign' "
            "when the link points to something that is not a session directory.")
      .example("kovabackup session list")
      .example("kovabackup session list --sort=-bytes --limit 10")
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
      .completes(volumeRules, "same:")
      .note(
          "Without --volume the session is local, below /tmp. Every session remains until it is "
          "destroyed. A message warns when the directories that lead to it belong to another user "
          "or may be written by one.")
      .example("id=$(kovabackup session create)")
      .example("kovabackup session create --volume max-ext-btrfs")
      .action([createOptions](Context &c) { return create(c, *createOptions); });
  auto destroyOptions = std::make_shared<DestroyOptions>();
  sessions.command("destroy", "Remove sessions and everything in them")
      .arguments(destroyOptions->ids, "ID", "ids of the sessions")
      .completes(sessionIds)
      .flag(destroyOptions->force, "--force", "remove sessions that are in use, too")
      .note("Every id is checked before anything is removed. A session is left alone while a "
            "process has one of its files open or uses its directory, and when that cannot be "
            "known. Ends with 1 when a session was left alone or could not be removed completely, "
            "else with 3 when one did not exist.")
      .example("kovabackup session destroy sess.a1B2c3 seln.d4E5f6")
      .action([destroyOptions](Context &c) { return destroy(c, *destroyOptions); });
  auto adoptOptions = std::make_shared<AdoptOptions>();
  sessions.command("adopt", "Give a lost session an id and print it")
      .argument(adoptOptions->path, "PATH", "directory of the lost session")
      .completes(lostSessions)
      .note("A session on a volume is lost when no link in /tmp leads to its directory, as after a "
            "restart that emptied /tmp. A directory that changed within the last ten minutes does "
            "not count as lost, since the session may still be in creation. Ends with 3 when there "
            "is no such session.")
      .example("kovabackup session adopt /volume1/.kova_tmp/seln.a1B2c3")
      .action([adoptOptions](Context &c) { return adopt(c, *adoptOptions); });
  registerPrune(sessions);
}

} // namespace KOVA::Backup::Tool
