// Reading a section: what counts as header, option, white space and comment, and what every failure
// leaves behind.

#include "base/json_text.h"
#include "base/unique_fd.h"
#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"
#include "tests/support/lease.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <fcntl.h>
#include <fstream>
#include <gmock/gmock.h>
#include <json/value.h>
#include <locale>
#include <random>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace {

class SectionLoad : public PlatformTest {
protected:
  // The options of section "task12" of a file with that content, as JSON; "false" when not found.
  std::string read(const std::string &content) {
    const std::string path = writeFile(dir_ / "conf", content);
    return map_.optSectionLoad(path, "task", 12) ? map_.optToJsonString() : "false";
  }

  // What a failed load leaves: bound, not loaded, no values.
  void expectBoundOnly() {
    EXPECT_FALSE(map_.optIsLoaded());
    EXPECT_EQ("task12", map_.optSectionGetName());
    EXPECT_EQ(12, map_.optSectionGetId());
    EXPECT_EQ("{}", map_.optToJsonString());
  }

  TestFolder dir_;
  LogCapture log_;
  OptionMap map_;
};

class SectionLoadFailure : public SectionLoad {
protected:
  SectionLoadFailure() { map_.optSet("before", 1); }
};

// A read returns no more than so many bytes at a time.
std::size_t mostRead = SIZE_MAX;

class ShortReads {
public:
  explicit ShortReads(std::size_t most) { mostRead = most; }
  ~ShortReads() { mostRead = SIZE_MAX; }
  ShortReads(const ShortReads &) = delete;
  ShortReads &operator=(const ShortReads &) = delete;
};

LogLine lost(const std::string &key, const std::string &value, const std::string &path) {
  return errLine("option_map", 508,
                 "json load failed key(" + key + ") value(" + value + ") out(null) form " + path);
}

std::string nested(std::size_t depth) {
  return std::string(depth, '[') + std::string(depth, ']');
}

} // namespace

extern "C" ssize_t read(int fd, void *buf, size_t size) {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("read");
  return failsNow("read") ? -1 : real(fd, buf, std::min(size, mostRead));
}

TEST_F(SectionLoad, FindsTheSectionOfThePrefixAndId) {
  const std::string path = writeFile(dir_ / "conf", "[task1]\na=\"x\"\n[task12]\nb=5\n");
  EXPECT_TRUE(map_.optSectionLoad(path, "task", 12));
  EXPECT_EQ(R"({"b":5})", map_.optToJsonString());
  EXPECT_EQ("task12", map_.optSectionGetName());
  EXPECT_EQ(12, map_.optSectionGetId());
  EXPECT_TRUE(map_.optSectionLoad(path, "task1", -1));
  EXPECT_EQ(R"({"a":"x"})", map_.optToJsonString());
  EXPECT_EQ("task1", map_.optSectionGetName());
  EXPECT_EQ(-1, map_.optSectionGetId());
  EXPECT_TRUE(map_.optIsLoaded());
}

TEST_F(SectionLoad, TakesAnyIdBelowZeroForNone) {
  const std::string path = writeFile(dir_ / "conf", "[task]\na=1\n[task-5]\nb=1\n[task0]\nc=1\n");
  EXPECT_TRUE(map_.optSectionLoad(path, "task", -5));
  EXPECT_EQ(R"({"a":1})", map_.optToJsonString());
  EXPECT_EQ(-5, map_.optSectionGetId());
  EXPECT_TRUE(map_.optSectionLoad(path, "task", 0));
  EXPECT_EQ(R"({"c":1})", map_.optToJsonString());
  EXPECT_EQ(0, map_.optSectionGetId());
}

TEST_F(SectionLoad, AnIdCanStandWithoutAPrefix) {
  EXPECT_TRUE(map_.optSectionLoad(writeFile(dir_ / "conf", "[2147483647]\na=1\n"), "", 2147483647));
  EXPECT_EQ("2147483647", map_.optSectionGetName());
}

TEST_F(SectionLoad, ReadsEveryType) {
  EXPECT_EQ(
      R"({"b":true,"i":-3,"l":["x","y"],"n":null,"o":{"k":1},"r":1.5,"s":"a b"})",
      read("[task12]\ns=\"a b\"\ni=-3\nb=true\nl=[\"x\",\"y\"]\nn=null\nr=1.5\no={\"k\":1}\n"));
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionLoad, SplitsAtTheFirstEqualsSign) {
  EXPECT_EQ(R"({"a":"b=c=d"})", read("[task12]\na=\"b=c=d\"\n"));
}

