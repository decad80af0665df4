// Tasks in one section file, made by several processes at once and read by another.
//
//     option_relay [DIRECTORY]
//
// Some processes create tasks with ids of their own, fill them with options of every type and a
// secret, and save them at the same time under one lock token. Then one process lists, loads and
// prints them all. The file lies in DIRECTORY, by default in a temporary folder; the platform's key
// file lies beside it, so that nothing of the system is touched.
//
// Exit status: 0 when every task came back whole, the count is exact and no secret stands in the
// file in clear; 1 when not; 2 when it could not be tried.

#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "kovabackup/temp_manager.h"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <list>
#include <set>
#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

using KOVA::Backup::OptionMap;
using KOVA::Backup::ScopedTempFolder;
namespace Path = KOVA::Backup::Path;

namespace {

constexpr int kProcesses = 6;
constexpr int kTasksEach = 5;
constexpr int kShownTasks = 3; // the others only when something is wrong with them
constexpr const char *kPrefix = "task";
constexpr const char *kSecret = "open sesame of task ";

enum ExitStatus { kAllHeld = 0, kFailed = 1, kNotPossible = 2 };

bool complain(const std::string &what) {
  std::fprintf(stderr, "option_relay: process %d: %s\n", static_cast<int>(::getpid()),
               what.c_str());
  return false;
}

// The file with its lock token, and what goes when it is done: file, configuration, key and lock
// file. The child processes leave by _exit, so that only the parent cleans up.
class TaskFile {
public:
  explicit TaskFile(const std::string &directory)
      : token_("option_relay." + std::to_string(::getpid())),
        path_(Path::join(directory, token_ + ".conf")),
        platform_(Path::join(directory, token_ + ".platform")),
        key_(Path::join(directory, token_ + ".key")) {}
  ~TaskFile() {
    const std::string lock = Path::join(Path::join(Path::getIpcTempPath(), "lock"), token_);
    for (const std::string &file : {path_, platform_, key_, lock}) {
      (void)::unlink(file.c_str()); // may not have come to be
    }
  }
  TaskFile(const TaskFile &) = delete;
  TaskFile &operator=(const TaskFile &) = delete;

  // Gives this process and its children a key of their own. A map writes the configuration too:
  // the platform reads it in the same format.
  bool useOwnKey() const {
    OptionMap secret;
    secret.optSet("keyFile", key_);
    return secret.optSectionExport(platform_, "secret", true) &&
           ::setenv("KOVA_PLATFORM_CONF", platform_.c_str(), 1) == 0;
  }

