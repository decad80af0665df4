#include "service/lock_table.h"

#include "service/file_text.h"
#include "service/mount_device.h"
#include "service/process_facts.h"
#include "service/words.h"

#include <string_view>
#include <sys/sysmacros.h>

namespace KOVA::Backup::Service {
namespace {

// The list is long and other locks come and go while it is read. See findLockUsers.
constexpr int kMaxReadings = 5;

// One line about an flock lock on the inode that is looked for.
struct Entry {
  pid_t pid = -1;
  bool waits = false;
  dev_t device = 0;

  bool operator==(const Entry &other) const { return pid == other.pid && waits == other.waits; }
};

bool parseHex(std::string_view text, unsigned int &out) {
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), out, 16);
  return error == std::errc() && end == text.data() + text.size();
}

// "00:2e:77": the device in hexadecimal, the inode in decimal.
bool parseFile(std::string_view file, ino_t inode, Entry &entry) {
  const std::size_t first = file.find(':');
  const std::size_t last = file.rfind(':');
  ino_t found = 0;
  unsigned int high = 0;
  unsigned int low = 0;
  if (last == std::string_view::npos || first == last ||
      !parseInteger(file.substr(last + 1), found) || found != inode ||
      !parseHex(file.substr(0, first), high) ||
      !parseHex(file.substr(first + 1, last - first - 1), low)) {
    return false;
  }
  entry.device = makedev(high, low);
  return true;
}

// A line reads "1: FLOCK  ADVISORY  WRITE 4711 00:2e:77 0 EOF". A process that waits has "->" after
// the number.
bool parseEntry(std::string_view line, ino_t inode, Entry &entry) {
  (void)takeWord(line);
  std::string_view kind = takeWord(line);
  entry.waits = kind == "->";
  if (entry.waits) {
    kind = takeWord(line);
  }
  (void)takeWord(line);
  (void)takeWord(line);
  const std::string_view pid = takeWord(line);
  return kind == "FLOCK" && parseInteger(pid, entry.pid) && parseFile(takeWord(line), inode, entry);
}

// Inode numbers are only unique per device. In a subvolume and on some overlays stat reports
// another device number than the list does, and two files of one file system may have the same
// number. What the process has open then decides, if it can be examined; it cannot once it has
// ended. The device of stat is compared first because that needs no access to the process.
bool isOnFile(const Entry &entry, const std::string &path, const struct stat &file) {
  if (entry.device == file.st_dev) {
    return true;
  }
  const Opens opens = hasOpen(entry.pid, file);
  dev_t device = 0;
  if (opens == Opens::Yes || !findMountDevice(path, device) || entry.device != device) {
    return opens == Opens::Yes;
  }
  ProcessFacts process;
  return opens == Opens::Unknown || !findProcess(entry.pid, process);
}

bool readEntries(const std::string &path, const struct stat &file, std::vector<Entry> &out,
                 Error &error) {
  std::string text;
  if (!readFileText("/proc/locks", text, error)) {
    return false;
  }
  std::vector<Entry> entries;
  std::string_view rest = text;
  while (!rest.empty()) {
    Entry entry;
    if (parseEntry(takeLine(rest), file.st_ino, entry) && isOnFile(entry, path, file)) {
      entries.push_back(entry);
    }
  }
  out.swap(entries);
  return true;
}

} // namespace

// The kernel hands out a long list in parts. If another lock is released between two parts, an
// entry can be skipped; if one is added, an entry can come twice. So the list is read until two
// readings agree.
bool findLockUsers(const std::string &path, const struct stat &file, std::vector<LockUser> &out,
                   Error &error) {
  std::vector<Entry> entries;
  std::vector<Entry> again;
  if (!readEntries(path, file, entries, error)) {
    return false;
  }
  for (int readings = 1; readings < kMaxReadings; ++readings) {
    again.swap(entries);
    if (!readEntries(path, file, entries, error)) {
      return false;
    }
    if (entries == again) {
      break;
    }
  }
  std::vector<LockUser> users;
  for (const Entry &entry : entries) {
    ProcessFacts process;
    (void)findProcess(entry.pid, process); // without a name when it has ended
    users.push_back({entry.pid, entry.waits, process.command});
  }
  out.swap(users);
  return true;
}

} // namespace KOVA::Backup::Service
