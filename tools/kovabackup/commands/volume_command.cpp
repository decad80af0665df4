#include "kovaplatform/kovasdk.h"
#include "tools/kovabackup/commands/groups.h"

#include "tools/kovabackup/commands/completions.h"
#include "tools/kovabackup/facts/space.h"
#include "tools/kovabackup/facts/volume_rule.h"
#include "tools/kovabackup/facts/volumes.h"
#include "tools/kovabackup/frame/list_order.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct ListOptions {
  bool null = false;
  OrderOptions order;
};

SortKeys sortKeys() {
  return {{"type", "type"},
          {"size", "size"},
          {"free", "free"},
          {"location", "location"},
          {"path", "path"}};
}

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
  return !volume.mounted ? whyNotMounted(volume) : volume.writable ? "writable" : "read-only";
}

// Below the mount point of a volume that is not mounted there is another file system.
std::optional<Space> spaceOn(const Volume &volume) {
  return volume.mounted ? spaceOf(volume.path) : std::nullopt;
}

Json::Value jsonVolume(const Volume &volume, const std::optional<Space> &space) {
  Json::Value value(Json::objectValue);
  value["path"] = jsonName(volume.path);
  value["fsType"] = volume.fsType; // the number as well: not every platform names its types
  value["type"] = typeName(volume.fsType);
  value["size"] = Json::UInt64{volume.size};
  value["free"] = space ? Json::Value(Json::UInt64{space->free}) : Json::Value();
  value["freePercent"] = space ? Json::Value(space->freePercent()) : Json::Value();
  value["mounted"] = volume.mounted;
  value["writable"] = volume.writable;
  value["location"] = locationName(volume.location);
  return value;
}

Rows volumeRows() {
  Rows rows;
  rows.column("TYPE").column("SIZE", Align::Right).column("FREE", Align::Right);
  rows.column("FREE%", Align::Right).column("LOCATION").column("STATE").column("PATH");
  return rows;
}

std::vector<std::string> volumeRow(const Context &context, const Volume &volume,
                                   const std::optional<Space> &space) {
  const auto shown = [&context](std::uint64_t bytes) {
    return context.out.terminal() ? humanBytes(bytes) : std::to_string(bytes);
  };
  return {typeName(volume.fsType),
          shown(volume.size),
          space ? shown(space->free) : "-",
          space ? std::to_string(space->freePercent()) : "-",
          locationName(volume.location),
          stateName(volume),
          volume.path};
}

bool isUsable(const Volume &volume) {
  return volume.mounted && volume.writable;
}

void remarkWhereNoneIsUsable(Context &context, const std::vector<Volume> &volumes) {
  if (std::none_of(volumes.begin(), volumes.end(), isUsable)) {
    context.remark(fmt::format(
        "{}; {}", volumes.empty() ? "the platform reports no volumes" : "no volume can be written",
        volumeAdvice()));
  }
}

int list(Context &context, const ListOptions &options) {
  const ListOrder order(options.order, sortKeys());
  const std::vector<Volume> volumes = listVolumes();
  std::vector<Listed> entries;
  for (const Volume &volume : volumes) {
    const std::optional<Space> space = spaceOn(volume);
    entries.push_back({jsonVolume(volume, space), {volumeRow(context, volume, space)}});
  }
  order.apply(context, "volumes", entries);
  if (context.json) {
    return kDone;
  }
  remarkWhereNoneIsUsable(context, volumes);
  printRows(context, volumeRows(), entries, options.null);
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

// A rule looks at the size of a volume, never at the room on it.
void warnOfFullVolume(Context &context, const Choice &choice) {
  const std::optional<Space> space = spaceOf(choice.folder);
  if (space && space->isBelow(kMinFreePercent)) {
    context.remark(
        fmt::format("{} is chosen, but has little room: {}", choice.folder, describe(*space)));
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
    remarkWhereNoneIsUsable(context, listVolumes());
    context.reportError(kNegative, "no volume qualifies");
    return kNegative;
  }
  if (choice.volume.empty()) {
    context.remark("no volume qualifies; this is the fallback");
  }
  warnOfFullVolume(context, choice);
  context.out.name(choice.folder, options.null ? '\0' : '\n');
  return kDone;
}

} // namespace

void registerVolume(CommandGroup &root) {
  CommandGroup group = root.group("volume", "Show volumes and what a rule chooses");
  group.example("kovabackup volume list").example("kovabackup volume pick max-ext-btrfs");
  auto listOptions = std::make_shared<ListOptions>();
  Command listing = group.command("list", "List the volumes that the platform reports");
  listing.nullFlag(listOptions->null, "end each row with a NUL byte");
  declareOrder(listing, listOptions->order, sortKeys());
  listing
      .note("Unless the output is a terminal, a row is type, size, free space in bytes, free "
            "space in percent, location, state and path, separated by tabs; the free space of a "
            "volume that is not mounted is '-'. A machine whose only file system is the root has "
            "no volumes, unless the platform's configuration names a directory as one.")
      .example("kovabackup volume list")
      .example("kovabackup volume list --sort=-free")
      .example("kovabackup volume list --json")
      .action([listOptions](Context &c) { return list(c, *listOptions); });
  auto pickOptions = std::make_shared<PickOptions>();
  group.command("pick", "Show where a rule would place temporary data, and why not elsewhere")
      .argument(pickOptions->rule, "RULE", VolumeRule::names())
      .completes(volumeRules, "same:")
      .flag(pickOptions->fallbackTmp, "--fallback-tmp", "use /tmp when no volume qualifies")
      .nullFlag(pickOptions->null, "end the path with a NUL byte")
      .note("The path of the directory goes to standard output; the reasons against the other "
            "volumes "
            "go to standard error. A rule compares sizes, not free space, so a full volume may be "
            "chosen; a message says so. Ends with 3 when no volume qualifies. Creates missing "
            "temporary "
            "directories on the volumes that it examines, as every service does.")
      .example("kovabackup volume pick max")
      .example("kovabackup volume pick same:/volume1/photo")
      .example("kovabackup volume pick max-ext --fallback-tmp --json")
      .action([pickOptions](Context &c) { return pick(c, *pickOptions); });
}

} // namespace KOVA::Backup::Tool
