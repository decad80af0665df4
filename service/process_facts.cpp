#include "service/process_facts.h"

#include "service/absence.h"
#include "service/file_text.h"
#include "service/words.h"

#include <cerrno>
#include <dirent.h>
#include <fcntl.h>
#include <memory>
#include <string_view>

namespace KOVA::Backup::Service {
namespace {

// In /proc/PID/stat, the state is the first word after the name and the start is the 20th.
constexpr int kWordsBetween = 18;

using Folder = std::unique_ptr<DIR, int (*)(DIR *)>;

} // namespace

// A line reads "4711 (tar) S 1 4711 ...". The name may contain any character, even ") ".
bool readProcessFacts(std::string_view line, ProcessFacts &out) {
  const std::size_t open = line.find('(');
  const std::size_t close = line.rfind(')');
  if (open == std::string_view::npos || close == std::string_view::npos || close < open) {
    return false;
  }
  std::string_view rest = line.substr(close + 1);
  const std::string_view state = takeWord(rest);
  for (int skipped = 0; skipped < kWordsBetween; ++skipped) {
    (void)takeWord(rest);
  }
  ProcessFacts facts;
  if (state == "Z" || state == "X" || !parseInteger(takeWord(rest), facts.start)) {
    return false;
  }
  facts.command = line.substr(open + 1, close - open - 1);
  out = std::move(facts);
  return true;
}

bool findProcess(pid_t pid, ProcessFacts &out) {
  const std::string path = "/proc/" + std::to_string(pid) + "/stat";
  std::string text;
  Error ignored; // whatever the reason, the process cannot be seen
  return readFileText(path, text, ignored) && readProcessFacts(text, out);
}

// Without the capabilities of the process, its descriptors may be listed but not examined.
Opens hasOpen(pid_t pid, const struct stat &file) {
  const std::string path = "/proc/" + std::to_string(pid) + "/fd";
  const Folder folder(::opendir(path.c_str()), &::closedir);
  if (!folder) {
    return errno == ENOENT ? Opens::No : Opens::Unknown;
  }
  Opens opens = Opens::No;
  for (;;) {
    errno = 0;
    const dirent *entry = ::readdir(folder.get());
    if (entry == nullptr) {
      return errno == 0 || isEndOfProcess(errno) ? opens : Opens::Unknown;
    }
    struct stat open = {};
    if (::fstatat(::dirfd(folder.get()), entry->d_name, &open, 0) != 0) {
      opens = isEndOfProcess(errno) ? opens : Opens::Unknown;
    } else if (open.st_dev == file.st_dev && open.st_ino == file.st_ino) {
      return Opens::Yes;
    }
  }
}

} // namespace KOVA::Backup::Service
