#include "platform/core/file_attributes.h"

#include <cerrno>
#include <cstring>
#include <string>
#include <sys/xattr.h>
#include <unistd.h>
#include <vector>

namespace KovaPlatform {
namespace {

constexpr const char *kAccessList = "system.posix_acl_access";
constexpr mode_t kModeBits = 07777;

bool copyOwnerAndMode(const struct stat &from, int to) {
  struct stat now {};
  if (::fstat(to, &now) != 0) {
    return false;
  }
  // Only differences are set: where a mount option decides owner and mode for all files, setting
  // them fails even when nothing would change.
  const bool sameOwner = now.st_uid == from.st_uid && now.st_gid == from.st_gid;
  const bool sameMode = (now.st_mode & kModeBits) == (from.st_mode & kModeBits);
  if (!sameOwner && ::fchown(to, from.st_uid, from.st_gid) != 0) {
    return false;
  }
  // After the owner, because fchown clears the set-user-ID and set-group-ID bits.
  return (sameOwner && sameMode) || ::fchmod(to, from.st_mode & kModeBits) == 0;
}

// Calls get(buffer, size), which returns a length: first for the length, then for the data. Data
// that grow in between fail with ERANGE; the attributes of a file that is being replaced rarely do.
template <typename Get>
bool getSized(Get get, std::vector<char> &out) {
  const ssize_t size = get(nullptr, 0);
  if (size < 0) {
    return false;
  }
  out.resize(static_cast<std::size_t>(size));
  const ssize_t got = size == 0 ? 0 : get(out.data(), out.size());
  if (got >= 0) {
    out.resize(static_cast<std::size_t>(got));
  }
  return got >= 0;
}

// Lists the names that the caller may see; those in "trusted." take privilege.
bool listNames(int fd, std::vector<std::string> &names) {
  std::vector<char> list;
  if (!getSized([fd](char *buf, std::size_t size) { return ::flistxattr(fd, buf, size); }, list)) {
    return errno == ENOTSUP; // a file system without attributes
  }
  for (std::size_t at = 0; at < list.size(); at += names.back().size() + 1) {
    names.emplace_back(&list[at]);
  }
  return true;
}

bool isMeasurement(const std::string &name) {
  return name == "security.ima" || name == "security.evm";
}

bool copyOne(int from, int to, const std::string &name) {
  std::vector<char> value;
  std::vector<char> present;
  const auto getFrom = [&](int fd) {
    return [fd, &name](char *buf, std::size_t size) {
      return ::fgetxattr(fd, name.c_str(), buf, size);
    };
  };
  if (!getSized(getFrom(from), value)) {
    return false;
  }
  // A security label that the new file already has may be one that only the system may set.
  const bool same = getSized(getFrom(to), present) && present == value;
  return same || ::fsetxattr(to, name.c_str(), value.data(), value.size(), 0) == 0;
}

// A new file inherits the default list of its directory. An old file without a list must not come
// back with one: it could open the file to further users.
bool dropAccessList(int fd) {
  if (::fgetxattr(fd, kAccessList, nullptr, 0) < 0) {
    return errno == ENODATA || errno == ENOTSUP;
  }
  return ::fremovexattr(fd, kAccessList) == 0;
}

} // namespace

// Owner and mode come first. A change of owner drops file capabilities, and a change of mode
// rewrites the mask of an access control list; both are attributes, which are therefore set last.
bool copyAttributes(const RegularFile &from, int to) {
  std::vector<std::string> names;
  if (!copyOwnerAndMode(from.status, to) || !listNames(from.fd.get(), names)) {
    return false;
  }
  bool hasAccessList = false;
  for (const std::string &name : names) {
    hasAccessList = hasAccessList || name == kAccessList;
    if (!isMeasurement(name) && !copyOne(from.fd.get(), to, name)) {
      return false;
    }
  }
  return hasAccessList || dropAccessList(to);
}

} // namespace KovaPlatform
