#include "backup_run.h"

#include "filtered_tree.h"
#include "interrupt.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <json/writer.h>
#include <kovabackup/network.h>
#include <kovabackup/path_util.h>
#include <kovabackup/string_util.h>
#include <stdexcept>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace KOVA::Backup;

namespace {

constexpr char kInterrupted[] = "interrupted";

std::string utcNow(const char *format) {
  const std::time_t now = std::time(nullptr);
  std::tm parts{};
  ::gmtime_r(&now, &parts);
  char text[32] = "";
  (void)std::strftime(text, sizeof text, format, &parts);
  return text;
}

std::uint64_t fileBytes(const std::string &path) {
  struct stat info {};
  return ::stat(path.c_str(), &info) == 0 ? static_cast<std::uint64_t>(info.st_size) : 0;
}

std::string bytesText(std::uint64_t bytes) {
  return std::to_string(bytes) + " bytes";
}

// A rename would replace the archive of another run that finished in the same second.
std::string unusedName(const std::string &stem, const std::string &suffix) {
  std::string name = stem + suffix;
  for (int next = 2; ::access(name.c_str(), F_OK) == 0; ++next) {
    name = stringf("%s-%d%s", stem.c_str(), next, suffix.c_str());
  }
  return name;
}

bool syncToDisk(const std::string &path) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  const bool synced = fd >= 0 && ::fsync(fd) == 0;
  if (fd >= 0) {
    ::close(fd);
  }
  return synced;
}

std::list<std::string> firstLines(const std::string &path, std::size_t count) {
  std::list<std::string> lines;
  std::ifstream in(path);
  for (std::string line; lines.size() < count && std::getline(in, line);) {
    lines.push_back(line);
  }
  return lines;
}

} // namespace

std::uint64_t countLines(const std::string &path) {
  std::ifstream in(path, std::ios::binary);
  std::uint64_t lines = 0;
  char block[65536];
  do {
    in.read(block, sizeof block);
    lines += static_cast<std::uint64_t>(std::count(block, block + in.gcount(), '\n'));
  } while (in);
  return lines;
}

BackupRun::BackupRun(Task &task) : task_(task), runLock_(task.takeRunLock()) {
  if (runLock_ < 0) {
    throw std::runtime_error("task " + std::to_string(task.id()) + " is already running");
  }
  task_.load(); // a run that has just finished may have changed it
}

BackupRun::~BackupRun() {
  ::close(runLock_); // also releases the lock
}

int BackupRun::run() {
  const InterruptWatch watch;
  std::string failure;
  try {
    execute();
  } catch (const Interrupted &) {
    failure = kInterrupted;
  } catch (const std::exception &error) {
    failure = InterruptWatch::received() != 0 ? kInterrupted : error.what();
  }
  const SignalsIgnored untilRecorded;
  return record(failure);
}

void BackupRun::execute() {
  passphrase_ = task_.passphrase();
  cleanUpCrashedRun();
  probeDestination();
  openSession();
  listFiles();
  archive();
  encrypt();
  publish();
}

// This run holds the run lock, so the run that recorded a session must have crashed.
void BackupRun::cleanUpCrashedRun() {
  for (const std::string &partial : task_.list("partials")) {
    (void)::unlink(partial.c_str()); // may be gone already
  }
  const std::string left = task_.text("session");
  if (!left.empty()) {
    std::cerr << "removing session " << left << " of a crashed run" << std::endl;
    (void)Session::destroyById(left); // the library logs what could not be removed
  }
}

void BackupRun::probeDestination() const {
  const std::string host = task_.text("probeHost");
  if (!host.empty()) {
    const int answer = Net::testIpAndPortConnect(host.c_str(), task_.number("probePort"),
                                                 task_.number("probeTimeout"));
    if (answer != 0) {
      throw std::runtime_error(host +
                               (answer == -2 ? " does not answer in time" : " cannot be reached"));
    }
  }
  const std::string destination = task_.text("destination");
  if (::access((destination + "/").c_str(), W_OK | X_OK) != 0) {
    throw std::runtime_error("cannot write to " + destination + ": " + std::strerror(errno));
  }
}

void BackupRun::openSession() {
  if (!session_.create(volumeFilterFor(task_.text("volume")))) {
    throw std::runtime_error("cannot create a session");
  }
  // From now on other processes can follow the run.
  task_.change([this](OptionMap &options) { options.optSet("session", session_.getId()); });
}

void BackupRun::listFiles() {
  begin("walking", "");
  fileList_ = std::make_unique<ScopedTempFile>(sessionFile("files"), true);
  std::ofstream list(fileList_->getPath(), std::ios::binary);
  PathFilter filter;
  task_.fillFilter(filter);
  for (const std::string &source : task_.sources()) {
    walk(source, filter, list);
  }
  list.close();
  if (!list) {
    throw std::runtime_error("cannot write the list of files");
  }
  progress_.show(walkSummary());
  if (files_ == 0) {
    throw std::runtime_error("there is nothing to back up: no sources, or all paths are excluded");
  }
}

