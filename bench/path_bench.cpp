// Joining and splitting paths, raced against std::filesystem and Boost's split. Every run checks
// its result.

#include "kovabackup/path_util.h"

#include "bench/race.h"

#include <benchmark/benchmark.h>
#include <boost/algorithm/string/classification.hpp>
#include <boost/algorithm/string/split.hpp>
#include <filesystem>

namespace {

namespace fs = std::filesystem;
namespace Path = KOVA::Backup::Path;
using KovaBench::Race;
using KovaBench::rounds;
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

void join(benchmark::State &state) {
  const Parts parts = makeParts(state.range(0));
  const std::string expected = joinFilesystem(parts);
  Race(state, [&] { return joinPath(parts) == expected; })
      .peer("std_filesystem", [&] { return joinFilesystem(parts) == expected; })
      .peer("append", [&] { return joinBySlash(parts) == expected; })
      .run();
}
BENCHMARK(join)->Arg(2)->Arg(8)->Arg(64)->Apply(rounds);

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

void split(benchmark::State &state) {
  const std::string path = joinPath(makeParts(state.range(0)));
  const Parts expected = splitFilesystem(path);
  Race(state, [&] { return splitPath(path) == expected; })
      .peer("std_filesystem", [&] { return splitFilesystem(path) == expected; })
      .peer("boost_split", [&] { return splitBoost(path) == expected; })
      .run();
}
BENCHMARK(split)->Arg(2)->Arg(8)->Arg(64)->Apply(rounds);

std::string tokenPath(const std::string &path, std::int64_t index) {
  return Path::token(path, static_cast<unsigned int>(index));
}
std::string tokenFilesystem(const std::string &path, std::int64_t index) {
  const fs::path parts(path);
  return std::next(parts.begin(), index)->string();
}

// The last component, so that all of the path is read.
void token(benchmark::State &state) {
  const std::string path = joinPath(makeParts(state.range(0)));
  const std::int64_t last = state.range(0) - 1;
  const std::string expected = makeParts(state.range(0)).back();
  Race(state, [&] { return tokenPath(path, last) == expected; })
      .peer(
          "std_filesystem", [&] { return tokenFilesystem(path, last) == expected; }, 0.5)
      .run();
}
BENCHMARK(token)->Arg(2)->Arg(8)->Arg(64)->Apply(rounds);

} // namespace
