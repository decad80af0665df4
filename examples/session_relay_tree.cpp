#include "examples/session_relay_tree.h"

#include "kovabackup/path_util.h"

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <vector>

namespace fs = std::filesystem;
namespace Path = KOVA::Backup::Path;

namespace {

// Calls visit for everything below a tree, with the path relative to the tree. Links are not
// followed.
template <typename Visit>
void walk(const std::string &tree, Visit visit) {
  for (const fs::directory_entry &entry : fs::recursive_directory_iterator(tree)) {
    visit(entry, Path::relative(entry.path().string(), tree));
  }
}

bool sameContent(const std::string &one, const std::string &other) {
  constexpr std::size_t kBlockBytes = 65536;
  std::ifstream first(one, std::ios::binary);
  std::ifstream second(other, std::ios::binary);
  std::vector<char> block(kBlockBytes);
  std::vector<char> otherBlock(kBlockBytes);
  while (first && second) {
    first.read(block.data(), static_cast<std::streamsize>(block.size()));
    second.read(otherBlock.data(), static_cast<std::streamsize>(otherBlock.size()));
    const auto count = first.gcount();
    if (count != second.gcount() ||
        !std::equal(block.begin(), block.begin() + count, otherBlock.begin())) {
      return false;
    }
  }
  return first.eof() && second.eof();
}

void requireSame(const fs::directory_entry &entry, const std::string &copy) {
  if (!fs::is_regular_file(fs::symlink_status(copy))) {
    throw std::runtime_error(copy + " is missing");
  }
  if (fs::file_size(copy) != entry.file_size()) {
    throw std::runtime_error(copy + " differs in size from " + entry.path().string());
  }
  if (!sameContent(entry.path().string(), copy)) {
    throw std::runtime_error(copy + " differs from " + entry.path().string());
  }
}

std::size_t countFiles(const std::string &tree) {
  std::size_t files = 0;
  walk(tree, [&](const fs::directory_entry &entry, const std::string &) {
    files += !entry.is_symlink() && entry.is_regular_file() ? 1U : 0U;
  });
  return files;
}

} // namespace

std::string readableSize(std::uintmax_t bytes) {
  const std::array<const char *, 5> units = {"bytes", "KiB", "MiB", "GiB", "TiB"};
  double size = static_cast<double>(bytes);
  std::size_t unit = 0;
  for (; size >= 1024 && unit + 1 < units.size(); ++unit) {
    size /= 1024;
  }
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), unit == 0 ? "%.0f %s" : "%.1f %s", size, units[unit]);
  return text.data();
}

std::string Tally::text() const {
  return std::to_string(files) + " files, " + readableSize(bytes);
}

Tally copyTree(const std::string &tree, const std::string &copy) {
  Tally tally;
  fs::create_directory(copy);
  walk(tree, [&](const fs::directory_entry &entry, const std::string &name) {
    const std::string target = Path::join(copy, name);
    if (entry.is_symlink()) {
      fs::copy_symlink(entry.path(), target);
    } else if (entry.is_directory()) {
      fs::create_directory(target);
    } else if (entry.is_regular_file()) {
      fs::copy_file(entry.path(), target);
      ++tally.files;
      tally.bytes += entry.file_size();
    }
  });
  return tally;
}

Tally compareTrees(const std::string &tree, const std::string &copy) {
  Tally tally;
  walk(tree, [&](const fs::directory_entry &entry, const std::string &name) {
    if (entry.is_symlink() || !entry.is_regular_file()) {
      return;
    }
    requireSame(entry, Path::join(copy, name));
    ++tally.files;
    tally.bytes += entry.file_size();
  });
  if (countFiles(copy) != tally.files) {
    throw std::runtime_error(copy + " holds more files than " + tree);
  }
  return tally;
}
