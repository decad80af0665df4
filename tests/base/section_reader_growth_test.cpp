// How the work of reading grows with the file, counted without a clock: the basic blocks that the
// reader's code enters, and the bytes that memchr and memmove look at for it. Hostile files must
// not cost more than their size explains, even if each read returns little.

#include "base/section_reader.h"

#include "base/unique_fd.h"
#include "tests/path/filter/path_filter_steps.h"
#include "tests/support/fault.h"

#include <algorithm>
#include <cstring>
#include <functional>
#include <gtest/gtest.h>
#include <ostream>
#include <string>
#include <sys/mman.h>
#include <unistd.h>

using KOVA::Base::SectionReader;
using KOVA::Base::UniqueFd;
using KovaTest::stepsOf;
using Read = SectionReader::Read;

extern "C" {

void *__real_memchr(const void *text, int c, size_t size);
void *__real_memmove(void *to, const void *from, size_t size);

void *__wrap_memchr(const void *text, int c, size_t size) {
  void *const found = __real_memchr(text, c, size);
  const auto *const begin = static_cast<const char *>(text);
  KovaTest::steps +=
      found == nullptr ? size : static_cast<size_t>(static_cast<const char *>(found) - begin);
  return found;
}

void *__wrap_memmove(void *to, const void *from, size_t size) {
  KovaTest::steps += size;
  return __real_memmove(to, from, size);
}

ssize_t read(int fd, void *buf, size_t size) {
  static auto *const real = KovaTest::realFunction<ssize_t(int, void *, size_t)>("read");
  return real(fd, buf, std::min(size, size_t{100}));
}
}

namespace {

std::string repeated(const std::string &text, std::size_t size) {
  std::string all;
  while (all.size() < size) {
    all += text;
  }
  return all;
}

struct Case {
  const char *name;
  std::function<std::string(std::size_t)> file; // of about that size
};

void PrintTo(const Case &c, std::ostream *os) {
  *os << c.name;
}

// A text in front of many copies of another one.
Case many(const char *name, const std::string &begin, const std::string &unit) {
  return {name, [begin, unit](std::size_t size) { return begin + repeated(unit, size); }};
}

void readAllNames(SectionReader &reader) {
  std::string_view line;
  while (reader.nextHeader(line) == Read::Line) {
  }
}

void readSection(SectionReader &reader) {
  std::string_view line;
  if (reader.findSection("s") == Read::Line) {
    while (reader.nextInSection(line) == Read::Line) {
    }
  }
}

std::uint64_t workOf(const std::string &text, void (*job)(SectionReader &)) {
  const UniqueFd file(::memfd_create("conf", MFD_CLOEXEC));
  EXPECT_EQ(static_cast<ssize_t>(text.size()), ::pwrite(file.get(), text.data(), text.size(), 0));
  SectionReader reader(file.get(), 64);
  return stepsOf([&] { job(reader); });
}

class SectionReaderGrowth : public testing::TestWithParam<Case> {};

} // namespace

TEST_P(SectionReaderGrowth, IsLinear) {
  constexpr std::size_t kSize = 50000;
  for (void (*const job)(SectionReader &) : {readAllNames, readSection}) {
    const std::uint64_t small = workOf(GetParam().file(kSize), job);
    const std::uint64_t large = workOf(GetParam().file(8 * kSize), job);
    EXPECT_GE(9 * small, large);
    EXPECT_GE(30 * 8 * kSize, large);
  }
}

INSTANTIATE_TEST_SUITE_P(
    Files, SectionReaderGrowth,
    testing::Values(many("one line", "", "x"), many("NUL bytes", "", std::string(1, '\0')),
                    many("blanks", "", " "), many("carriage returns", "", "\r"),
                    many("line feeds", "", "\n"), many("brackets", "", "["),
                    many("brackets within a line", "x", "["), many("blanks and brackets", "", " ["),
                    many("lines of blanks", "", "        \n"), many("headers", "", "[t]\n"),
                    many("broken headers", "", "[s\n"), many("a long header", "[s", "x"),
                    many("blanks behind the header", "[s]", " "),
                    many("almost the header", "[s]", "        x"),
                    many("a long line of the section", "[s]\n", "x"),
                    many("blanks in the section", "[s]\n", " "),
                    many("a line behind the section", "[s]\n[", "x"),
                    many("options", "[s]\n", "key=1\n"), many("sections", "", "[t]\nkey=[1]\n")));
