// Export: the text of each type of value, what is refused, and which failures of the platform are
// handled.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/counting_loop.h"
#include "tests/support/files.h"
#include "tests/support/interpose.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <climits>
#include <cstdarg>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <locale>
#include <sys/stat.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;
using testing::SizeIs;

namespace {

class SectionExport : public PlatformTest {
protected:
  SectionExport() { platform.code = 0x4321; }

  void expectNothingWritten() {
    EXPECT_THAT(platform.setCalls, IsEmpty());
    EXPECT_THAT(platform.addCalls, IsEmpty());
    EXPECT_FALSE(exists());
  }
  void setAnswers(int result, int code) {
    platform.setResult = result;
    platform.setCode = code;
  }
  bool write(bool create) { return map_.optSectionExport(path_, "task1", create); }
  bool exists() const { return ::access(path_.c_str(), F_OK) == 0; }
  std::string setFailed(int result) const {
    return "KLIBCFileSetSection(" + path_ + ", task1)=" + std::to_string(result) + ": ";
  }

  TestFolder dir_;
  std::string path_ = dir_ / "conf";
  LogCapture log_;
  OptionMap map_;
};
class SectionExportCreate : public SectionExport {
protected:
  SectionExportCreate() { map_.optSet("a", 1); }
};

int openedWith = 0; // the flags of the last open

} // namespace

extern "C" int open(const char *path, int flags, ...) {
  static auto *const real = realFunction<int(const char *, int, ...)>("open");
  va_list args;
  va_start(args, flags);
  const mode_t mode = modeArgument(flags, args);
  va_end(args);
  openedWith = flags;
  return failsNow("open") ? -1 : real(path, flags, mode);
}

TEST_F(SectionExport, EachTypeHasItsText) {
  map_.optSet("bool", true);
  map_.optSet("int", -3);
  map_.optSet("list", std::list<std::string>{"x", "y"});
  map_.optSet("no", false);
  map_.optSet("text", "a b");
  EXPECT_TRUE(write(false));
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_EQ(path_, platform.setCalls[0].path);
  EXPECT_EQ("task1", platform.setCalls[0].name);
  EXPECT_TRUE(platform.setCalls[0].reservedIsNull);
  EXPECT_EQ(0, platform.setCalls[0].flags);
  EXPECT_THAT(platform.setCalls[0].pairs,
              ElementsAre(Pair("bool", "true"), Pair("int", "-3"), Pair("list", R"(["x","y"])"),
                          Pair("no", "false"), Pair("text", R"("a b")")));
  EXPECT_THAT(platform.capacities, ElementsAre(1024));
  EXPECT_THAT(platform.addCalls, IsEmpty());
  EXPECT_THAT(log_.take(), IsEmpty());
  EXPECT_EQ(0x4321, platform.code);
}

TEST_F(SectionExport, TextIsEscaped) {
  map_.optSet("a", std::string("\"\\\n[x]=#\0\xff", 10));
  EXPECT_TRUE(write(false));
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs,
              ElementsAre(Pair("a", "\"\\\"\\\\\\n[x]=#\\u0000\xff\"")));
}

TEST_F(SectionExport, IntegersOf32BitsAreDecimal) {
  map_.optSet("a", INT_MIN);
  map_.optSet("b", INT_MAX);
  map_.optSet("c", 4294967295LL);
  map_.optSet("d", -2147483648LL);
  ASSERT_TRUE(map_.optLoadJsonString(map_.optToJsonString())); // and as the parser types them
  EXPECT_TRUE(write(false));
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs,
              ElementsAre(Pair("a", "-2147483648"), Pair("b", "2147483647"),
                          Pair("c", "4294967295"), Pair("d", "-2147483648")));
}

TEST_F(SectionExport, IntegersAreNotGroupedByALocale) {
  struct Grouped : std::numpunct<char> {
    char do_thousands_sep() const override { return '.'; }
    std::string do_grouping() const override { return "\3"; }
  };
  map_.optSet("a", 1234567);
  const std::locale before = std::locale::global(std::locale(std::locale(), new Grouped));
  EXPECT_TRUE(write(false));
  std::locale::global(before);
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs, ElementsAre(Pair("a", "1234567")));
}

TEST_F(SectionExport, AWholeRealOf32BitsIsAnInteger) {
  ASSERT_TRUE(map_.optLoadJsonString(R"({"a":5.0,"b":3e9,"c":-7.0})"));
  EXPECT_TRUE(write(false));
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs,
              ElementsAre(Pair("a", "5"), Pair("b", "3000000000"), Pair("c", "-7")));
}

TEST_F(SectionExport, ASecretIsWrittenAsCipherText) {
  map_.optSet("key", "open sesame", true);
  EXPECT_TRUE(write(false));
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs,
              ElementsAre(Pair("key", "\"" + fakeCipher("open sesame") + "\"")));
}

TEST_F(SectionExport, AnEmptyMapIsASectionWithoutOptions) {
  EXPECT_TRUE(write(false));
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs, IsEmpty());
}

