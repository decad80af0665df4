#ifndef KOVABACKUP_TESTS_LOOPBACK_H
#define KOVABACKUP_TESTS_LOOPBACK_H

/// @file Peers of the probe on the loopback interface.

#include "base/unique_fd.h"

#include <cstdint>
#include <cstdlib>
#include <cstring>
#include <gtest/gtest.h>
#include <netdb.h>
#include <netinet/in.h>
#include <new>
#include <poll.h>
#include <string>
#include <sys/socket.h>
#include <sys/time.h>

namespace KovaTest {

using KOVA::Base::UniqueFd;

/// A TCP socket on a free port of 127.0.0.1 or ::1. It is bound but does not listen, so the port
/// refuses connections.
class LoopbackPort {
public:
  explicit LoopbackPort(int family = AF_INET)
      : fd_(::socket(family, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_storage address{};
    address.ss_family = static_cast<sa_family_t>(family);
    auto *const in4 = reinterpret_cast<sockaddr_in *>(&address);
    auto *const in6 = reinterpret_cast<sockaddr_in6 *>(&address);
    if (family == AF_INET) {
      in4->sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    } else {
      in6->sin6_addr = in6addr_loopback;
    }
    socklen_t size = sizeof address;
    auto *const general = reinterpret_cast<sockaddr *>(&address);
    usable_ = fd_ && ::bind(fd_.get(), general, size) == 0 &&
              ::getsockname(fd_.get(), general, &size) == 0;
    port_ = ntohs(family == AF_INET ? in4->sin_port : in6->sin6_port);
  }

  bool usable() const { return usable_; }
  int port() const { return port_; }
  int fd() const { return fd_.get(); }

  /// Starts to listen, so that the kernel accepts connections.
  void listen(int backlog = 8) { ASSERT_EQ(0, ::listen(fd_.get(), backlog)); }

  /// The next connection; invalid when none arrives within ten seconds.
  UniqueFd accept() const {
    pollfd waiting{fd_.get(), POLLIN, 0};
    if (::poll(&waiting, 1, 10000) != 1) {
      return UniqueFd();
    }
    return UniqueFd(::accept4(fd_.get(), nullptr, nullptr, SOCK_CLOEXEC));
  }

  /// Whether a connection waits to be accepted.
  bool hasConnection() const {
    pollfd waiting{fd_.get(), POLLIN, 0};
    return ::poll(&waiting, 1, 0) == 1;
  }

private:
  UniqueFd fd_;
  bool usable_ = false;
  int port_ = 0;
};

/// Everything that a peer sends until it closes the connection.
inline std::string readAll(const UniqueFd &peer) {
  const timeval generous{10, 0};
  EXPECT_EQ(0, ::setsockopt(peer.get(), SOL_SOCKET, SO_RCVTIMEO, &generous, sizeof generous));
  std::string all;
  char buffer[16];
  ssize_t got = 0;
  while ((got = ::recv(peer.get(), buffer, sizeof buffer, 0)) > 0) {
    all.append(buffer, static_cast<std::size_t>(got));
  }
  EXPECT_EQ(0, got) << "the peer did not close";
  return all;
}

/// A list entry as getaddrinfo allocates it; a single free releases it.
template <typename Address>
addrinfo *makeEntry(int family, int type, int protocol, const Address &address) {
  void *const memory = std::malloc(sizeof(addrinfo) + sizeof address);
  auto *const entry = new (memory) addrinfo{};
  entry->ai_family = family;
  entry->ai_socktype = type;
  entry->ai_protocol = protocol;
  entry->ai_addrlen = sizeof address;
  std::memcpy(entry + 1, &address, sizeof address);
  entry->ai_addr = reinterpret_cast<sockaddr *>(entry + 1);
  return entry;
}

/// The entry of a port over IPv4.
inline addrinfo *entryFor(const LoopbackPort &port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_port = htons(static_cast<std::uint16_t>(port.port()));
  address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
  return makeEntry(AF_INET, SOCK_STREAM, IPPROTO_TCP, address);
}

} // namespace KovaTest

#endif
