// removeAll raced against rm(1), whose start is part of its time, and against the bare calls, which
// remove each entry by its name in an open folder.
//
// A deep tree costs removeAll several times as much, and that is part of its contract: it calls
// unlink(2) and rmdir(2) with complete paths, which appear in its log lines, and opens at most 20
// folders at a time. The kernel therefore walks a long path for each entry.
//
// The trees are made before the race, in memory if there is /dev/shm, and in the working directory
// otherwise. Each removal uses up one of them.

#include "kovabackup/path_util.h"

#include "bench/race.h"

#include <benchmark/benchmark.h>
#include <dirent.h>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string_view>

namespace {

namespace fs = std::filesystem;
using KOVA::Backup::removeAll;
using KovaBench::Race;

constexpr int kRounds = 11;
constexpr int kTrees = kRounds + 3; // a race tries each job three times before it starts
constexpr int kFiles = 1000;
constexpr int kChains = 5;
constexpr int kLevels = 200;

void makeFlat(const fs::path &root) {
  fs::create_directory(root);
  for (int i = 0; i < kFiles; ++i) {
    const std::ofstream file(root / ("IMG_" + std::to_string(i) + ".jpg"));
  }
}

void makeDeep(const fs::path &root) {
  fs::create_directory(root);
  for (int chain = 0; chain < kChains; ++chain) {
    fs::path folder = root / std::to_string(chain);
    for (int level = 0; level < kLevels; ++level) {
      fs::create_directory(folder);
      const std::ofstream file(folder / "file");
      folder /= "level" + std::to_string(level);
    }
  }
}

// The trees of one contestant, and their removal when it is done.
class Trees {
public:
  Trees(const std::string &name, void (*make)(const fs::path &)) {
    const fs::path place = fs::is_directory("/dev/shm") ? "/dev/shm" : fs::current_path();
    root_ = place / ("kova-remove-bench-" + std::to_string(::getpid()) + "-" + name);
    fs::create_directory(root_);
    for (int i = 0; i < kTrees; ++i) {
      make(root_ / std::to_string(i));
    }
  }
  ~Trees() { fs::remove_all(root_); }
  Trees(const Trees &) = delete;
  Trees &operator=(const Trees &) = delete;

  fs::path next() { return root_ / std::to_string(used_++); }

private:
  fs::path root_;
  int used_ = 0;
};

struct CloseFolder {
  void operator()(DIR *folder) const { ::closedir(folder); }
};

bool removeBare(int parent, const char *name) {
  const int fd = ::openat(parent, name, O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  const std::unique_ptr<DIR, CloseFolder> folder(::fdopendir(fd));
  if (!folder) {
    return false;
  }
  bool removed = true;
  while (const dirent *entry = ::readdir(folder.get())) {
    const std::string_view found = entry->d_name;
    if (entry->d_type != DT_DIR) {
      removed = ::unlinkat(fd, entry->d_name, 0) == 0 && removed;
    } else if (found != "." && found != "..") {
      removed = removeBare(fd, entry->d_name) && removed;
    }
  }
  return ::unlinkat(parent, name, AT_REMOVEDIR) == 0 && removed;
}

bool removeByRm(const std::string &path) {
  const auto run = [&] { ::execl("/bin/rm", "rm", "-rf", path.c_str(), nullptr); };
  return KovaBench::timesOfChild(run).cpu >= 0;
}

void raceRemoval(benchmark::State &state, void (*make)(const fs::path &), double goal) {
  Trees ours("ours", make);
  Trees bare("bare", make);
  Trees rm("rm", make);
  const auto removes = [](Trees &trees, auto remove) {
    const fs::path tree = trees.next();
    return remove(tree) && !fs::exists(tree);
  };
  const auto removesBare = [](const fs::path &tree) { return removeBare(AT_FDCWD, tree.c_str()); };
  Race(state, [&] { return removes(ours, &removeAll); })
      .peer("bare_calls", [&] { return removes(bare, removesBare); })
      .peer(
          "rm", [&] { return removes(rm, &removeByRm); }, goal)
      .slice(0) // one removal a round
      .run();
}

void removeFlat(benchmark::State &state) {
  raceRemoval(state, &makeFlat, 1.0);
}
void removeDeep(benchmark::State &state) {
  raceRemoval(state, &makeDeep, 0);
}
BENCHMARK(removeFlat)->Apply(KovaBench::rounds);
BENCHMARK(removeDeep)->Apply(KovaBench::rounds);

} // namespace
