// Templates and formatting, raced against what a caller would write instead: Boost's replace_all
// once for each name, a regular expression that finds the placeholders, snprintf(3), boost::format
// and an output stream. template_peer_bench.cpp has the race against ctemplate.

#include "kovabackup/string_util.h"

#include "bench/race.h"
#include "bench/templates.h"

#include <benchmark/benchmark.h>
#include <boost/algorithm/string/replace.hpp>
#include <boost/format.hpp>
#include <regex>
#include <sstream>

namespace {

using KOVA::Backup::replaceMustache;
using KOVA::Backup::stringf;
using KovaBench::makeTemplate;
using KovaBench::makeVars;
using KovaBench::Race;
using KovaBench::rounds;
using KovaBench::Vars;

std::string byReplaceAll(std::string text, const Vars &vars) {
  for (const auto &[name, value] : vars) {
    boost::algorithm::replace_all(text, "{{" + name + "}}", value);
  }
  return text;
}

std::string byRegex(const std::string &text, const Vars &vars) {
  static const std::regex placeholder("\\{\\{([^{}]*)\\}\\}");
  std::string out;
  auto copied = text.cbegin();
  for (std::sregex_iterator at(text.begin(), text.end(), placeholder), end; at != end; ++at) {
    out.append(copied, (*at)[0].first);
    const auto found = vars.find((*at)[1]);
    out += found == vars.end() ? "" : found->second;
    copied = (*at)[0].second;
  }
  return out.append(copied, text.cend());
}

// The argument is the size of the template, with a placeholder in every 50 bytes.
void expand(benchmark::State &state) {
  const std::string text = makeTemplate(static_cast<std::size_t>(state.range(0)), 20);
  const Vars vars = makeVars(20);
  const std::string expected = byReplaceAll(text, vars);
  Race(state, [&] { return replaceMustache(text, vars) == expected; })
      .peer("boost_replace_all", [&] { return byReplaceAll(text, vars) == expected; })
      .peer("std_regex", [&] { return byRegex(text, vars) == expected; })
      .run();
}
BENCHMARK(expand)->Arg(50)->Arg(1000)->Arg(16000)->Apply(rounds);

// A report that names few of many variables: what is spent on the others would be wasted.
void expandFewOfMany(benchmark::State &state) {
  const std::string line(static_cast<std::size_t>(state.range(0)) / 3, 'x');
  const std::string text = line + "{{name1}}" + line + "{{name2}}" + line + "{{name3}}";
  const Vars vars = makeVars(200);
  const std::string expected = byRegex(text, vars);
  Race(state, [&] {
    return replaceMustache(text, vars) == expected;
  }).peer("std_regex", [&] {
      return byRegex(text, vars) == expected;
    }).run();
}
BENCHMARK(expandFewOfMany)->Arg(30)->Arg(3000)->Apply(rounds);

// Braces that are never closed and nested braces, against a copy of the text. The time for a byte
// must not grow with the size.
void expandUnclosed(benchmark::State &state) {
  const std::string text(static_cast<std::size_t>(state.range(0)), '{');
  const Vars vars = makeVars(20);
  Race(state, [&] {
    return replaceMustache(text, vars).size() == text.size();
  }).peer("copy", [&] {
      return std::string(text).size() == text.size();
    }).run();
}
BENCHMARK(expandUnclosed)->RangeMultiplier(16)->Range(1 << 10, 1 << 22)->Apply(rounds);

void expandNested(benchmark::State &state) {
  const auto half = static_cast<std::size_t>(state.range(0)) / 2;
  const std::string text = std::string(half, '{') + std::string(half, '}');
  const Vars vars = makeVars(20);
  Race(state, [&] {
    return replaceMustache(text, vars).size() == text.size() - 4;
  }).peer("copy", [&] {
      return std::string(text).size() == text.size();
    }).run();
}
BENCHMARK(expandNested)->RangeMultiplier(16)->Range(1 << 10, 1 << 22)->Apply(rounds);

// One call of snprintf(3), for texts that fit the buffer.
std::string bySnprintf(const char *text) {
  char buffer[128];
  const int length = std::snprintf(buffer, sizeof buffer, "%s: task %d", text, 7);
  return std::string(buffer, static_cast<std::size_t>(length));
}

// The two passes of a text that does not fit: one of 128 bytes, one of its own size.
std::string byTwoPasses(const char *text) {
  char buffer[128];
  const int length = std::snprintf(buffer, sizeof buffer, "%s: task %d", text, 7);
  std::string out(static_cast<std::size_t>(length), '\0');
  (void)std::snprintf(out.data(), out.size() + 1, "%s: task %d", text, 7);
  return out;
}

std::string byBoostFormat(const char *text) {
  return (boost::format("%s: task %d") % text % 7).str();
}

std::string byStream(const char *text) {
  std::ostringstream out;
  out << text << ": task " << 7;
  return out.str();
}

// The argument is the length of the formatted text.
void format(benchmark::State &state) {
  const auto length = static_cast<std::size_t>(state.range(0));
  const std::string text(length - std::strlen(": task 7"), 'x');
  const std::string expected = text + ": task 7";
  Race race(state, [&] { return stringf("%s: task %d", text.c_str(), 7) == expected; });
  if (length < 128) {
    race.peer(
        "snprintf", [&] { return bySnprintf(text.c_str()) == expected; }, 1.05);
  } else {
    race.peer(
        "two_passes", [&] { return byTwoPasses(text.c_str()) == expected; }, 1.05);
  }
  race.peer("boost_format", [&] { return byBoostFormat(text.c_str()) == expected; })
      .peer("ostringstream", [&] { return byStream(text.c_str()) == expected; })
      .run();
}
BENCHMARK(format)->Arg(10)->Arg(40)->Arg(300)->Arg(3000)->Apply(rounds);

} // namespace
