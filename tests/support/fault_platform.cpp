// More libc functions on files, used by the stand-ins. Weak, like the others.

#include "tests/support/interpose.h"

#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

extern "C" {
KOVA_INTERPOSE(ssize_t, write, -1, (int fd, const void *buf, size_t size), (fd, buf, size))
KOVA_INTERPOSE_NOTHROW(int, fstatat, -1, (int dir, const char *path, struct stat *out, int flags),
                       (dir, path, out, flags))
KOVA_INTERPOSE_NOTHROW(ssize_t, readlinkat, -1, (int dir, const char *path, char *buf, size_t size),
                       (dir, path, buf, size))
KOVA_INTERPOSE_NOTHROW(ssize_t, flistxattr, -1, (int fd, char *list, size_t size), (fd, list, size))
KOVA_INTERPOSE_NOTHROW(ssize_t, fgetxattr, -1, (int fd, const char *name, void *value, size_t size),
                       (fd, name, value, size))
KOVA_INTERPOSE_NOTHROW(int, fsetxattr, -1,
                       (int fd, const char *name, const void *value, size_t size, int flags),
                       (fd, name, value, size, flags))
KOVA_INTERPOSE_NOTHROW(int, fremovexattr, -1, (int fd, const char *name), (fd, name))
}
