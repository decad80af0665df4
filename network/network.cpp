#include "kovabackup/network.h"

#include "base/unique_fd.h"
#include "common/log.h"
#include "kovaplatform/kovanetsdk.h"

#include <cerrno>
#include <cstdio>
#include <cstring>
#include <fcntl.h>
#include <memory>
#include <netdb.h>
#include <sys/ioctl.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <syslog.h>
#include <vector>

namespace KOVA::Backup::Net {
namespace {

constexpr const char *kModule = "network/network";

constexpr int kConnected = 0;
constexpr int kFailed = -1;
constexpr int kTimedOut = -2;

struct FreeAddresses {
  void operator()(addrinfo *list) const { ::freeaddrinfo(list); }
};
using Addresses = std::unique_ptr<addrinfo, FreeAddresses>;

// A set for select(2) that is large enough for its descriptor. A plain fd_set ends at FD_SETSIZE,
// and writing past its end crashes a service that has a thousand open files.
class DescriptorSet {
public:
  explicit DescriptorSet(int fd)
      : part_(static_cast<std::size_t>(fd) / FD_SETSIZE), bit_(fd % FD_SETSIZE), parts_(part_ + 1) {
    FD_SET(bit_, &parts_[part_]);
  }

  fd_set *get() { return parts_.data(); }
  bool flagged() const { return FD_ISSET(bit_, &parts_[part_]); }

private:
  std::size_t part_;
  int bit_;
  std::vector<fd_set> parts_; // contiguous, so the kernel reads them as one bit field
};
static_assert(sizeof(fd_set) * 8 == FD_SETSIZE, "fd_set is nothing but its bits");

Addresses resolve(const char *host, int port) {
  // Nine digits and the NUL. A longer number is cut; no valid port has more than five digits.
  char portText[10];
  (void)std::snprintf(portText, sizeof portText, "%d", port);
  addrinfo hints{};
  hints.ai_socktype = SOCK_STREAM;
  addrinfo *list = nullptr;
  return Addresses(::getaddrinfo(host, portText, &hints, &list) == 0 ? list : nullptr);
}

bool makeNonBlocking(int fd) {
  const int flags = ::fcntl(fd, F_GETFL);
  return flags != -1 && ::fcntl(fd, F_SETFL, flags | O_NONBLOCK) != -1;
}

bool hasPendingError(int fd) {
  int error = 0;
  socklen_t size = sizeof error;
  return ::getsockopt(fd, SOL_SOCKET, SO_ERROR, &error, &size) != 0 || error != 0;
}

int waitForConnection(int fd, int timeoutSec) {
  DescriptorSet readable(fd);
  DescriptorSet writable(fd);
  DescriptorSet exceptional(fd);
  timeval limit{timeoutSec, 0};
  const int flagged = ::select(fd + 1, readable.get(), writable.get(), exceptional.get(), &limit);
  if (flagged == 0) {
    return kTimedOut;
  }
  if (flagged < 0 || !(readable.flagged() || writable.flagged()) || hasPendingError(fd)) {
    return kFailed;
  }
  // Peers recognise the probe by this byte. Whether it arrives makes no difference to the result. A
  // peer that has reset the connection meanwhile must not kill the caller by SIGPIPE.
  const char zero = '\0';
  (void)::send(fd, &zero, sizeof zero, MSG_NOSIGNAL);
  return kConnected;
}

int connectTo(int fd, const addrinfo &address, int timeoutSec) {
  if (!makeNonBlocking(fd)) {
    return kFailed;
  }
  if (::connect(fd, address.ai_addr, address.ai_addrlen) == 0) {
    return kConnected;
  }
  return errno == EINPROGRESS ? waitForConnection(fd, timeoutSec) : kFailed;
}

} // namespace

std::string getIpFromAddr(const std::string &addr) {
  if (::BlKLIBIsIpAddr(addr.c_str()) != 0 || ::BlKLIBIsv6IpAddrValid(addr.c_str()) != 0) {
    return addr;
  }
  char ip[KOVA_NET_IP_TEXT_BYTES] = {};
  if (::KOVANetLookupIP(addr.c_str(), ip, 1, 0) <= 0) {
    const PlatformError error = PlatformError::last();
    Log::error(kModule, 21, "lookup[%s]: [0x%04X %s:%d]", addr.c_str(), error.code, error.file,
               error.line);
    return "";
  }
  return std::string(ip, ::strnlen(ip, sizeof ip));
}

int testIpAndPortConnect(const char *host, int port, int timeout) {
  if (host == nullptr || port < 0 || timeout < 0) {
    Log::bare(LOG_ERR, kModule, 97, "bad parameter");
    return kFailed;
  }
  const Addresses addresses = resolve(host, port);
  if (!addresses) {
    return kFailed;
  }
  const Base::UniqueFd fd(
      ::socket(addresses->ai_family, addresses->ai_socktype, addresses->ai_protocol));
  if (!fd) {
    return kFailed;
  }
  // The socket is made with exactly the type that was resolved, so the flag is set afterwards. When
  // this fails, a program started meanwhile inherits the socket; the result is the same.
  (void)::ioctl(fd.get(), FIOCLEX);
  return connectTo(fd.get(), *addresses, timeout);
}

} // namespace KOVA::Backup::Net
