#include "tests/faults/calls.h"

#include <cerrno>
#include <fcntl.h>
#include <map>
#include <sys/mman.h>
#include <sys/syscall.h>

namespace KovaTest::Faults {
namespace {

using Table = std::map<long, Call>;

// ENOENT, ENOTDIR and EEXIST are left out everywhere: they say something about the disk, and the
// checks compare what the library reports with the disk.
Table fileCalls() {
  const std::vector<int> change = {EIO, EACCES, EROFS, ENOSPC};
  const std::vector<int> remove = {EIO, EACCES, EROFS, EBUSY};
  const std::vector<int> create = {ENOSPC, EACCES, EDQUOT, EROFS};
  const std::vector<int> attribute = {EPERM, EIO, EROFS};
  return {{SYS_rename, {"rename", change}},
          {SYS_renameat, {"renameat", change}},
          {SYS_renameat2, {"renameat2", change}},
          {SYS_link, {"link", create}},
          {SYS_linkat, {"linkat", create}},
          {SYS_symlink, {"symlink", create}},
          {SYS_symlinkat, {"symlinkat", create}},
          {SYS_unlink, {"unlink", remove}},
          {SYS_unlinkat, {"unlinkat", remove}},
          {SYS_rmdir, {"rmdir", remove}},
          {SYS_mkdir, {"mkdir", create}},
          {SYS_mkdirat, {"mkdirat", create}},
          {SYS_chmod, {"chmod", attribute}},
          {SYS_fchmod, {"fchmod", attribute}},
          {SYS_fchmodat, {"fchmodat", attribute}},
          {SYS_chown, {"chown", attribute}},
          {SYS_fchown, {"fchown", attribute}},
          {SYS_fchownat, {"fchownat", attribute}},
          {SYS_utime, {"utime", attribute}},
          {SYS_utimensat, {"utimensat", attribute}},
          {SYS_fsetxattr, {"fsetxattr", {ENOSPC, ENOTSUP, EPERM}}},
          {SYS_fgetxattr, {"fgetxattr", {EIO, ENOTSUP}}},
          {SYS_flistxattr, {"flistxattr", {EIO, ENOTSUP}}},
          {SYS_fremovexattr, {"fremovexattr", {EIO, EPERM}}}};
}

Table lookingCalls() {
  const std::vector<int> look = {EIO, EACCES, ENOMEM};
  return {{SYS_stat, {"stat", look}},
          {SYS_lstat, {"lstat", look}},
          {SYS_fstat, {"fstat", {EIO, ENOMEM}}},
          {SYS_newfstatat, {"newfstatat", look}},
          {SYS_statx, {"statx", look}},
          {SYS_statfs, {"statfs", {EIO, EACCES}}},
          {SYS_fstatfs, {"fstatfs", {EIO}}},
          {SYS_access, {"access", look}},
          {SYS_faccessat, {"faccessat", look}},
          {SYS_faccessat2, {"faccessat2", look}},
          {SYS_readlink, {"readlink", look}},
          {SYS_readlinkat, {"readlinkat", look}},
          {SYS_getdents64, {"getdents64", {EIO, ENOMEM}}},
          {SYS_getcwd, {"getcwd", {EACCES, ENOMEM}}},
          {SYS_chdir, {"chdir", {EACCES, EIO}}},
          {SYS_fchdir, {"fchdir", {EACCES, EIO}}},
          {SYS_lseek, {"lseek", {EIO}}}};
}

Table descriptorCalls() {
  const std::vector<int> open = {EMFILE, EACCES, EIO, ENOMEM, ENOSPC};
  const std::vector<int> number = {EMFILE, ENFILE, ENOMEM};
  return {{SYS_open, {"open", open, false, true}},
          {SYS_openat, {"openat", open, false, true}},
          {SYS_openat2, {"openat2", open, false, true}},
          {SYS_close, {"close", {EIO, EINTR, ENOSPC}}},
          {SYS_read, {"read", {EIO, ENOMEM}, true, true}},
          {SYS_pread64, {"pread64", {EIO}, true, true}},
          {SYS_write, {"write", {ENOSPC, EIO, EDQUOT}, true, true}},
          {SYS_pwrite64, {"pwrite64", {ENOSPC, EIO, EDQUOT}, true, true}},
          {SYS_writev, {"writev", {ENOSPC, EIO}, false, true}},
          {SYS_fsync, {"fsync", {EIO, ENOSPC, EDQUOT}}},
          {SYS_fdatasync, {"fdatasync", {EIO, ENOSPC}}},
          {SYS_ftruncate, {"ftruncate", {ENOSPC, EIO}, false, true}},
          {SYS_fallocate, {"fallocate", {ENOSPC, EOPNOTSUPP}, false, true}},
          {SYS_flock, {"flock", {ENOLCK, EIO}, false, true}},
          {SYS_fcntl, {"fcntl", {EMFILE, ENOLCK}}},
          {SYS_ioctl, {"ioctl", {EIO, ENOTTY}}},
          {SYS_dup, {"dup", number}},
          {SYS_dup2, {"dup2", {EBUSY, EMFILE}, false, true}},
          {SYS_dup3, {"dup3", {EBUSY, EMFILE}, false, true}},
          {SYS_pipe2, {"pipe2", number}},
          {SYS_memfd_create, {"memfd_create", number}},
          {SYS_eventfd2, {"eventfd2", number}},
          {SYS_timerfd_create, {"timerfd_create", number}},
          {SYS_signalfd4, {"signalfd4", number}},
          {SYS_epoll_create1, {"epoll_create1", number}}};
}

Table processCalls() {
  const std::vector<int> fork = {EAGAIN, ENOMEM};
  return {{SYS_fork, {"fork", fork}},
          {SYS_vfork, {"vfork", fork}},
          {SYS_clone, {"clone", fork}},
          {SYS_clone3, {"clone3", fork}},
          {SYS_execve, {"execve", {ENOMEM, EACCES, EIO}}},
          {SYS_pidfd_open, {"pidfd_open", {EMFILE, ENOMEM, ENOSYS}}},
          {SYS_wait4, {"wait4", {}, false, true}},
          {SYS_setsid, {"setsid", {EPERM}}},
          {SYS_setpgid, {"setpgid", {EPERM, EACCES}}},
          {SYS_prctl, {"prctl", {EINVAL}}},
          {SYS_poll, {"poll", {ENOMEM}, false, true}},
          {SYS_ppoll, {"ppoll", {ENOMEM}, false, true}},
          {SYS_pselect6, {"pselect6", {ENOMEM}, false, true}},
          {SYS_socket, {"socket", {EMFILE, ENOBUFS, EACCES}}},
          {SYS_connect, {"connect", {ECONNREFUSED, ETIMEDOUT, ENETUNREACH}}},
          {SYS_sendto, {"sendto", {ENOBUFS, ECONNRESET}, false, true}},
          {SYS_getrandom, {"getrandom", {}, false, true}},
          {SYS_mmap, {"mmap", {ENOMEM}}},
          {SYS_mremap, {"mremap", {ENOMEM}}},
          {SYS_brk, {"brk", {ENOMEM}}}};
}

Table makeTable() {
  Table table = fileCalls();
  table.merge(lookingCalls());
  table.merge(descriptorCalls());
  table.merge(processCalls());
  return table;
}

const Table &table() {
  static const Table calls = makeTable();
  return calls;
}

// Other commands of fcntl fail for a wrong descriptor only.
bool fcntlFails(std::uint64_t command) {
  return command == F_DUPFD || command == F_DUPFD_CLOEXEC || command == F_SETLK ||
         command == F_SETLKW || command == F_OFD_SETLK || command == F_OFD_SETLKW;
}

} // namespace

const Call *findCall(long number, const Arguments &arguments) {
  const auto found = table().find(number);
  const bool possible =
      (number != SYS_fcntl || fcntlFails(arguments[1])) && (number != SYS_brk || arguments[0] != 0);
  return found != table().end() && possible ? &found->second : nullptr;
}

const char *callName(long number) {
  if (number == kMemory) {
    return "memory";
  }
  const auto found = table().find(number);
  return found == table().end() ? "" : found->second.name;
}

} // namespace KovaTest::Faults
