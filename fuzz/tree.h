#ifndef KOVABACKUP_FUZZ_TREE_H
#define KOVABACKUP_FUZZ_TREE_H

/// @file A small tree of real files, made as an input says.
///
/// The root must be below a /tmp of this process alone. fuzz/private_tmp.cpp sees to that, and
/// where tests replay a corpus, their main function.

#include "fuzz/support.h"

#include <array>
#include <fcntl.h>
#include <filesystem>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace KovaFuzz {

/// Where the links in a tree lead.
inline const std::string kLinkTarget = "/tmp/world/outside";

/// The number that the next descriptor gets; the same at the end when none was left open.
inline int nextDescriptor() {
  const int fd = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
  ::close(fd);
  return fd;
}

/// A folder and up to 20 entries below it, three bytes for each: its kind, the folder that holds it
/// and its name. A name that is taken adds nothing. One kind of folder has twelve more below it.
class Tree {
public:
  explicit Tree(std::string root) : root_(std::move(root)) {
    clear();
    require(::mkdir(root_.c_str(), 0755) == 0);
    folders_.push_back(root_);
  }
  ~Tree() { clear(); }
  Tree(const Tree &) = delete;
  Tree &operator=(const Tree &) = delete;

  void make(Input &input) {
    for (unsigned left = input.byte() % 21; left > 0; --left) {
      const unsigned kind = input.byte() % 8;
      const std::string path = folders_[input.byte() % folders_.size()] + "/" + pick(input);
      if (add(kind, path) && kind < 4) {
        folders_.push_back(path);
      }
      if (kind == 3) {
        addDeepFolder(path);
      }
    }
  }

  /// A path that may exist.
  std::string somePath(Input &input) const {
    const std::string &folder = folders_[input.byte() % folders_.size()];
    const unsigned name = input.byte();
    return name % 4 == 0 ? folder : folder + "/" + kNames[name % kNames.size()];
  }

private:
  // Characters of patterns, bytes that are not UTF-8, and names that contain one another.
  static inline const std::array<std::string, 12> kNames = {
      "a", "b", "ab", "aa", "*", "?", "\\", "a b", ".a", "\xff", "a\n", "..."};

  static const std::string &pick(Input &input) { return kNames[input.byte() % kNames.size()]; }

  static bool add(unsigned kind, const std::string &path) {
    if (kind < 4) {
      return ::mkdir(path.c_str(), 0755) == 0;
    }
    if (kind == 4) {
      return ::symlink(kLinkTarget.c_str(), path.c_str()) == 0;
    }
    return ::mknod(path.c_str(), (kind == 5 ? S_IFIFO : S_IFREG) | 0644, 0) == 0;
  }

  // Below more folders than a walk or a removal holds open.
  void addDeepFolder(std::string path) {
    for (int levels = 12; levels > 0; --levels) {
      path += "/a";
      (void)::mkdir(path.c_str(), 0755);
    }
    folders_.push_back(path);
  }

  void clear() {
    std::error_code ignored;
    std::filesystem::remove_all(root_, ignored);
  }

  std::string root_;
  std::vector<std::string> folders_;
};

} // namespace KovaFuzz

#endif
