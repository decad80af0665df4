// Path algebra: it works on the bytes of paths and, apart from absPath, asks the system nothing.

#include "kovabackup/path_util.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <libgen.h>
#include <memory>
#include <new>
#include <string_view>
#include <unistd.h>

namespace KOVA::Backup {
namespace {

constexpr char kSeparator = '/';

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

// Joins tail onto head in place, so that folding many parts copies each of them once. tail must not
// refer into head.
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

// dirname(3) and basename(3) modify the text that they are given, so they get a copy.
std::string applyToCopy(char *(*function)(char *), const std::string &path) {
  const std::unique_ptr<char, decltype(&std::free)> copy(::strdup(path.c_str()), &std::free);
  if (!copy) {
    throw std::bad_alloc();
  }
  return function(copy.get());
}

// Here basename is still the macro of <libgen.h>, so this is the POSIX function and not the one
// that <string.h> declares.
char *posixBasename(char *path) {
  return ::basename(path);
}
#undef basename

void stripIfLast(std::vector<std::string> &parts, std::size_t index) {
  if (index + 1 == parts.size()) {
    parts[index].resize(withoutTrailingSlashes(parts[index]).size());
  }
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
  std::vector<std::string> parts; // not out itself: path may be an element of it
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

// The components are those of split, which would copy all of them.
std::string token(const std::string &path, unsigned int index) {
  unsigned int namesBefore = index;
  if (isAbsolute(path)) {
    if (index == 0) {
      return std::string(1, kSeparator);
    }
    --namesBefore; // the root is a component, but not a name
  }
  std::size_t begin = path.find_first_not_of(kSeparator);
  while (begin != std::string::npos) {
    const std::size_t end = std::min(path.find(kSeparator, begin), path.size());
    const std::size_t next = path.find_first_not_of(kSeparator, end);
    if (namesBefore == 0) {
      const bool keepsSlash = next == std::string::npos && end < path.size();
      return path.substr(begin, end - begin + (keepsSlash ? 1 : 0));
    }
    --namesBefore;
    begin = next;
  }
  return "";
}

std::string common(const std::string &a, const std::string &b) {
  std::vector<std::string> ours;
  std::vector<std::string> theirs;
  (void)split(a, ours); // always true
  (void)split(b, theirs);
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
  // A failing getcwd may leave part of a path in the buffer, so only its result counts.
  const char *known = ::getcwd(current, sizeof current - 1);
  return join(known != nullptr ? known : "", path);
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

} // namespace KOVA::Backup
