#include "base/open_file.h"

#include "tests/support/fault.h"
#include "tests/support/lease.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

using KOVA::Base::openFile;
using KOVA::Base::UniqueFd;
using KovaTest::Fault;
using KovaTest::LeaseHolder;

namespace {

class OpenFile : public testing::Test {
protected:
  OpenFile() { std::ofstream(path_) << "text"; }
  ~OpenFile() override { std::filesystem::remove(path_); }

  const std::string path_ = "/tmp/open_file_test";
};

// For a process without a controlling terminal. Returns: 0 if opening a terminal gave it none, 1 if
// it did, 2 if no terminal could be opened.
int openTerminal() {
  const UniqueFd master(::posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC));
  const char *const name = master ? ::ptsname(master.get()) : nullptr;
  if (name == nullptr || ::unlockpt(master.get()) != 0) {
    return 2;
  }
  const UniqueFd terminal = openFile(name, O_RDWR);
  const UniqueFd own(::open("/dev/tty", O_RDWR | O_NOCTTY | O_CLOEXEC));
  return !terminal ? 2 : own ? 1 : 0;
}

} // namespace

TEST_F(OpenFile, OpensForReadingOrForReadingAndWriting) {
  EXPECT_EQ(O_RDONLY, ::fcntl(openFile(path_.c_str(), O_RDONLY).get(), F_GETFL) & O_ACCMODE);
  EXPECT_EQ(O_RDWR, ::fcntl(openFile(path_.c_str(), O_RDWR).get(), F_GETFL) & O_ACCMODE);
}

TEST_F(OpenFile, DoesNotPassTheDescriptorToChildren) {
  EXPECT_EQ(FD_CLOEXEC, ::fcntl(openFile(path_.c_str(), O_RDONLY).get(), F_GETFD));
  const LeaseHolder holder(path_);
  EXPECT_EQ(FD_CLOEXEC, ::fcntl(openFile(path_.c_str(), O_RDONLY).get(), F_GETFD));
}

TEST_F(OpenFile, FailsAsOpenDoes) {
  EXPECT_FALSE(openFile("/tmp/absent", O_RDONLY));
  EXPECT_EQ(ENOENT, errno);
}

TEST_F(OpenFile, DoesNotWaitForAWriter) {
  std::filesystem::remove(path_);
  ASSERT_EQ(0, ::mkfifo(path_.c_str(), 0600));
  EXPECT_TRUE(openFile(path_.c_str(), O_RDONLY));
}

TEST_F(OpenFile, WaitsForALease) {
  LeaseHolder holder(path_);
  if (!holder.held()) {
    GTEST_SKIP() << "skipped: no leases on this file system";
  }
  EXPECT_TRUE(openFile(path_.c_str(), O_RDONLY));
  EXPECT_TRUE(holder.wasAsked());
}

TEST_F(OpenFile, GoesOnWhenASignalInterrupts) {
  const Fault signal("open", 1, EINTR);
  EXPECT_TRUE(openFile(path_.c_str(), O_RDONLY));
  EXPECT_TRUE(signal.fired());
}

TEST_F(OpenFile, KeepsWaitingWhenASignalInterrupts) {
  const Fault lease("open", 1, EWOULDBLOCK);
  const Fault signal("open", 2, EINTR);
  EXPECT_TRUE(openFile(path_.c_str(), O_RDONLY));
  EXPECT_TRUE(lease.fired() && signal.fired());
}

TEST_F(OpenFile, FailsWhenTheLeaseStays) {
  const Fault lease("open", 1, EWOULDBLOCK, true);
  EXPECT_FALSE(openFile(path_.c_str(), O_RDONLY));
  EXPECT_EQ(2, lease.calls());
}

TEST_F(OpenFile, GetsNoControllingTerminal) {
  const pid_t child = ::fork();
  if (child == 0) {
    (void)::signal(SIGHUP, SIG_IGN); // a controlling terminal sends it when it is closed
    ::_exit(::setsid() < 0 ? 2 : openTerminal());
  }
  int status = -1;
  ASSERT_EQ(child, ::waitpid(child, &status, 0));
  ASSERT_TRUE(WIFEXITED(status)) << status;
  if (WEXITSTATUS(status) == 2) {
    GTEST_SKIP() << "skipped: no terminal can be made";
  }
  EXPECT_EQ(0, WEXITSTATUS(status));
}
