#include "tools/kovabackup/commands/session_prune.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/commands/session_removal.h"
#include "tools/kovabackup/commands/session_view.h"
#include "tools/kovabackup/frame/progress.h"
#include "tools/kovabackup/frame/prompt.h"
#include "tools/kovabackup/frame/text.h"

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
  SessionEntry entry;
  TreeSize size;
  std::vector<TreePart> parts;
  bool removed = false;
};

// An old session that some process still uses.
struct InUse {
  std::string id;
  std::vector<Process> users;
};

struct Stale {
  std::vector<StaleSession> candidates;
  std::vector<InUse> inUse;
};

struct Totals {
  std::size_t sessions = 0;
  std::uint64_t bytes = 0;
};

// Where the progress bar is drawn; -1 when messages do not go to a terminal.
int terminalOf(const Context &context) {
  return context.messages.terminal() ? STDERR_FILENO : -1;
}

// A dangling link has an age of its own: its volume may be unmounted only for a while. A foreign
// link is never stale, since removing it would remove what it points to.
bool isStale(const SessionEntry &entry, std::chrono::seconds olderThan) {
  return entry.state != SessionState::Foreign && entry.age >= olderThan;
}

// A backup may run for longer than the given age without creating anything in its session, so a
// session in use is left alone.
Stale findStale(const Context &context, std::chrono::seconds olderThan) {
  Stale stale;
  const OpenPaths open;
  for (const SessionEntry &entry : listSessions()) {
    if (!isStale(entry, olderThan)) {
      continue;
    }
    const std::vector<Process> users = usersOf(open, entry);
    if (users.empty()) {
      stale.candidates.emplace_back().entry = entry;
    } else {
      stale.inUse.push_back({entry.id, users});
    }
  }
  Progress progress(terminalOf(context), "counting", stale.candidates.size(), Unit::Things);
  for (StaleSession &candidate : stale.candidates) {
    candidate.size = measure(candidate.entry, &candidate.parts);
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
    rows.add(sessionRow(context, candidate.entry, candidate.size));
  }
  if (!context.json && !rows.empty()) {
    rows.print(context.out, null);
    // The rows must be visible before the question. A failure is reported at the end.
    (void)context.out.flush();
  }
}

// A session may have been loaded, opened or destroyed since it was listed.
bool stillStale(const std::string &id, std::chrono::seconds olderThan, const OpenPaths &open) {
  SessionEntry entry;
  return lookUpSession(id, entry) && isStale(entry, olderThan) && usersOf(open, entry).empty();
}

// Collects the failures: reported at once they would be written into the line of the bar, which is
// gone when this returns.
std::vector<Failure> removeAllOf(Context &context, std::vector<StaleSession> &candidates,
                                 std::chrono::seconds olderThan) {
  std::vector<Failure> failures;
  const OpenPaths open; // looked at again: the user may have taken long to answer
  Progress progress(terminalOf(context), "removing", totalsOf(candidates).bytes, Unit::Bytes);
  for (StaleSession &candidate : candidates) {
    try {
      if (stillStale(candidate.entry.id, olderThan, open)) {
        removeSession(candidate.entry, candidate.parts,
                      [&progress](std::uint64_t bytes) { progress.add(bytes); });
        candidate.removed = true;
      }
    } catch (const Failure &failure) {
      failures.push_back(failure);
    }
  }
  return failures;
}

void documentResult(Json::Value &document, const PruneOptions &options, const Stale &stale) {
  document["dryRun"] = options.dryRun;
  document["sessions"] = Json::Value(Json::arrayValue);
  for (const StaleSession &candidate : stale.candidates) {
    Json::Value entry = jsonSession(candidate.entry, candidate.size);
    entry["removed"] = candidate.removed;
    document["sessions"].append(entry);
  }
  document["inUse"] = Json::Value(Json::arrayValue);
  for (const InUse &session : stale.inUse) {
    Json::Value entry(Json::objectValue);
    entry["id"] = session.id;
    entry["users"] = jsonUsers(session.users);
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
  const std::vector<Failure> failures = removeAllOf(context, candidates, olderThan);
  for (const Failure &failure : failures) {
    context.reportError(failure.exitCode(), failure.what());
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

int prune(Context &context, const PruneOptions &options) {
  const std::chrono::seconds olderThan = requireAge(options.olderThan);
  requireConsentPossible(context, options);
  requireTrustedRoot();
  Stale stale = findStale(context, olderThan);
  std::vector<StaleSession> &candidates = stale.candidates;
  int exitCode = kDone;
  printCandidates(context, candidates, options.null);
  // An old session that stays would otherwise look like an error of the command.
  for (const InUse &session : stale.inUse) {
    context.remark(fmt::format("session {} is old, but left alone: in use by {}", session.id,
                               describeUsers(session.users)));
  }
  if (candidates.empty()) {
    context.remark("there is nothing to prune");
  } else if (options.dryRun) {
    context.remark(fmt::format("would remove {}", describe(totalsOf(candidates))));
  } else {
    exitCode = removeStale(context, candidates, options, olderThan);
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
          "Foreign links are never touched. A session is left alone, however old it is, while a "
          "process has one of its files open or uses its directory; an ordinary user sees only "
          "their own processes.")
      .note("The rows are those of session list. On a terminal the command asks first; elsewhere "
            "it requires --yes.")
      .example("kovabackup session prune --older-than 7d --dry-run")
      .example("kovabackup session prune --older-than 36h --yes")
      .action([options](Context &c) { return prune(c, *options); });
}

} // namespace KOVA::Backup::Tool
