#include "tools/kovabackup/facts/boot_health.h"

#include "kovabackup/path_util.h"
#include "tools/kovabackup/facts/folder_names.h"

#include <fmt/format.h>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace KOVA::Backup::Tool {
namespace {

// systemd creates this directory and no other program does, see sd_booted(3).
bool runsSystemd() {
  struct stat info = {};
  return ::lstat("/run/systemd/system", &info) == 0 && S_ISDIR(info.st_mode);
}

// Whether a file of tmpfiles.d(5) has a line that creates the directory: type, path and more.
bool createsRoot(const std::string &file) {
  std::ifstream text(file);
  for (std::string line; std::getline(text, line);) {
    std::istringstream words(line);
    std::string type;
    std::string path;
    if (words >> type >> path && type.find_first_of("dD") == 0 && path == Path::getIpcTempPath()) {
      return true;
    }
  }
  return false;
}

bool isEntry(const std::string &name) {
  static const std::string kSuffix = ".conf";
  return name.size() > kSuffix.size() &&
         name.compare(name.size() - kSuffix.size(), kSuffix.size(), kSuffix) == 0;
}

bool hasEntry() {
  for (const char *folder :
       {"/etc/tmpfiles.d", "/run/tmpfiles.d", "/usr/local/lib/tmpfiles.d", "/usr/lib/tmpfiles.d"}) {
    std::vector<std::string> names;
    (void)addNamesIn(folder, names); // most of these directories are optional
    for (const std::string &name : names) {
      if (isEntry(name) && createsRoot(Path::join(folder, name))) {
        return true;
      }
    }
  }
  return false;
}

Finding nothingCreates(const std::string &why, const std::string &hint) {
  return {Verdict::Remark, "boot",
          fmt::format("{}, so nothing creates {} at boot: the first user who needs it will own it",
                      why, Path::getIpcTempPath()),
          hint};
}

} // namespace

void checkBoot(Findings &findings) {
  const std::string root = Path::getIpcTempPath();
  if (!runsSystemd()) {
    findings.push_back(nothingCreates("this machine does not run systemd",
                                      fmt::format("run at boot: install -d -m 0755 {}", root)));
  } else if (!hasEntry()) {
    findings.push_back(nothingCreates(
        "tmpfiles.d(5) has no entry",
        fmt::format("add the line 'd {} 0755 root root -' to /etc/tmpfiles.d/kovabackup.conf",
                    root)));
  } else {
    findings.push_back({Verdict::Good, "boot", fmt::format("systemd creates {} at boot", root)});
  }
}

} // namespace KOVA::Backup::Tool