TEST_F(SectionExport, AValueThatIsNoObjectIsASectionWithoutOptions) {
  for (const char *text : {"[1,2]", "5", "\"a\"", "true", "null"}) {
    platform.setCalls.clear();
    ASSERT_TRUE(map_.optLoadJsonString(text));
    EXPECT_TRUE(write(false)) << text;
    ASSERT_THAT(platform.setCalls, SizeIs(1));
    EXPECT_THAT(platform.setCalls[0].pairs, IsEmpty()) << text;
  }
}

TEST_F(SectionExport, NeedsNoBindingAndChangesNone) {
  EXPECT_TRUE(write(false));
  EXPECT_EQ("", map_.optSectionGetName());
  EXPECT_FALSE(map_.optIsLoaded());
}

TEST_F(SectionExport, TakesNoLock) {
  ASSERT_TRUE(map_.setLockToken("export"));
  const Fault fault("flock", 1, EIO);
  EXPECT_TRUE(write(false));
  EXPECT_EQ(0, fault.calls());
}

TEST_F(SectionExport, WhatHasNoTextFailsBeforeAnythingIsWritten) {
  for (const char *value :
       {"1.5", "null", "{}", "{\"x\":1}", "4294967296", "-2147483649", "9223372036854775807",
        "18446744073709551615", "-9223372036854775808", "1e300", "1e10"}) {
    ASSERT_TRUE(map_.optLoadJsonString(std::string(R"({"a":1,"b":)") + value + R"(,"c":2})"));
    EXPECT_FALSE(write(true)) << value;
    EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 687, "unknown type key"))) << value;
  }
  expectNothingWritten();
}

TEST_F(SectionExport, FailsWithoutAHash) {
  platform.hashAllocFails = true;
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 667, "KLIBCSzHashAlloc: " + kTriple)));
  expectNothingWritten();
}

TEST_F(SectionExport, AnyResultOfTheHashFromZeroOnIsSuccess) {
  map_.optSet("a", 1);
  map_.optSet("b", 2);
  platform.setValueResult = 2;
  EXPECT_TRUE(write(false));
  ASSERT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.setCalls[0].pairs, SizeIs(2));
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionExport, ARefusedKeyFailsBeforeAnythingIsWritten) {
  map_.optSet("a", 1);
  map_.optSet("b", 2);
  platform.refusedKey = "b";
  platform.setValueCode = 0x1234;
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 692, "KLIBCSzHashSetValue: " + kTriple)));
  expectNothingWritten();
}

TEST_F(SectionExport, TheFirstBadOptionIsTheOneThatIsSaid) {
  ASSERT_TRUE(map_.optLoadJsonString(R"({"a":null,"b":2})"));
  platform.refusedKey = "b";
  platform.setValueCode = 0x1234;
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 687, "unknown type key")));
  ASSERT_TRUE(map_.optLoadJsonString(R"({"b":2,"c":null})"));
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 692, "KLIBCSzHashSetValue: " + kTriple)));
}

// The platform's strings end at the first NUL, so the option would be stored under another key.
TEST_F(SectionExport, AKeyWithANulByteIsRefused) {
  map_.optSet(std::string("a\0b", 3), 1);
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 692,
                                               "KLIBCSzHashSetValue: [0xF201 option_map:692]")));
  expectNothingWritten();
}

TEST_F(SectionExport, ANameWithANulByteIsRefused) {
  const std::string name("task\0x", 6);
  EXPECT_FALSE(map_.optSectionExport(path_, name, false));
  EXPECT_FALSE(map_.optSectionExport(path_, name, true));
  EXPECT_THAT(
      log_.take(),
      ElementsAre(errLine("option_map", 379, "KLIBFileSetSection failed.: [0xF203 option_map:379]"),
                  errLine("option_map", 392,
                          "KLIBCFileSetSection(" + path_ + ", task)=-1: [0xF203 option_map:379]")));
  expectNothingWritten();
}

TEST_F(SectionExport, WithoutCreateAnyOtherResultThanOneIsAFailure) {
  const std::pair<int, int> answers[] = {
      {0, 0x2000}, {-1, 0x0900}, {-1, 0x1234}, {0, 0x1234}, {2, 0x1234}};
  for (const auto &[result, code] : answers) {
    setAnswers(result, code);
    char triple[32];
    std::snprintf(triple, sizeof triple, "[0x%04X core/fake.c:77]", static_cast<unsigned>(code));
    EXPECT_FALSE(write(false));
    EXPECT_THAT(log_.take(),
                ElementsAre(errLine("option_map", 379,
                                    std::string("KLIBFileSetSection failed.: ") + triple)));
  }
  EXPECT_FALSE(exists());
  EXPECT_THAT(platform.addCalls, IsEmpty());
  EXPECT_THAT(platform.errSets, IsEmpty());
}

TEST_F(SectionExportCreate, ReplacesASectionThatIsThere) {
  EXPECT_TRUE(write(true));
  EXPECT_THAT(platform.setCalls, SizeIs(1));
  EXPECT_THAT(platform.addCalls, IsEmpty());
  EXPECT_THAT(platform.errSets, IsEmpty());
}

