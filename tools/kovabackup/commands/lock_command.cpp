#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/lock_holders.h"
#include "tools/kovabackup/frame/list_order.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <chrono>
#include <ctime>
#include <fmt/format.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct ShowOptions {
  std::string token;
  bool null = false;
};

// A holder that has ended is still listed: its lock lives on in a child that inherited the file.
Json::Value jsonUsers(const std::vector<LockUser> &users, bool waiting) {
  Json::Value list(Json::arrayValue);
  for (const LockUser &user : users) {
    if (user.waits == waiting) {
      Json::Value entry(Json::objectValue);
      entry["pid"] = user.pid;
      entry["command"] = jsonName(user.command);
      entry["alive"] = !user.command.empty();
      list.append(entry);
    }
  }
  return list;
}

const char *stateOf(const LockUser &user) {
  return user.waits ? "waits" : "holds";
}

std::string commandOf(const LockUser &user) {
  return user.command.empty() ? "(ended; a child keeps the lock)" : user.command;
}

// State, process and command of each process, those that hold the lock first.
std::vector<std::vector<std::string>> rowsOf(const LockState &lock) {
  std::vector<std::vector<std::string>> rows;
  for (const LockUser &user : lock.users) {
    rows.push_back({stateOf(user), std::to_string(user.pid), commandOf(user)});
  }
  for (const LockKeeper &keeper : lock.keepers) {
    rows.push_back({"keeps", std::to_string(keeper.pid), keeper.command});
  }
  return rows;
}

Json::Value jsonKeepers(const std::vector<LockKeeper> &keepers) {
  Json::Value list(Json::arrayValue);
  for (const LockKeeper &keeper : keepers) {
    Json::Value entry(Json::objectValue);
    entry["pid"] = keeper.pid;
    entry["command"] = jsonName(keeper.command);
    list.append(entry);
  }
  return list;
}

void describeLock(Json::Value &entry, const LockState &lock) {
  entry["held"] = lock.held();
  entry["holders"] = jsonUsers(lock.users, false);
  entry["keepers"] = jsonKeepers(lock.keepers);
  entry["waiting"] = jsonUsers(lock.users, true);
}

void printProcesses(Context &context, const LockState &lock, bool null) {
  Rows rows;
  rows.column("STATE").column("PID", Align::Right).column("COMMAND");
  for (const std::vector<std::string> &row : rowsOf(lock)) {
    rows.add(row);
  }
  rows.print(context.out, null);
}

// A lock that was taken through an option map has no time.
void remarkOnAge(Context &context, const std::string &token) {
  Service::LockHolder holder;
  if (Service::RunLock::holder(token, holder) && holder.since > 0) {
    context.remark(fmt::format("process {} took the lock {} ago", holder.taker,
                               humanAge(std::chrono::seconds(std::time(nullptr) - holder.since))));
  }
}

// All of these end with 3, but a token that was never used is often a mistyped one, and in a
// container it cannot be known whether a lock is free.
void remarkOnFreeLock(Context &context, const std::string &token, const std::string &file) {
  if (::access(file.c_str(), F_OK) != 0) {
    context.remark(fmt::format("the lock '{}' was never taken: there is no {}", token, file));
  } else if (seesAllProcesses()) {
    context.remark(fmt::format("no process holds the lock '{}'", token));
  } else {
    context.remark(fmt::format("no process in this container holds the lock '{}'; whether one "
                               "outside does cannot be seen from here",
                               token));
  }
}

struct ListOptions {
  bool null = false;
  OrderOptions order;
};

// Lists of processes are compared by their lengths first.
SortKeys sortKeys() {
  return {{"token", "token"}, {"holders", "holders"}, {"waiting", "waiting"}};
}

int show(Context &context, const ShowOptions &options) {
  const std::string file = lockFileOf(options.token);
  const LockState lock = lockStateOf(options.token);
  context.document["token"] = jsonName(options.token);
  context.document["file"] = jsonName(file);
  context.document["exists"] = ::access(file.c_str(), F_OK) == 0;
  context.document["seesAll"] = seesAllProcesses();
  describeLock(context.document, lock);
  if (!context.json) {
    printProcesses(context, lock, options.null);
    if (lock.held()) {
      remarkOnAge(context, options.token);
    } else {
      remarkOnFreeLock(context, options.token, file);
    }
  }
  return lock.held() ? kDone : kNegative;
}

Listed listed(const std::string &token) {
  const LockState state = lockStateOf(token);
  Listed lock;
  lock.rows = rowsOf(state);
  if (lock.rows.empty()) {
    lock.rows.push_back({"free", "-", "-"});
  }
  for (std::vector<std::string> &row : lock.rows) {
    row.push_back(token);
  }
  lock.entry["token"] = jsonName(token);
  describeLock(lock.entry, state);
  return lock;
}

void remarkOnSight(Context &context, const std::vector<Listed> &entries) {
  const bool someFree = std::any_of(entries.begin(), entries.end(), [](const Listed &lock) {
    return !lock.entry["held"].asBool();
  });
  if (someFree && !seesAllProcesses()) {
    context.remark("free means that no process in this container holds the lock; whether one "
                   "outside does cannot be seen from here");
  }
}

int list(Context &context, const ListOptions &options) {
  const ListOrder order(options.order, sortKeys());
  context.document["seesAll"] = seesAllProcesses();
  std::vector<Listed> entries;
  for (const std::string &token : allLockTokens()) {
    entries.push_back(listed(token));
  }
  order.apply(context, "locks", entries);
  if (!context.json && entries.empty()) {
    context.remark("no lock was ever taken");
  } else if (!context.json) {
    Rows rows;
    rows.column("STATE").column("PID", Align::Right).column("COMMAND").column("TOKEN");
    printRows(context, rows, entries, options.null);
    remarkOnSight(context, entries);
  }
  return kDone;
}

} // namespace

void registerLock(CommandGroup &root) {
  CommandGroup group = root.group("lock", "Show the locks between writers of options");
  group.example("kovabackup lock show tasks");
  auto options = std::make_shared<ShowOptions>();
  group.command("show", "Show which processes hold a lock token or wait for it")
      .argument(options->token, "TOKEN", "the lock token, as services name it")
      .completes(lockTokens)
      .nullFlag(options->null, "end each row with a NUL byte")
      .note("A row is holds, keeps or waits, the process and its command. A process keeps the lock "
            "when another one handed it over and ended; root sees all of these. In a container the "
            "kernel does not show locks of processes outside. Ends with 0 when the lock is held "
            "and with 3 when it is free. Looking neither takes the lock nor creates its file.")
      .example("kovabackup lock show tasks")
      .example("kovabackup lock show tasks --json")
      .action([options](Context &c) { return show(c, *options); });
  auto listOptions = std::make_shared<ListOptions>();
  Command listing = group.command("list", "List all lock tokens and the processes that use them");
  listing.nullFlag(listOptions->null, "end each row with a NUL byte");
  declareOrder(listing, listOptions->order, sortKeys());
  listing
      .note("A row is holds, keeps, waits or free, the process, its command and the token; both "
            "are - for a free lock. Looking takes no lock.")
      .example("kovabackup lock list --sort=-holders")
      .action([listOptions](Context &c) { return list(c, *listOptions); });
}

} // namespace KOVA::Backup::Tool
