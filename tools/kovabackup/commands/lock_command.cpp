#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/lock_holders.h"
#include "tools/kovabackup/frame/list_order.h"

#include <algorithm>
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

void printUsers(Context &context, const std::vector<LockUser> &users, bool null) {
  Rows rows;
  rows.column("STATE").column("PID", Align::Right).column("COMMAND");
  for (const LockUser &user : users) {
    rows.add({stateOf(user), std::to_string(user.pid), commandOf(user)});
  }
  rows.print(context.out, null);
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
  const std::vector<LockUser> users = lockUsersOf(options.token);
  const bool exists = ::access(file.c_str(), F_OK) == 0;
  const bool held =
      std::any_of(users.begin(), users.end(), [](const LockUser &user) { return !user.waits; });
  context.document["token"] = jsonName(options.token);
  context.document["file"] = jsonName(file);
  context.document["exists"] = exists;
  context.document["held"] = held;
  context.document["holders"] = jsonUsers(users, false);
  context.document["waiting"] = jsonUsers(users, true);
  if (context.json) {
    return held ? kDone : kNegative;
  }
  printUsers(context, users, options.null);
  // Both end with 3, but a token that was never used is often a mistyped one.
  if (!exists) {
    context.remark(
        fmt::format("the lock '{}' was never taken: there is no {}", options.token, file));
  } else if (!held) {
    context.remark(fmt::format("no process holds the lock '{}'", options.token));
  }
  return held ? kDone : kNegative;
}

Listed listed(const std::string &token) {
  const std::vector<LockUser> users = lockUsersOf(token);
  Listed lock;
  for (const LockUser &user : users) {
    lock.rows.push_back({stateOf(user), std::to_string(user.pid), commandOf(user), token});
  }
  if (users.empty()) {
    lock.rows.push_back({"free", "-", "-", token});
  }
  lock.entry["token"] = jsonName(token);
  lock.entry["holders"] = jsonUsers(users, false);
  lock.entry["waiting"] = jsonUsers(users, true);
  return lock;
}

int list(Context &context, const ListOptions &options) {
  const ListOrder order(options.order, sortKeys());
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
      .note("Ends with 0 when the lock is held and with 3 when it is free. Looking neither takes "
            "the lock nor creates its file.")
      .example("kovabackup lock show tasks")
      .example("kovabackup lock show tasks --json")
      .action([options](Context &c) { return show(c, *options); });
  auto listOptions = std::make_shared<ListOptions>();
  Command listing = group.command("list", "List all lock tokens and the processes that use them");
  listing.nullFlag(listOptions->null, "end each row with a NUL byte");
  declareOrder(listing, listOptions->order, sortKeys());
  listing
      .note("A row is holds, waits or free, the process, its command and the token; both are - "
            "for a free lock. Looking takes no lock.")
      .example("kovabackup lock list --sort=-holders")
      .action([listOptions](Context &c) { return list(c, *listOptions); });
}

} // namespace KOVA::Backup::Tool
