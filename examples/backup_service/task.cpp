#include "task.h"

#include <fcntl.h>
#include <kovabackup/path_util.h>
#include <kovabackup/temp_manager.h>
#include <stdexcept>
#include <sys/file.h>
#include <unistd.h>

using namespace KOVA::Backup;

int Task::create(const std::string &file, const TaskSettings &settings) {
  OptionMap options;
  options.setLockToken(kTaskLockToken);
  if (!options.optSectionCreate(file, kTaskPrefix, true)) {
    throw std::runtime_error("cannot make a task in " + file);
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
    // An encryption that failed is stored as an empty secret; nobody must learn that at restore.
    if (options.optSecret("passphrase", "") != settings.passphrase) {
      options.optSectionRemove();
      throw std::runtime_error("the passphrase cannot be encrypted");
    }
  }
  if (!options.optSectionSave()) {
    throw std::runtime_error("cannot save the task in " + file);
  }
  return options.optSectionGetId();
}

Task::Task(const std::string &file, int id) {
  options_.setLockToken(kTaskLockToken);
  if (!options_.optSectionLoad(file, kTaskPrefix, id)) {
    throw std::runtime_error("no task " + std::to_string(id) + " in " + file);
  }
}

std::list<std::string> Task::list(const std::string &key) const {
  std::list<std::string> values;
  options_.optGet(key, values);
  return values;
}

void Task::save() {
  if (!options_.optSectionSave()) {
    throw std::runtime_error("cannot save the task");
  }
}

void Task::fillFilter(PathFilter &filter) const {
  for (const std::string &pattern : list("include")) {
    filter.addIncludePattern(pattern);
  }
  for (const std::string &pattern : list("exclude")) {
    filter.addExcludePattern(pattern);
  }
}

boost::shared_ptr<FilterVolume> Task::volumeFilter() const {
  const std::string rule = text("volume");
  const std::string same = "same:";
  if (rule.compare(0, same.size(), same) == 0) {
    return TempManager::sameVolume(rule.substr(same.size()));
  }
  // Without a suitable volume the session goes to the local area under /tmp.
  constexpr bool kFallbackTmp = true;
  if (rule == "max") {
    return TempManager::maxVolume(kFallbackTmp);
  }
  return rule == "max-ext" ? TempManager::maxExtVolume(kFallbackTmp)
                           : TempManager::maxExtBtrfsVolume(kFallbackTmp);
}

int Task::tryRunLock() const {
  const int fd = Path::createIpcLockFile("backup_service.run." + std::to_string(id()));
  if (fd < 0) {
    throw std::runtime_error("cannot open the run lock");
  }
  ::fcntl(fd, F_SETFD, FD_CLOEXEC);
  if (::flock(fd, LOCK_EX | LOCK_NB) != 0) {
    ::close(fd);
    return -1;
  }
  return fd;
}
