// Several processes create tasks in one section file at the same time, and another one reads them.
//
//     option_relay [DIRECTORY]
//
// Each writer creates tasks with unique ids, sets options of every type and a secret, and saves the
// tasks. All writers use the same lock token. Then one process lists, loads and prints all tasks.
// The section file is in DIRECTORY, by default a temporary folder. So is the platform's key file,
// so that the key of the system is not used.
//
// Exit status: 0 if every task was read as it was saved, none is missing and the file holds no
// secret in clear text; 1 if not; 2 if the program could not run.

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
constexpr int kAllTasks = kProcesses * kTasksEach;
constexpr int kShownTasks = 3; // any other task is printed only if it is wrong
constexpr const char *kPrefix = "task";
constexpr const char *kSecret = "open sesame of task ";

enum ExitStatus { kSuccess = 0, kFailed = 1, kNotPossible = 2 };

bool reportError(const std::string &what) {
  std::fprintf(stderr, "option_relay: process %d: %s\n", static_cast<int>(::getpid()),
               what.c_str());
  return false;
}

// The section file with its lock token. The destructor removes the section file, the configuration,
// the key file and the lock file. The child processes end with _exit, so that only the parent
// removes the files.
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
      (void)::unlink(file.c_str()); // it may not exist
    }
  }
  TaskFile(const TaskFile &) = delete;
  TaskFile &operator=(const TaskFile &) = delete;

  // Makes this process and its children use their own key. The configuration of the platform has
  // the format of section files, so a map can write it.
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

std::list<std::string> pathsFor(int writer) {
  return {"/volume1/photo", "/volume1/by process " + std::to_string(writer), "a\nb \"c\" \xff"};
}

// --- the writers ---

bool createTask(const TaskFile &file, int writer) {
  OptionMap task;
  if (!task.setLockToken(file.token()) || !task.optSectionCreate(file.path(), kPrefix, true)) {
    return reportError("a task could not be created");
  }
  const int id = task.optSectionGetId();
  task.optSet("name", "task " + std::to_string(id));
  task.optSet("writer", writer);
  task.optSet("quota", 3000000000LL + id);
  task.optSet("enabled", id % 2 == 0);
  task.optSet("paths", pathsFor(writer));
  task.optSet("password", kSecret + std::to_string(id), true);
  return task.optSectionSave() || reportError("a task could not be saved");
}

int createTasks(const TaskFile &file, int writer) {
  for (int i = 0; i < kTasksEach; ++i) {
    if (!createTask(file, writer)) {
      return kFailed;
    }
  }
  return kSuccess;
}

// --- the reader ---

bool checkTask(const TaskFile &file, int id) {
  OptionMap task;
  if (!task.optSectionLoad(file.path(), kPrefix, id)) {
    return reportError("task " + std::to_string(id) + " does not exist");
  }
  long long quota = 0;
  std::list<std::string> paths;
  const int writer = task.optInt("writer", -1);
  const bool correct = task.optString("name", "") == "task " + std::to_string(id) &&
                       task.optGet("quota", quota) && quota == 3000000000LL + id &&
                       task.optBool("enabled", id % 2 != 0) == (id % 2 == 0) &&
                       task.optGet("paths", paths) && paths == pathsFor(writer) &&
                       task.optSecret("password", "") == kSecret + std::to_string(id);
  if (id <= kShownTasks || !correct) {
    std::printf("  [%s] by writer %d%s: %s\n", task.optSectionGetName().c_str(), writer,
                correct ? "" : ", NOT as saved", task.optToJsonString().c_str());
  }
  return correct;
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
  const bool exact = ids.size() == kAllTasks && distinct == ids.size();
  const auto correct =
      std::count_if(ids.begin(), ids.end(), [&](int id) { return checkTask(file, id); });
  const bool hidden = holdsNoSecret(file.path());
  std::printf("%zu tasks of %d, %zu distinct ids, %d read as they were saved, secrets %s\n",
              ids.size(), kAllTasks, distinct, static_cast<int>(correct),
              hidden ? "only as cipher text" : "IN CLEAR TEXT");
  return exact && static_cast<std::size_t>(correct) == ids.size() && hidden ? kSuccess : kFailed;
}

// --- the processes ---

template <typename Work>
pid_t start(Work work) {
  (void)std::fflush(nullptr); // otherwise the child would write the buffered output again
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

// Starts the writers, releases them at the same moment and waits for all of them.
bool runWriters(const TaskFile &file) {
  int gate[2];
  if (::pipe(gate) != 0) {
    return reportError("cannot create a pipe");
  }
  std::vector<pid_t> writers;
  for (int writer = 1; writer <= kProcesses; ++writer) {
    writers.push_back(start([&] {
      char end = 0;
      (void)::close(gate[1]);
      (void)!::read(gate[0], &end, 1); // returns when the parent closes the gate
      return createTasks(file, writer);
    }));
  }
  (void)::close(gate[0]);
  (void)::close(gate[1]);
  const auto done = std::count_if(writers.begin(), writers.end(), succeeded);
  std::printf("%d of %d processes created %d tasks each\n", static_cast<int>(done), kProcesses,
              kTasksEach);
  return done == kProcesses;
}

int relay(const std::string &directory) {
  const TaskFile file(Path::absPath(directory));
  if (!file.useOwnKey()) {
    (void)reportError("cannot write a configuration in " + directory);
    return kNotPossible;
  }
  const bool made = runWriters(file);
  const bool read = succeeded(start([&] { return readTasks(file); }));
  return made && read ? kSuccess : kFailed;
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
