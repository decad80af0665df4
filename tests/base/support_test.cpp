// The test tools themselves: a guard that notices nothing would make every test weaker.

#include "tests/support/census.h"
#include "tests/support/fault.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <dlfcn.h>
#include <fcntl.h>
#include <fstream>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <syslog.h>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

TEST(Census, SeesDescriptorsSignalsEnvironmentAndFiles) {
  const Census before = takeCensus();
  const int fd = ::open("/dev/null", O_RDONLY);
  EXPECT_NE(before, takeCensus());
  ::close(fd);
  struct sigaction old {};
  struct sigaction ignored {};
  ignored.sa_handler = SIG_IGN;
  ::sigaction(SIGUSR1, &ignored, &old);
  EXPECT_NE(before, takeCensus());
  ::sigaction(SIGUSR1, &old, nullptr);
  ::setenv("KOVA_TEST_CENSUS", "1", 1);
  EXPECT_NE(before, takeCensus());
  ::unsetenv("KOVA_TEST_CENSUS");
  ::mkdir("/tmp/census", 0700);
  EXPECT_NE(before, takeCensus());
  ::rmdir("/tmp/census");
  EXPECT_EQ(before, takeCensus());
}

TEST(PrivateTmp, IsAFileSystemOfItsOwn) {
  struct stat tmp {};
  struct stat root {};
  ASSERT_EQ(0, ::stat("/tmp", &tmp));
  ASSERT_EQ(0, ::stat("/", &root));
  EXPECT_NE(tmp.st_dev, root.st_dev);
}

TEST(LogCapture, ListsLinesInOrderAndForgetsThemWhenTaken) {
  LogCapture log;
  ::syslog(LOG_INFO, "first %d", 1);
  ::syslog(LOG_ERR, "second");
  EXPECT_THAT(log.take(), ElementsAre(LogLine{LOG_INFO, "first 1"}, LogLine{LOG_ERR, "second"}));
  EXPECT_THAT(log.take(), IsEmpty());
}

TEST(Fault, FailsTheCallWithTheGivenNumberOnly) {
  const Fault fault("access", 2, ENOSPC);
  EXPECT_EQ(0, ::access("/", F_OK));
  EXPECT_FALSE(fault.fired());
  errno = 0;
  EXPECT_EQ(-1, ::access("/", F_OK));
  EXPECT_EQ(ENOSPC, errno);
  EXPECT_EQ(0, ::access("/", F_OK));
  EXPECT_EQ(3, fault.calls());
}

TEST(Fault, LastsWhenAsked) {
  const Fault fault("access", 2, EIO, true);
  EXPECT_EQ(0, ::access("/", F_OK));
  EXPECT_EQ(-1, ::access("/", F_OK));
  EXPECT_EQ(-1, ::access("/", F_OK));
}

TEST(Interposers, AreWhatSharedLibrariesCall) {
  for (const char *name : {"syslog", "vsyslog", "open", "openat", "mkdir", "fchmod"}) {
    Dl_info found{};
    ASSERT_NE(0, ::dladdr(::dlsym(RTLD_DEFAULT, name), &found)) << name;
    Dl_info own{};
    ASSERT_NE(0, ::dladdr(reinterpret_cast<void *>(&countOpenDescriptors), &own));
    EXPECT_EQ(own.dli_fbase, found.dli_fbase) << name << " is found in " << found.dli_fname;
  }
}
