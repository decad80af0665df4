#include "backup_run.h"

#include "archive.h"

#include <algorithm>
#include <cerrno>
#include <ctime>
#include <fcntl.h>
#include <kovabackup/service/published_file.h>
#include <kovabackup/service/run_lock.h>
#include <kovabackup/service/tree_walk.h>
#include <kovabackup/temp_manager.h>
#include <regex>
#include <set>
#include <sys/stat.h>
#include <unistd.h>

using namespace KOVA::Backup;

namespace {

constexpr char kList[] = "cannot write the list of paths";

// In UTC. The milliseconds keep the archives of quick runs apart.
std::string timeStamp() {
  std::timespec now{};
  (void)std::timespec_get(&now, TIME_UTC);
  std::tm parts{};
  char text[32] = "";
  (void)std::strftime(text, sizeof text, "%Y%m%dT%H%M%S", ::gmtime_r(&now.tv_sec, &parts));
  return stringf("%s.%03ldZ", text, now.tv_nsec / 1000000);
}

// On a file system without unnamed files, a killed run leaves an incomplete archive under a name
// that only a PublishedFile with the same target clears, and every archive has another target.
void clearLeftovers(const OptionMap &task) {
  static const std::regex form("\\.(.*)\\.kova\\.[0-9]+\\.tmp");
  std::set<std::string> targets; // creating files changes the folder
  for (const fs::path &path : fs::directory_iterator(task.optString("destination", ""))) {
    const std::string fileName = path.filename();
    std::smatch parts;
    if (std::regex_match(fileName, parts, form) && isArchiveName(task, parts[1])) {
      targets.insert(path.parent_path() / parts[1].str());
    }
  }
  for (const std::string &target : targets) {
    Service::Error ignored;
    (void)Service::PublishedFile(target).create(ignored);
  }
}

// A file without a name, which vanishes with the process, however that ends. On the largest volume;
// without one, in /tmp.
File openScratchFile() {
  const auto largest = TempManager::maxExtBtrfsVolume(true);
  std::string folder;
  require(VolumePathManager::getInstance().getVolumePath(largest, folder), kList);
  int fd = ::open(folder.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600);
  if (fd < 0) { // the file system has none, so the file has a name for a moment
    ScopedVolumeTempFile file(largest, "backup_service", false);
    requireCall(file.isValid(), kList);
    file.unlink();
    fd = ::fcntl(file.getFileDescripter(), F_DUPFD_CLOEXEC, 0);
  }
  File file(::fdopen(fd, "w+"));
  requireCall(file != nullptr, kList);
  return file;
}

class Run {
public:
  Run(TaskFile &tasks, int id) : tasks_(tasks), id_(id) { tasks.check(task_, id); }

  int run() {
    try {
      record("did not end", "did not end"); // what remains if the run is killed
    } catch (const std::exception &failure) {
      warn(failure.what()); // an archive is worth more than its record
    }
    try {
      execute();
    } catch (const std::exception &failure) {
      return finish(std::string("failed: ") + failure.what());
    }
    return finish(messages_.empty() ? "ok" : "warnings");
  }

  int dryRun() {
    walk([](const std::string &path) { std::cout << printable(path) << std::endl; });
    showMessage("would store " + summary());
    for (const std::string &old : surplus()) {
      showMessage("would remove " + old);
    }
    return messages_.empty() ? 0 : 3;
  }

private:
  void execute() {
    const std::string kind = isSet(task_, "recipient")    ? ".age"
                             : isSet(task_, "passphrase") ? ".gpg"
                                                          : "";
    const std::string target =
        fs::path(task_.optString("destination", "")) /
        (task_.optString("name", "") + "-" + timeStamp() + ".tar.zst" + kind);
    Service::PublishedFile archive(target, 0600);
    Service::Error error;
    require(archive.create(error), "cannot write to the destination", error);
    clearLeftovers(task_);
    const auto tick = [&] {
      const off_t written = ::lseek(archive.fd(), 0, SEEK_CUR);
      showProgress(summary() + ", " + sizeText(static_cast<std::uint64_t>(written)) + " written");
    };
    writeArchive(
        task_, archive.fd(), [this] { return makeList(); },
        [this](std::string_view line) { warn(std::string(line)); }, tick);
    const std::string space = " (" + spaceText(archive.fd()) + ")"; // while it is open
    require(archive.publish(error), "cannot complete the archive" + space, error);
    archive_ = target;
    for (const std::string &old : surplus()) {
      fs::remove(old);
    }
  }

