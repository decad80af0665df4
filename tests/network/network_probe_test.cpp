// The probe against real peers on the loopback interface, and with each system call failing.

#include "kovabackup/network.h"

#include "tests/network/loopback.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <climits>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <string>
#include <sys/resource.h>
#include <syslog.h>
#include <vector>

using namespace KovaTest;
using KOVA::Backup::Net::testIpAndPortConnect;
using testing::ElementsAre;

namespace {

const std::string kOneZeroByte(1, '\0');

// A port that never answers: its queue of connections is full, so the kernel drops every further
// attempt without refusing it.
class SilentPort {
public:
  SilentPort() {
    port_.listen(0);
    // The first one fills the queue. Whether a second one fits is the kernel's choice; a third
    // never does.
    for (UniqueFd &filler : fillers_) {
      filler = UniqueFd(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
      sockaddr_in address{};
      address.sin_family = AF_INET;
      address.sin_port = htons(static_cast<std::uint16_t>(port_.port()));
      address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
      (void)::connect(filler.get(), reinterpret_cast<sockaddr *>(&address), sizeof address);
    }
    pollfd first{fillers_[0].get(), POLLOUT, 0};
    EXPECT_EQ(1, ::poll(&first, 1, 10000));
  }

  int port() const { return port_.port(); }

private:
  LoopbackPort port_;
  UniqueFd fillers_[3];
};

TEST(Probe, ConnectsOnceAndSendsOneZeroByte) {
  LoopbackPort port;
  port.listen();
  EXPECT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
  const UniqueFd peer = port.accept();
  ASSERT_TRUE(peer);
  EXPECT_EQ(kOneZeroByte, readAll(peer));
  EXPECT_FALSE(port.hasConnection());
}

TEST(Probe, ConnectsOverIpv6) {
  LoopbackPort port(AF_INET6);
  if (!port.usable()) {
    GTEST_SKIP() << "skipped: no IPv6 loopback here";
  }
  port.listen();
  EXPECT_EQ(0, testIpAndPortConnect("::1", port.port(), 10));
  const UniqueFd peer = port.accept();
  ASSERT_TRUE(peer);
  EXPECT_EQ(kOneZeroByte, readAll(peer));
}

TEST(Probe, ConnectsAgainAndAgain) {
  LoopbackPort port;
  port.listen();
  for (int i = 0; i < 50; ++i) {
    ASSERT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
    const UniqueFd peer = port.accept();
    ASSERT_TRUE(peer);
    ASSERT_EQ(kOneZeroByte, readAll(peer));
  }
}

TEST(Probe, IsRefusedByAClosedPort) {
  const LoopbackPort closed; // so that no other process takes the port meanwhile
  EXPECT_EQ(-1, testIpAndPortConnect("127.0.0.1", closed.port(), 10));
  EXPECT_EQ(-1, testIpAndPortConnect("127.0.0.1", closed.port(), 0));
}

TEST(Probe, TimesOutWhenNobodyAnswers) {
  const SilentPort silent;
  EXPECT_EQ(-2, testIpAndPortConnect("127.0.0.1", silent.port(), 1));
}

TEST(Probe, LooksOnceWithoutWaitingWhenTheTimeoutIsZero) {
  const SilentPort silent;
  EXPECT_EQ(-2, testIpAndPortConnect("127.0.0.1", silent.port(), 0));
}

TEST(Probe, TriesPortZero) {
  const Fault watch("connect", INT_MAX, 0);
  EXPECT_EQ(-1, testIpAndPortConnect("127.0.0.1", 0, 10));
  EXPECT_EQ(1, watch.calls());
}

TEST(Probe, FailsSilentlyForAHostThatCannotBeResolved) {
  const Fault watch("socket", INT_MAX, 0);
  EXPECT_EQ(-1, testIpAndPortConnect("", 80, 10));
  EXPECT_EQ(0, watch.calls());
}

struct BadCall {
  const char *host;
  int port;
  int timeout;
};

class ProbeBadParameter : public testing::TestWithParam<BadCall> {};

TEST_P(ProbeBadParameter, IsLoggedWithoutPidAndTagAndNothingIsTried) {
  const BadCall &bad = GetParam();
  LogCapture log;
  const Fault lookups("getaddrinfo", INT_MAX, 0);
  const Fault sockets("socket", INT_MAX, 0);
  EXPECT_EQ(-1, testIpAndPortConnect(bad.host, bad.port, bad.timeout));
  EXPECT_THAT(log.take(), ElementsAre(bareLine(LOG_ERR, "network/network", 97, "bad parameter")));
  EXPECT_EQ(0, lookups.calls() + sockets.calls());
}

INSTANTIATE_TEST_SUITE_P(Cases, ProbeBadParameter,
                         testing::Values(BadCall{nullptr, 80, 1}, BadCall{"127.0.0.1", -1, 1},
                                         BadCall{"127.0.0.1", 80, -1},
                                         BadCall{"127.0.0.1", INT_MIN, INT_MIN},
                                         BadCall{nullptr, -1, -1}));

TEST(Probe, WorksWithDescriptorZero) {
  LoopbackPort port;
  port.listen();
  const UniqueFd input(
      ::fcntl(0, F_DUPFD_CLOEXEC, 3)); // invalid if the test was started without one
  ::close(0);
  EXPECT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
  EXPECT_EQ(-1, ::fcntl(0, F_GETFD)) << "the socket is left open";
  EXPECT_EQ(input ? 0 : -1, ::dup2(input.get(), 0));
}

// Opens many files, under a raised limit, for its lifetime.
class ManyFiles {
public:
  explicit ManyFiles(int count) {
    ::getrlimit(RLIMIT_NOFILE, &before_);
    rlimit raised = before_;
    raised.rlim_cur = static_cast<rlim_t>(count) + 200;
    if (raised.rlim_cur > before_.rlim_cur && ::setrlimit(RLIMIT_NOFILE, &raised) != 0) {
      return;
    }
    for (int i = 0; i < count; ++i) {
      files_.emplace_back(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    }
  }
  ~ManyFiles() {
    files_.clear();
    ::setrlimit(RLIMIT_NOFILE, &before_);
  }
  ManyFiles(const ManyFiles &) = delete;
  ManyFiles &operator=(const ManyFiles &) = delete;

  bool reachedPast(int fd) const { return !files_.empty() && files_.back().get() > fd; }

private:
  rlimit before_{};
  std::vector<UniqueFd> files_;
};

TEST(Probe, WorksWithDescriptorsBeyondASetsUsualSize) {
  LoopbackPort open;
  open.listen();
  const LoopbackPort closed;
  const SilentPort silent;
  const ManyFiles files(2000);
  if (!files.reachedPast(FD_SETSIZE)) {
    GTEST_SKIP() << "skipped: the limit of open files is too low for descriptors past FD_SETSIZE";
  }
  EXPECT_EQ(0, testIpAndPortConnect("127.0.0.1", open.port(), 10));
  EXPECT_EQ(-1, testIpAndPortConnect("127.0.0.1", closed.port(), 10));
  EXPECT_EQ(-2, testIpAndPortConnect("127.0.0.1", silent.port(), 0));
  const UniqueFd peer = open.accept();
  ASSERT_TRUE(peer);
  EXPECT_EQ(kOneZeroByte, readAll(peer));
}

// Every descriptor number around the sizes at which a set grows.
TEST(Probe, WorksWithEachDescriptorAroundASetsEnd) {
  LoopbackPort port;
  port.listen();
  const ManyFiles files(FD_SETSIZE - 10);
  if (!files.reachedPast(FD_SETSIZE - 10)) {
    GTEST_SKIP() << "skipped: the limit of open files is too low for descriptors past FD_SETSIZE";
  }
  std::vector<UniqueFd> more;
  for (int i = 0; i < 20; ++i) {
    ASSERT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
    more.push_back(port.accept());
    ASSERT_TRUE(more.back());
  }
  EXPECT_LT(FD_SETSIZE, more.back().get());
}

struct FailingCall {
  const char *function;
  int error;
};

void PrintTo(const FailingCall &call, std::ostream *os) {
  *os << call.function;
}

class ProbeFailure : public testing::TestWithParam<FailingCall> {};

// No line is logged (none is expected here, so one would fail the test) and no descriptor is left.
TEST_P(ProbeFailure, OfASystemCallIsAFailedProbe) {
  LoopbackPort port;
  port.listen(100);
  forEachFailure(GetParam().function, GetParam().error, [&](Fault &fault) {
    const int before = countOpenDescriptors();
    const int result = testIpAndPortConnect("127.0.0.1", port.port(), 10);
    EXPECT_EQ(fault.fired() ? -1 : 0, result);
    EXPECT_EQ(before, countOpenDescriptors());
  });
}

INSTANTIATE_TEST_SUITE_P(
    Calls, ProbeFailure,
    testing::Values(FailingCall{"getaddrinfo", EIO}, FailingCall{"socket", EMFILE},
                    FailingCall{"fcntl", EBADF}, FailingCall{"connect", ENETUNREACH},
                    FailingCall{"connect", EINTR}, FailingCall{"select", ENOMEM},
                    FailingCall{"select", EINTR}, FailingCall{"getsockopt", ENOBUFS}));

TEST(Probe, IsStillASuccessWhenTheByteCannotBeSent) {
  LoopbackPort port;
  port.listen();
  const Fault fault("send", 1, EPIPE, true);
  EXPECT_EQ(0, testIpAndPortConnect("127.0.0.1", port.port(), 10));
  EXPECT_TRUE(fault.fired());
  const UniqueFd peer = port.accept();
  ASSERT_TRUE(peer);
  EXPECT_EQ("", readAll(peer));
}

TEST(Probe, ThatGetsNoMemoryLeavesNoDescriptor) {
  LoopbackPort port;
  port.listen(100);
  const int before = countOpenDescriptors();
  int result = -1;
  forEachAllocation([&] { result = testIpAndPortConnect("127.0.0.1", port.port(), 10); },
                    [&](bool threw) {
                      EXPECT_EQ(before, countOpenDescriptors());
                      EXPECT_EQ(threw ? -1 : 0, result);
                    });
}

} // namespace