void BackupRun::walk(const std::string &source, PathFilter &filter, std::ostream &list) {
  FilteredTree tree(source, filter, session_.getPath());
  for (TreeEntry entry; tree.next(entry);) {
    InterruptWatch::check();
    const bool vanished = entry.error == ENOENT && entry.path != source;
    if (entry.error != 0 && !vanished) {
      warn(entry.path, entry.error);
    }
    if (entry.kept) {
      ++files_;
      bytes_ += entry.bytes;
      // Relative to "/", where tar starts. A path can contain any byte except NUL.
      list << (entry.path == "/" ? "." : entry.path.substr(1)) << '\0';
    }
    if (progress_.isDue()) {
      progress_.show(walkSummary());
      publishProgress();
    }
  }
}

void BackupRun::archive() {
  begin("archiving", walkSummary());
  partial_ = makePartial(task_.text("name") + ".tar");
  SubProcess tar("/bin/tar");
  tar.addArgList("--create", "--directory=/", "--null", "--verbatim-files-from", "--no-recursion",
                 "--numeric-owner", "--ignore-failed-read", "--verbose", nullptr);
  tar.addFormatArg("--index-file=%s", sessionFile(kSessionArchived).c_str());
  tar.addFormatArg("--files-from=%s", fileList_->getPath().c_str());
  tar.addFormatArg("--file=%s", partial_->getPath().c_str());
  // Status 1: a file changed while tar read it. The archive is complete; the log names the file.
  supervise(tar, 1, [this] {
    return stringf("%ju of %ju files, ", std::uintmax_t(countLines(sessionFile(kSessionArchived))),
                   std::uintmax_t(files_)) +
           bytesText(fileBytes(partial_->getPath()));
  });
}

void BackupRun::encrypt() {
  if (passphrase_.empty()) {
    return;
  }
  begin("encrypting", bytesText(fileBytes(partial_->getPath())));
  TempFile encrypted = makePartial(task_.text("name") + ".tar.enc");
  SubProcess openssl("/usr/bin/openssl");
  openssl.addArgList("enc", "-aes-256-cbc", "-pbkdf2", "-salt", "-pass", "env:KOVA_PASSPHRASE",
                     "-in", partial_->getPath().c_str(), "-out", encrypted->getPath().c_str(),
                     nullptr);
  openssl.setEnv("KOVA_PASSPHRASE", passphrase_); // every user can read the arguments of a process
  supervise(openssl, 0, [&] { return bytesText(fileBytes(encrypted->getPath())); });
  partial_ = std::move(encrypted); // removes the unencrypted archive
}

void BackupRun::publish() {
  archiveBytes_ = fileBytes(partial_->getPath());
  begin("moving", bytesText(archiveBytes_));
  const std::string destination = task_.text("destination");
  const std::string target =
      unusedName(Path::join(destination, task_.text("name") + "-" + utcNow("%Y%m%dT%H%M%SZ")),
                 passphrase_.empty() ? ".tar" : ".tar.enc");
  bool moved = syncToDisk(partial_->getPath()) && partial_->rename(target);
  if (!moved && errno == EXDEV) {
    copyNextTo(target);
    moved = syncToDisk(partial_->getPath()) && partial_->rename(target);
  }
  if (!moved) {
    throw std::runtime_error("cannot move the archive to " + target + ": " + std::strerror(errno));
  }
  archivePath_ = target;
  if (!syncToDisk(destination)) {
    warn(destination, errno);
  }
}

// For a destination that is not on the file system of its volume's temporary directory. The archive
// is copied under a temporary name, so that an incomplete one never has the final name.
void BackupRun::copyNextTo(const std::string &target) {
  const std::string hidden = Path::join(Path::dirname(target), "." + Path::basename(target));
  TempFile copy = recordPartial(std::make_unique<ScopedTempFile>(hidden, true));
  SubProcess cp("/bin/cp");
  cp.addArgList("--", partial_->getPath().c_str(), copy->getPath().c_str(), nullptr);
  supervise(cp, 0, [&] { return bytesText(fileBytes(copy->getPath())); });
  partial_ = std::move(copy);
}

// The archive is written on the volume of its destination, so that the last step is a rename.
BackupRun::TempFile BackupRun::makePartial(const std::string &name) {
  const std::string destination = task_.text("destination");
  TempFile file =
      std::make_unique<ScopedVolumeTempFile>(TempManager::sameVolume(destination), name, true);
  if (!file->isValid()) { // not on a volume: use the destination itself
    file = std::make_unique<ScopedTempFile>(Path::join(destination, "." + name), true);
  }
  return recordPartial(std::move(file));
}

