#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/health.h"
#include "tools/kovabackup/facts/sessions.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct DoctorOptions {
  std::optional<std::string> olderThan;
  bool null = false;
};

// Scripts rely on these words.
const char *word(Verdict verdict) {
  switch (verdict) {
  case Verdict::Good:
    return "ok";
  case Verdict::Remark:
    return "note";
  case Verdict::Wrong:
    break;
  }
  return "wrong";
}

std::string painted(const Style &style, Verdict verdict) {
  const std::string text = fmt::format("{:<5}", word(verdict));
  return verdict == Verdict::Good    ? style.good(text)
         : verdict == Verdict::Wrong ? style.bad(text)
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
    out.write(fmt::format("{}  {:<12}  {}", painted(out.style(), finding.verdict), finding.check,
                          detail));
    // The hint has a line of its own, below the detail.
    out.write(hint.empty() ? "" : fmt::format("{}{:21}{}", end, "", out.style().faint(hint)));
  } else {
    out.write(fmt::format("{}\t{}\t{}", word(finding.verdict), finding.check, detail));
    out.write(hint.empty() ? "" : "\t" + hint);
  }
  out.write({&end, 1});
}

int doctor(Context &context, const DoctorOptions &options) {
  const std::string age = options.olderThan.value_or("7d");
  const std::chrono::seconds olderThan = requireAge(age);
  bool healthy = true; // a note is not a fault
  context.document["findings"] = Json::Value(Json::arrayValue);
  for (const Finding &finding : checkHealth(olderThan, age)) {
    healthy = healthy && finding.verdict != Verdict::Wrong;
    context.document["findings"].append(jsonFinding(finding));
    if (!context.json) {
      print(context.out, finding, options.null ? '\0' : '\n');
    }
  }
  context.document["healthy"] = healthy;
  return healthy ? kDone : kNegative;
}

} // namespace

void registerDoctor(CommandGroup &root) {
  auto options = std::make_shared<DoctorOptions>();
  root.command("doctor", "Check that the machine is in the state that services need")
      .option(options->olderThan, "--older-than", "AGE",
              "age from which a session counts as stale: a number and s, m, h, d or w (7d)")
      .completes(ages)
      .nullFlag(options->null, "end each row with a NUL byte")
      .note("Checks the owner and mode of the directories under /tmp/kovabackup, stale sessions, "
            "whether each volume is writable, the platform's key file, and the system log. Each "
            "row is ok, note or wrong, the check, what was found and, if something has to be done, "
            "a hint, separated by tabs. Ends with 3 when something is wrong. Missing temporary "
            "directories of volumes are created, as every service does; nothing else is changed.")
      .example("kovabackup doctor")
      .example("kovabackup doctor --json | jq '.findings[] | select(.verdict == \"wrong\")'")
      .action([options](Context &c) { return doctor(c, *options); });
}

} // namespace KOVA::Backup::Tool
