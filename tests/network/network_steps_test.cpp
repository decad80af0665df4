// The steps of a probe, one by one. The libc functions are replaced by ones that record their
// arguments and return what the test chooses.

#include "kovabackup/network.h"

#include "tests/network/loopback.h"
#include "tests/support/fault.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdarg>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <functional>
#include <gmock/gmock.h>
#include <netdb.h>
#include <sys/un.h>
#include <utility>
#include <vector>

using namespace KovaTest;
using KOVA::Backup::Net::testIpAndPortConnect;
using testing::ElementsAre;

namespace {

// What the replaced functions below do and record during the lifetime of such an object.
struct Steps {
  Steps();
  ~Steps();
  Steps(const Steps &) = delete;
  Steps &operator=(const Steps &) = delete;

  std::vector<std::string> order;
  std::function<int(addrinfo **)> lookup; // in place of getaddrinfo
  std::function<int(int, fd_set *, fd_set *, fd_set *)> wait;
  std::function<int(int *)> pendingError;
  std::function<void()> beforeSend;

  std::string host, service;
  addrinfo hints{};
  std::vector<int> socketArguments;
  int socketFlags = 0; // the initial flags of the socket
  int probe = -1;      // the probe's socket
  int flagsAtConnect = 0, descriptorFlagsAtConnect = 0;
  timeval selectLimit{};
  std::string sent;
  int sendFlags = 0;
};

Steps *steps = nullptr;

Steps::Steps() {
  steps = this;
}
Steps::~Steps() {
  steps = nullptr;
}

void note(const std::string &what) {
  if (steps != nullptr) {
    steps->order.push_back(what);
  }
}

} // namespace

extern "C" {

int getaddrinfo(const char *host, const char *service, const addrinfo *hints, addrinfo **list) {
  static auto *const real = realFunction<decltype(getaddrinfo)>("getaddrinfo");
  note("getaddrinfo");
  if (steps == nullptr) {
    return real(host, service, hints, list);
  }
  steps->host = host;
  steps->service = service;
  steps->hints = *hints;
  return steps->lookup ? steps->lookup(list) : real(host, service, hints, list);
}

// The lists of these tests consist of single entries from malloc.
void freeaddrinfo(addrinfo *list) noexcept {
  static auto *const real = realFunction<void(addrinfo *)>("freeaddrinfo");
  note("freeaddrinfo");
  if (steps == nullptr || !steps->lookup) {
    real(list);
    return;
  }
  while (list != nullptr) {
    std::free(std::exchange(list, list->ai_next));
  }
}

int socket(int family, int type, int protocol) noexcept {
  static auto *const real = realFunction<int(int, int, int)>("socket");
  static auto *const control = realFunction<int(int, int, ...)>("fcntl");
  const int fd = real(family, type, protocol);
  note("socket");
  if (steps != nullptr) {
    steps->socketArguments = {family, type, protocol};
    steps->probe = fd;
    EXPECT_TRUE(steps->socketFlags == 0 || control(fd, F_SETFL, steps->socketFlags) == 0);
  }
  return fd;
}

int fcntl(int fd, int command, ...) {
  static auto *const real = realFunction<int(int, int, ...)>("fcntl");
  va_list args;
  va_start(args, command);
  void *const argument = va_arg(args, void *);
  va_end(args);
  note("fcntl " + std::to_string(command));
  return real(fd, command, argument);
}

int connect(int fd, const sockaddr *address, socklen_t size) {
  static auto *const real = realFunction<decltype(connect)>("connect");
  static auto *const control = realFunction<int(int, int, ...)>("fcntl");
  note("connect");
  if (steps != nullptr) {
    steps->flagsAtConnect = control(fd, F_GETFL);
    steps->descriptorFlagsAtConnect = control(fd, F_GETFD);
  }
  return real(fd, address, size);
}

int select(int end, fd_set *read, fd_set *write, fd_set *except, timeval *limit) {
  static auto *const real = realFunction<decltype(select)>("select");
  note("select");
  if (steps == nullptr) {
    return real(end, read, write, except, limit);
  }
  steps->selectLimit = *limit;
  return steps->wait ? steps->wait(end, read, write, except)
                     : real(end, read, write, except, limit);
}

int getsockopt(int fd, int level, int option, void *value, socklen_t *size) noexcept {
  static auto *const real = realFunction<int(int, int, int, void *, socklen_t *)>("getsockopt");
  const bool pending = level == SOL_SOCKET && option == SO_ERROR;
  note(pending ? "getsockopt SO_ERROR" : "getsockopt");
  if (steps != nullptr && steps->pendingError) {
    return steps->pendingError(static_cast<int *>(value));
  }
  return real(fd, level, option, value, size);
}

ssize_t send(int fd, const void *data, size_t size, int flags) {
  static auto *const real = realFunction<decltype(send)>("send");
  note("send");
  if (steps != nullptr) {
    steps->sent.assign(static_cast<const char *>(data), size);
    steps->sendFlags = flags;
    if (steps->beforeSend) {
      steps->beforeSend();
    }
  }
  return real(fd, data, size, flags);
}

int close(int fd) {
  static auto *const real = realFunction<int(int)>("close");
  if (steps != nullptr && fd == steps->probe) {
    note("close");
  }
  return real(fd);
}
}

