#ifndef KOVABACKUP_TESTS_PATH_FILTER_TREE_H
#define KOVABACKUP_TESTS_PATH_FILTER_TREE_H

/// @file Typical paths on the storage system of an office or a family, and typical patterns of its
/// users. The same on every machine and in every run.

#include <array>
#include <cstdarg>
#include <cstdio>
#include <random>
#include <string>
#include <vector>

namespace KovaTest::Tree {

constexpr std::array<const char *, 8> kFolders{"Documents", "Downloads", "Desktop", "Pictures",
                                               "Music",     "Projects",  "Mail",    ".cache"};
constexpr std::array<const char *, 12> kExtensions{"docx", "xlsx", "pdf", "jpg", "png", "mp3",
                                                   "cpp",  "h",    "o",   "tmp", "log", "bak"};
constexpr std::array<const char *, 8> kPackages{"left", "lodge", "chalk",  "react",
                                                "core", "debug", "semver", "yargs"};

/// printf into a string.
__attribute__((format(printf, 1, 2))) inline std::string text(const char *format, ...) {
  char buffer[512];
  va_list args;
  va_start(args, format);
  const int length = std::vsnprintf(buffer, sizeof buffer, format, args);
  va_end(args);
  return std::string(buffer, static_cast<std::size_t>(length));
}

inline void addHomes(std::vector<std::string> &paths, std::mt19937 &random) {
  for (int user = 0; user < 60; ++user) {
    for (const char *folder : kFolders) {
      const std::string home = text("/volume1/homes/user%02d/%s", user, folder);
      paths.push_back(home);
      for (auto file = random() % 40; file > 0; --file) {
        paths.push_back(home + text("/%s%u.%s", file % 3 == 0 ? "2023/report " : "note_",
                                    static_cast<unsigned>(random() % 500),
                                    kExtensions[random() % kExtensions.size()]));
      }
    }
    paths.push_back(text("/volume1/homes/user%02d/Desktop/Thumbs.db", user));
    paths.push_back(text("/volume1/homes/user%02d/.DS_Store", user));
  }
}

inline void addPhotos(std::vector<std::string> &paths) {
  for (int year = 2005; year < 2024; ++year) {
    for (int month = 1; month <= 12; ++month) {
      const std::string folder = text("/volume1/photo/%d/%02d", year, month);
      paths.push_back(folder);
      for (int shot = 0; shot < 20; ++shot) {
        paths.push_back(folder + text("/IMG_%04d.JPG", month * 100 + shot));
      }
    }
  }
}

inline void addProjects(std::vector<std::string> &paths) {
  for (int site = 0; site < 40; ++site) {
    const std::string root = text("/volume2/web/site%02d", site);
    paths.push_back(root);
    for (const char *package : kPackages) {
      for (const char *file : {"index.js", "package.json", "lib/util.js", "test/cache/x.tmp"}) {
        paths.push_back(root + "/node_modules/" + package + "/" + file);
      }
    }
    for (int object = 0; object < 30; ++object) {
      paths.push_back(root + text("/.git/objects/%02x/%010x", object * 7 % 256, object * 2654435));
    }
  }
}

/// Some 17,000 absolute paths.
inline std::vector<std::string> paths() {
  std::mt19937 random(7);
  std::vector<std::string> all;
  addHomes(all, random);
  addPhotos(all);
  addProjects(all);
  return all;
}

/// The ith pattern of a user's list: folders, suffixes, names and mixtures in turn. A few apply to
/// the tree, but most to files of other machines, as in lists that users share.
inline std::string pattern(int i) {
  const int n = i / 10;
  switch (i % 10) {
  case 0:
    return text("/volume1/homes/user%02d/%s/**", n % 600,
                kFolders[static_cast<std::size_t>(n) % 8]);
  case 1:
    return text("**.%s%d", kExtensions[static_cast<std::size_t>(n) % 12], n / 12);
  case 2:
    return n == 0 ? "**/node_modules/**" : text("**/build-%d/**", n);
  case 3:
    return n == 0 ? "**/Thumbs.db" : text("**/leftover.%d", n);
  case 4:
    return text("/volume1/photo/%d/%02d/IMG_%04d.JPG", 2005 + n % 19, 1 + n % 12, n);
  case 5:
    return text("/volume1/homes/*/Projects/p%d/**", n);
  case 6:
    return text("/volume2/web/site%02d/*.tmp", n);
  case 7:
    return text("/volume1/homes/*/Mail/note_%d.*", n);
  case 8:
    return text("**/cache-%d/*.tmp", n);
  default:
    return text("/volume%d/backup/host%d/**/core.?", 1 + n % 4, n);
  }
}

} // namespace KovaTest::Tree

#endif
