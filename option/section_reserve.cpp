// Reserving a section under a unique id or name. Its header line is written at once: until the
// options are saved, that line is what keeps others from taking the same id or name.

#include "base/errno_guard.h"
#include "common/log.h"
#include "kovabackup/option_map.h"
#include "option/option_map_private.h"
#include "option/section_list.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <sys/stat.h>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup {
namespace {

constexpr SectionListReport kUniqueId = {761, 767, 771, ""};

bool logWriteFailed() {
  Log::error(kOptionModule, 740, "fprintf: %m");
  return false;
}

// The end of a file before the header is added.
struct FileEnd {
  off_t size = 0;
  bool endsLine = true; // an empty file needs no line end before its first line
};

bool findEnd(std::FILE *file, FileEnd &end) {
  if (::fseeko(file, 0, SEEK_END) != 0) {
    return false;
  }
  end.size = ::ftello(file);
  if (end.size <= 0) {
    return end.size == 0;
  }
  if (::fseeko(file, -1, SEEK_END) != 0) {
    return false;
  }
  const int last = std::fgetc(file);
  end.endsLine = last == '\n';
  return last != EOF;
}

// Removes a header that was written in part. When the file has grown by more than the header,
// another process has added to it without the lock, and nothing is cut off.
void removePartialHeader(const std::string &path, off_t size, std::size_t added) {
  const Base::ErrnoGuard guard;
  struct stat now {};
  if (::stat(path.c_str(), &now) == 0 && S_ISREG(now.st_mode) && now.st_size > size &&
      now.st_size <= size + static_cast<off_t>(added)) {
    (void)!::truncate(path.c_str(), size); // the failed write is reported in any case
  }
}

// Writes, flushes and closes. A full disk may show in any of the three.
bool writeHeader(FilePtr file, const std::string &path, const std::string &name) {
  FileEnd end;
  if (!findEnd(file.get(), end)) {
    return false;
  }
  // When the last line has no line end, the header would become part of it and both would be lost.
  const char *const lineEnd = end.endsLine ? "" : "\n";
  const bool written =
      ::fseeko(file.get(), 0, SEEK_END) == 0 && // C requires it between reading and writing
      std::fprintf(file.get(), "%s[%s]\n", lineEnd, name.c_str()) >= 0 &&
      std::fflush(file.get()) == 0;
  const bool closed = written && std::fclose(file.release()) == 0;
  if (!closed) {
    file.reset();
    removePartialHeader(path, end.size, name.size() + 4);
  }
  return closed;
}

bool canBeHeader(const std::string &name) {
  return name.find_first_of(std::string("\n\r\0", 3)) == std::string::npos;
}

// Adds the header of a section at the end of a file, which is made when it does not exist.
// Returns: false on failure, which is logged; the file then holds what it held before.
bool appendSectionHeader(const std::string &path, const std::string &name) {
  if (!canBeHeader(name)) {
    errno = EINVAL;
    return logWriteFailed();
  }
  FilePtr file(std::fopen(path.c_str(), "a+e"));
  if (!file) {
    Log::error(kOptionModule, 735, "fopen: %m");
    return false;
  }
  return writeHeader(std::move(file), path, name) || logWriteFailed();
}

} // namespace

int OptionMap::optSectionGetUniqueId(const std::string &path, const std::string &prefix) {
  SectionList sections(kUniqueId);
  if (!sections.allocate() || !sections.read(path)) {
    return -1;
  }
  int highest = 0;
  for (int index = 0; index < sections.count(); ++index) {
    int id = 0;
    if (parseSectionId(sections.name(index), prefix, id)) {
      highest = std::max(highest, id);
    }
  }
  if (highest == INT_MAX) {
    errno = EOVERFLOW; // no id follows the largest, so there is no header to write
    (void)logWriteFailed();
    return -1;
  }
  const int next = highest + 1;
  return appendSectionHeader(path, sectionName(prefix, next)) ? next : -1;
}

bool OptionMap::optSectionCreateUniqueId(const std::string &path, const std::string &prefix,
                                         int id) {
  std::list<int> ids;
  if (!optSectionListId(path, prefix, ids)) {
    return false;
  }
  const bool taken = std::find(ids.begin(), ids.end(), id) != ids.end();
  // Not sectionName: here a negative id becomes part of the name, too.
  return !taken && appendSectionHeader(path, prefix + std::to_string(id));
}

bool OptionMap::optSectionCreateUniqueName(const std::string &path, const std::string &name) {
  std::list<std::string> names;
  if (!optSectionListName(path, names)) {
    return false;
  }
  const bool taken = std::find(names.begin(), names.end(), name) != names.end();
  return !taken && appendSectionHeader(path, name);
}

} // namespace KOVA::Backup
