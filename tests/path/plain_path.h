#ifndef KOVABACKUP_TESTS_PLAIN_PATH_H
#define KOVABACKUP_TESTS_PLAIN_PATH_H

/// @file The rules of the path algebra, written down one by one and without regard to speed: the
/// oracle of the test and of the fuzz target. They share no code with the library.

#include <string>
#include <vector>

namespace KovaTest::PlainPath {

using Parts = std::vector<std::string>;

inline std::string stripped(std::string text) {
  while (!text.empty() && text.back() == '/') {
    text.pop_back();
  }
  return text;
}

inline std::string join(const std::string &a, const std::string &b) {
  const std::string head = stripped(a);
  std::string tail = b;
  while (!tail.empty() && tail.front() == '/') {
    tail.erase(0, 1);
  }
  if (tail == ".") {
    tail = "";
  }
  if (!head.empty()) {
    if (head == ".") {
      return tail;
    }
    return tail.empty() ? head : head + "/" + tail;
  }
  return !a.empty() && a.front() == '/' ? "/" + tail : tail;
}

/// The seven-part form, which folds the two-part one, except for its third argument.
inline std::string joinSeven(const Parts &parts) {
  std::string joined = join(join(parts[0], parts[1]), parts[2]);
  for (std::size_t i = 3; i < 7; ++i) {
    joined = parts[i].empty() ? joined : join(joined, parts[i]);
  }
  return joined;
}

inline std::string joinAll(const Parts &parts) {
  std::string joined;
  for (std::size_t i = 0; i < parts.size(); ++i) {
    joined = i == 0 ? parts[i] : join(joined, parts[i]);
  }
  return joined;
}

inline Parts split(const std::string &path) {
  if (path.empty()) {
    return {};
  }
  Parts out = {""};
  for (std::size_t i = 0; i < path.size(); ++i) {
    if (path[i] != '/') {
      out.back() += path[i];
    } else if (i == 0 || path[i - 1] != '/') { // a run of slashes separates once
      out.emplace_back();
    }
  }
  if (out[0].empty()) {
    out[0] = "/";
  }
  if (out.size() == 2 && out[0] == "/") {
    if (out[1].empty()) {
      out.pop_back();
    }
    return out;
  }
  if (out.back().empty()) {
    out.pop_back();
    out.back() += "/";
  }
  return out;
}

inline std::string token(const std::string &path, unsigned int index) {
  if (path.empty()) {
    return "";
  }
  if (index > 0) {
    const Parts parts = split(path);
    return index < parts.size() ? parts[index] : "";
  }
  if (path.front() == '/') {
    return "/";
  }
  const std::size_t p = path.find('/');
  if (p == std::string::npos || p + 1 == path.size()) {
    return path;
  }
  const bool onlySlashes = path.substr(p).find_first_not_of('/') == std::string::npos;
  return path.substr(0, onlySlashes ? p + 1 : p);
}

inline std::string common(const std::string &a, const std::string &b) {
  Parts ours = split(a);
  Parts theirs = split(b);
  std::string result;
  std::size_t i = 0;
  for (; i < ours.size() && i < theirs.size(); ++i) {
    if (i + 1 == ours.size()) {
      ours[i] = stripped(ours[i]);
    }
    if (i + 1 == theirs.size()) {
      theirs[i] = stripped(theirs[i]);
    }
    if (ours[i] != theirs[i]) {
      break;
    }
    result = i == 0 ? ours[i] : join(result, ours[i]);
  }
  return result;
}

inline std::string relative(const std::string &path, const std::string &base) {
  const std::string prefix = stripped(base) + "/";
  if (base.empty() || path.substr(0, prefix.size()) != prefix) {
    return "";
  }
  return path.substr(prefix.size());
}

/// glibc keeps exactly two slashes in front, as POSIX permits.
inline std::string dirname(const std::string &path) {
  std::string rest = path.c_str();
  const std::size_t leading = rest.find_first_not_of('/');
  const std::string root = rest.find_first_not_of('/') == 2 || rest == "//" ? "//" : "/";
  if (leading == std::string::npos) {
    return rest.empty() ? "." : root;
  }
  rest = stripped(rest);
  const std::size_t slash = rest.rfind('/');
  if (slash == std::string::npos) {
    return ".";
  }
  rest = stripped(rest.substr(0, slash));
  return rest.empty() ? root : rest;
}

inline std::string basename(const std::string &path) {
  const std::string whole = path.c_str();
  const std::string rest = stripped(whole);
  if (rest.empty()) {
    return whole.empty() ? "." : "/";
  }
  return rest.substr(rest.rfind('/') + 1);
}

inline std::string shareName(const std::string &path) {
  if (path.empty() || path[0] != '/') {
    return "";
  }
  std::string name;
  for (std::size_t i = 1; i < path.size() && path[i] != '/'; ++i) {
    name += path[i];
  }
  return name;
}

inline std::string shareRelativePath(const std::string &path) {
  const std::string name = shareName(path);
  const bool goesOn = !path.empty() && path[0] == '/' && path.size() > name.size() + 2;
  return goesOn ? path.substr(name.size() + 2) : "";
}

inline bool isInEaDir(const std::string &path) {
  std::string component;
  for (const char byte : path + "/") {
    if (byte != '/') {
      component += byte;
    } else if (component == "@eaDir") {
      return true;
    } else {
      component.clear();
    }
  }
  return false;
}

} // namespace KovaTest::PlainPath

#endif
