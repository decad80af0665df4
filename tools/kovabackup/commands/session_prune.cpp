#include "tools/kovabackup/commands/session_prune.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/session_view.h"
#include "tools/kovabackup/facts/sessions.h"
#include "tools/kovabackup/frame/progress.h"
#include "tools/kovabackup/frame/prompt.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <fmt/format.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct PruneOptions {
  std::string olderThan;
  bool dryRun = false;
  bool yes = false;
  bool null = false;
};

// A session to remove. Its size is taken before the removal; afterwards there is nothing to count.
struct StaleSession {
  SessionInfo session;
  TreeSize size;
  bool removed = false;
};

// An old session that some process still uses.
struct InUse {
  SessionInfo session;
  SessionUsers users;
};

struct Stale {
  std::vector<StaleSession> candidates;
  std::vector<InUse> inUse;
  std::vector<Service::Error> failures; // sessions that could not be examined
};

struct Totals {
  std::size_t sessions = 0;
  std::uint64_t bytes = 0;
};

// Where the progress bar is drawn; -1 when messages do not go to a terminal.
int terminalOf(const Context &context) {
  return context.messages.terminal() ? STDERR_FILENO : -1;
}

// The store names a session in use by its path.
InUse describeInUse(const std::string &path, const std::vector<SessionInfo> &sessions) {
  for (const SessionInfo &session : sessions) {
    if (session.path == path) {
      return {session, usersOf(session)};
    }
  }
  InUse gone; // meanwhile
  gone.session.path = path;
  return gone;
}

void sortFailures(std::vector<Service::Error> failed, Stale &stale) {
  std::vector<SessionInfo> sessions;
  for (Service::Error &error : failed) {
    if (!isSpared(error)) {
      stale.failures.push_back(std::move(error));
      continue;
    }
    Service::Error ignored; // found by the store, which has listed them a moment ago
    if (sessions.empty()) {
      (void)SessionStore().list(sessions, ignored);
    }
    stale.inUse.push_back(describeInUse(error.path, sessions));
  }
}

Stale findStale(const Context &context, std::chrono::seconds olderThan) {
  Stale stale;
  std::vector<SessionInfo> old;
  std::vector<Service::Error> failed;
  (void)SessionStore().prune(olderThan, true, old, failed); // failed says more than the result
  sortFailures(std::move(failed), stale);
  for (SessionInfo &session : old) {
    stale.candidates.emplace_back().session = std::move(session);
  }
  Progress progress(terminalOf(context), "counting", stale.candidates.size(), Unit::Things);
  for (StaleSession &candidate : stale.candidates) {
    candidate.size = measure(candidate.session);
    progress.add(1);
  }
  return stale;
}

// The question is about all candidates; the final message only about those that are gone.
enum class Which { All, Removed };

Totals totalsOf(const std::vector<StaleSession> &candidates, Which which = Which::All) {
  Totals totals;
  for (const StaleSession &candidate : candidates) {
    if (which == Which::All || candidate.removed) {
      ++totals.sessions;
      totals.bytes += candidate.size.bytes;
    }
  }
  return totals;
}

std::string describe(const Totals &totals) {
  return fmt::format("{} session{}, {}", totals.sessions, totals.sessions == 1 ? "" : "s",
                     humanBytes(totals.bytes));
}

void printCandidates(Context &context, const std::vector<StaleSession> &candidates, bool null) {
  Rows rows = sessionRows();
  for (const StaleSession &candidate : candidates) {
    rows.add(sessionRow(context, candidate.session, candidate.size));
  }
  if (!context.json && !rows.empty()) {
    rows.print(context.out, null);
    // The rows must be visible before the question. A failure is reported at the end.
    (void)context.out.flush();
  }
}

// A session may have been loaded, opened or destroyed since it was listed; it is then left alone.
bool removeCandidate(StaleSession &candidate, std::chrono::seconds olderThan, Progress &progress,
                     Service::Error &error) {
  Service::SessionRemoval how;
  how.olderThan = olderThan;
  how.parts = candidate.size.parts;
  how.gone = [&progress](std::uint64_t bytes) { progress.add(bytes); };
  candidate.removed = SessionStore().remove(candidate.session, error, how);
  return candidate.removed || isSpared(error);
}

std::string describeFailure(const SessionInfo &session, const Service::Error &error) {
  return isUsersUnknown(error) ? fmt::format("session {} is left alone: its users are unknown: {}",
                                             nameOf(session), reasonOf(error))
                               : fmt::format("session {} could not be removed completely: {}",
                                             nameOf(session), reasonOf(error));
}

// Collects the failures: reported at once they would be written into the line of the bar, which is
// gone when this returns.
std::vector<std::string> removeAllOf(Context &context, std::vector<StaleSession> &candidates,
                                     std::chrono::seconds olderThan) {
  std::vector<std::string> failures;
  Progress progress(terminalOf(context), "removing", totalsOf(candidates).bytes, Unit::Bytes);
  for (StaleSession &candidate : candidates) {
    Service::Error error;
    if (!removeCandidate(candidate, olderThan, progress, error)) {
      failures.push_back(describeFailure(candidate.session, error));
    }
  }
  return failures;
}

