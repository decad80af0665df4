// The lock file holds one line about the process that took the lock last: "PID START SINCE", in
// decimal. START is the start of the process as /proc shows it, in clock ticks since boot; SINCE is
// the time in seconds since 1970.

#include "kovabackup/service/run_lock.h"

#include "base/retry_on_eintr.h"
#include "service/absence.h"
#include "service/failed.h"
#include "service/file_text.h"
#include "service/lock_table.h"
#include "service/process_facts.h"
#include "service/token_lock.h"
#include "service/words.h"

#include <algorithm>
#include <unistd.h>

namespace KOVA::Backup::Service {
namespace {

// Three numbers of up to 20 digits.
constexpr std::size_t kLongestNote = 80;

struct Note {
  pid_t pid = -1;
  std::uint64_t start = 0;
  std::time_t since = 0;
};

bool parseNote(std::string_view text, Note &out) {
  std::string_view line = takeLine(text);
  Note note;
  if (!parseInteger(takeWord(line), note.pid) || !parseInteger(takeWord(line), note.start) ||
      !parseInteger(takeWord(line), note.since) || !line.empty()) {
    return false;
  }
  out = note;
  return true;
}

// Reads little more than a note can have: the file may be anything.
Note readNote(const std::string &path) {
  Note note;
  std::string text;
  Error ignored;
  if (readFileText(path, text, ignored, kLongestNote)) {
    (void)parseNote(text, note);
  }
  return note;
}

// The lock does not depend on the note, so no failure is reported. What cannot be written
// completely is removed, together with the note of the run before.
void writeNote(int fd) {
  struct stat file = {};
  if (::fstat(fd, &file) != 0 || !S_ISREG(file.st_mode) || file.st_nlink != 1) {
    return;
  }
  ProcessFacts self;
  std::string text;
  if (findProcess(::getpid(), self)) {
    text = std::to_string(::getpid()) + " " + std::to_string(self.start) + " " +
           std::to_string(std::time(nullptr)) + "\n";
  }
  const ssize_t wrote =
      Base::retryOnEintr([&] { return ::pwrite(fd, text.data(), text.size(), 0); });
  const bool complete = wrote == static_cast<ssize_t>(text.size());
  (void)Base::retryOnEintr([&] { return ::ftruncate(fd, complete ? wrote : 0); });
}

// What note and kernel say together about the taker of a lock.
LockHolder holderOf(pid_t taker, const Note &note, const struct stat &file) {
  LockHolder holder;
  holder.taker = taker;
  const bool noted = note.pid == taker;
  ProcessFacts process;
  const bool runs = findProcess(taker, process);
  if (noted && runs && process.start == note.start) {
    holder.alive = true;
    holder.since = note.since;
    return holder;
  }
  // Either the taker has ended, and its PID may belong to another process by now; or it did not
  // write the note. Only a taker that still runs has the file open.
  const Opens opens = runs ? hasOpen(taker, file) : Opens::No;
  holder.alive = opens == Opens::Yes || (opens == Opens::Unknown && !noted);
  holder.since = noted && !holder.alive ? note.since : 0;
  return holder;
}

} // namespace

RunLock::RunLock(const std::string &name) : name_(name) {}

RunLock::~RunLock() {
  release();
}

bool RunLock::take(Error &error, Millis limit) {
  if (fd_ >= 0) {
    return failed(error, "flock", path(name_), EALREADY);
  }
  Base::UniqueFd lock;
  if (!takeToken(name_, limit, lock, error)) {
    return false;
  }
  writeNote(lock.get());
  fd_ = lock.release();
  return true;
}

void RunLock::release() {
  const Base::UniqueFd closed(std::exchange(fd_, -1));
}

std::string RunLock::path(const std::string &name) {
  return tokenPath(name);
}

bool RunLock::holder(const std::string &name, LockHolder &out) {
  const std::string file = path(name);
  struct stat info = {};
  std::vector<LockUser> users;
  Error ignored; // the caller can ask users
  if (file.empty() || ::stat(file.c_str(), &info) != 0 ||
      !findLockUsers(file, info, users, ignored)) {
    return false;
  }
  const auto first =
      std::find_if(users.begin(), users.end(), [](const LockUser &user) { return !user.waits; });
  if (first == users.end()) {
    return false;
  }
  out = holderOf(first->pid, readNote(file), info);
  return true;
}

bool RunLock::users(const std::string &name, std::vector<LockUser> &out, Error &error) {
  const std::string file = path(name);
  if (file.empty()) {
    return failed(error, "stat", name, EINVAL);
  }
  struct stat info = {};
  if (::stat(file.c_str(), &info) == 0) {
    return findLockUsers(file, info, out, error);
  }
  if (!isAbsence(errno)) {
    return failed(error, "stat", file);
  }
  out.clear();
  return true;
}

} // namespace KOVA::Backup::Service
