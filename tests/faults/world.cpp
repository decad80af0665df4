#include "tests/faults/world.h"

#include "tests/support/private_tmp.h"

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <ftw.h>
#include <mntent.h>
#include <sched.h>
#include <sstream>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

namespace fs = std::filesystem;

constexpr const char *kConfiguration = "/tmp/platform.conf";

// The mount points of the machine, as a JSON list, so that none of its volumes is used.
std::string machineMounts() {
  std::string list;
  std::FILE *const table = ::setmntent("/proc/self/mounts", "re");
  while (const mntent *entry = table != nullptr ? ::getmntent(table) : nullptr) {
    list += (list.empty() ? "\"" : ",\"") + std::string(entry->mnt_dir) + "\"";
  }
  if (table != nullptr) {
    ::endmntent(table);
  }
  return "[" + list + "]";
}

std::string &configuration() {
  static std::string text;
  return text;
}

bool holds(const std::string &folder, const std::string &path) {
  return path.rfind(folder + "/", 0) == 0;
}

// A folder that can be hidden, because neither the sources nor the programs are in it; "" when
// there is none.
std::string unusedFolder() {
  for (const std::string folder : {"/mnt", "/opt", "/srv", "/media"}) {
    if (fs::is_directory(folder) && !holds(folder, KOVA_TEST_SOURCE_DIR) &&
        !holds(folder, KOVA_TEST_BINARY_DIR)) {
      return folder;
    }
  }
  return "";
}

std::string mountVolume() {
  if (volume().empty()) {
    return "there is no folder on which a volume could be mounted";
  }
  if (::mount("tmpfs", volume().c_str(), "tmpfs", 0, "mode=1777") != 0) {
    return "a tmpfs cannot be mounted on " + volume() + ": " + std::strerror(errno);
  }
  return "";
}

// What is mounted belongs to the machine, such as a source tree below /tmp.
bool isMountPoint(const std::string &path, const std::string &folder) {
  struct stat own = {};
  struct stat above = {};
  return ::lstat(path.c_str(), &own) != 0 || ::lstat(folder.c_str(), &above) != 0 ||
         own.st_dev != above.st_dev;
}

int removeBelow(const char *path, const struct stat * /*info*/, int /*type*/, FTW *at) {
  if (at->level > 0) {
    (void)std::remove(path); // fails for a folder that leads to a mount point
  }
  return 0;
}

// What is mounted in the folder is not entered: it belongs to the machine.
void emptyFolder(const std::string &folder) {
  constexpr int kOpenFolders = 20;
  (void)::nftw(folder.c_str(), removeBelow, kOpenFolders, FTW_PHYS | FTW_MOUNT | FTW_DEPTH);
}

std::string describe(const fs::path &path) {
  std::error_code ignored;
  const fs::file_status status = fs::symlink_status(path, ignored);
  if (fs::is_symlink(status)) {
    return "-> " + fs::read_symlink(path, ignored).string();
  }
  if (!fs::is_regular_file(status)) {
    return "";
  }
  std::ifstream in(path, std::ios::binary);
  std::ostringstream content;
  content << in.rdbuf();
  return content.str();
}

void readFolder(const std::string &folder, std::map<std::string, std::string> &disk) {
  for (const fs::directory_entry &entry : fs::directory_iterator(folder)) {
    const std::string path = entry.path().string();
    if (isMountPoint(path, folder) || path == kConfiguration) {
      continue;
    }
    if (path != kWork) {
      disk[path] = describe(entry.path());
    }
    if (entry.is_directory() && !entry.is_symlink()) {
      readFolder(path, disk);
    }
  }
}

} // namespace

const std::string &volume() {
  static const std::string path = unusedFolder();
  return path;
}

std::string enterWorld() {
  const std::string mounts = machineMounts();
  std::string why = enterPrivateTmp();
  if (why.empty()) {
    why = mountVolume();
  }
  if (!why.empty()) {
    return why;
  }
  configuration() = "[mounts]\nexclude=" + mounts + "\n[volume v1]\npath=\"" + volume() +
                    "\"\nfsType=2\n[secret]\nkeyFile=\"" + kKeyFile + "\"\n";
  ::setenv("KOVA_PLATFORM_CONF", kConfiguration, 1);
  ::umask(022);
  // Root's /proc of the processes here only, so that a look for users of a session is short and
  // the same each time. Where it cannot be mounted, that of the machine serves.
  (void)::mount("proc", "/proc", "proc", 0, nullptr);
  return "";
}

void resetWorld() {
  emptyFolder("/tmp");
  emptyFolder(volume());
  std::ofstream(kConfiguration) << configuration() << std::flush;
  ::chmod(kConfiguration, 0644);
  ::mkdir(kWork, 0755);
}

std::map<std::string, std::string> readWorld() {
  std::map<std::string, std::string> disk;
  readFolder("/tmp", disk);
  readFolder(volume(), disk);
  return disk;
}

} // namespace KovaTest::Faults