TEST_F(SectionLoad, TrimsTheFourBlanksEverywhere) {
  EXPECT_EQ(R"({"colour":"y z"})", read(" \t[task12]\r \n\t colour \t= \t\"y z\" \t\r\n"));
}

TEST_F(SectionLoad, NoOtherCharacterIsABlank) {
  EXPECT_EQ("{\"\\u000ba\\f\":1}", read("[task12]\n\va\f=1\n"));
  EXPECT_EQ("false", read("\v[task12]\na=1\n"));
  EXPECT_EQ("false", read(std::string("\0[task12]\na=1\n", 14)));
}

TEST_F(SectionLoad, SkipsCommentsAndLinesWithoutEquals) {
  EXPECT_EQ(
      R"({"a":1,"b#":2})",
      read("[task12]\n# comment\n#d=1\n  # e = 2\n\n  \na=1\nnothing\nb#=2\n=\n" + std::string()));
  EXPECT_THAT(log_.take(), ElementsAre(lost("", "", dir_ / "conf")));
}

TEST_F(SectionLoad, ALineMayHaveAnEmptyKey) {
  EXPECT_EQ(R"({"":5})", read("[task12]\n = 5\n"));
}

TEST_F(SectionLoad, EndsAtTheNextLineThatBeginsWithABracket) {
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\n[next]\nb=2\n"));
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\n  [ not a header\nb=2\n"));
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\n[x=3\nb=2\n"));
}

TEST_F(SectionLoad, ReadsTheFirstSectionOfThatName) {
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\n[task12]\na=2\n"));
}

TEST_F(SectionLoad, TheLastOfEqualKeysCounts) {
  EXPECT_EQ(R"({"a":3,"b":1})", read("[task12]\na=1\nb=1\na=[2]\n a =3\n"));
}

TEST_F(SectionLoad, TheTextBeforeTheFirstHeaderBelongsToNone) {
  EXPECT_EQ(R"({"b":2})", read("a=1\n[task12]\nb=2\n"));
}

TEST_F(SectionLoad, TheLastCharacterOfAHeaderIsNotExamined) {
  EXPECT_EQ(R"({"a":1})", read("[task12x\na=1\n"));
  EXPECT_EQ(R"({"a":1})", read("[task12[\na=1\n"));
}

TEST_F(SectionLoad, AHeaderHasExactlyTheNamesLength) {
  for (const char *header :
       {"[task12", "[task123]", "[task1]", "[Task12]", "[task12 ]", "[ task12]", "[task12]]",
        "task12]", "x[task12]", "[task12]x", "[]", "[", "[task1"}) {
    EXPECT_EQ("false", read(std::string(header) + "\na=1\n")) << header;
  }
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionLoad, ABracketMayStandInTheName) {
  const std::string path = writeFile(dir_ / "conf", "[a]b]\nx=1\n");
  EXPECT_TRUE(map_.optSectionLoad(path, "a]b", -1));
  EXPECT_EQ(R"({"x":1})", map_.optToJsonString());
}

TEST_F(SectionLoad, ASectionWithoutOptionsLoadsEmpty) {
  EXPECT_EQ("{}", read("[task12]\n"));
  EXPECT_EQ("{}", read("[task12]"));
  EXPECT_EQ("{}", read("[task12]\n[next]\n"));
  EXPECT_TRUE(map_.optIsLoaded());
}

TEST_F(SectionLoad, TheLastLineNeedsNoLineEnd) {
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1"));
}

TEST_F(SectionLoad, ReadsFilesWithCarriageReturns) {
  EXPECT_EQ(R"({"a":"x","b":[1]})", read("[task12]\r\na=\"x\"\r\n\r\nb=[1]\r\n[next]\r\n"));
}

TEST_F(SectionLoad, NulBytesAreText) {
  EXPECT_EQ("{\"a\\u0000b\":\"c\\u0000d\"}", read(std::string("[task12]\na\0b=\"c\0d\"\n", 19)));
}

TEST_F(SectionLoad, ANulByteAfterAValueMakesItBad) {
  EXPECT_EQ(R"({"b":2})", read(std::string("[task12]\na=1\0\nb=2\n", 18)));
  EXPECT_THAT(log_.take(), ElementsAre(lost("a", "1", dir_ / "conf")));
}

TEST_F(SectionLoad, LinesHaveAnyLength) {
  const std::string key(100000, 'k');
  const std::string text(3000000, 'x');
  EXPECT_EQ("{\"" + key + "\":\"" + text + "\"}",
            read("#" + text + "\n[task12]\n" + key + "=\"" + text + "\"\n"));
}

TEST_F(SectionLoad, ABadValueLosesOnlyItself) {
  const std::string path = dir_ / "conf";
  EXPECT_EQ(R"({"a":1,"f":2})", read("[task12]\na=1\n e = oops \ng=\nh=1 2\ni=[1,]\nj=\"x\nf=2\n"));
  EXPECT_THAT(log_.take(),
              ElementsAre(lost("e", "oops", path), lost("g", "", path), lost("h", "1 2", path),
                          lost("i", "[1,]", path), lost("j", "\"x", path)));
  EXPECT_TRUE(map_.optIsLoaded());
}

TEST_F(SectionLoad, ABadValueLeavesAnEarlierOneOfItsKey) {
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\na=oops\n"));
  EXPECT_THAT(log_.take(), ElementsAre(lost("a", "oops", dir_ / "conf")));
}

// A value can be nested so deeply that it is JSON by itself but not inside the object of all
// options. The other options must not be lost with it.
TEST_F(SectionLoad, AValueTooDeepForAnObjectLosesOnlyItself) {
  const std::string path = dir_ / "conf";
  EXPECT_EQ("{\"a\":1,\"ok\":" + nested(999) + "}",
            read("[task12]\na=1\ndeep=" + nested(1000) + "\nok=" + nested(999) + "\n"));
  EXPECT_THAT(log_.take(), ElementsAre(lost("deep", nested(1000), path)));
  const std::string object = "{\"o\":" + nested(999) + "}";
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\ndeep=" + object + "\n"));
  EXPECT_THAT(log_.take(), ElementsAre(lost("deep", object, path)));
}

TEST_F(SectionLoad, EndlessNestingLosesOnlyItself) {
  const std::string endless(200000, '[');
  EXPECT_EQ(R"({"a":1})", read("[task12]\ndeep=" + endless + "\na=1\n"));
  EXPECT_THAT(log_.take(), ElementsAre(lost("deep", endless, dir_ / "conf")));
}

TEST_F(SectionLoad, ForgetsWhatTheMapHeld) {
  map_.optSet("gone", 1);
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\n"));
}

TEST_F(SectionLoad, FollowsALink) {
  const std::string path = writeFile(dir_ / "conf", "[task12]\na=1\n");
  ASSERT_EQ(0, ::symlink(path.c_str(), (dir_ / "link").c_str()));
  EXPECT_TRUE(map_.optSectionLoad(dir_ / "link", "task", 12));
}

// A file may have a hundred thousand sections above the one that is sought.
TEST_F(SectionLoad, TakesNoMemoryForTheLinesAboveTheSection) {
  const auto allocations = [&](int linesAbove) {
    std::string content;
    for (int line = 0; line < linesAbove; ++line) {
      content += "[another section]\nand=\"an option of it, with a text of some length\"\n";
    }
    const std::string path = writeFile(dir_ / "conf", content + "[task12]\na=1\n");
    int count = 0;
    forEachAllocation([&] { (void)map_.optSectionLoad(path, "task", 12); }, [&](bool) { ++count; });
    return count;
  };
  (void)allocations(0); // whatever the first load makes for the thread
  EXPECT_EQ(allocations(1), allocations(500));
}

// When a number was refused on the second reading, all other options were lost, and a later save
// removed them from the file.
TEST_F(SectionLoad, ReadsNumbersUnderALocaleWithADecimalComma) {
  struct Comma : std::numpunct<char> {
    char do_thousands_sep() const override { return '.'; }
    std::string do_grouping() const override { return "\3"; }
    char do_decimal_point() const override { return ','; }
  };
  const std::locale before = std::locale::global({std::locale(), new Comma});
  const std::string read = this->read("[task12]\nkeep=\"x\"\nr=1.500\nt=1e3\n");
  std::locale::global(before);
  EXPECT_EQ(R"({"keep":"x","r":1.5,"t":1000.0})", read);
}

// Files of 64 MB, most of it holes: one line of each kind that is not wanted.
TEST_F(SectionLoad, TakesNoMemoryForLinesOfOtherSections) {
  constexpr off_t kLineBytes = off_t{64} << 20;
  const std::string end = "\n[task12]\na=1\n";
  for (const char *begin : {"a=", "[", "[other]\na=", "#"}) {
    const std::string path = writeFile(dir_ / "conf", begin);
    ASSERT_EQ(0, ::truncate(path.c_str(), kLineBytes));
    std::ofstream(path, std::ios::app) << end;
    (void)takeReallocSize();
    EXPECT_TRUE(map_.optSectionLoad(path, "task", 12)) << begin;
    EXPECT_EQ(R"({"a":1})", map_.optToJsonString());
    EXPECT_GE(std::size_t{1} << 17, takeReallocSize()) << begin;
  }
}

// The census fails the test if the file stays open.
TEST_F(SectionLoadFailure, LeavesNoValuesWhenMemoryRunsOut) {
  const std::string path = writeFile(
      dir_ / "conf", "[task12]\na key that is long=\"and a text that is long as well\"\nr=1.5\n");
  map_ = OptionMap();
  EXPECT_TRUE(map_.optSectionLoad(path, "task", 12)); // creates the reader of this thread
  forEachAllocation([&] { EXPECT_TRUE(map_.optSectionLoad(path, "task", 12)); },
                    [&](bool threw) {
                      EXPECT_EQ(!threw, map_.optIsLoaded());
                      EXPECT_EQ(threw ? 0 : 1, map_.optString("a key that is long", "") != "");
                      EXPECT_EQ(threw ? "" : "1.5", map_.optString("r", ""));
                    });
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionLoad, TakesNoLock) {
  ASSERT_TRUE(map_.setLockToken("load"));
  const Fault fault("flock", 1, EIO);
  EXPECT_EQ("{}", read("[task12]\n"));
  EXPECT_EQ(0, fault.calls());
}

TEST_F(SectionLoadFailure, OfAMissingFileIsSilentAndBinds) {
  EXPECT_FALSE(map_.optSectionLoad(dir_ / "absent", "task", 12));
  expectBoundOnly();
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionLoadFailure, OfAMissingSectionIsSilentAndBinds) {
  EXPECT_EQ("false", read("[task1]\na=1\n"));
  expectBoundOnly();
  EXPECT_EQ("false", read(""));
  expectBoundOnly();
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionLoadFailure, AfterASuccessIsNotLoadedAnyMore) {
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\n"));
  EXPECT_FALSE(map_.optSectionLoad(dir_ / "absent", "task", 12));
  expectBoundOnly();
}

TEST_F(SectionLoadFailure, WithoutANameSaysSo) {
  EXPECT_FALSE(map_.optSectionLoad("/conf", "", -1));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 625, "invalid sec [/conf][]")));
  EXPECT_EQ("{}", map_.optToJsonString());
  EXPECT_EQ("", map_.optSectionGetName());
  EXPECT_EQ(-1, map_.optSectionGetId());
  EXPECT_FALSE(map_.optIsLoaded());
}

