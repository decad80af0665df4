#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/health.h"
#include "tools/kovabackup/facts/sessions.h"
#include "tools/kovabackup/facts/space.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct DoctorOptions {
  std::optional<std::string> olderThan;
  std::optional<std::string> minFree;
  bool fix = false;
  bool null = false;
};

constexpr std::size_t kCheckColumn = 7;   // behind the verdict
constexpr std::size_t kDetailColumn = 21; // behind the check
constexpr std::size_t kNarrow = 72;       // below it the detail has lines of its own

// Scripts rely on these words.
const char *word(Verdict verdict) {
  switch (verdict) {
  case Verdict::Good:
    return "ok";
  case Verdict::Remark:
    return "note";
  case Verdict::Fixed:
    return "fixed";
  case Verdict::Wrong:
    break;
  }
  return "wrong";
}

std::string painted(const Style &style, Verdict verdict) {
  const std::string text = fmt::format("{:<5}", word(verdict));
  return verdict == Verdict::Good || verdict == Verdict::Fixed ? style.good(text)
         : verdict == Verdict::Wrong                           ? style.bad(text)
                                                               : style.faint(text);
}

Json::Value jsonFinding(const Finding &finding) {
  Json::Value entry(Json::objectValue);
  entry["verdict"] = word(finding.verdict);
  entry["check"] = finding.check;
  entry["detail"] = jsonName(finding.detail);
  entry["hint"] = finding.hint.empty() ? Json::Value() : jsonName(finding.hint);
  return entry;
}

// The words of a verdict are padded to the width of the longest, so that checks are aligned.
void print(Output &out, const Finding &finding, char end) {
  const std::string detail = out.name(finding.detail);
  const std::string hint = out.name(finding.hint);
  if (out.terminal()) {
    const bool narrow = out.width() < kNarrow;
    const std::size_t column = narrow ? kCheckColumn : kDetailColumn;
    const std::string below = fmt::format("{}{:{}}", end, "", column);
    out.write(fmt::format("{}  {}{}{}", painted(out.style(), finding.verdict),
                          narrow ? finding.check : fmt::format("{:<12}", finding.check),
                          narrow ? below : "  ", wrapped(detail, column, out.width())));
    // The hint has a line of its own, below the detail.
    out.write(hint.empty() ? "" : below + out.style().faint(wrapped(hint, column, out.width())));
  } else {
    out.write(fmt::format("{}\t{}\t{}", word(finding.verdict), finding.check, detail));
    out.write(hint.empty() ? "" : "\t" + hint);
  }
  out.write({&end, 1});
}

HealthLimits limitsOf(const DoctorOptions &options) {
  const std::string age = options.olderThan.value_or("7d");
  const std::string percent = options.minFree.value_or(std::to_string(kMinFreePercent));
  const auto minFree = parseNumber(percent, 0, 100);
  if (!minFree) {
    throw Failure(kUsage, fmt::format("'{}' is not a valid share: expected a percentage from 0 to "
                                      "100",
                                      percent));
  }
  return {requireAge(age), age, static_cast<int>(*minFree)};
}

// What could not be repaired is found again by the checks that follow.
Findings fixed(Context &context, const Findings &findings) {
  Findings done;
  for (const Finding &finding : findings) {
    if (!finding.fix) {
      continue;
    }
    const std::string why = finding.fix();
    if (why.empty()) {
      done.push_back({Verdict::Fixed, finding.check, finding.detail});
    } else {
      context.remark(fmt::format("{} could not be fixed: {}", finding.check, why));
    }
  }
  return done;
}

std::size_t count(const Findings &findings, Verdict verdict) {
  return static_cast<std::size_t>(
      std::count_if(findings.begin(), findings.end(),
                    [verdict](const Finding &finding) { return finding.verdict == verdict; }));
}

void printSummary(Context &context, const Findings &findings, char end) {
  const std::string text =
      fmt::format("{} ok, {} to note, {} wrong", count(findings, Verdict::Good),
                  count(findings, Verdict::Remark), count(findings, Verdict::Wrong));
  if (context.out.terminal()) {
    context.out.write(fmt::format("{}{}{}", end, text, end));
  } else {
    context.out.write(fmt::format("summary\tall checks\t{}{}", text, end));
  }
}

int doctor(Context &context, const DoctorOptions &options) {
  const HealthLimits limits = limitsOf(options);
  Findings findings = checkHealth(limits);
  Findings shown;
  if (options.fix) {
    shown = fixed(context, findings);
    findings = checkHealth(limits);
  }
  shown.insert(shown.end(), findings.begin(), findings.end());
  const char end = options.null ? '\0' : '\n';
  context.document["findings"] = Json::Value(Json::arrayValue);
  for (const Finding &finding : shown) {
    context.document["findings"].append(jsonFinding(finding));
    if (!context.json && !(context.quiet && finding.verdict == Verdict::Good)) {
      print(context.out, finding, end);
    }
  }
  const bool healthy = count(findings, Verdict::Wrong) == 0; // a note is not a fault
  context.document["healthy"] = healthy;
  if (!context.json && !context.quiet) {
    printSummary(context, findings, end);
  }
  return healthy ? kDone : kNegative;
}

} // namespace

void registerDoctor(CommandGroup &root) {
  auto options = std::make_shared<DoctorOptions>();
  root.command("doctor", "Check that the machine is in the state that services need")
      .option(options->olderThan, "--older-than", "AGE",
              "age from which a session counts as stale: a number and s, m, h, d or w (7d)")
      .completes(ages)
      .option(options->minFree, "--min-free", "PERCENT",
              fmt::format("share of free space below which a volume or /tmp is reported ({})",
                          kMinFreePercent))
      .flag(options->fix, "--fix", "repair what can be repaired without harm: modes")
      .nullFlag(options->null, "end each row with a NUL byte")
      .note(
          "Checks /tmp and the owner and mode of the directories under /tmp/kovabackup, stale "
          "sessions, whether each volume is writable and has room, the platform's key file, and "
          "the system log, whether /tmp/kovabackup is created at boot, and edited sections that "
          "were never saved. Each row is ok, note or wrong, the check, what was found and, unless "
          "it is ok, a hint, separated by tabs. The last row is a summary. Ends with 3 when "
          "something is wrong. Missing temporary directories of volumes are created, as every "
          "service does; nothing else is changed without --fix. With --quiet only findings are "
          "printed: neither rows that are ok nor the summary.")
      .note("--fix corrects the modes of /tmp, of the directories under /tmp/kovabackup and of the "
            "key file where they belong to root or to you, and checks again. It removes nothing.")
      .example("kovabackup doctor")
      .example("kovabackup doctor --fix --min-free 10")
      .example("kovabackup doctor --json | jq '.findings[] | select(.verdict == \"wrong\")'")
      .action([options](Context &c) { return doctor(c, *options); });
}

} // namespace KOVA::Backup::Tool
