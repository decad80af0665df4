// printf-style formatting: lengths around the buffer of the first pass, both passes, and failures.

#include "kovabackup/string_util.h"

#include "tests/support/alloc_failure.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <gtest/gtest.h>

namespace {

using KOVA::Backup::stringf;
using KOVA::Backup::vstringf;

// What vsnprintf below records and does; it counts only if a test sets counts.
struct {
  bool counts = false;
  int calls = 0;
  std::size_t sizes[4] = {};
  bool firstBufferWasZero = false;
  int failingCall = 0;  // from 1; 0: none
  int secondLonger = 0; // how much more than the truth the second call reports
} passes;

struct ScopedPasses {
  ScopedPasses() {
    passes = {};
    passes.counts = true;
  }
  ~ScopedPasses() { passes = {}; }
  ScopedPasses(const ScopedPasses &) = delete;
  ScopedPasses &operator=(const ScopedPasses &) = delete;
};

__attribute__((format(printf, 1, 2))) std::string viaVstringf(const char *format, ...) {
  va_list args;
  va_start(args, format);
  std::string text = vstringf(format, args);
  va_end(args);
  return text;
}

TEST(Stringf, FormatsAsPrintfDoes) {
  EXPECT_EQ("task-007 0x1f 50% c 1.50",
            stringf("%s-%03d 0x%x %d%% %c %.2f", "task", 7, 31, 50, 'c', 1.5));
  EXPECT_EQ("9223372036854775807", stringf("%lld", LLONG_MAX));
}

TEST(Stringf, GivesTheResultsThatItsHeaderShows) {
  EXPECT_EQ("task-007", stringf("%s-%03d", "task", 7));
  EXPECT_EQ("50%", stringf("%d%%", 50));
}

TEST(Stringf, GivesAnEmptyTextForAnEmptyFormat) {
  EXPECT_EQ("", stringf("%s", ""));
}

TEST(Stringf, KeepsEveryLengthWhole) {
  for (const std::size_t length : {1U, 126U, 127U, 128U, 129U, 255U, 256U, 4096U, 1000000U}) {
    const std::string text(length, 'x');
    EXPECT_EQ(text, stringf("%s", text.c_str())) << length;
  }
}

TEST(Stringf, KeepsNulBytesThatTheFormatPutsIn) {
  EXPECT_EQ(std::string("a\0b", 3), stringf("a%cb", '\0'));
  const std::string before(200, 'x');
  EXPECT_EQ(before + std::string("\0b", 2), stringf("%s%cb", before.c_str(), '\0'));
}

TEST(Stringf, TakesAllArgumentsAgainForALongText) {
  const std::string text(150, 'x');
  EXPECT_EQ("1 " + text + " 2.5 three 4",
            stringf("%d %s %.1f %s %lld", 1, text.c_str(), 2.5, "three", 4LL));
}

TEST(Vstringf, FormatsFromAListOfArguments) {
  EXPECT_EQ("a 1", viaVstringf("%s %d", "a", 1));
  const std::string text(300, 'y');
  EXPECT_EQ(text + " 1", viaVstringf("%s %d", text.c_str(), 1));
}

TEST(Vstringf, FormatsAShortTextInOnePassOf128Bytes) {
  const std::string text(127, 'x');
  const ScopedPasses counted;
  EXPECT_EQ(text, stringf("%s", text.c_str()));
  EXPECT_EQ(1, passes.calls);
  EXPECT_EQ(128U, passes.sizes[0]);
  EXPECT_TRUE(passes.firstBufferWasZero);
}

TEST(Vstringf, FormatsALongTextInTwoPassesTheSecondOfItsLength) {
  const std::string text(128, 'x');
  const ScopedPasses counted;
  EXPECT_EQ(text, stringf("%s", text.c_str()));
  EXPECT_EQ(2, passes.calls);
  EXPECT_EQ(128U, passes.sizes[0]);
  EXPECT_EQ(129U, passes.sizes[1]);
}

TEST(Vstringf, AllocatesNothingButTheResultForAShortText) {
  const std::string text(127, 'x');
  const KovaTest::AllocFailure counter(INT_MAX);
  const std::string result = stringf("%s", text.c_str());
  const int allocations = counter.calls();
  EXPECT_EQ(127U, result.size());
  EXPECT_EQ(1, allocations);
}

TEST(Vstringf, IsEmptyWhenTheTextCannotBeFormatted) {
  EXPECT_EQ("", stringf("a%ls", L"\u00e9")); // the C locale has no such character
  const ScopedPasses counted;
  passes.failingCall = 1;
  EXPECT_EQ("", stringf("%d", 1));
  EXPECT_EQ(1, passes.calls);
}

TEST(Vstringf, IsEmptyWhenOnlyTheSecondPassFails) {
  const std::string text(200, 'x');
  const ScopedPasses counted;
  passes.failingCall = 2;
  EXPECT_EQ("", stringf("%s", text.c_str()));
  EXPECT_EQ(2, passes.calls);
}

TEST(Vstringf, HasTheLengthThatTheSecondPassReports) {
  const std::string text(200, 'x');
  const ScopedPasses counted;
  passes.secondLonger = 50; // a longer text would be cut to the first length and padded
  EXPECT_EQ(text + std::string(50, '\0'), stringf("%s", text.c_str()));
  passes = {};
  passes.counts = true;
  passes.secondLonger = -50;
  EXPECT_EQ(std::string(150, 'x'), stringf("%s", text.c_str()));
}

} // namespace

extern "C" __attribute__((format(printf, 3, 0))) int vsnprintf(char *out, std::size_t size,
                                                               const char *format, va_list args) {
  static auto *const real =
      KovaTest::realFunction<int(char *, std::size_t, const char *, va_list)>("vsnprintf");
  if (!passes.counts) {
    return real(out, size, format, args);
  }
  if (passes.calls == 0) {
    passes.firstBufferWasZero = std::all_of(out, out + size, [](char c) { return c == '\0'; });
  }
  passes.sizes[passes.calls % 4] = size;
  ++passes.calls;
  if (passes.calls == passes.failingCall) {
    errno = EILSEQ;
    return -1;
  }
  return real(out, size, format, args) + (passes.calls == 2 ? passes.secondLonger : 0);
}
