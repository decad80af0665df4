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
  // What is right already is not set: some file systems have one owner and one mode for all.
  const bool sameOwner = now.st_uid == from.st_uid && now.st_gid == from.st_gid;
  const bool sameMode = (now.st_mode & kModeBits) == (from.st_mode & kModeBits);
  if (!sameOwner && ::fchown(to, from.st_uid, from.st_gid) != 0) {
    return false;
  }
  // After the owner, whose change clears bits.
  return (sameOwner && sameMode) || ::fchmod(to, from.st_mode & kModeBits) == 0;
}

// Calls a function of the form (buffer, size) -> length, first to ask for the length.
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

bool listNames(int fd, std::vector<std::string> &names) {
  std::vector<char> list;
  if (!getSized([fd](char *buf, std::size_t size) { return ::flistxattr(fd, buf, size); }, list)) {
    return errno == ENOTSUP; // a file system that has none
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
  // A label that the new file already has may be one that only the system sets.
  const bool same = getSized(getFrom(to), present) && present == value;
  return same || ::fsetxattr(to, name.c_str(), value.data(), value.size(), 0) == 0;
}

// The directory's default list came with the making of the file.
bool dropAccessList(int fd) {
  if (::fgetxattr(fd, kAccessList, nullptr, 0) < 0) {
    return errno == ENODATA || errno == ENOTSUP;
  }
  return ::fremovexattr(fd, kAccessList) == 0;
}

} // namespace

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
