#include "kovaplatform/kovasdk.h"
#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/volume_rule.h"
#include "tools/kovabackup/facts/volumes.h"
#include "tools/kovabackup/frame/text.h"

#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct ListOptions {
  bool null = false;
};

struct PickOptions {
  std::string rule;
  bool fallbackTmp = false;
  bool null = false;
};

// Other bits are specific to each platform.
std::string locationName(int location) {
  return location == KOVA_VOL_LOC_INTERNAL    ? "internal"
         : location == KOVA_VOL_LOC_REMOVABLE ? "removable"
                                              : fmt::format("location {}", location);
}

std::string stateName(const Volume &volume) {
  return !volume.mounted ? "not mounted" : volume.writable ? "writable" : "read-only";
}

Json::Value jsonVolume(const Volume &volume) {
  Json::Value value(Json::objectValue);
  value["path"] = jsonName(volume.path);
  value["fsType"] = volume.fsType; // the number as well: not every platform names its types
  value["type"] = typeName(volume.fsType);
  value["size"] = Json::UInt64{volume.size};
  value["mounted"] = volume.mounted;
  value["writable"] = volume.writable;
  value["location"] = locationName(volume.location);
  return value;
}

int list(Context &context, const ListOptions &options) {
  const std::vector<Volume> volumes = listVolumes();
  context.document["volumes"] = Json::Value(Json::arrayValue);
  Rows rows;
  rows.column("TYPE")
      .column("SIZE", Align::Right)
      .column("LOCATION")
      .column("STATE")
      .column("PATH");
  for (const Volume &volume : volumes) {
    context.document["volumes"].append(jsonVolume(volume));
    rows.add({typeName(volume.fsType),
              context.out.terminal() ? humanBytes(volume.size) : std::to_string(volume.size),
              locationName(volume.location), stateName(volume), volume.path});
  }
  if (context.json) {
    return kDone;
  }
  if (rows.empty()) {
    context.remark("the platform reports no volumes");
  }
  rows.print(context.out, options.null);
  return kDone;
}

void documentChoice(Json::Value &document, const PickOptions &options, const Choice &choice) {
  document["rule"] = jsonName(options.rule);
  document["folder"] = choice.folder.empty() ? Json::Value() : jsonName(choice.folder);
  document["volume"] = choice.volume.empty() ? Json::Value() : jsonName(choice.volume);
  // A folder that is on no volume is the fallback.
  document["fallback"] = !choice.folder.empty() && choice.volume.empty();
  document["rejected"] = Json::Value(Json::arrayValue);
  for (const Choice::Rejected &rejected : choice.rejected) {
    Json::Value entry(Json::objectValue);
    entry["path"] = jsonName(rejected.volume);
    entry["why"] = jsonName(rejected.why);
    document["rejected"].append(entry);
  }
}

int pick(Context &context, const PickOptions &options) {
  const VolumeRule rule(options.rule);
  if (rule.isSame() && options.fallbackTmp) {
    throw Failure(kUsage, "same:PATH has no fallback; omit --fallback-tmp");
  }
  const Choice choice = choose(rule, options.fallbackTmp);
  documentChoice(context.document, options, choice);
  if (context.json) {
    return choice.folder.empty() ? kNegative : kDone;
  }
  // The reasons go to standard error: standard output carries only the path, for use in $(...).
  for (const Choice::Rejected &rejected : choice.rejected) {
    context.remark(fmt::format("passed over {}: {}", rejected.volume, rejected.why));
  }
  if (choice.folder.empty()) {
    context.reportError(kNegative, "no volume qualifies");
    return kNegative;
  }
  if (choice.volume.empty()) {
    context.remark("no volume qualifies; this is the fallback");
  }
  context.out.name(choice.folder, options.null ? '\0' : '\n');
  return kDone;
}

} // namespace

void registerVolume(CommandGroup &root) {
  CommandGroup group = root.group("volume", "Show volumes and what a rule chooses");
  group.example("kovabackup volume list").example("kovabackup volume pick max-ext-btrfs");
  auto listOptions = std::make_shared<ListOptions>();
  group.command("list", "List the volumes that the platform reports")
      .nullFlag(listOptions->null, "end each row with a NUL byte")
      .note("Unless the output is a terminal, a row is type, size in bytes, location, state and "
            "path, separated by tabs. A machine whose only file system is the root has no volumes, "
            "unless the platform's configuration names a directory as one.")
      .example("kovabackup volume list")
      .example("kovabackup volume list --json")
      .action([listOptions](Context &c) { return list(c, *listOptions); });
  auto pickOptions = std::make_shared<PickOptions>();
  group.command("pick", "Show where a rule would place temporary data, and why not elsewhere")
      .argument(pickOptions->rule, "RULE", VolumeRule::names())
      .completes(volumeRules)
      .flag(pickOptions->fallbackTmp, "--fallback-tmp", "use /tmp when no volume qualifies")
      .nullFlag(pickOptions->null, "end the path with a NUL byte")
      .note("The path of the directory goes to standard output; the reasons against the other "
            "volumes "
            "go to standard error. Ends with 3 when no volume qualifies. Creates missing temporary "
            "directories on the volumes that it examines, as every service does.")
      .example("kovabackup volume pick max")
      .example("kovabackup volume pick same:/volume1/photo")
      .example("kovabackup volume pick max-ext --fallback-tmp --json")
      .action([pickOptions](Context &c) { return pick(c, *pickOptions); });
}

} // namespace KOVA::Backup::Tool
