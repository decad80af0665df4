// Joining and splitting paths, compared with std::filesystem and Boost's split. Every result is
// checked before it is measured.

#include "kovabackup/path_util.h"

#include <benchmark/benchmark.h>
#include <boost/algorithm/string/classification.hpp>
#include <boost/algorithm/string/split.hpp>
#include <filesystem>

namespace {

namespace fs = std::filesystem;
namespace Path = KOVA::Backup::Path;
using Parts = std::vector<std::string>;

Parts makeParts(std::int64_t count) {
  Parts parts = {"/"};
  for (std::int64_t i = 1; i < count; ++i) {
    parts.push_back("folder" + std::to_string(i));
  }
  return parts;
}

std::string joinPath(const Parts &parts) {
  return Path::join(parts);
}
std::string joinFilesystem(const Parts &parts) {
  fs::path path;
  for (const std::string &part : parts) {
    path /= part;
  }
  return path.string();
}
std::string joinBySlash(const Parts &parts) {
  std::string path;
  for (const std::string &part : parts) {
    if (!path.empty() && path.back() != '/') {
      path += '/';
    }
    path += part;
  }
  return path;
}

template <typename Join>
void join(benchmark::State &state, Join function) {
  const Parts parts = makeParts(state.range(0));
  if (function(parts) != joinFilesystem(parts)) {
    state.SkipWithError("the result differs from the peer's");
    return;
  }
  for (auto _ : state) {
    benchmark::DoNotOptimize(function(parts));
  }
}
BENCHMARK_CAPTURE(join, Path, &joinPath)->Arg(2)->Arg(8)->Arg(64);
BENCHMARK_CAPTURE(join, stdFilesystem, &joinFilesystem)->Arg(2)->Arg(8)->Arg(64);
BENCHMARK_CAPTURE(join, plainAppend, &joinBySlash)->Arg(2)->Arg(8)->Arg(64);

Parts splitPath(const std::string &path) {
  Parts parts;
  Path::split(path, parts);
  return parts;
}
Parts splitFilesystem(const std::string &path) {
  Parts parts;
  for (const fs::path &part : fs::path(path)) {
    parts.push_back(part.string());
  }
  return parts;
}
Parts splitBoost(const std::string &path) {
  Parts parts;
  boost::algorithm::split(parts, path, boost::algorithm::is_any_of("/"),
                          boost::algorithm::token_compress_on);
  parts.front() = "/";
  return parts;
}

template <typename Split>
void split(benchmark::State &state, Split function) {
  const std::string path = joinPath(makeParts(state.range(0)));
  if (function(path) != splitFilesystem(path)) {
    state.SkipWithError("the result differs from the peer's");
    return;
  }
  for (auto _ : state) {
    benchmark::DoNotOptimize(function(path));
  }
}
BENCHMARK_CAPTURE(split, Path, &splitPath)->Arg(2)->Arg(8)->Arg(64);
BENCHMARK_CAPTURE(split, stdFilesystem, &splitFilesystem)->Arg(2)->Arg(8)->Arg(64);
BENCHMARK_CAPTURE(split, boostSplit, &splitBoost)->Arg(2)->Arg(8)->Arg(64);

std::string tokenPath(const std::string &path, std::int64_t index) {
  return Path::token(path, static_cast<unsigned int>(index));
}
std::string tokenFilesystem(const std::string &path, std::int64_t index) {
  const fs::path parts(path);
  return std::next(parts.begin(), index)->string();
}

// The last component, so that all of the path is read.
template <typename Token>
void token(benchmark::State &state, Token function) {
  const std::string path = joinPath(makeParts(state.range(0)));
  const std::int64_t last = state.range(0) - 1;
  if (function(path, last) != makeParts(state.range(0)).back()) {
    state.SkipWithError("the result is not the last component");
    return;
  }
  for (auto _ : state) {
    benchmark::DoNotOptimize(function(path, last));
  }
}
BENCHMARK_CAPTURE(token, Path, &tokenPath)->Arg(2)->Arg(8)->Arg(64);
BENCHMARK_CAPTURE(token, stdFilesystem, &tokenFilesystem)->Arg(2)->Arg(8)->Arg(64);

} // namespace
