#include "task.h"

#include <algorithm>
#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <kovabackup/path_util.h>
#include <kovabackup/string_util.h>
#include <kovabackup/temp_manager.h>
#include <stdexcept>
#include <unistd.h>

using namespace KOVA::Backup;

namespace {

// All processes that write a task file use this token.
constexpr char kLockToken[] = "backup_service.tasks";

struct flock lockOfEntireFile() {
  struct flock lock {};
  lock.l_type = F_WRLCK;
  lock.l_whence = SEEK_SET;
  return lock;
}

} // namespace

boost::shared_ptr<FilterVolume> volumeFilterFor(const std::string &rule) {
  const std::string same = "same:";
  if (rule.compare(0, same.size(), same) == 0) {
    return TempManager::sameVolume(rule.substr(same.size()));
  }
  constexpr bool kFallbackTmp = true; // if no volume qualifies, use a local session under /tmp
  if (rule == "max") {
    return TempManager::maxVolume(kFallbackTmp);
  }
  if (rule == "max-ext") {
    return TempManager::maxExtVolume(kFallbackTmp);
  }
  if (rule == "max-ext-btrfs") {
    return TempManager::maxExtBtrfsVolume(kFallbackTmp);
  }
  throw std::invalid_argument("unknown volume rule '" + rule + "'");
}

int Task::create(const std::string &file, const TaskSettings &settings) {
  (void)volumeFilterFor(settings.volumeRule); // fails here and not in the first run
  OptionMap options;
  options.setLockToken(kLockToken);
  if (!options.optSectionCreate(file, kTaskPrefix, true)) {
    throw std::runtime_error("cannot create a task in " + file);
  }
  options.optSet("name", settings.name);
  options.optSet("sources", settings.sources);
  options.optSet("include", settings.includes);
  options.optSet("exclude", settings.excludes);
  options.optSet("destination", settings.destination);
  options.optSet("probeHost", settings.probeHost);
  options.optSet("probePort", settings.probePort);
  options.optSet("probeTimeout", settings.probeTimeoutSec);
  options.optSet("volume", settings.volumeRule);
  options.optSet("template", settings.reportTemplate);
  if (!settings.passphrase.empty()) {
    options.optSet("passphrase", settings.passphrase, true);
  }
  // When encryption fails, an empty text is stored. Detect that now and not when an archive is
  // restored.
  const bool stored = options.optSecret("passphrase", "") == settings.passphrase;
  if (!stored || !options.optSectionSave()) {
    (void)options.optSectionRemove();
    throw std::runtime_error(stored ? "cannot save the task in " + file
                                    : std::string("the passphrase cannot be stored"));
  }
  return options.optSectionGetId();
}

Task::Task(const std::string &file, int id) : file_(file), id_(id) {
  load();
}

void Task::load() {
  if (!options_.optSectionLoad(file_, kTaskPrefix, id_)) {
    throw std::runtime_error("no task " + std::to_string(id_) + " in " + file_);
  }
}

std::list<std::string> Task::list(const std::string &key) const {
  std::list<std::string> values;
  options_.optGet(key, values);
  return values;
}

std::list<std::string> Task::sources() const {
  std::list<std::string> all = list("sources");
  all.sort();
  std::list<std::string> outermost;
  for (const std::string &source : all) {
    const auto contains = [&](const std::string &other) {
      return source == other || !Path::relative(source, other).empty();
    };
    if (std::none_of(outermost.begin(), outermost.end(), contains)) {
      outermost.push_back(source);
    }
  }
  return outermost;
}

std::string Task::passphrase() const {
  std::string clear;
  if (options_.optGet("passphrase", clear, true) && clear.empty()) {
    throw std::runtime_error("the passphrase cannot be decrypted: has the key file changed?");
  }
  return clear;
}

void Task::fillFilter(PathFilter &filter) const {
  for (const std::string &pattern : list("include")) {
    filter.addIncludePattern(pattern);
  }
  for (const std::string &pattern : list("exclude")) {
    filter.addExcludePattern(pattern);
  }
}

// The lock must cover both the load and the save. optSectionSave takes it only for the save, so
// optSectionExport writes here.
void Task::change(const std::function<void(OptionMap &options)> &set) {
  OptionMap fresh;
  fresh.setLockToken(kLockToken);
  bool done = fresh.lock() && fresh.optSectionLoad(file_, kTaskPrefix, id_);
  if (done) {
    set(fresh);
    done = fresh.optSectionExport(file_, fresh.optSectionGetName(), false);
  }
  (void)fresh.unlock();
  if (!done) {
    throw std::runtime_error("cannot save task " + std::to_string(id_) + " in " + file_);
  }
  set(options_);
}

// The name includes a hash of the file's path, because another file may have a task of the same id.
int Task::openRunLock() const {
  const std::size_t file = std::hash<std::string>()(std::filesystem::canonical(file_).string());
  const int fd = Path::createIpcLockFile(stringf("backup_service.run.%zx.%d", file, id_));
  if (fd < 0) {
    throw std::runtime_error("cannot open the run lock (are you root?)");
  }
  (void)::fcntl(fd, F_SETFD, FD_CLOEXEC);
  return fd;
}

int Task::takeRunLock() const {
  const int fd = openRunLock();
  struct flock lock = lockOfEntireFile();
  if (::fcntl(fd, F_SETLK, &lock) != 0) {
    ::close(fd);
    return -1;
  }
  return fd;
}

// Only queries the lock. Taking it, however briefly, could make a run that starts now fail.
pid_t Task::runner() const {
  const int fd = openRunLock();
  struct flock lock = lockOfEntireFile();
  const bool held = ::fcntl(fd, F_GETLK, &lock) == 0 && lock.l_type != F_UNLCK;
  ::close(fd);
  return held ? lock.l_pid : 0;
}
