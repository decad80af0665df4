#ifndef KOVABACKUP_TESTS_SERVICE_TREE_SUPPORT_H
#define KOVABACKUP_TESTS_SERVICE_TREE_SUPPORT_H

/// @file Makes trees, and changes them at random while they are walked or removed.

#include <filesystem>
#include <fstream>
#include <random>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

namespace KovaTest {

using Paths = std::vector<std::string>;

/// Makes a file, or a folder when the path ends in "/", with the folders above it. A path without a
/// slash in front is below root.
inline void makeEntry(const std::string &root, const std::string &path,
                      const std::string &content = "") {
  namespace fs = std::filesystem;
  const fs::path full = path.front() == '/' ? path : root + ("/" + path);
  fs::create_directories(full.parent_path());
  if (full.has_filename()) {
    std::ofstream(full) << content;
  }
}

/// As the failure of an entry is listed.
inline std::string failure(const std::string &step, const std::string &path, int code) {
  return step + " " + path + ": " + std::to_string(code);
}

/// Changes a tree at random, by paths of the names "a" and "b". Some become links to /tmp/outside.
class Vandal {
public:
  Vandal(std::string root, unsigned seed) : root_(std::move(root)), random_(seed) {}

  void act() {
    namespace fs = std::filesystem;
    std::error_code ignored;
    const std::string one = somePath();
    const std::string other = somePath();
    switch (random_() % 16) {
    case 0:
      fs::remove_all(one, ignored);
      break;
    case 1:
    case 2:
      fs::rename(one, other, ignored);
      break;
    case 3:
      fs::remove_all(one, ignored);
      fs::create_directory_symlink("/tmp/outside", one, ignored);
      break;
    case 4:
      fs::rename(one, one + "x", ignored);
      fs::create_directory_symlink("/tmp/outside", one, ignored);
      break;
    case 5:
    case 6:
      fs::create_directories(one, ignored);
      break;
    default:
      break;
    }
  }

  void makeTree() {
    for (int i = 0; i < 40; ++i) {
      std::error_code ignored;
      std::filesystem::create_directories(somePath(), ignored);
    }
  }

private:
  std::string somePath() {
    std::string path = root_;
    for (auto depth = 1 + random_() % 9; depth > 0; --depth) {
      path += random_() % 2 == 0 ? "/a" : "/b";
    }
    return path;
  }

  std::string root_;
  std::mt19937 random_;
};

} // namespace KovaTest

#endif
