#include "backup_run.h"

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstring>
#include <ctime>
#include <fcntl.h>
#include <fstream>
#include <iostream>
#include <json/writer.h>
#include <kovabackup/network.h>
#include <kovabackup/path_util.h>
#include <kovabackup/signal.h>
#include <kovabackup/string_util.h>
#include <kovabackup/subprocess.h>
#include <stdexcept>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace KOVA::Backup;

namespace {

// Set by SIGTERM and SIGINT; the steps look at it between themselves.
volatile std::sig_atomic_t interrupted = 0;

struct Interrupted {};

void noteInterrupt(int signal) {
  interrupted = 1;
  // The library passes a SIGTERM on to the child that it waits for; so that an interrupt does the
  // same, it becomes one.
  if (signal == SIGINT) {
    (void)std::raise(SIGTERM);
  }
}

void stopIfInterrupted() {
  if (interrupted != 0) {
    throw Interrupted();
  }
}

bool onTerminal() {
  return ::isatty(STDERR_FILENO) == 1;
}

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

bool syncFile(const std::string &path) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  const bool synced = fd >= 0 && ::fsync(fd) == 0;
  if (fd >= 0) {
    ::close(fd);
  }
  return synced;
}

} // namespace

BackupRun::BackupRun(Task &task) : task_(task), runLock_(task.tryRunLock()) {
  if (runLock_ < 0) {
    throw std::runtime_error("task " + std::to_string(task.id()) + " is running already");
  }
}

BackupRun::~BackupRun() {
  ::close(runLock_); // the lock goes with it
}

int BackupRun::run() {
  ScopedTempSigHandler onTerm;
  ScopedTempSigHandler onInterrupt;
  onTerm.setSignalHandler(SIGTERM, SA_RESTART, &noteInterrupt);
  // Without SA_RESTART: the wait for a child must notice the SIGTERM that an interrupt becomes.
  onInterrupt.setSignalHandler(SIGINT, 0, &noteInterrupt);
  try {
    execute();
    return record("ok", 0);
  } catch (const Interrupted &) {
    return record("interrupted", 3);
  } catch (const std::exception &error) {
    std::cerr << "backup_service: " << error.what() << '\n';
    return record(std::string("failed: ") + error.what(), 1);
  }
}

void BackupRun::execute() {
  clearDeadRun();
  probeDestination();
  openSession();
  listFiles();
  archive();
  encrypt();
  publish();
}

// This run holds the run lock, so whoever recorded a session has died.
void BackupRun::clearDeadRun() {
  for (const std::string &partial : task_.list("partials")) {
    (void)::unlink(partial.c_str()); // gone already where the run ended by itself
  }
  const std::string left = task_.text("session");
  if (!left.empty()) {
    std::cerr << "clearing session " << left << " of a run that died\n";
    (void)Session::destroyById(left); // the system log says what could not be removed
  }
}

void BackupRun::probeDestination() const {
  const std::string host = task_.text("probeHost");
  if (host.empty()) {
    return;
  }
  const int answer = Net::testIpAndPortConnect(host.c_str(), task_.number("probePort"),
                                               task_.number("probeTimeout"));
  if (answer != 0) {
    throw std::runtime_error(host +
                             (answer == -2 ? " does not answer in time" : " cannot be reached"));
  }
}

void BackupRun::openSession() {
  if (!session_.create(task_.volumeFilter())) {
    throw std::runtime_error("cannot make a session");
  }
  task_.set("session", session_.getId());
  task_.save(); // from here on other processes can look into the run
}

void BackupRun::listFiles() {
  startStage("walking");
  fileList_ = std::make_unique<ScopedTempFile>(Path::join(session_.getPath(), "files"), true);
  std::ofstream list(fileList_->getPath(), std::ios::binary);
  PathFilter filter;
  task_.fillFilter(filter);
  const auto addToList = [&](const std::string &path) {
    // Relative to the root, where tar is told to start; NUL is the one byte that no path holds.
    list << path.substr(1) << '\0';
    if (totals_.files % 1000 == 0) {
      noteProgress();
    }
    return interrupted == 0;
  };
  for (const std::string &source : task_.list("sources")) {
    walkFiltered(source, filter, addToList, totals_);
    stopIfInterrupted();
  }
  list.flush();
  if (!list) {
    throw std::runtime_error("cannot write the list of files");
  }
  noteProgress();
}

void BackupRun::archive() {
  startStage("archiving");
  partial_ = makePartial(task_.text("name") + ".tar");
  SubProcess tar("/bin/tar");
  tar.addArgList("--create", "--directory=/", "--null", "--verbatim-files-from", "--no-recursion",
                 "--numeric-owner", nullptr);
  tar.addFormatArg("--files-from=%s", fileList_->getPath().c_str());
  tar.addFormatArg("--file=%s", partial_->getPath().c_str());
  if (onTerminal()) {
    tar.addArgList("--checkpoint=1000", "--checkpoint-action=ttyout=archived%T%*\r", nullptr);
  }
  // 1: a file changed while it was read; the archive is whole, the log says which.
  supervise(tar, 1);
}

