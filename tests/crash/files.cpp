#include "tests/crash/files.h"

#include "base/unique_fd.h"

#include <algorithm>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <unistd.h>

namespace KovaTest::Crash {

namespace fs = std::filesystem;

void mustHold(bool condition, const std::string &what) {
  if (!condition) {
    throw std::runtime_error(what + " failed");
  }
}

std::string makeFolder(const std::string &path) {
  fs::create_directories(path);
  const KOVA::Base::UniqueFd folder(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  mustHold(folder && ::syncfs(folder.get()) == 0, "syncing " + path);
  return path;
}

std::vector<std::string> namesIn(const std::string &folder) {
  std::vector<std::string> names;
  std::error_code ignored;
  for (const fs::directory_entry &entry : fs::directory_iterator(folder, ignored)) {
    names.push_back(entry.path().filename().string());
  }
  std::sort(names.begin(), names.end());
  return names;
}

std::string contentOf(const std::string &path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream content;
  content << in.rdbuf();
  return content.str();
}

std::string leftovers(const std::string &path) {
  std::string found;
  for (const std::string &name : namesIn(fs::path(path).parent_path().string())) {
    found += name.front() == '.' && name != ".kova_tmp" ? name + " " : "";
  }
  return found;
}

std::string differing(const std::string &what, const Progress &progress, int found) {
  return what + ": " + std::to_string(found) + " on the disk, " + std::to_string(progress.kept) +
         " kept, " + std::to_string(progress.attempted) + " attempted";
}

} // namespace KovaTest::Crash