TEST_F(SectionLoadFailure, WithoutAPathSaysSo) {
  EXPECT_FALSE(map_.optSectionLoad("", "task", 12));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 625, "invalid sec [][task]")));
  EXPECT_EQ("", map_.optSectionGetName()) << "unbound";
  EXPECT_EQ(-1, map_.optSectionGetId()) << "unbound";
}

TEST_F(SectionLoadFailure, OfADirectoryIsAReadError) {
  EXPECT_FALSE(map_.optSectionLoad("/tmp", "task", 12));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 476, "getline [/tmp]: Is a directory")));
  expectBoundOnly();
}

TEST_F(SectionLoadFailure, OfAFifoWithoutAWriterDoesNotHang) {
  const std::string path = dir_ / "fifo";
  ASSERT_EQ(0, ::mkfifo(path.c_str(), 0600));
  EXPECT_FALSE(map_.optSectionLoad(path, "task", 12));
  EXPECT_THAT(log_.take(), IsEmpty());
  expectBoundOnly();
}

TEST_F(SectionLoadFailure, OfAFifoWithASilentWriterDoesNotHang) {
  const std::string path = dir_ / "fifo";
  ASSERT_EQ(0, ::mkfifo(path.c_str(), 0600));
  const int writer = ::open(path.c_str(), O_RDWR | O_CLOEXEC);
  EXPECT_FALSE(map_.optSectionLoad(path, "task", 12));
  ::close(writer);
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 476,
                                  "getline [" + path + "]: Resource temporarily unavailable")));
}

