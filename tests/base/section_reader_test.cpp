// Reading in blocks, compared with reading line by line. The blocks are so small that every byte of
// a line is the first or the last one of a block.

#include "base/section_reader.h"

#include "base/unique_fd.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/fault.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <sys/mman.h>
#include <unistd.h>
#include <vector>

using namespace KovaTest;
using KOVA::Base::SectionReader;
using KOVA::Base::UniqueFd;
using Read = SectionReader::Read;

namespace {

// A read returns no more than so many bytes at a time.
std::size_t mostRead = SIZE_MAX;

UniqueFd fileOf(const std::string &text) {
  UniqueFd file(::memfd_create("conf", MFD_CLOEXEC));
  EXPECT_EQ(static_cast<ssize_t>(text.size()), ::pwrite(file.get(), text.data(), text.size(), 0));
  return file;
}

// What a reader returned, one entry for each call; the last one is "end" or "error".
using Answers = std::vector<std::string>;

std::string last(Read read) {
  return read == Read::End ? "end" : "error";
}

// The rules once more, in the plainest possible code.
std::string trimmed(std::string text) {
  const std::string blanks = " \t\n\r";
  while (!text.empty() && blanks.find(text.back()) != std::string::npos) {
    text.pop_back();
  }
  while (!text.empty() && blanks.find(text.front()) != std::string::npos) {
    text.erase(0, 1);
  }
  return text;
}

// The lines of a text by getline, each of them complete, and trimmed.
class PlainLines {
public:
  // Reading fails after so many bytes.
  PlainLines(const std::string &text, std::size_t failAt)
      : text_(text), failAt_(failAt), file_(::fmemopen(text_.data(), text_.size(), "r")) {}
  ~PlainLines() { std::free(buffer_); }
  PlainLines(const PlainLines &) = delete;
  PlainLines &operator=(const PlainLines &) = delete;

  Read next(std::string &line) {
    const ssize_t length = file_ ? ::getline(&buffer_, &size_, file_.get()) : -1;
    const std::size_t raw = length > 0 ? static_cast<std::size_t>(length) : 0;
    at_ += raw;
    const bool ended = raw == 0 || buffer_[raw - 1] != '\n'; // seen only by one more read
    if (ended ? failAt_ <= text_.size() : failAt_ < at_) {
      return Read::Error;
    }
    line = trimmed({buffer_, raw});
    return raw == 0 ? Read::End : Read::Line;
  }

private:
  struct Close {
    void operator()(std::FILE *file) const { (void)std::fclose(file); }
  };
  std::string text_;
  std::size_t failAt_;
  std::unique_ptr<std::FILE, Close> file_; // none for an empty text
  char *buffer_ = nullptr;
  std::size_t size_ = 0;
  std::size_t at_ = 0;
};

Answers plainHeaders(const std::string &text, std::size_t failAt) {
  PlainLines lines(text, failAt);
  Answers answers;
  std::string line;
  Read read = Read::Line;
  while ((read = lines.next(line)) == Read::Line) {
    if (line.substr(0, 1) == "[") {
      answers.push_back(line);
    }
  }
  answers.push_back(last(read));
  return answers;
}

Answers plainSection(const std::string &text, const std::string &name, std::size_t failAt) {
  PlainLines lines(text, failAt);
  Answers answers;
  std::string line;
  Read read = Read::Line;
  bool inside = false;
  while ((read = lines.next(line)) == Read::Line) {
    if (!inside) {
      inside = line.size() == name.size() + 2 && line[0] == '[' &&
               line.substr(1, line.size() - 2) == name;
      if (inside) {
        answers.emplace_back("found");
      }
    } else if (line.substr(0, 1) == "[") {
      read = Read::End;
      break;
    } else if (!line.empty()) {
      answers.push_back(line);
    }
  }
  answers.push_back(last(read));
  return answers;
}

Answers headers(const std::string &text, std::size_t blockBytes) {
  const UniqueFd file = fileOf(text);
  SectionReader reader(file.get(), blockBytes);
  Answers answers;
  std::string_view line;
  Read read = Read::Line;
  while ((read = reader.nextHeader(line)) == Read::Line) {
    answers.push_back(trimmed(std::string(line)));
    EXPECT_EQ('[', line.front());
  }
  answers.push_back(last(read));
  return answers;
}

Answers section(const std::string &text, const std::string &name, std::size_t blockBytes) {
  const UniqueFd file = fileOf(text);
  SectionReader reader(file.get(), blockBytes);
  Answers answers;
  std::string_view line;
  Read read = reader.findSection(name);
  if (read == Read::Line) {
    answers.emplace_back("found");
    while ((read = reader.nextInSection(line)) == Read::Line) {
      answers.push_back(trimmed(std::string(line)));
    }
  }
  answers.push_back(last(read));
  return answers;
}

std::string rest(const std::string &text, std::size_t blockBytes) {
  const UniqueFd file = fileOf(text);
  SectionReader reader(file.get(), blockBytes);
  std::string_view all;
  EXPECT_EQ(Read::Line, reader.takeRest(all));
  return std::string(all);
}

std::string randomText(std::mt19937 &random) {
  static const std::string pieces[] = {"\n",
                                       "\n",
                                       "\n",
                                       "\r\n",
                                       "\r",
                                       " ",
                                       "\t",
                                       "[",
                                       "]",
                                       "[s]",
                                       "[s]\n",
                                       "\n[s]\n",
                                       "\n[s] ",
                                       "[s]x",
                                       "[sx\n",
                                       "\n[",
                                       "[other",
                                       "\n[longer name]\n",
                                       "a=1\n",
                                       "b",
                                       "=",
                                       "#",
                                       "# [s]",
                                       "\v[s]",
                                       "\f",
                                       "a=[1]",
                                       "l=[\"x\"]\n",
                                       std::string(1, '\0'),
                                       std::string("[\0]\n", 4),
                                       std::string(40, ' '),
                                       std::string(40, 'x'),
                                       "\n[s]" + std::string(40, ' ')};
  std::string text;
  for (auto count = random() % 24; count > 0; --count) {
    text += pieces[random() % std::size(pieces)];
  }
  return text;
}

} // namespace