TEST_F(SectionExportCreate, AddsAMissingSectionAndForgetsThatItWasMissed) {
  setAnswers(0, 0x2000);
  EXPECT_TRUE(write(true));
  ASSERT_THAT(platform.addCalls, SizeIs(1));
  EXPECT_EQ(path_, platform.addCalls[0].path);
  EXPECT_EQ("task1", platform.addCalls[0].name);
  EXPECT_EQ(0, platform.addCalls[0].flags);
  EXPECT_THAT(platform.addCalls[0].pairs, ElementsAre(Pair("a", "1")));
  EXPECT_THAT(platform.errSets, ElementsAre(ErrSet{0x4321, "option_map", 403}));
  EXPECT_EQ(0x4321, platform.code);
  EXPECT_FALSE(exists()) << "the file is the platform's to write";
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionExportCreate, MakesAMissingFileAndForgetsThatItWasMissed) {
  setAnswers(-1, 0x0900);
  const mode_t before = ::umask(0);
  EXPECT_TRUE(write(true));
  ::umask(before);
  EXPECT_EQ(O_RDWR | O_CREAT | O_CLOEXEC, openedWith);
  EXPECT_EQ(0644, modeOf(path_));
  EXPECT_EQ("", readFile(path_));
  EXPECT_THAT(platform.addCalls, SizeIs(1));
  EXPECT_THAT(platform.errSets, ElementsAre(ErrSet{0x4321, "option_map", 389}));
  EXPECT_EQ(0x4321, platform.code);
  EXPECT_THAT(log_.take(), IsEmpty());
}

TEST_F(SectionExportCreate, TheUmaskCountsForANewFile) {
  setAnswers(-1, 0x0900);
  const mode_t before = ::umask(077);
  EXPECT_TRUE(write(true));
  ::umask(before);
  EXPECT_EQ(0600, modeOf(path_));
}

TEST_F(SectionExportCreate, AFileThatCameMeanwhileIsNotCut) {
  setAnswers(-1, 0x0900);
  writeFile(dir_ / "conf", "[x]\n");
  EXPECT_TRUE(write(true));
  EXPECT_EQ("[x]\n", readFile(path_));
}

TEST_F(SectionExportCreate, AFileThatCannotBeMadeIsAFailure) {
  path_ = dir_ / "absent/conf";
  setAnswers(-1, 0x0900);
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 384,
                                               "create [" + path_ +
                                                   "] failed: No such file or "
                                                   "directory")));
  EXPECT_THAT(platform.addCalls, IsEmpty());
  EXPECT_THAT(platform.errSets, IsEmpty());
}

TEST_F(SectionExportCreate, EveryFailingOpenIsSaid) {
  setAnswers(-1, 0x0900);
  forEachFailure("open", ENOSPC, [&](Fault &fault) {
    EXPECT_EQ(!fault.fired(), write(true));
    EXPECT_THAT(log_.take(), SizeIs(fault.fired() ? 1 : 0));
  });
}

TEST_F(SectionExportCreate, AnotherNegativeResultIsAFailure) {
  setAnswers(-7, 0x1234);
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 392, setFailed(-7) + kTriple)));
  setAnswers(-1, 0x2000);
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 392, setFailed(-1) + "[0x2000 core/fake.c:77]")));
  EXPECT_FALSE(exists());
  EXPECT_THAT(platform.addCalls, IsEmpty());
  EXPECT_THAT(platform.errSets, IsEmpty());
}

TEST_F(SectionExportCreate, AZeroForAnotherReasonIsAFailure) {
  setAnswers(0, 0x1234);
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(), ElementsAre(errLine("option_map", 398, setFailed(0) + kTriple)));
  setAnswers(0, 0x0900);
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 398, setFailed(0) + "[0x0900 core/fake.c:77]")));
  EXPECT_FALSE(exists());
  EXPECT_THAT(platform.addCalls, IsEmpty());
}

TEST_F(SectionExportCreate, AnyOtherResultGoesOnToAdd) {
  setAnswers(2, 0x1234);
  EXPECT_TRUE(write(true));
  EXPECT_THAT(platform.addCalls, SizeIs(1));
  EXPECT_THAT(platform.errSets, IsEmpty());
  EXPECT_EQ(0x1234, platform.code) << "nothing was made good";
}

TEST_F(SectionExportCreate, AFailedAddIsAFailure) {
  setAnswers(0, 0x2000);
  platform.addResult = -1;
  platform.addCode = 0x1234;
  EXPECT_FALSE(write(true));
  EXPECT_THAT(log_.take(),
              ElementsAre(errLine("option_map", 408,
                                  "KLIBCFileAddSection(" + path_ + ", task1): " + kTriple)));
  platform.addResult = 3;
  platform.addCode = 0;
  EXPECT_TRUE(write(true)) << "0 or more";
}

// The fixture counts the hashes.
TEST_F(SectionExportCreate, FreesItsHashWhenMemoryRunsOut) {
  setAnswers(0, 0x2000);
  map_.optSet("a key too long to be kept without memory", "and a text of that kind as well");
  forEachAllocation([&] { EXPECT_TRUE(write(true)); }, [](bool) { EXPECT_EQ(0, platform.alive); });
}