// A device may have no end. So it is not read at all.
TEST_F(SectionLoadFailure, OfADeviceIsSilentAndReadsNothing) {
  const Fault fault("read", 1, EIO);
  for (const char *device : {"/dev/zero", "/dev/null"}) {
    EXPECT_FALSE(map_.optSectionLoad(device, "task", 12)) << device;
    expectBoundOnly();
  }
  EXPECT_EQ(0, fault.calls());
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionLoadFailure, OfASocketIsSilent) {
  const std::string path = dir_ / "socket";
  const KOVA::Base::UniqueFd server(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  struct sockaddr_un address = {AF_UNIX, {}};
  ASSERT_GT(sizeof address.sun_path, path.size());
  path.copy(address.sun_path, path.size());
  ASSERT_EQ(0, ::bind(server.get(), reinterpret_cast<const sockaddr *>(&address), sizeof address));
  EXPECT_FALSE(map_.optSectionLoad(path, "task", 12));
  EXPECT_THAT(log_.take(), IsEmpty());
  expectBoundOnly();
}

// The rest of the line cannot be read, and then the file ends. The beginning of the line must not
// count as a value that is not JSON.
TEST_F(SectionLoadFailure, HalfALineIsNoLine) {
  const std::string path = writeFile(dir_ / "conf", "[task12]\na=1\nb=\"x");
  const Fault passing("read", 2, EIO);
  EXPECT_FALSE(map_.optSectionLoad(path, "task", 12));
  EXPECT_TRUE(passing.fired());
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 515,
                                               "getline [" + path + "]: Input/output error")));
  expectBoundOnly();
}

