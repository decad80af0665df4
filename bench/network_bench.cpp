// The probe of a listener on this machine, raced against the bare calls of the same steps.
//
// A child process accepts the connections and resets them, so that no closed connection occupies a
// port of this process. Its time does not count, because it ends after the race.

#include "kovabackup/network.h"

#include "bench/race.h"

#include <arpa/inet.h>
#include <benchmark/benchmark.h>
#include <csignal>
#include <fcntl.h>
#include <memory>
#include <netdb.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

namespace {

using KOVA::Backup::Net::testIpAndPortConnect;
using KovaBench::Race;
using KovaBench::rounds;

constexpr const char *kHost = "127.0.0.1";

class Socket {
public:
  explicit Socket(int fd) : fd_(fd) {}
  ~Socket() { ::close(fd_); }
  Socket(const Socket &) = delete;
  Socket &operator=(const Socket &) = delete;

  int get() const { return fd_; }

private:
  int fd_;
};

[[noreturn]] void resetAll(int listener) {
  const linger reset = {1, 0};
  for (;;) {
    const Socket connection(::accept(listener, nullptr, nullptr));
    char byte = 0;
    while (::recv(connection.get(), &byte, 1, 0) > 0) {
      // up to the end of the probe; an earlier reset would make it fail
    }
    (void)::setsockopt(connection.get(), SOL_SOCKET, SO_LINGER, &reset, sizeof reset);
  }
}

// Listens on a free port for as long as it lives.
class Listener {
public:
  Listener() : socket_(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_in address = {};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = ::htonl(INADDR_LOOPBACK);
    socklen_t size = sizeof address;
    auto *const plain = reinterpret_cast<sockaddr *>(&address);
    if (::bind(socket_.get(), plain, size) == 0 && ::listen(socket_.get(), SOMAXCONN) == 0 &&
        ::getsockname(socket_.get(), plain, &size) == 0) {
      port_ = ::ntohs(address.sin_port);
      child_ = ::fork();
    }
    if (child_ == 0) {
      resetAll(socket_.get());
    }
  }
  ~Listener() {
    if (child_ > 0) {
      (void)::kill(child_, SIGKILL);
      (void)::waitpid(child_, nullptr, 0);
    }
  }
  Listener(const Listener &) = delete;
  Listener &operator=(const Listener &) = delete;

  int port() const { return port_; } // 0 when it could not be made

private:
  Socket socket_;
  int port_ = 0;
  pid_t child_ = -1;
};

bool waitsForConnection(int fd) {
  pollfd writable = {fd, POLLOUT, 0};
  int error = -1;
  socklen_t size = sizeof error;
  return ::poll(&writable, 1, 1000) == 1 &&
         ::getsockopt(fd, SOL_SOCKET, SO_ERROR, &error, &size) == 0 && error == 0 &&
         ::send(fd, "", 1, MSG_NOSIGNAL) == 1;
}

bool probesAddress(const addrinfo &address) {
  const Socket fd(::socket(address.ai_family, address.ai_socktype, address.ai_protocol));
  const int flags = ::fcntl(fd.get(), F_GETFL);
  (void)::fcntl(fd.get(), F_SETFL, flags | O_NONBLOCK);
  return ::connect(fd.get(), address.ai_addr, address.ai_addrlen) == 0 ||
         (errno == EINPROGRESS && waitsForConnection(fd.get()));
}

bool probesBare(const std::string &port) {
  addrinfo hints = {};
  hints.ai_socktype = SOCK_STREAM;
  addrinfo *found = nullptr;
  if (::getaddrinfo(kHost, port.c_str(), &hints, &found) != 0) {
    return false;
  }
  const std::unique_ptr<addrinfo, decltype(&::freeaddrinfo)> list(found, &::freeaddrinfo);
  return probesAddress(*list);
}

void probe(benchmark::State &state) {
  const Listener listener;
  const std::string port = std::to_string(listener.port());
  Race(state, [&] { return testIpAndPortConnect(kHost, listener.port(), 1) == 0; })
      .peer(
          "bare_calls", [&] { return probesBare(port); }, 1.05)
      .slice(0.02)
      .run();
}
BENCHMARK(probe)->Apply(rounds);

} // namespace
