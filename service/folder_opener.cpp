#include "service/folder_opener.h"

#include "base/retry_on_eintr.h"

#include <cerrno>
#include <cstddef>
#include <fcntl.h>
#include <linux/openat2.h>
#include <sys/syscall.h>
#include <unistd.h>
#include <utility>

namespace KOVA::Backup::Service {
namespace {

using Base::UniqueFd;

Failed openInOneCall(int folder, const std::string &path, int access, FolderOpener::Mount mount,
                     UniqueFd &opened) {
  open_how how = {};
  how.flags = static_cast<unsigned>(access | O_DIRECTORY | O_CLOEXEC);
  how.resolve = RESOLVE_BENEATH | RESOLVE_NO_SYMLINKS;
  if (mount == FolderOpener::Mount::Same) {
    how.resolve |= RESOLVE_NO_XDEV;
  }
  opened.reset(static_cast<int>(Base::retryOnEintr(
      [&] { return ::syscall(SYS_openat2, folder, path.c_str(), &how, sizeof how); })));
  return {"openat2", opened ? 0 : errno};
}

// Failed::code is ENOSYS when the kernel gives no ids of mounts.
Failed compareMounts(int one, int other) {
  struct statx first = {};
  struct statx second = {};
  Failed failed = statEntry(one, "", first);
  if (!failed) {
    failed = statEntry(other, "", second);
  }
  if (failed) {
    return failed;
  }
  if ((first.stx_mask & second.stx_mask & STATX_MNT_ID) == 0) {
    return {"statx", ENOSYS};
  }
  return {"openat", first.stx_mnt_id == second.stx_mnt_id ? 0 : EXDEV};
}

Failed openName(int folder, const std::string &name, int access, FolderOpener::Mount mount,
                UniqueFd &opened) {
  const int flags = access | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC;
  UniqueFd fd(Base::retryOnEintr([&] { return ::openat(folder, name.c_str(), flags); }));
  if (!fd) {
    return {"openat", errno};
  }
  if (mount == FolderOpener::Mount::Same) {
    const Failed failed = compareMounts(folder, fd.get());
    if (failed) {
      return failed;
    }
  }
  opened = std::move(fd);
  return {};
}

Failed openStepwise(int folder, const std::string &path, int access, FolderOpener::Mount mount,
                    UniqueFd &opened) {
  UniqueFd above;
  for (std::size_t start = 0;;) {
    const std::size_t slash = path.find('/', start);
    const bool last = slash == std::string::npos;
    const int from = above ? above.get() : folder;
    const std::string name = path.substr(start, last ? slash : slash - start);
    const Failed failed =
        openName(from, name, last ? access : O_PATH, mount, last ? opened : above);
    if (failed || last) {
      return failed;
    }
    start = slash + 1;
  }
}

} // namespace

Failed FolderOpener::open(int folder, const std::string &path, int access, Mount mount,
                          Base::UniqueFd &opened) {
  if (!stepwise_) {
    const Failed failed = openInOneCall(folder, path, access, mount, opened);
    if (failed.code != ENOSYS && failed.code != EPERM) {
      return failed;
    }
  }
  const Failed failed = openStepwise(folder, path, access, mount, opened);
  stepwise_ = stepwise_ || !failed;
  return failed;
}

} // namespace KOVA::Backup::Service