TEST_F(SectionLoadFailure, OfAnUnreadableFileIsSilent) {
  const std::string path = writeFile(dir_ / "conf", "[task12]\n");
  for (const int error : {EACCES, EMFILE, ELOOP}) {
    const Fault fault("open", 1, error);
    EXPECT_FALSE(map_.optSectionLoad(path, "task", 12));
    EXPECT_TRUE(fault.fired());
    expectBoundOnly();
  }
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionLoadFailure, OfABufferIsSilentAndClosesTheFile) {
  const std::string path = writeFile(dir_ / "conf", "[task12]\n");
  const Fault fault("realloc", 1, ENOMEM);
  EXPECT_FALSE(map_.optSectionLoad(path, "task", 12));
  EXPECT_TRUE(fault.fired());
  EXPECT_THAT(log_.take(), IsEmpty());
  expectBoundOnly();
}

TEST_F(SectionLoadFailure, WithoutMemoryForALineSaysWhere) {
  const std::string longText(100000, 'x');
  const std::string path =
      writeFile(dir_ / "conf", "[task12]\na=1\nb=\"" + longText + "\"\n[" + longText + "]\n");
  {
    const Fault fault("realloc", 2, ENOMEM);
    EXPECT_FALSE(map_.optSectionLoad(path, "task", 12));
    EXPECT_TRUE(fault.fired());
    expectBoundOnly();
  }
  const Fault fault("realloc", 2, ENOMEM);
  EXPECT_FALSE(map_.optSectionLoad(path, longText, -1));
  EXPECT_TRUE(fault.fired());
  const std::string message = "getline [" + path + "]: Cannot allocate memory";
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 515, message),
                                       errLine("option_map", 476, message)));
}

