#include "platform/sdk/mounts.h"

#include <libmount.h>
#include <memory>
#include <utility>

namespace KovaPlatform {
namespace {

struct LibmountDeleter {
  void operator()(libmnt_table *table) const { ::mnt_unref_table(table); }
  void operator()(libmnt_iter *iterator) const { ::mnt_free_iter(iterator); }
};

// libmount returns null for a field that the table does not have.
std::string orEmpty(const char *text) {
  return text != nullptr ? text : "";
}

Mount toMount(libmnt_fs *entry) {
  Mount mount;
  mount.id = ::mnt_fs_get_id(entry);
  mount.device = ::mnt_fs_get_devno(entry);
  mount.root = orEmpty(::mnt_fs_get_root(entry));
  mount.target = orEmpty(::mnt_fs_get_target(entry));
  mount.fsType = orEmpty(::mnt_fs_get_fstype(entry));
  mount.source = orEmpty(::mnt_fs_get_source(entry));
  return mount;
}

} // namespace

// Parsed by libmount and not by hand, because it decodes the escapes and skips the optional fields.
// Callers pass mountinfo and not mounts, because mounts lists neither ids nor roots.
bool readMounts(const char *path, std::vector<Mount> &mounts) {
  const std::unique_ptr<libmnt_table, LibmountDeleter> table(::mnt_new_table());
  const std::unique_ptr<libmnt_iter, LibmountDeleter> iterator(::mnt_new_iter(MNT_ITER_FORWARD));
  if (!table || !iterator || ::mnt_table_parse_file(table.get(), path) != 0) {
    return false;
  }
  std::vector<Mount> found;
  libmnt_fs *entry = nullptr;
  while (::mnt_table_next_fs(table.get(), iterator.get(), &entry) == 0) {
    found.push_back(toMount(entry));
  }
  mounts = std::move(found);
  return true;
}

bool isWithin(const std::string &dir, const std::string &path) {
  return dir == "/" || path == dir ||
         (path.size() > dir.size() && path[dir.size()] == '/' &&
          path.compare(0, dir.size(), dir) == 0);
}

std::string below(const std::string &dir, const std::string &path) {
  const std::size_t skip = dir == "/" ? 1 : dir.size() + 1;
  return path.size() > skip ? path.substr(skip) : "";
}

std::string joined(const std::string &dir, const std::string &name) {
  if (name.empty()) {
    return dir;
  }
  return dir == "/" ? dir + name : dir + "/" + name;
}

} // namespace KovaPlatform