void BackupRun::encrypt() {
  const std::string passphrase = task_.passphrase();
  if (passphrase.empty()) {
    return;
  }
  startStage("encrypting");
  std::unique_ptr<ScopedTempFile> sealed = makePartial(task_.text("name") + ".tar.enc");
  SubProcess openssl("/usr/bin/openssl");
  openssl.addArgList("enc", "-aes-256-cbc", "-pbkdf2", "-salt", "-pass", "env:KOVA_PASSPHRASE",
                     "-in", partial_->getPath().c_str(), "-out", sealed->getPath().c_str(),
                     nullptr);
  openssl.setEnv("KOVA_PASSPHRASE", passphrase); // arguments stand in everybody's process list
  supervise(openssl, 0);
  partial_ = std::move(sealed); // the clear archive is removed
}

void BackupRun::publish() {
  startStage("publishing");
  archiveBytes_ = fileBytes(partial_->getPath());
  const std::string name = task_.text("name") + "-" + utcNow("%Y%m%dT%H%M%SZ") + ".tar" +
                           (task_.passphrase().empty() ? "" : ".enc");
  const std::string target = Path::join(task_.text("destination"), name);
  if (!syncFile(partial_->getPath()) || !partial_->rename(target)) {
    throw std::runtime_error("cannot move the archive to " + target + ": " + std::strerror(errno));
  }
  archivePath_ = target;
}

// The archive grows on the volume of its destination, so that the last step is a rename.
// It is recorded, so that a later run can remove what a dead one leaves.
std::unique_ptr<ScopedTempFile> BackupRun::makePartial(const std::string &name) {
  const std::string destination = task_.text("destination");
  std::unique_ptr<ScopedTempFile> file =
      std::make_unique<ScopedVolumeTempFile>(TempManager::sameVolume(destination), name, true);
  if (!file->isValid()) { // a destination on no volume: beside the final name
    file = std::make_unique<ScopedTempFile>(Path::join(destination, "." + name), true);
  }
  if (!file->isValid()) {
    throw std::runtime_error("cannot make a file in " + destination);
  }
  partials_.push_back(file->getPath());
  task_.set("partials", partials_);
  task_.save();
  return file;
}

void BackupRun::supervise(SubProcess &command, int highestGoodStatus) const {
  command.setStdError(Path::join(session_.getPath(), kSessionLog), 0600);
  const int status = command.call();
  stopIfInterrupted();
  if (status == -1 || !WIFEXITED(status)) {
    throw std::runtime_error(command.toString() + " was ended");
  }
  if (WEXITSTATUS(status) > highestGoodStatus) {
    std::ifstream log(Path::join(session_.getPath(), kSessionLog));
    std::string first;
    std::getline(log, first);
    throw std::runtime_error(
        stringf("%s: exit status %d: %s", stage_.c_str(), WEXITSTATUS(status), first.c_str()));
  }
}

void BackupRun::startStage(const std::string &stage) {
  stopIfInterrupted();
  stage_ = stage;
  noteProgress();
  if (!onTerminal()) {
    std::cerr << stage << " (" << totals_.files << " files, " << totals_.bytes << " bytes)\n";
  }
}

void BackupRun::noteProgress() const {
  if (onTerminal()) {
    std::cerr << '\r' << stage_ << ": " << totals_.files << " files, " << totals_.bytes
              << " bytes\033[K" << (stage_ == "publishing" ? "\n" : "") << std::flush;
  }
  // Written aside and renamed: whoever looks reads the old state or the new one.
  ScopedTempFile file(Path::join(session_.getPath(), kSessionProgress), true);
  Json::StreamWriterBuilder compact;
  compact["indentation"] = "";
  std::ofstream(file.getPath()) << Json::writeString(compact, summary(stage_)) << '\n';
  (void)file.rename(Path::join(session_.getPath(), kSessionProgress));
}

Json::Value BackupRun::summary(const std::string &result) const {
  Json::Value values(Json::objectValue);
  values["task"] = task_.text("name");
  values["result"] = result;
  values["files"] = Json::UInt64(totals_.files);
  values["bytes"] = Json::UInt64(totals_.bytes);
  values["unreadable"] = Json::UInt64(totals_.unreadable);
  values["archive"] = archivePath_;
  values["archiveBytes"] = Json::UInt64(archiveBytes_);
  values["finished"] = utcNow("%Y-%m-%dT%H:%M:%SZ");
  return values;
}

int BackupRun::record(const std::string &result, int status) {
  fileList_.reset();
  partial_.reset(); // removes what is not whole
  const std::string id = session_.getId();
  const Json::Value values = summary(result);
  // What could not be removed stays recorded, for the next run to clear.
  task_.set("session", session_.destroy() ? std::string() : id);
  task_.set("partials", std::list<std::string>());
  task_.set("lastResult", result);
  task_.set("lastRun", values["finished"].asString());
  // Sizes pass what an integer option can hold in a file; text holds any.
  for (const char *key : {"files", "bytes", "archiveBytes"}) {
    task_.set(key, values[key].asString());
  }
  task_.set("archive", archivePath_);
  task_.save();
  std::cout << replaceMustache(task_.text("template"), values, false) << std::endl;
  return status;
}
