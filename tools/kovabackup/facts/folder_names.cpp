#include "tools/kovabackup/facts/folder_names.h"

#include <cerrno>
#include <dirent.h>
#include <memory>

namespace KOVA::Backup::Tool {
namespace {

struct DirCloser {
  void operator()(DIR *dir) const { (void)::closedir(dir); }
};

} // namespace

int addNamesIn(const std::string &folder, std::vector<std::string> &names) {
  const std::unique_ptr<DIR, DirCloser> dir(::opendir(folder.c_str()));
  if (!dir) {
    return errno;
  }
  for (;;) {
    errno = 0;
    const dirent *entry = ::readdir(dir.get());
    if (entry == nullptr) {
      return errno; // 0 at the end
    }
    const std::string name = entry->d_name;
    if (name != "." && name != "..") {
      names.push_back(name);
    }
  }
}

} // namespace KOVA::Backup::Tool
