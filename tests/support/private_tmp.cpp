#include "tests/support/private_tmp.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <sched.h>
#include <sys/mount.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace KovaTest {
namespace {

std::string failure(const std::string &what) {
  return what + ": " + std::strerror(errno);
}

bool writeText(const char *path, const std::string &text) {
  std::ofstream out(path);
  out << text << std::flush;
  return out.good();
}

std::string unshareMounts() {
  if (::geteuid() == 0) {
    return ::unshare(CLONE_NEWNS) == 0 ? "" : failure("unshare(CLONE_NEWNS)");
  }
  const unsigned uid = ::geteuid();
  const unsigned gid = ::getegid();
  if (::unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) {
    return failure("unshare(CLONE_NEWUSER | CLONE_NEWNS)");
  }
  if (!writeText("/proc/self/setgroups", "deny") ||
      !writeText("/proc/self/uid_map", "0 " + std::to_string(uid) + " 1") ||
      !writeText("/proc/self/gid_map", "0 " + std::to_string(gid) + " 1")) {
    return failure("mapping the user into its namespace");
  }
  return "";
}

// Handles of the trees under /tmp that must stay reachable below the new /tmp, with their paths.
using Trees = std::vector<std::pair<int, std::string>>;

Trees openTreesUnderTmp() {
  Trees trees;
  for (const std::string path : {KOVA_TEST_SOURCE_DIR, KOVA_TEST_BINARY_DIR}) {
    if (path.rfind("/tmp/", 0) == 0) {
      trees.emplace_back(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC), path);
    }
  }
  return trees;
}

std::string bindBack(const Trees &trees) {
  for (const auto &[fd, path] : trees) {
    const std::string from = "/proc/self/fd/" + std::to_string(fd);
    std::error_code ignored;
    std::filesystem::create_directories(path, ignored);
    if (::mount(from.c_str(), path.c_str(), "none", MS_BIND | MS_REC, nullptr) != 0) {
      return failure("binding " + path);
    }
    ::close(fd);
  }
  return "";
}

} // namespace

std::string enterPrivateTmp() {
  const std::string unshared = unshareMounts();
  if (!unshared.empty()) {
    return unshared;
  }
  if (::mount("none", "/", "none", MS_REC | MS_PRIVATE, nullptr) != 0) {
    return failure("making the mounts private");
  }
  const Trees trees = openTreesUnderTmp();
  const std::string cwd = std::filesystem::current_path().string();
  if (::mount("tmpfs", "/tmp", "tmpfs", 0, "mode=1777") != 0) {
    return failure("mounting a tmpfs on /tmp");
  }
  const std::string bound = bindBack(trees);
  // A working directory under the old /tmp would still refer to it.
  if (bound.empty() && ::chdir(cwd.c_str()) != 0 && ::chdir("/") != 0) {
    return failure("changing to /");
  }
  return bound;
}

} // namespace KovaTest
