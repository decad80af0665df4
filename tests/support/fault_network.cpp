// The libc functions on sockets that a test may make fail. Weak, so that a test which needs another
// behaviour defines its own.

#include "tests/support/interpose.h"

#include <cstdarg>
#include <fcntl.h>
#include <netdb.h>
#include <sys/select.h>
#include <sys/socket.h>

extern "C" {

KOVA_INTERPOSE(int, getaddrinfo, EAI_SYSTEM,
               (const char *host, const char *service, const addrinfo *hints, addrinfo **list),
               (host, service, hints, list))
KOVA_INTERPOSE_NOTHROW(int, socket, -1, (int family, int type, int protocol),
                       (family, type, protocol))
KOVA_INTERPOSE(int, connect, -1, (int fd, const sockaddr *address, socklen_t size),
               (fd, address, size))
KOVA_INTERPOSE(int, select, -1,
               (int end, fd_set *read, fd_set *write, fd_set *except, timeval *limit),
               (end, read, write, except, limit))
KOVA_INTERPOSE_NOTHROW(int, getsockopt, -1,
                       (int fd, int level, int option, void *value, socklen_t *size),
                       (fd, level, option, value, size))
KOVA_INTERPOSE(ssize_t, send, -1, (int fd, const void *data, size_t size, int flags),
               (fd, data, size, flags))

// The third argument, if any, fits into a pointer; libc itself passes it on in the same way.
__attribute__((weak)) int fcntl(int fd, int command, ...) {
  static auto *const real = KovaTest::realFunction<int(int, int, ...)>("fcntl");
  va_list args;
  va_start(args, command);
  void *const argument = va_arg(args, void *);
  va_end(args);
  return KovaTest::failsNow("fcntl") ? -1 : real(fd, command, argument);
}
}
