#include "kovabackup/service/cancel.h"

#include "tests/support/fault.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/eventfd.h>
#include <system_error>
#include <thread>
#include <unistd.h>

using KOVA::Backup::Service::Cancel;

namespace {

Cancel *cancelOfHandler = nullptr;

void requestInHandler(int) {
  cancelOfHandler->request();
}

bool isReadable(int fd) {
  struct pollfd readable = {fd, POLLIN, 0};
  return ::poll(&readable, 1, 0) == 1;
}

} // namespace

extern "C" int eventfd(unsigned int count, int flags) noexcept {
  using KovaTest::failsNow;
  return failsNow("eventfd")
             ? -1
             : KovaTest::realFunction<int(unsigned int, int)>("eventfd")(count, flags);
}

TEST(Cancel, HasNoRequestAtFirst) {
  const Cancel cancel;
  EXPECT_FALSE(cancel.requested());
  EXPECT_FALSE(isReadable(cancel.fd()));
}

TEST(Cancel, KeepsARequest) {
  Cancel cancel;
  cancel.request();
  EXPECT_TRUE(cancel.requested());
  EXPECT_TRUE(cancel.requested()) << "asking takes nothing away";
  EXPECT_TRUE(isReadable(cancel.fd()));
}

TEST(Cancel, KeepsARequestThatIsMadeAgainAndAgain) {
  Cancel cancel;
  for (int i = 0; i < 1000; ++i) {
    cancel.request();
  }
  EXPECT_TRUE(cancel.requested());
}

TEST(Cancel, DoesNotWaitWhereTheCounterIsFull) {
  Cancel cancel;
  ASSERT_EQ(0, ::eventfd_write(cancel.fd(), 0xfffffffffffffffe)); // the largest count there is
  cancel.request();
  EXPECT_TRUE(cancel.requested());
}

TEST(Cancel, TakesARequestFromASignalHandler) {
  Cancel cancel;
  cancelOfHandler = &cancel;
  struct sigaction action = {};
  action.sa_handler = requestInHandler;
  struct sigaction before = {};
  ASSERT_EQ(0, ::sigaction(SIGUSR1, &action, &before));
  ASSERT_EQ(0, ::raise(SIGUSR1));
  ASSERT_EQ(0, ::sigaction(SIGUSR1, &before, nullptr));
  EXPECT_TRUE(cancel.requested());
}

TEST(Cancel, TakesARequestFromAnotherThread) {
  Cancel cancel;
  std::thread other([&] { cancel.request(); });
  other.join();
  EXPECT_TRUE(cancel.requested());
}

TEST(Cancel, WakesAWaitInPoll) {
  Cancel cancel;
  std::thread other([&] { cancel.request(); });
  struct pollfd readable = {cancel.fd(), POLLIN, 0};
  EXPECT_EQ(1, ::poll(&readable, 1, 10000));
  other.join();
}

TEST(Cancel, LeavesErrnoAlone) {
  Cancel cancel;
  errno = ENOTTY;
  cancel.request();
  EXPECT_EQ(ENOTTY, errno);
  (void)cancel.requested();
  EXPECT_EQ(ENOTTY, errno);
}

TEST(Cancel, ClosesItsDescriptorAtTheEnd) {
  int fd = -1;
  {
    const Cancel cancel;
    fd = cancel.fd();
    EXPECT_EQ(FD_CLOEXEC, ::fcntl(fd, F_GETFD));
  }
  EXPECT_EQ(-1, ::fcntl(fd, F_GETFD));
}

TEST(Cancel, ThrowsWhereNoDescriptorCanBeHad) {
  const KovaTest::Fault fault("eventfd", 1, EMFILE);
  try {
    const Cancel cancel;
    FAIL() << "no exception";
  } catch (const std::system_error &error) {
    EXPECT_EQ(EMFILE, error.code().value());
  }
}
