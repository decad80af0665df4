#include "kovabackup/path_util.h"

#include "common/log.h"
#include "path/tree_removal.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <libgen.h>
#include <memory>
#include <new>
#include <string_view>
#include <sys/stat.h>
#include <unistd.h>

namespace KOVA::Backup {
namespace {

constexpr char kModule[] = "path/path_util";
constexpr char kSeparator = '/';
constexpr char kIpcRoot[] = "/tmp/kovabackup";

// Path of the first entry that the present run of removeAll failed to remove. The walk's callback
// takes no context, so it stands here.
std::string firstFailure;

bool isAbsolute(std::string_view path) {
  return !path.empty() && path.front() == kSeparator;
}

std::string_view withoutTrailingSlashes(std::string_view path) {
  while (!path.empty() && path.back() == kSeparator) {
    path.remove_suffix(1);
  }
  return path;
}

std::string_view withoutLeadingSlashes(std::string_view path) {
  while (isAbsolute(path)) {
    path.remove_prefix(1);
  }
  return path;
}

// Makes head the two joined, in place: a fold of many then copies each once. tail is no part of it.
void joinOnto(std::string &head, std::string_view tail) {
  const bool fromRoot = isAbsolute(head);
  head.resize(withoutTrailingSlashes(head).size());
  tail = withoutLeadingSlashes(tail);
  if (tail == ".") {
    tail = {};
  }
  if (head == ".") {
    head.clear();
  } else if (head.empty() ? fromRoot : !tail.empty()) {
    head += kSeparator;
  }
  head += tail;
}

// The two functions of libc change the text that they are given.
std::string applyToCopy(char *(*function)(char *), const std::string &path) {
  const std::unique_ptr<char, decltype(&std::free)> copy(::strdup(path.c_str()), &std::free);
  if (!copy) {
    throw std::bad_alloc();
  }
  return function(copy.get());
}

// basename is still libgen's macro here: this is the POSIX function, not the one of <string.h>.
char *posixBasename(char *path) {
  return ::basename(path);
}
#undef basename

void stripIfLast(std::vector<std::string> &parts, std::size_t index) {
  if (index + 1 == parts.size()) {
    parts[index].resize(withoutTrailingSlashes(parts[index]).size());
  }
}

std::string firstToken(const std::string &path) {
  if (isAbsolute(path)) {
    return std::string(1, kSeparator);
  }
  const std::size_t slash = path.find(kSeparator);
  if (slash == std::string::npos) {
    return path;
  }
  const bool onlySlashesFollow = path.find_first_not_of(kSeparator, slash) == std::string::npos;
  return path.substr(0, onlySlashesFollow ? slash + 1 : slash);
}

// Makes a directory, or accepts the one that is there, and sets its mode: mkdir alone would leave
// the umask's doing and the bits of an existing directory.
bool makeDirectory(const std::string &dir, mode_t mode, int mkdirLine, int chmodLine) {
  if (::mkdir(dir.c_str(), mode) != 0 && errno != EEXIST) {
    Log::error(kModule, mkdirLine, "mkdir %s path failed. %m", dir.c_str());
    return false;
  }
  if (::chmod(dir.c_str(), mode) != 0) {
    Log::error(kModule, chmodLine, "chmod %s path failed. %m", dir.c_str());
    return false;
  }
  return true;
}

int removeAndNoteFirstFailure(const char *path, const struct stat * /*info*/, int type,
                              struct FTW * /*position*/) {
  if (TreeRemoval::removeEntry(path, type) == 0 || errno == ENOENT || !firstFailure.empty()) {
    return 0;
  }
  if (TreeRemoval::isDirectory(type)) {
    Log::error(kModule, 32, "rmdir %s failed. %m", path);
  } else {
    Log::error(kModule, 39, "unlink %s failed. %m", path);
  }
  firstFailure.assign(path, ::strnlen(path, firstFailure.capacity())); // cut, never grown
  return 0;
}

} // namespace

namespace Path {

std::string dirname(const std::string &path) {
  return applyToCopy(&::dirname, path);
}

std::string basename(const std::string &path) {
  return applyToCopy(&posixBasename, path);
}

std::string join(const std::string &a, const std::string &b) {
  std::string result;
  result.reserve(a.size() + 1 + b.size());
  result = a;
  joinOnto(result, b);
  return result;
}

std::string join(const std::string &a, const std::string &b, const std::string &c,
                 const std::string &d, const std::string &e, const std::string &f,
                 const std::string &g) {
  std::string result = join(a, b);
  joinOnto(result, c);
  for (const std::string *part : {&d, &e, &f, &g}) {
    if (!part->empty()) {
      joinOnto(result, *part);
    }
  }
  return result;
}

std::string join(std::vector<std::string>::const_iterator first,
                 std::vector<std::string>::const_iterator last) {
  if (first == last) {
    return "";
  }
  std::string result = *first;
  while (++first != last) {
    joinOnto(result, *first);
  }
  return result;
}

std::string join(const std::vector<std::string> &parts) {
  return join(parts.begin(), parts.end());
}

bool split(const std::string &path, std::vector<std::string> &out) {
  std::vector<std::string> parts; // path may be an element of out
  if (isAbsolute(path)) {
    parts.emplace_back(1, kSeparator);
  }
  std::size_t begin = path.find_first_not_of(kSeparator);
  while (begin != std::string::npos) {
    const std::size_t end = std::min(path.find(kSeparator, begin), path.size());
    parts.emplace_back(path, begin, end - begin);
    begin = path.find_first_not_of(kSeparator, end);
    if (begin == std::string::npos && end < path.size()) {
      parts.back() += kSeparator;
    }
  }
  out.swap(parts);
  return true;
}

std::string token(const std::string &path, unsigned int index) {
  if (index == 0) {
    return firstToken(path);
  }
  std::vector<std::string> parts;
  if (!split(path, parts) || index >= parts.size()) {
    return "";
  }
  return parts[index];
}

std::string common(const std::string &a, const std::string &b) {
  std::vector<std::string> ours;
  std::vector<std::string> theirs;
  if (!split(a, ours) || !split(b, theirs)) {
    return "";
  }
  std::size_t shared = 0;
  for (; shared < std::min(ours.size(), theirs.size()); ++shared) {
    stripIfLast(ours, shared);
    stripIfLast(theirs, shared);
    if (ours[shared] != theirs[shared]) {
      break;
    }
  }
  return join(ours.begin(), ours.begin() + static_cast<std::ptrdiff_t>(shared));
}

std::string relative(const std::string &path, const std::string &base) {
  if (base.empty()) {
    return "";
  }
  const std::string prefix = std::string(withoutTrailingSlashes(base)) + kSeparator;
  return path.compare(0, prefix.size(), prefix) == 0 ? path.substr(prefix.size()) : "";
}

std::string absPath(const std::string &path) {
  if (isAbsolute(path)) {
    return path;
  }
  char current[4096] = "";
  // A failing getcwd may leave a piece of the path in the buffer.
  const char *known = ::getcwd(current, sizeof current - 1);
  return join(known != nullptr ? known : "", path);
}

std::string getIpcTempPath() {
  return kIpcRoot;
}

std::string createIpcTempPath(const std::string &name, unsigned int mode) {
  if (name.empty() || name.find(kSeparator) != std::string::npos) {
    Log::error(kModule, 387, "bad %s name.", name.c_str());
    return "";
  }
  const std::string root = getIpcTempPath();
  if (!makeDirectory(root, 0755, 395, 402)) {
    return "";
  }
  std::string dir = join(root, name);
  if (!makeDirectory(dir, mode, 409, 414)) {
    return "";
  }
  return dir;
}

int createIpcLockFile(const std::string &name) {
  const std::string dir = createIpcTempPath("lock", 0770);
  if (dir.empty()) {
    return -1;
  }
  // Without O_CLOEXEC on purpose: the lock is the caller's, also to hand on.
  return ::open(join(dir, name).c_str(), O_RDWR | O_CREAT, 0666);
}

} // namespace Path

namespace ConfigPath {

std::string shareName(const std::string &path) {
  if (!isAbsolute(path)) {
    return "";
  }
  const std::size_t end = std::min(path.find(kSeparator, 1), path.size());
  return path.substr(1, end - 1);
}

std::string shareRelativePath(const std::string &path) {
  if (!isAbsolute(path)) {
    return "";
  }
  const std::size_t slash = path.find(kSeparator, 1);
  return slash == std::string::npos ? "" : path.substr(slash + 1);
}

} // namespace ConfigPath

bool removeAll(const std::string &path) {
  firstFailure.clear();
  // The callback must not throw for want of memory: the walk would leave its directories open.
  firstFailure.reserve(PATH_MAX);
  TreeRemoval::walk(path, &removeAndNoteFirstFailure);
  return firstFailure.empty();
}

} // namespace KOVA::Backup