// Each call of read fails in turn, however little the earlier ones have returned.
TEST_F(SectionLoadFailure, WhileReadingSaysWhere) {
  const std::string above = "# 1\n[task12]\n";
  const std::string path = writeFile(dir_ / "conf", above + "a=1\nb=2\n");
  for (const std::size_t most : {1U, 2U, 5U, 13U, 1000U}) {
    const ShortReads reads(most);
    int clean = 0;
    forEachFailure("read", EIO, [&](Fault &fault) {
      const bool found = map_.optSectionLoad(path, "task", 12);
      const auto lines = log_.take();
      if (!fault.fired()) {
        EXPECT_TRUE(found);
        EXPECT_THAT(lines, IsEmpty());
        ++clean;
        return;
      }
      // The header is found as soon as its line has been read.
      const std::size_t before = static_cast<std::size_t>(fault.calls() - 1) * most;
      const int number = before < above.size() ? 476 : 515;
      EXPECT_FALSE(found);
      EXPECT_THAT(lines, ElementsAre(errLine("option_map", number,
                                             "getline [" + path + "]: Input/output error")));
      expectBoundOnly();
    });
    EXPECT_EQ(2, clean);
  }
}

TEST_F(SectionLoad, IsReadThoughASignalInterrupts) {
  const Fault fault("read", 1, EINTR);
  EXPECT_EQ(R"({"a":1})", read("[task12]\na=1\n"));
  EXPECT_TRUE(fault.fired());
}

TEST_F(SectionLoad, WaitsForALease) {
  const std::string path = writeFile(dir_ / "conf", "[task12]\na=1\n");
  LeaseHolder holder(path);
  if (!holder.held()) {
    GTEST_SKIP() << "skipped: no leases on this file system";
  }
  EXPECT_TRUE(map_.optSectionLoad(path, "task", 12));
  EXPECT_TRUE(holder.wasAsked());
}

namespace {

// The rules once more, in the plainest possible code.
std::string plainTrim(std::string text) {
  const auto blank = [](char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; };
  while (!text.empty() && blank(text.back())) {
    text.pop_back();
  }
  while (!text.empty() && blank(text.front())) {
    text.erase(0, 1);
  }
  return text;
}

std::string plainRead(const std::string &content, const std::string &name, std::size_t &bad) {
  std::vector<std::string> lines(1);
  for (const char c : content) {
    lines.back() += c;
    if (c == '\n') {
      lines.emplace_back();
    }
  }
  bool inside = false;
  Json::Value options(Json::objectValue);
  for (const std::string &raw : lines) {
    const std::string line = plainTrim(raw);
    if (!inside) {
      inside = line.size() == name.size() + 2 && line[0] == '[' &&
               line.substr(1, line.size() - 2) == name;
      continue;
    }
    if (!line.empty() && line[0] == '[') {
      break;
    }
    const std::size_t equals = line.find('=');
    if (equals == std::string::npos) {
      continue;
    }
    const std::string key = plainTrim(line.substr(0, equals));
    if (!key.empty() && key[0] == '#') {
      continue;
    }
    Json::Value value;
    if (KOVA::Base::JsonText::fromText(plainTrim(line.substr(equals + 1)), value)) {
      options[key] = value;
    } else {
      ++bad;
    }
  }
  return inside ? KOVA::Base::JsonText::toText(options) : "false";
}

} // namespace

TEST_F(SectionLoad, AgreesWithAPlainReaderOnRandomFiles) {
  constexpr unsigned kSeed = 4711;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  std::mt19937 random(kSeed);
  const std::string pieces[] = {"[",     "]",   "task12", "[task12]",    "[task12x",
                                "\n",    "\n",  "\r\n",   " ",           "\t",
                                "=",     "a",   "b",      "#",           "1",
                                "\"x\"", "[1]", "{}",     "\v",          std::string(1, '\0'),
                                "\xff",  "\"",  "a=1\n",  "\n[task12]\n"};
  for (int round = 0; round < 5000; ++round) {
    std::string content = round % 2 == 0 ? "[task12]\n" : "";
    for (auto count = random() % 30; count > 0; --count) {
      content += pieces[random() % std::size(pieces)];
    }
    std::size_t bad = 0;
    const std::string expected = plainRead(content, "task12", bad);
    ASSERT_EQ(expected, read(content)) << testing::PrintToString(content);
    ASSERT_THAT(log_.take(), SizeIs(bad)) << testing::PrintToString(content);
  }
}