extern "C" ssize_t read(int fd, void *buf, size_t size) {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("read");
  return failsNow("read") ? -1 : real(fd, buf, std::min(size, mostRead));
}

TEST(SectionReader, AgreesWithReadingLineByLine) {
  constexpr unsigned kSeed = 20261122;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  std::mt19937 random(kSeed);
  const std::string names[] = {"s",  "other", "longer name", std::string(1, '\0'), "[", "",
                               "sx", "s]",    " s"};
  for (int round = 0; round < 5000 && !testing::Test::HasFailure(); ++round) {
    const std::string text = randomText(random);
    const std::string &name = names[random() % std::size(names)];
    const std::size_t block = round % 8 == 0 ? SectionReader::kBlockBytes : 1 + random() % 40;
    mostRead = round % 3 == 0 ? 1 + random() % 9 : SIZE_MAX;
    SCOPED_TRACE(testing::Message() << testing::PrintToString(text) << " by " << block);
    ASSERT_EQ(plainHeaders(text, SIZE_MAX), headers(text, block));
    ASSERT_EQ(plainSection(text, name, SIZE_MAX), section(text, name, block)) << name;
    ASSERT_EQ(text, rest(text, block));
  }
  mostRead = SIZE_MAX;
}

// An error counts only when the bytes behind it are needed, as it would line by line.
TEST(SectionReader, AgreesWithReadingLineByLineUntilAnError) {
  std::mt19937 random(4711);
  mostRead = 1;
  for (int round = 0; round < 5000 && !testing::Test::HasFailure(); ++round) {
    const std::string text = (round % 2 == 0 ? "[s]\n" : "") + randomText(random);
    const std::size_t failAt = random() % (text.size() + 2);
    const std::size_t block = 1 + random() % 40;
    SCOPED_TRACE(testing::Message() << testing::PrintToString(text) << " until " << failAt);
    {
      const Fault fault("read", static_cast<int>(failAt) + 1, EIO);
      ASSERT_EQ(plainHeaders(text, failAt), headers(text, block));
    }
    const Fault fault("read", static_cast<int>(failAt) + 1, EIO);
    ASSERT_EQ(plainSection(text, "s", failAt), section(text, "s", block));
  }
  mostRead = SIZE_MAX;
}