// Lets the next run remove the file if this one crashes.
BackupRun::TempFile BackupRun::recordPartial(TempFile file) {
  if (!file->isValid()) {
    throw std::runtime_error("cannot create a file for " + task_.text("destination") + ": " +
                             std::strerror(errno));
  }
  partials_.push_back(file->getPath());
  task_.change([this](OptionMap &options) { options.optSet("partials", partials_); });
  return file;
}

void BackupRun::supervise(SubProcess &command, int maxSuccessStatus,
                          const DetailSource &currentDetail) {
  const std::string log = sessionFile(kSessionLog);
  const std::uint64_t linesBefore = countLines(log);
  command.setStdError(log, 0600);
  InterruptWatch::check();
  int status = 0;
  {
    const ProgressTicker watcher(progress_, currentDetail);
    status = command.call();
  }
  InterruptWatch::check();
  if (status == -1 || WIFSIGNALED(status)) {
    throw std::runtime_error(
        stage_ + ": " +
        (status == -1 ? "not started; see the system log" : ::strsignal(WTERMSIG(status))));
  }
  if (WEXITSTATUS(status) > maxSuccessStatus) {
    const std::list<std::string> lines = firstLines(log, linesBefore + 1);
    std::string why = lines.size() > linesBefore ? lines.back() : "";
    if (why.empty() && std::filesystem::space(session_.getPath()).available == 0) {
      why = std::strerror(ENOSPC); // there was no space for the log either
    }
    throw std::runtime_error(
        stringf("%s: exit status %d: %s", stage_.c_str(), WEXITSTATUS(status), why.c_str()));
  }
}

void BackupRun::begin(const std::string &stage, const std::string &detail) {
  InterruptWatch::check();
  stage_ = stage;
  progress_.begin(stage, detail);
  publishProgress();
}

// The file is replaced atomically, so a reader sees either the old state or the new one.
void BackupRun::publishProgress() const {
  ScopedTempFile file(sessionFile(kSessionProgress), true);
  Json::StreamWriterBuilder compact;
  compact["indentation"] = "";
  std::ofstream(file.getPath()) << Json::writeString(compact, summary(stage_)) << '\n';
  (void)file.rename(sessionFile(kSessionProgress));
}

// Control characters are replaced, so that each path takes exactly one line.
void BackupRun::warn(const std::string &path, int error) const {
  std::string line = path + ": " + std::strerror(error);
  std::replace_if(
      line.begin(), line.end(), [](unsigned char c) { return c < ' '; }, '?');
  std::ofstream(sessionFile(kSessionLog), std::ios::app) << line << '\n';
}

std::string BackupRun::sessionFile(const char *name) const {
  return session_.getPath().empty() ? "" : Path::join(session_.getPath(), name);
}

std::string BackupRun::walkSummary() const {
  return std::to_string(files_) + " files, " + bytesText(bytes_);
}

Json::Value BackupRun::summary(const std::string &result) const {
  Json::Value values(Json::objectValue);
  values["task"] = task_.text("name");
  values["result"] = result;
  values["files"] = Json::UInt64(files_);
  values["bytes"] = Json::UInt64(bytes_);
  values["warnings"] = Json::UInt64(countLines(sessionFile(kSessionLog)));
  values["archive"] = archivePath_;
  values["archiveBytes"] = Json::UInt64(archiveBytes_);
  values["finished"] = utcNow("%Y-%m-%dT%H:%M:%SZ");
  return values;
}

int BackupRun::record(const std::string &failure) {
  const std::list<std::string> messages = firstLines(sessionFile(kSessionLog), 20);
  std::string result = messages.empty() ? "ok" : "warnings";
  int status = messages.empty() ? 0 : 3;
  if (failure == kInterrupted) {
    result = failure;
    status = 128 + InterruptWatch::received(); // the convention of shells
  } else if (!failure.empty()) {
    result = "failed: " + failure;
    status = 1;
  }
  progress_.endLine();
  for (const std::string &message : messages) {
    std::cerr << message << '\n';
  }
  if (!failure.empty()) {
    std::cerr << "backup_service: " << failure << '\n';
  }
  const Json::Value values = summary(result);
  save(values, messages);
  std::cout << replaceMustache(task_.text("template"), values, false) << std::endl;
  return status;
}

// Removes the run's temporary files and an incomplete archive. Saves the outcome in the task.
void BackupRun::save(const Json::Value &values, const std::list<std::string> &messages) {
  fileList_.reset();
  partial_.reset();
  const std::string id = session_.getId();
  const std::string left = session_.destroy() ? "" : id; // for the next run to remove
  task_.change([&](OptionMap &options) {
    options.optSet("session", left);
    options.optSet("partials", std::list<std::string>());
    options.optSet("messages", messages);
    options.optSet("lastRun", values["finished"].asString());
    options.optSet("lastResult", values["result"].asString());
    options.optSet("archive", archivePath_);
    // As text, because sizes can exceed the largest integer that a section file can hold.
    for (const char *key : {"files", "bytes", "warnings", "archiveBytes"}) {
      options.optSet(key, values[key].asString());
    }
  });
}