namespace {

const std::string kGetFlags = "fcntl " + std::to_string(F_GETFL);
const std::string kSetFlags = "fcntl " + std::to_string(F_SETFL);

TEST(ProbeSteps, ComeInOrder) {
  LoopbackPort port;
  port.listen();
  Steps seen;
  EXPECT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
  EXPECT_THAT(seen.order,
              ElementsAre("getaddrinfo", "socket", kGetFlags, kSetFlags, "connect", "select",
                          "getsockopt SO_ERROR", "send", "close", "freeaddrinfo"));
}

TEST(ProbeSteps, OfARefusedProbeEndAtThePendingError) {
  const LoopbackPort closed;
  Steps seen;
  EXPECT_EQ(-1, testIpAndPortConnect("127.0.0.1", closed.port(), 10));
  EXPECT_THAT(seen.order, ElementsAre("getaddrinfo", "socket", kGetFlags, kSetFlags, "connect",
                                      "select", "getsockopt SO_ERROR", "close", "freeaddrinfo"));
}

struct PortText {
  int port;
  const char *text;
};

class ProbeLookup : public testing::TestWithParam<PortText> {};

TEST_P(ProbeLookup, AsksForAStreamAndNothingElse) {
  Steps seen;
  seen.lookup = [](addrinfo **) { return EAI_NONAME; };
  EXPECT_EQ(-1, testIpAndPortConnect("some.host", GetParam().port, 10));
  EXPECT_EQ("some.host", seen.host);
  EXPECT_EQ(GetParam().text, seen.service);
  EXPECT_EQ(0, seen.hints.ai_flags);
  EXPECT_EQ(AF_UNSPEC, seen.hints.ai_family);
  EXPECT_EQ(SOCK_STREAM, seen.hints.ai_socktype);
  EXPECT_EQ(0, seen.hints.ai_protocol);
  EXPECT_EQ(nullptr, seen.hints.ai_next);
  EXPECT_THAT(seen.order, ElementsAre("getaddrinfo"));
}

// Ten bytes hold nine digits.
INSTANTIATE_TEST_SUITE_P(Ports, ProbeLookup,
                         testing::Values(PortText{0, "0"}, PortText{80, "80"},
                                         PortText{65535, "65535"}, PortText{70000, "70000"},
                                         PortText{999999999, "999999999"},
                                         PortText{1000000000, "100000000"},
                                         PortText{INT_MAX, "214748364"}));

TEST(ProbeSteps, SocketIsMadeAsTheFirstEntrySays) {
  Steps seen;
  seen.lookup = [](addrinfo **list) {
    sockaddr_un nobody{};
    nobody.sun_family = AF_UNIX;
    *list = makeEntry(AF_UNIX, SOCK_SEQPACKET, 0, nobody);
    return 0;
  };
  EXPECT_EQ(-1, testIpAndPortConnect("h", 1, 10));
  EXPECT_THAT(seen.socketArguments, ElementsAre(AF_UNIX, SOCK_SEQPACKET, 0));
  EXPECT_EQ("freeaddrinfo", seen.order.back());
}

TEST(ProbeSteps, SocketThatCannotBeMadeEndsTheProbe) {
  Steps seen;
  seen.lookup = [](addrinfo **list) {
    *list = makeEntry(-1, SOCK_STREAM, 0, sockaddr_in{});
    return 0;
  };
  EXPECT_EQ(-1, testIpAndPortConnect("h", 1, 10));
  EXPECT_THAT(seen.order, ElementsAre("getaddrinfo", "socket", "freeaddrinfo"));
}

TEST(ProbeSteps, OnlyTheFirstAddressIsTried) {
  const LoopbackPort closed;
  LoopbackPort open;
  open.listen();
  Steps seen;
  seen.lookup = [&](addrinfo **list) {
    *list = entryFor(closed);
    (*list)->ai_next = entryFor(open);
    return 0;
  };
  EXPECT_EQ(-1, testIpAndPortConnect("two.addresses", 1, 10));
  EXPECT_EQ(1, std::count(seen.order.begin(), seen.order.end(), "connect"));
  EXPECT_FALSE(open.hasConnection());
}

TEST(ProbeSteps, SocketIsNonBlockingKeepsItsFlagsAndIsCloseOnExec) {
  LoopbackPort port;
  port.listen();
  Steps seen;
  seen.socketFlags = O_APPEND;
  EXPECT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
  EXPECT_EQ(O_RDWR | O_APPEND | O_NONBLOCK,
            seen.flagsAtConnect & (O_ACCMODE | O_APPEND | O_NONBLOCK));
  EXPECT_EQ(FD_CLOEXEC, seen.descriptorFlagsAtConnect);
}

TEST(ProbeSteps, AConnectionMadeAtOnceGetsNoByte) {
  // Local sockets connect at once.
  const UniqueFd listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strcpy(address.sun_path + 1, "kovabackup-network-steps-test"); // an abstract address
  ASSERT_EQ(0, ::bind(listener.get(), reinterpret_cast<sockaddr *>(&address), sizeof address));
  ASSERT_EQ(0, ::listen(listener.get(), 1));
  {
    Steps seen;
    seen.lookup = [&](addrinfo **list) {
      *list = makeEntry(AF_UNIX, SOCK_STREAM, 0, address);
      return 0;
    };
    EXPECT_EQ(0, testIpAndPortConnect("h", 1, 10));
    EXPECT_THAT(seen.order, ElementsAre("getaddrinfo", "socket", kGetFlags, kSetFlags, "connect",
                                        "close", "freeaddrinfo"));
  }
  const UniqueFd peer(::accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
  ASSERT_TRUE(peer);
  EXPECT_EQ("", readAll(peer));
}

// Probes an open port with select replaced.
int probeOpenPort(int timeout) {
  LoopbackPort port;
  port.listen();
  return testIpAndPortConnect("127.0.0.1", port.port(), timeout);
}

TEST(ProbeSteps, SelectWatchesTheDescriptorAloneInAllThreeSets) {
  Steps seen;
  seen.wait = [&seen](int end, fd_set *read, fd_set *write, fd_set *except) {
    EXPECT_EQ(seen.probe + 1, end);
    for (fd_set *set : {read, write, except}) {
      for (int fd = 0; fd < FD_SETSIZE; ++fd) {
        EXPECT_EQ(fd == seen.probe, FD_ISSET(fd, set) != 0) << fd;
      }
    }
    return 0;
  };
  EXPECT_EQ(-2, probeOpenPort(7));
  EXPECT_EQ(7, seen.selectLimit.tv_sec);
  EXPECT_EQ(0, seen.selectLimit.tv_usec);
}

TEST(ProbeSteps, SelectWaitsForAsLongAsItIsTold) {
  for (const int timeout : {0, INT_MAX}) {
    Steps seen;
    seen.wait = [](int, fd_set *, fd_set *, fd_set *) { return 0; };
    EXPECT_EQ(-2, probeOpenPort(timeout));
    EXPECT_EQ(timeout, seen.selectLimit.tv_sec);
  }
}

TEST(ProbeSteps, AnExceptionAloneIsAFailure) {
  Steps seen;
  seen.wait = [&seen](int, fd_set *read, fd_set *write, fd_set *) {
    FD_CLR(seen.probe, read);
    FD_CLR(seen.probe, write);
    return 1;
  };
  EXPECT_EQ(-1, probeOpenPort(10));
  EXPECT_EQ(0, std::count(seen.order.begin(), seen.order.end(), "getsockopt SO_ERROR"));
}

TEST(ProbeSteps, ReadableAloneAndWritableAloneAreEnough) {
  for (const bool readable : {true, false}) {
    Steps seen;
    seen.wait = [&](int, fd_set *read, fd_set *write, fd_set *except) {
      FD_CLR(seen.probe, readable ? write : read);
      FD_CLR(seen.probe, except);
      return 1;
    };
    EXPECT_EQ(0, probeOpenPort(10));
    EXPECT_EQ(std::string(1, '\0'), seen.sent);
  }
}

TEST(ProbeSteps, APendingErrorIsAFailureWithoutAByte) {
  Steps seen;
  seen.pendingError = [](int *error) {
    *error = EHOSTUNREACH;
    return 0;
  };
  EXPECT_EQ(-1, probeOpenPort(10));
  EXPECT_EQ("", seen.sent);
}

TEST(ProbeSteps, APeerThatResetsTheConnectionDoesNotKillTheCaller) {
  struct sigaction action {};
  ASSERT_EQ(0, ::sigaction(SIGPIPE, nullptr, &action));
  ASSERT_EQ(SIG_DFL, action.sa_handler); // otherwise the test proves nothing
  LoopbackPort port;
  port.listen();
  Steps seen;
  seen.beforeSend = [&] {
    {
      const UniqueFd peer = port.accept();
      const linger reset{1, 0};
      EXPECT_EQ(0, ::setsockopt(peer.get(), SOL_SOCKET, SO_LINGER, &reset, sizeof reset));
    }
    // After the reset has been received, another byte would raise SIGPIPE.
    pollfd gone{seen.probe, 0, 0};
    EXPECT_EQ(1, ::poll(&gone, 1, 10000));
    char byte = '\0';
    EXPECT_EQ(-1, ::recv(seen.probe, &byte, 1, 0));
    EXPECT_EQ(ECONNRESET, errno);
  };
  EXPECT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
  EXPECT_EQ(MSG_NOSIGNAL, seen.sendFlags);
}

} // namespace
