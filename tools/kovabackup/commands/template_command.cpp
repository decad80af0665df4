#include "tools/kovabackup/commands/groups.h"

#include "kovabackup/string_util.h"
#include "tools/kovabackup/frame/input.h"
#include "tools/kovabackup/frame/text.h"

#include <algorithm>
#include <fmt/format.h>

namespace KOVA::Backup::Tool {
namespace {

struct FillOptions {
  std::string file;
  std::vector<std::string> set;
  std::optional<std::string> json;
  bool strict = false;
};

using Values = std::map<std::string, std::string>;

// The last value of a name counts, as with most commands.
Values valuesOf(const std::vector<std::string> &pairs) {
  Values values;
  for (const std::string &pair : pairs) {
    const std::size_t equals = pair.find('=');
    if (equals == std::string::npos) {
      throw Failure(kUsage, fmt::format("--set requires NAME=VALUE, not '{}'", pair));
    }
    values[pair.substr(0, equals)] = pair.substr(equals + 1);
  }
  return values;
}

// Looks names up in the values of --set, then in the JSON object, and remembers the names that have
// no value, each once and in the order of the template.
class Mapper {
public:
  Mapper(const Values &values, const Json::Value &json, std::vector<std::string> &missing)
      : fromValues_(values), fromJson_(json, false), missing_(&missing) {}

  bool operator()(const std::string &name, std::string &value) const {
    if (fromValues_(name, value) || fromJson_(name, value)) {
      return true;
    }
    if (std::find(missing_->begin(), missing_->end(), name) == missing_->end()) {
      missing_->push_back(name);
    }
    return false;
  }

private:
  _VarsMapperMapString fromValues_;
  _VarsMapperJson fromJson_;
  std::vector<std::string> *missing_;
};

int fill(Context &context, const FillOptions &options) {
  if (options.file == "-" && options.json == "-") {
    throw Failure(kUsage, "template and values cannot both come from standard input");
  }
  const Values values = valuesOf(options.set);
  const Json::Value json =
      options.json ? readJsonObject(*options.json) : Json::Value(Json::objectValue);
  std::vector<std::string> missing;
  const std::string text = replaceMustache(readAll(options.file), Mapper(values, json, missing));
  for (const std::string &name : missing) {
    const std::string message = fmt::format("no value for '{}': it is left out", name);
    // Nothing was printed yet: a strict caller gets a complete text or none.
    if (options.strict) {
      throw Failure(kNegative, fmt::format("no value for '{}'", name));
    }
    context.remark(message);
  }
  context.document["text"] = jsonName(text);
  context.document["missing"] = Json::Value(Json::arrayValue);
  for (const std::string &name : missing) {
    context.document["missing"].append(jsonName(name));
  }
  if (!context.json) {
    context.out.write(context.out.terminal() ? escapeControls(text, Lines::Keep) : text);
  }
  return kDone;
}

} // namespace

void registerTemplate(CommandGroup &root) {
  CommandGroup group = root.group("template", "Fill message templates");
  group.example("kovabackup template fill report.txt --set task=photos");
  auto options = std::make_shared<FillOptions>();
  group.command("fill", "Replace each {{name}} of a template with its value")
      .argument(options->file, "FILE", "the template; - for standard input")
      .completes(Completes::Files)
      .repeated(options->set, "--set", "NAME=VALUE", "a value; may be given several times")
      .option(options->json, "--json", "FILE",
              "take values from the members of a JSON object; - for standard input")
      .completes(Completes::Files)
      .flag(options->strict, "--strict", "end with 3 when a name has no value")
      .note("Values of --set take precedence over those of --json. Values are inserted as they "
            "are: a "
            "{{name}} in a value is not replaced. A name without a value is left out with its "
            "braces, "
            "and a message says so.")
      .note("Here --json names a file. To get the result as a JSON document put --json first: "
            "kovabackup --json template fill FILE.")
      .example("kovabackup template fill report.txt --set task=photos --set result=done")
      .example("kovabackup template fill report.txt --json run.json --strict")
      .action([options](Context &c) { return fill(c, *options); });
}

} // namespace KOVA::Backup::Tool