  // The paths to store, relative to "/", each followed by NUL.
  File makeList() {
    File list = openScratchFile();
    walk([&list](const std::string &path) {
      const std::string relative = path == "/" ? "." : path.substr(1);
      requireCall(std::fwrite(relative.c_str(), relative.size() + 1, 1, list.get()) == 1, kList);
    });
    // rewind reports no failure, after which tar would read nothing and make an empty archive.
    requireCall(std::fflush(list.get()) == 0 && std::fseek(list.get(), 0, SEEK_SET) == 0, kList);
    return list;
  }

  void walk(const std::function<void(const std::string &path)> &store) {
    PathFilter filter;
    std::list<std::string> includes = listOf(task_, "include");
    std::list<std::string> excludes = listOf(task_, "exclude");
    filter.addIncludePattern(includes);
    filter.addExcludePattern(excludes);
    const std::list<std::string> sources = listOf(task_, "source");
    for (const std::string &source : sources) {
      Service::WalkOptions options;
      options.oneFileSystem = task_.optBool("one-file-system", false);
      options.leaveOut = archivesOf(task_);
      // A source inside another one is stored once.
      std::remove_copy(sources.begin(), sources.end(), std::back_inserter(options.leaveOut),
                       source);
      // What was mounted there is not, or the tree has moved and left a link. The walk reports
      // errors.
      std::error_code ignored;
      if (fs::is_symlink(source, ignored) || fs::is_empty(source, ignored)) {
        warn(source + ": is empty or a link; no archive is removed");
        isIncomplete_ = true;
      }
      Service::TreeWalk tree(source, filter, options);
      for (Service::WalkEntry entry; tree.next(entry);) {
        if (entry.error.code != 0) {
          warn(entry.path + ": " + std::generic_category().message(entry.error.code));
          isIncomplete_ = true;
        } else if (entry.kept && !S_ISSOCK(entry.mode)) { // tar cannot store a socket
          store(entry.path);
          ++files_;
          bytes_ += S_ISREG(entry.mode) ? entry.size : 0;
        }
        require(!stop().requested(), "interrupted");
        if (++visited_ % 4096 == 1) {
          showProgress(summary());
        }
      }
    }
    require(files_ > 0, "there is nothing to back up");
  }

  // The archives that are not to be kept when there is a new one. If anything is missing from that,
  // all are kept: it may be in older archives only.
  std::vector<std::string> surplus() const {
    std::vector<std::string> old = archivesOf(task_);
    old.erase(std::remove(old.begin(), old.end(), archive_), old.end());
    const auto keep = static_cast<std::size_t>(task_.optInt("keep", 0));
    old.resize(keep == 0 || isIncomplete_ || old.size() < keep ? 0 : old.size() - (keep - 1));
    return old;
  }

  int finish(const std::string &result) {
    std::string report = result;
    if (!archive_.empty()) {
      report += "; " + summary() + " -> " + archive_ + ", " + sizeText(fs::file_size(archive_));
    }
    showMessage(report, std::cout); // also if it cannot be recorded
    record(result, report);
    return result == "ok" ? 0 : result == "warnings" ? 3 : 1;
  }

  void record(const std::string &result, const std::string &report) {
    tasks_.change(id_, [&](OptionMap &options) {
      options.optSet("lastRun", timeStamp());
      options.optSet("lastResult", result);
      options.optSet("lastReport", report);
      options.optSet("messages", messages_);
    });
  }

  std::string summary() const { return std::to_string(files_) + " files, " + sizeText(bytes_); }

  void warn(const std::string &message) {
    constexpr std::size_t kRecorded = 20;
    showMessage(printable(message));
    messages_.resize(std::min(messages_.size(), kRecorded - 1));
    messages_.push_back(printable(message));
  }

  TaskFile &tasks_;
  const int id_;
  const OptionMap task_ = tasks_.load(id_);
  std::string archive_; // "" until it is complete
  std::list<std::string> messages_;
  bool isIncomplete_ = false; // a source, or a part of one, was not found or not readable
  std::uint64_t visited_ = 0;
  std::uint64_t files_ = 0; // that are to be stored
  std::uint64_t bytes_ = 0;
};

} // namespace

int runTask(TaskFile tasks, int id, bool isDry) {
  if (isDry) {
    return Run(tasks, id).dryRun();
  }
  Service::RunLock lock(tasks.runLock(id));
  Service::Error error;
  const bool taken = lock.take(error);
  require(taken || error.code != EWOULDBLOCK, "the task is already running");
  require(taken, "cannot lock the task", error);
  return Run(tasks, id).run();
}
