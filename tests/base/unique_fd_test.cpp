#include "base/unique_fd.h"

#include <cerrno>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <utility>

using KOVA::Base::UniqueFd;

namespace {

int openNull() {
  return ::open("/dev/null", O_RDONLY | O_CLOEXEC);
}

bool isOpen(int fd) {
  return ::fcntl(fd, F_GETFD) != -1;
}

} // namespace

TEST(UniqueFd, HoldsNothingAtFirst) {
  const UniqueFd fd;
  EXPECT_FALSE(fd);
  EXPECT_EQ(-1, fd.get());
}

TEST(UniqueFd, ClosesAtTheEndOfItsScope) {
  const int raw = openNull();
  { const UniqueFd fd(raw); }
  EXPECT_FALSE(isOpen(raw));
}

TEST(UniqueFd, HoldsAndClosesDescriptorZeroLikeAnyOther) {
  const UniqueFd kept(::fcntl(0, F_DUPFD_CLOEXEC, 3));
  ::close(0);
  {
    const UniqueFd fd(openNull());
    EXPECT_EQ(0, fd.get());
    EXPECT_TRUE(fd);
  }
  EXPECT_FALSE(isOpen(0));
  EXPECT_EQ(kept ? 0 : -1, ::dup2(kept.get(), 0)); // -1 if the test was started without it
}

TEST(UniqueFd, ClosingKeepsErrno) {
  errno = ELOOP;
  { const UniqueFd fd(9999); } // not open, so close fails with EBADF
  EXPECT_EQ(ELOOP, errno);
}

TEST(UniqueFd, ReleasePassesTheDescriptorOn) {
  UniqueFd fd(openNull());
  const int raw = fd.release();
  EXPECT_FALSE(fd);
  EXPECT_TRUE(isOpen(raw));
  ::close(raw);
}

TEST(UniqueFd, MovingLeavesOneOwner) {
  UniqueFd first(openNull());
  const int raw = first.get();
  UniqueFd second(std::move(first));
  EXPECT_EQ(raw, second.get());
  UniqueFd third(openNull());
  const int replaced = third.get();
  third = std::move(second);
  EXPECT_EQ(raw, third.get());
  EXPECT_FALSE(isOpen(replaced));
  EXPECT_TRUE(isOpen(raw));
}
