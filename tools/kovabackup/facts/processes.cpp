#include "tools/kovabackup/facts/processes.h"

#include "tools/kovabackup/facts/directory.h"
#include "tools/kovabackup/frame/text.h"

#include <array>
#include <climits>
#include <cstdlib>
#include <fmt/format.h>
#include <fstream>
#include <memory>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

// A plain prefix is not enough: /a/bc is not below /a/b.
bool isWithin(const std::string &path, const std::string &folder) {
  return path.compare(0, folder.size(), folder) == 0 &&
         (path.size() == folder.size() || path[folder.size()] == '/');
}

} // namespace

std::string commandOf(pid_t pid) {
  std::ifstream in(fmt::format("/proc/{}/comm", pid));
  std::string name;
  std::getline(in, name);
  return name;
}

OpenPaths::OpenPaths() {
  const Directory proc = openDirectory("/proc");
  while (const dirent *entry = proc ? ::readdir(proc.get()) : nullptr) {
    const auto pid = parseNumber(entry->d_name, 1, INT_MAX);
    if (pid && *pid != ::getpid()) {
      look(static_cast<pid_t>(*pid));
    }
  }
}

void OpenPaths::look(pid_t pid) {
  const std::string folder = fmt::format("/proc/{}/", pid);
  add(pid, folder + "cwd");
  add(pid, folder + "root");
  const Directory descriptors = openDirectory(folder + "fd");
  while (const dirent *entry = descriptors ? ::readdir(descriptors.get()) : nullptr) {
    add(pid, folder + "fd/" + entry->d_name);
  }
}

// Pipes and sockets have names that do not begin with a slash, and "/" itself is in no directory. A
// process may end, or belong to another user, at any moment: a link that cannot be read is skipped.
void OpenPaths::add(pid_t pid, const std::string &link) {
  std::array<char, PATH_MAX> target{};
  const ssize_t length = ::readlink(link.c_str(), target.data(), target.size());
  if (length > 1 && target[0] == '/') {
    uses_.push_back({std::string(target.data(), static_cast<std::size_t>(length)), pid});
  }
}

std::vector<Process> OpenPaths::usersOf(const std::string &folder) const {
  // The kernel reports paths without links, so the directory must be compared in that form.
  const std::unique_ptr<char, void (*)(void *)> real(::realpath(folder.c_str(), nullptr),
                                                     &std::free);
  std::vector<Process> users;
  for (const Use &use : uses_) { // all uses of one process are adjacent
    const bool listed = !users.empty() && users.back().pid == use.pid;
    if (real && !listed && isWithin(use.path, real.get())) {
      users.push_back({use.pid, commandOf(use.pid)});
    }
  }
  return users;
}

} // namespace KOVA::Backup::Tool
