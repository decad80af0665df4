// Templates raced against ctemplate. "ctemplate" expands a template that was parsed beforehand,
// from a dictionary that was filled beforehand, into a string that keeps its memory.
// "ctemplate_parsing" parses the template each time, as replaceMustache does. Neither strips nor
// escapes anything.
//
// The first argument is the size of the template, with a placeholder in every 50 bytes, and the
// second one the number of different names.

#include "kovabackup/string_util.h"

#include "bench/race.h"
#include "bench/templates.h"

#include <benchmark/benchmark.h>
#include <ctemplate/template.h>
#include <memory>

namespace {

using ctemplate::DO_NOT_STRIP;
using ctemplate::Template;
using ctemplate::TemplateDictionary;
using KOVA::Backup::replaceMustache;
using KovaBench::makeTemplate;
using KovaBench::makeVars;
using KovaBench::Race;
using KovaBench::rounds;
using KovaBench::Vars;

std::unique_ptr<Template> parse(const std::string &text) {
  return std::unique_ptr<Template>(Template::StringToTemplate(text, DO_NOT_STRIP));
}

// Races ours against ctemplate with the same text and the same values. Complete results are
// compared before the race, and their sizes in it, so that comparing costs the contestants nothing.
template <typename Ours>
void raceCtemplate(benchmark::State &state, const std::string &text, const Vars &vars, Ours ours) {
  TemplateDictionary dictionary("vars");
  for (const auto &[name, value] : vars) {
    dictionary.SetValue(name, value);
  }
  const std::unique_ptr<Template> parsed = parse(text);
  std::string out;
  const auto expand = [&](const Template &from) {
    out.clear();
    return from.Expand(&out, &dictionary);
  };
  if (!expand(*parsed) || ours() != out) {
    state.SkipWithError("the result differs from the peer's");
    return;
  }
  const std::size_t size = out.size();
  const double goal = text.size() <= 2000 ? 1.1 : 0.8;
  Race(state, [&] { return ours().size() == size; })
      .peer(
          "ctemplate", [&] { return expand(*parsed) && out.size() == size; }, goal)
      .peer(
          "ctemplate_parsing", [&] { return expand(*parse(text)) && out.size() == size; }, 0.15)
      .run();
}

void expandMap(benchmark::State &state) {
  const auto names = static_cast<std::size_t>(state.range(1));
  const std::string text = makeTemplate(static_cast<std::size_t>(state.range(0)), names);
  const Vars vars = makeVars(names);
  raceCtemplate(state, text, vars, [&] { return replaceMustache(text, vars); });
}

void expandJson(benchmark::State &state) {
  const auto names = static_cast<std::size_t>(state.range(1));
  const std::string text = makeTemplate(static_cast<std::size_t>(state.range(0)), names);
  const Vars vars = makeVars(names);
  Json::Value json(Json::objectValue);
  for (const auto &[name, value] : vars) {
    json[name] = value;
  }
  raceCtemplate(state, text, vars, [&] { return replaceMustache(text, json, false); });
}

void sizes(benchmark::internal::Benchmark *race) {
  race->ArgNames({"bytes", "names"});
  for (const std::int64_t bytes : {1000, 2000, 16000, 256000, 1000000}) {
    race->Args({bytes, 40});
  }
  race->Args({2000, 10})->Args({1000000, 1000})->Args({1000000, 20000});
  rounds(race);
}
BENCHMARK(expandMap)->Apply(sizes);
BENCHMARK(expandJson)->Apply(sizes);

} // namespace