void documentResult(Json::Value &document, const PruneOptions &options, const Stale &stale) {
  document["dryRun"] = options.dryRun;
  document["sessions"] = Json::Value(Json::arrayValue);
  for (const StaleSession &candidate : stale.candidates) {
    Json::Value entry = jsonSession(candidate.session, candidate.size);
    entry["removed"] = candidate.removed;
    document["sessions"].append(entry);
  }
  document["inUse"] = Json::Value(Json::arrayValue);
  for (const InUse &used : stale.inUse) {
    Json::Value entry(Json::objectValue);
    entry["id"] = used.session.id.empty() ? Json::Value() : Json::Value(used.session.id);
    entry["path"] = jsonName(used.session.path);
    entry["users"] = jsonUsers(used.users);
    document["inUse"].append(entry);
  }
  document["staleBytes"] = Json::UInt64{totalsOf(stale.candidates).bytes};
  document["freedBytes"] = Json::UInt64{totalsOf(stale.candidates, Which::Removed).bytes};
}

// A no is a failure: a script that relies on the removal must not go on.
void requireConsent(Context &context, const std::vector<StaleSession> &candidates,
                    const PruneOptions &options) {
  if (!options.yes &&
      !confirm(context, fmt::format("Remove {}?", describe(totalsOf(candidates))))) {
    throw Failure(kFailed, "nothing was removed");
  }
}

int removeStale(Context &context, std::vector<StaleSession> &candidates,
                const PruneOptions &options, std::chrono::seconds olderThan) {
  requireConsent(context, candidates, options);
  const std::vector<std::string> failures = removeAllOf(context, candidates, olderThan);
  for (const std::string &failure : failures) {
    context.reportError(kFailed, failure);
  }
  context.remark(fmt::format("removed {}", describe(totalsOf(candidates, Which::Removed))));
  return failures.empty() ? kDone : kFailed;
}

// Checked before anything is counted: a script should not have to wait to learn that it needs
// --yes.
void requireConsentPossible(const Context &context, const PruneOptions &options) {
  if (!options.dryRun && !options.yes && (context.json || !canAsk(context))) {
    throw Failure(kUsage, context.json ? "--json never asks; pass --yes or --dry-run"
                                       : "not a terminal; pass --yes or --dry-run");
  }
}

// An old session that stays would otherwise look like an error of the command.
void reportKept(Context &context, const Stale &stale) {
  for (const InUse &used : stale.inUse) {
    context.remark(fmt::format("session {} is old, but left alone: in use by {}",
                               nameOf(used.session), describeUsers(used.users)));
  }
  for (const Service::Error &error : stale.failures) {
    context.reportError(
        kFailed,
        isUsersUnknown(error)
            ? fmt::format("sessions are left alone: their users are unknown: {}", reasonOf(error))
            : whyIncomplete(error));
  }
}

int prune(Context &context, const PruneOptions &options) {
  const std::chrono::seconds olderThan = requireAge(options.olderThan);
  requireConsentPossible(context, options);
  requireTrustedRoot();
  Stale stale = findStale(context, olderThan);
  std::vector<StaleSession> &candidates = stale.candidates;
  int exitCode = stale.failures.empty() ? kDone : kFailed;
  printCandidates(context, candidates, options.null);
  reportKept(context, stale);
  if (candidates.empty() && exitCode == kDone) {
    context.remark("there is nothing to prune");
  } else if (options.dryRun && !candidates.empty()) {
    context.remark(fmt::format("would remove {}", describe(totalsOf(candidates))));
  } else if (!candidates.empty()) {
    exitCode = std::max(exitCode, removeStale(context, candidates, options, olderThan));
  }
  documentResult(context.document, options, stale);
  return exitCode;
}

} // namespace

void registerPrune(CommandGroup &group) {
  auto options = std::make_shared<PruneOptions>();
  group.command("prune", "Remove what crashed services left behind")
      .required(options->olderThan, "--older-than", "AGE",
                "remove sessions not loaded for this long: a number and s, m, h, d or w")
      .completes(ages)
      .flag(options->dryRun, "--dry-run", "only show what would be removed")
      .flag(options->yes, "--yes", "do not ask")
      .nullFlag(options->null, "end each row with a NUL byte")
      .note(
          "Dangling links are removed when they were created that long ago. If the volume of such "
          "a link is merely unmounted, the data of the session remains there without an id. "
          "Foreign links are never touched; lost sessions are removed like any other. A session is "
          "left alone, however old it is, while a process has one of its files open or uses its "
          "directory, and when that cannot be known.")
      .note("The rows are those of session list. On a terminal the command asks first; elsewhere "
            "it requires --yes.")
      .example("kovabackup session prune --older-than 7d --dry-run")
      .example("kovabackup session prune --older-than 36h --yes")
      .action([options](Context &c) { return prune(c, *options); });
}

} // namespace KOVA::Backup::Tool
