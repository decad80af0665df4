// Templates and formatting, compared with what a caller would write instead: Boost's replace_all
// once for each name, a regular expression that finds the placeholders, boost::format and an output
// stream. Every result is checked before it is measured.

#include "kovabackup/string_util.h"

#include <benchmark/benchmark.h>
#include <boost/algorithm/string/replace.hpp>
#include <boost/format.hpp>
#include <regex>
#include <sstream>

namespace {

using KOVA::Backup::replaceMustache;
using KOVA::Backup::stringf;
using Vars = std::map<std::string, std::string>;

const Vars &vars() {
  static const Vars map = [] {
    Vars made;
    for (int i = 0; i < 20; ++i) {
      made["name" + std::to_string(i)] = "the value of name " + std::to_string(i);
    }
    return made;
  }();
  return map;
}

// A sentence of text for each placeholder.
std::string makeTemplate(std::int64_t placeholders) {
  std::string text;
  for (std::int64_t i = 0; i < placeholders; ++i) {
    text += "The task reported this about the {{name" + std::to_string(i % 20) + "}} that it had. ";
  }
  return text;
}

std::string byReplaceAll(std::string text) {
  for (const auto &[name, value] : vars()) {
    boost::algorithm::replace_all(text, "{{" + name + "}}", value);
  }
  return text;
}

std::string byRegex(const std::string &text) {
  static const std::regex placeholder("\\{\\{([^{}]*)\\}\\}");
  std::string out;
  auto copied = text.cbegin();
  for (std::sregex_iterator at(text.begin(), text.end(), placeholder), end; at != end; ++at) {
    out.append(copied, (*at)[0].first);
    const auto found = vars().find((*at)[1]);
    out += found == vars().end() ? "" : found->second;
    copied = (*at)[0].second;
  }
  return out.append(copied, text.cend());
}

template <typename Expand>
void expand(benchmark::State &state, Expand function) {
  const std::string text = makeTemplate(state.range(0));
  if (function(text) != byReplaceAll(text)) {
    state.SkipWithError("the result differs from the peer's");
    return;
  }
  for (auto _ : state) {
    benchmark::DoNotOptimize(function(text));
  }
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text.size()));
}

void templateReplaceMustache(benchmark::State &state) {
  expand(state, [](const std::string &text) { return replaceMustache(text, vars()); });
}
void templateBoostReplaceAll(benchmark::State &state) {
  expand(state, [](const std::string &text) { return byReplaceAll(text); });
}
void templateStdRegex(benchmark::State &state) {
  expand(state, [](const std::string &text) { return byRegex(text); });
}
BENCHMARK(templateReplaceMustache)->Arg(1)->Arg(20)->Arg(1000);
BENCHMARK(templateBoostReplaceAll)->Arg(1)->Arg(20)->Arg(1000);
BENCHMARK(templateStdRegex)->Arg(1)->Arg(20)->Arg(1000);

// Braces that are never closed, and nested braces. The cost per byte must not grow with the size.
void templateUnclosedBraces(benchmark::State &state) {
  const std::string text(static_cast<std::size_t>(state.range(0)), '{');
  if (replaceMustache(text, vars()) != text) {
    state.SkipWithError("the text was changed");
    return;
  }
  for (auto _ : state) {
    benchmark::DoNotOptimize(replaceMustache(text, vars()));
  }
  state.SetBytesProcessed(state.iterations() * state.range(0));
}
BENCHMARK(templateUnclosedBraces)->RangeMultiplier(16)->Range(1 << 10, 1 << 22);

void templateNestedBraces(benchmark::State &state) {
  const auto half = static_cast<std::size_t>(state.range(0) / 2);
  const std::string text = std::string(half, '{') + std::string(half, '}');
  if (replaceMustache(text, vars()).size() != text.size() - 4) {
    state.SkipWithError("not exactly the innermost placeholder was removed");
    return;
  }
  for (auto _ : state) {
    benchmark::DoNotOptimize(replaceMustache(text, vars()));
  }
  state.SetBytesProcessed(state.iterations() * state.range(0));
}
BENCHMARK(templateNestedBraces)->RangeMultiplier(16)->Range(1 << 10, 1 << 22);

std::string formatStringf(const std::string &text) {
  return stringf("%s: task %d of %lld", text.c_str(), 7, 123456789012LL);
}
std::string formatBoost(const std::string &text) {
  return (boost::format("%s: task %d of %d") % text % 7 % 123456789012LL).str();
}
std::string formatStream(const std::string &text) {
  std::ostringstream out;
  out << text << ": task " << 7 << " of " << 123456789012LL;
  return out.str();
}

template <typename Format>
void format(benchmark::State &state, Format function) {
  const std::string text(static_cast<std::size_t>(state.range(0)), 'x');
  if (function(text) != formatStream(text)) {
    state.SkipWithError("the result differs from the peer's");
    return;
  }
  for (auto _ : state) {
    benchmark::DoNotOptimize(function(text));
  }
}
BENCHMARK_CAPTURE(format, stringf, &formatStringf)->Arg(20)->Arg(1000);
BENCHMARK_CAPTURE(format, boostFormat, &formatBoost)->Arg(20)->Arg(1000);
BENCHMARK_CAPTURE(format, ostringstream, &formatStream)->Arg(20)->Arg(1000);

} // namespace