TEST(SectionReader, ReadsNoFurtherThanAsked) {
  const std::string text = "[s]\na=1\n[t]\n" + std::string(3 * SectionReader::kBlockBytes, 'x');
  const UniqueFd file = fileOf(text);
  SectionReader reader(file.get());
  std::string_view line;
  EXPECT_EQ(Read::Line, reader.findSection("s"));
  EXPECT_EQ(Read::Line, reader.nextInSection(line));
  EXPECT_EQ("a=1\n", line);
  EXPECT_EQ(Read::End, reader.nextInSection(line));
  EXPECT_EQ(static_cast<off_t>(SectionReader::kBlockBytes), ::lseek(file.get(), 0, SEEK_CUR));
}

TEST(SectionReader, ReadsOnBehindTheSection) {
  const UniqueFd file = fileOf("[s]\na=1\n[t]\n[u]\nb=2\n");
  SectionReader reader(file.get());
  std::string_view line;
  EXPECT_EQ(Read::Line, reader.findSection("s"));
  EXPECT_EQ(Read::Line, reader.nextInSection(line));
  EXPECT_EQ(Read::End, reader.nextInSection(line));
  EXPECT_EQ(Read::Line, reader.nextHeader(line));
  EXPECT_EQ("[u]\n", line);
  EXPECT_EQ(Read::Line, reader.takeRest(line));
  EXPECT_EQ("b=2\n", line);
}

TEST(SectionReader, HoldsNoLineThatIsNotWanted) {
  const std::string filler(10 * SectionReader::kBlockBytes, 'x');
  const std::string blanks(10 * SectionReader::kBlockBytes, ' ');
  for (const std::string &other :
       {filler, "[" + filler + "]", blanks + "x", blanks + "[t]", "[t]" + blanks,
        "[s]" + blanks + "x", "[s" + blanks + "]", "# " + filler}) {
    (void)takeReallocSize();
    EXPECT_EQ((Answers{"found", "a=1", "end"}),
              section(other + "\n[s]" + blanks + "\na=1\n" + blanks + "[next" + filler, "s",
                      SectionReader::kBlockBytes))
        << other.substr(0, 5);
    EXPECT_EQ(SectionReader::kBlockBytes, takeReallocSize()) << other.substr(0, 5);
  }
}

// The end of a line that is not wanted comes in another block than its beginning.
TEST(SectionReader, TakesNoEndOfALineForAHeader) {
  const std::string text = "xxxxx[\n[s]\n";
  for (std::size_t block = 1; block <= text.size(); ++block) {
    EXPECT_EQ((Answers{"[s]", "end"}), headers(text, block)) << block;
  }
}

TEST(SectionReader, HoldsALineThatIsWanted) {
  const std::string text(10 * SectionReader::kBlockBytes, 'x');
  EXPECT_EQ((Answers{"found", text, "end"}),
            section("[s]\n" + text + "\n", "s", SectionReader::kBlockBytes));
  EXPECT_EQ((Answers{"[" + text + "]", "end"}),
            headers("[" + text + "]\n", SectionReader::kBlockBytes));
  EXPECT_EQ((Answers{"found", "end"}),
            section("[" + text + "]\n", text, SectionReader::kBlockBytes));
}

TEST(SectionReader, ReportsThatMemoryRanOut) {
  const UniqueFd file = fileOf("[long name]\n");
  {
    const Fault fault("realloc", 1, ENOMEM);
    EXPECT_FALSE(SectionReader(file.get()));
  }
  SectionReader reader(file.get(), 4);
  EXPECT_TRUE(reader);
  std::string_view line;
  const Fault fault("realloc", 1, ENOMEM);
  EXPECT_EQ(Read::Error, reader.nextHeader(line));
  EXPECT_EQ(ENOMEM, errno);
}

TEST(SectionReader, ReadsOnWhenASignalInterrupts) {
  const UniqueFd file = fileOf("[s]\n");
  SectionReader reader(file.get());
  const Fault fault("read", 1, EINTR);
  EXPECT_EQ(Read::Line, reader.findSection("s"));
  EXPECT_TRUE(fault.fired());
}