  const std::string &path() const { return path_; }
  const std::string &token() const { return token_; }

private:
  std::string token_;
  std::string path_;
  std::string platform_;
  std::string key_;
};

std::list<std::string> pathsOf(int maker) {
  return {"/volume1/photo", "/volume1/by process " + std::to_string(maker), "a\nb \"c\" \xff"};
}

// --- the makers ---

bool makeTask(const TaskFile &file, int maker) {
  OptionMap task;
  if (!task.setLockToken(file.token()) || !task.optSectionCreate(file.path(), kPrefix, true)) {
    return complain("a task could not be created");
  }
  const int id = task.optSectionGetId();
  task.optSet("name", "task " + std::to_string(id));
  task.optSet("maker", maker);
  task.optSet("quota", 3000000000LL + id);
  task.optSet("enabled", id % 2 == 0);
  task.optSet("paths", pathsOf(maker));
  task.optSet("password", kSecret + std::to_string(id), true);
  return task.optSectionSave() || complain("a task could not be saved");
}

int makeTasks(const TaskFile &file, int maker) {
  for (int i = 0; i < kTasksEach; ++i) {
    if (!makeTask(file, maker)) {
      return kFailed;
    }
  }
  return kAllHeld;
}

// --- the reader ---

bool checkTask(const TaskFile &file, int id) {
  OptionMap task;
  if (!task.optSectionLoad(file.path(), kPrefix, id)) {
    return complain("task " + std::to_string(id) + " is not there");
  }
  long long quota = 0;
  std::list<std::string> paths;
  const int maker = task.optInt("maker", -1);
  const bool whole = task.optString("name", "") == "task " + std::to_string(id) &&
                     task.optGet("quota", quota) && quota == 3000000000LL + id &&
                     task.optBool("enabled", id % 2 != 0) == (id % 2 == 0) &&
                     task.optGet("paths", paths) && paths == pathsOf(maker) &&
                     task.optSecret("password", "") == kSecret + std::to_string(id);
  if (id <= kShownTasks || !whole) {
    std::printf("  [%s] by maker %d%s: %s\n", task.optSectionGetName().c_str(), maker,
                whole ? "" : ", NOT as it was saved", task.optToJsonString().c_str());
  }
  return whole;
}

bool holdsNoSecret(const std::string &path) {
  std::ifstream in(path, std::ios::binary);
  const std::string content(std::istreambuf_iterator<char>(in), {});
  return !content.empty() && content.find(kSecret) == std::string::npos;
}

int readTasks(const TaskFile &file) {
  std::list<int> ids;
  if (!OptionMap::optSectionListId(file.path(), kPrefix, ids)) {
    return kFailed;
  }
  const std::size_t distinct = std::set<int>(ids.begin(), ids.end()).size();
  const bool exact = ids.size() == kProcesses * kTasksEach && distinct == ids.size();
  const auto whole =
      std::count_if(ids.begin(), ids.end(), [&](int id) { return checkTask(file, id); });
  const bool hidden = holdsNoSecret(file.path());
  std::printf("%zu tasks of %d, %zu distinct ids, %d as they were saved, secrets %s\n", ids.size(),
              kProcesses * kTasksEach, distinct, static_cast<int>(whole),
              hidden ? "as cipher text only" : "IN CLEAR");
  return exact && static_cast<std::size_t>(whole) == ids.size() && hidden ? kAllHeld : kFailed;
}

// --- the processes ---

template <typename Work>
pid_t start(Work work) {
  (void)std::fflush(nullptr); // else the child would write what is buffered here once more
  const pid_t child = ::fork();
  if (child == 0) {
    const int status = work();
    (void)std::fflush(nullptr);
    ::_exit(status);
  }
  return child;
}

bool succeeded(pid_t child) {
  int status = -1;
  return child > 0 && ::waitpid(child, &status, 0) == child && status == 0;
}

// Starts the makers, lets them go at the same moment and waits for all.
bool runMakers(const TaskFile &file) {
  int gate[2];
  if (::pipe(gate) != 0) {
    return complain("no pipe");
  }
  std::vector<pid_t> makers;
  for (int maker = 1; maker <= kProcesses; ++maker) {
    makers.push_back(start([&] {
      char end = 0;
      (void)::close(gate[1]);
      (void)!::read(gate[0], &end, 1); // ends when the last writer, the parent, closes the gate
      return makeTasks(file, maker);
    }));
  }
  (void)::close(gate[0]);
  (void)::close(gate[1]);
  const auto done = std::count_if(makers.begin(), makers.end(), succeeded);
  std::printf("%d processes of %d made %d tasks each\n", static_cast<int>(done), kProcesses,
              kTasksEach);
  return done == kProcesses;
}

int relay(const std::string &directory) {
  const TaskFile file(Path::absPath(directory));
  if (!file.useOwnKey()) {
    (void)complain("no configuration can be written in " + directory);
    return kNotPossible;
  }
  const bool made = runMakers(file);
  const bool read = succeeded(start([&] { return readTasks(file); }));
  return made && read ? kAllHeld : kFailed;
}

} // namespace

int main(int argc, char **argv) {
  if (argc > 2) {
    std::fprintf(stderr, "usage: option_relay [DIRECTORY]\n");
    return kNotPossible;
  }
  if (argc == 2) {
    return relay(argv[1]);
  }
  const ScopedTempFolder folder("option_relay");
  return folder.isValid() ? relay(folder.getPath()) : kNotPossible;
}
