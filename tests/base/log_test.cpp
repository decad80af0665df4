#include "common/log.h"

#include "tests/support/log_capture.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <gmock/gmock.h>
#include <string>
#include <syslog.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;

TEST(Log, ErrorCarriesPidTagModuleAndNumber) {
  LogCapture log;
  Log::error("path/path_util", 387, "bad %s name.", "a/b");
  const std::string text =
      "(" + std::to_string(::getpid()) + ") [err] path/path_util:387 bad a/b name.";
  EXPECT_THAT(log.take(), ElementsAre(LogLine{LOG_ERR, text}));
}

TEST(Log, DebugHasItsOwnPriorityAndTag) {
  LogCapture log;
  Log::debug("proc/subprocess", 250, "arg[%d] = [%s]", 1, "-c");
  const std::string text =
      "(" + std::to_string(::getpid()) + ") [debug] proc/subprocess:250 arg[1] = [-c]";
  EXPECT_THAT(log.take(), ElementsAre(LogLine{LOG_DEBUG, text}));
}

TEST(Log, BareLineHasNoPidAndNoTag) {
  LogCapture log;
  Log::bare(LOG_ERR, "network/network", 97, "bad parameter");
  EXPECT_THAT(log.take(), ElementsAre(LogLine{LOG_ERR, "network/network:97 bad parameter"}));
}

TEST(Log, PercentMIsTheErrnoOfTheCall) {
  LogCapture log;
  errno = ENOTDIR;
  Log::error("m", 1, "failed. %m");
  EXPECT_THAT(log.take(), ElementsAre(errLine("m", 1, "failed. Not a directory")));
}

TEST(Log, LeavesErrnoAlone) {
  LogCapture log;
  errno = EXDEV;
  Log::error("m", 1, "%s", std::string(5000, 'x').c_str());
  EXPECT_EQ(EXDEV, errno);
}

TEST(Log, PercentSignsInArgumentsAreText) {
  LogCapture log;
  Log::error("m", 2, "[%s]", "100%s %m %n");
  EXPECT_THAT(log.take(), ElementsAre(errLine("m", 2, "[100%s %m %n]")));
}

class LogLength : public testing::TestWithParam<std::size_t> {};

TEST_P(LogLength, LinesOfAnyLengthArriveComplete) {
  LogCapture log;
  const std::string text(GetParam(), 'x');
  errno = EIO;
  Log::error("m", 3, "%s: %m", text.c_str());
  EXPECT_THAT(log.take(), ElementsAre(errLine("m", 3, text + ": Input/output error")));
}

INSTANTIATE_TEST_SUITE_P(AroundTheInlineBuffer, LogLength,
                         testing::Values(0U, 1U, 1003U, 1004U, 1005U, 1023U, 1024U, 1025U, 9000U));

// The allocator of a sanitizer cannot be replaced.
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
namespace {

std::size_t targetBytes = 0; // the size of the requests that are tampered with; 0: none
bool targetFails = false;    // otherwise such a request succeeds, with errno changed

} // namespace

extern "C" void *__libc_malloc(std::size_t size);

extern "C" void *malloc(std::size_t size) noexcept {
  if (size == 0 || size != targetBytes) {
    return __libc_malloc(size);
  }
  errno = ENOMEM;
  return targetFails ? nullptr : __libc_malloc(size);
}

TEST(Log, PercentMIsTheErrnoOfTheCallEvenIfTheAllocatorChangesIt) {
  const std::string text(2500, 'x');
  const std::string line = text + ": Input/output error";
  LogCapture log;
  targetBytes = line.size() + 1;
  targetFails = false;
  errno = EIO;
  Log::error("m", 3, "%s: %m", text.c_str());
  targetBytes = 0;
  EXPECT_THAT(log.take(), ElementsAre(errLine("m", 3, line)));
}

TEST(Log, TruncatesALineWhenMemoryRunsOut) {
  const std::string text(2500, 'x');
  LogCapture log;
  targetBytes = text.size() + 1;
  targetFails = true;
  errno = EIO;
  Log::error("m", 3, "%s", text.c_str());
  const int error = errno;
  targetBytes = 0;
  EXPECT_EQ(EIO, error);
  EXPECT_THAT(log.take(), ElementsAre(errLine("m", 3, text.substr(0, 1023))));
}
#endif

TEST(PlatformError, IsTheLastRecordedTriple) {
  KLIBCErrSetEx(0x2000, "core/section.c", 71);
  const PlatformError error = PlatformError::last();
  EXPECT_EQ(0x2000U, error.code);
  EXPECT_STREQ("core/section.c", error.file);
  EXPECT_EQ(71, error.line);
  KLIBCErrSetEx(0, nullptr, 0);
}
