// Secret values: what the platform receives, in which buffers, and what every failure leaves.

#include "kovabackup/option_map.h"
#include "tests/option/fake_platform.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/log_capture.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <gmock/gmock.h>
#include <json/value.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

struct Wiped {
  const void *at;
  std::size_t size;
};

// A fixed array, since any code may call explicit_bzero.
int wipes = 0;
Wiped wiped[16];

bool wasWiped(const CryptCall &call) {
  for (int i = 0; i < wipes; ++i) {
    if (wiped[i].at == call.buf && wiped[i].size == static_cast<std::size_t>(call.size)) {
      return true;
    }
  }
  return false;
}

class Secret : public PlatformTest {
protected:
  Secret() { wipes = 0; }

  OptionMap map_;
};

std::string stored(const OptionMap &map) {
  return map.optString("key", "absent");
}

} // namespace

extern "C" {

void explicit_bzero(void *memory, size_t size) noexcept {
  if (wipes < 16) {
    wiped[wipes++] = {memory, size};
  }
  std::memset(memory, 0, size);
}
}

TEST_F(Secret, IsKeptAsCipherTextAndReadInClear) {
  EXPECT_TRUE(map_.optSet("key", std::string("abc"), true));
  EXPECT_EQ(fakeCipher("abc"), stored(map_));
  EXPECT_EQ("abc", map_.optSecret("key", "def"));
  std::string out;
  EXPECT_TRUE(map_.optGet("key", out, true));
  EXPECT_EQ("abc", out);
  EXPECT_TRUE(map_.optGet("key", out));
  EXPECT_EQ(fakeCipher("abc"), out) << "without the flag: the cipher text";
  char buf[16] = "";
  EXPECT_TRUE(map_.optGet("key", buf, sizeof buf, true));
  EXPECT_STREQ("abc", buf);
}

TEST_F(Secret, ALiteralIsEncryptedToo) {
  EXPECT_TRUE(map_.optSet("key", "abc", true));
  EXPECT_EQ(fakeCipher("abc"), stored(map_));
}

TEST_F(Secret, IsCutToTheBuffer) {
  map_.optSet("key", "abcdef", true);
  char buf[8];
  std::memset(buf, '#', sizeof buf);
  EXPECT_TRUE(map_.optGet("key", buf, 4, true));
  EXPECT_EQ(std::string("abc\0####", 8), std::string(buf, 8));
}

TEST_F(Secret, EncryptsIntoAZeroedBufferOfTwiceTheLengthAndTwo) {
  for (const std::string &clear : {std::string(), std::string("a"), std::string(1000, 'x')}) {
    platform.encrypted.clear();
    map_.optSet("key", clear, true);
    ASSERT_EQ(1U, platform.encrypted.size());
    EXPECT_EQ(clear, platform.encrypted[0].text);
    EXPECT_EQ(static_cast<int>(2 * (clear.size() + 2)), platform.encrypted[0].size);
    EXPECT_TRUE(platform.encrypted[0].zeroed);
    EXPECT_EQ(fakeCipher(clear), stored(map_));
  }
}

TEST_F(Secret, TheBufferIsCallocsAndOfThatSize) {
  (void)takeCallocSize();
  map_.optSet("key", "abc", true);
  EXPECT_EQ(10U, takeCallocSize());
  (void)map_.optSecret("key", "");
  EXPECT_EQ(10U, takeCallocSize()) << "7 bytes of cipher text, but 10 at least";
}

TEST_F(Secret, DecryptsIntoAZeroedBufferAsLongAsTheCipherText) {
  map_.optSet("key", std::string(100, 'x'), true);
  EXPECT_EQ(std::string(100, 'x'), map_.optSecret("key", "def"));
  ASSERT_EQ(1U, platform.decrypted.size());
  EXPECT_EQ(201, platform.decrypted[0].size);
  EXPECT_TRUE(platform.decrypted[0].zeroed);
}

TEST_F(Secret, DecryptsShortTextsIntoTenBytes) {
  for (const std::string &cipher :
       {std::string("~"), std::string("~61"), std::string("~61626364")}) {
    platform.decrypted.clear();
    map_.optSet("key", cipher);
    (void)map_.optSecret("key", "def");
    ASSERT_EQ(1U, platform.decrypted.size());
    EXPECT_EQ(10, platform.decrypted[0].size);
  }
}

TEST_F(Secret, AnEmptySecretIsEncryptedLikeAnyOther) {
  EXPECT_TRUE(map_.optSet("key", "", true));
  ASSERT_EQ(1U, platform.encrypted.size());
  EXPECT_EQ(4, platform.encrypted[0].size);
  EXPECT_EQ("~", stored(map_));
  EXPECT_EQ("", map_.optSecret("key", "def"));
  EXPECT_EQ(1U, platform.decrypted.size());
}

TEST_F(Secret, AnEmptyCipherTextIsNotAskedAbout) {
  map_.optSet("key", "");
  EXPECT_EQ("", map_.optSecret("key", "def"));
  std::string out = "before";
  EXPECT_TRUE(map_.optGet("key", out, true));
  EXPECT_EQ("", out);
  char buf[8] = "before";
  EXPECT_TRUE(map_.optGet("key", buf, sizeof buf, true));
  EXPECT_STREQ("", buf);
  EXPECT_THAT(platform.decrypted, IsEmpty());
}

TEST_F(Secret, AnAbsentKeyIsNotAskedAbout) {
  EXPECT_EQ("def", map_.optSecret("key", "def"));
  EXPECT_THAT(platform.decrypted, IsEmpty());
}

TEST_F(Secret, ClearTextEndsAtItsFirstNul) {
  map_.optSet("key", std::string("ab\0cd", 5), true);
  ASSERT_EQ(1U, platform.encrypted.size());
  EXPECT_EQ("ab", platform.encrypted[0].text);
  EXPECT_EQ(14, platform.encrypted[0].size);
  EXPECT_EQ("ab", map_.optSecret("key", ""));
}

TEST_F(Secret, NumbersAreReadAsTheirText) {
  map_.optSet("key", 61);
  EXPECT_EQ("", map_.optSecret("key", "def")) << "the fake makes nothing of 61";
  ASSERT_EQ(1U, platform.decrypted.size());
  EXPECT_EQ("61", platform.decrypted[0].text);
}

TEST_F(Secret, StandsInTheJsonFormAsCipherText) {
  map_.optSet("key", "open sesame", true);
  EXPECT_EQ("{\"key\":\"" + fakeCipher("open sesame") + "\"}", map_.optToJsonString());
}

TEST_F(Secret, BuffersAreWipedBeforeTheyAreFreed) {
  map_.optSet("key", "open sesame", true);
  (void)map_.optSecret("key", "");
  ASSERT_EQ(1U, platform.encrypted.size());
  ASSERT_EQ(1U, platform.decrypted.size());
  EXPECT_TRUE(wasWiped(platform.encrypted[0]));
  EXPECT_TRUE(wasWiped(platform.decrypted[0]));
}

TEST_F(Secret, BuffersAreWipedAfterAFailureToo) {
  LogCapture log;
  platform.cryptCode = 0x1234;
  map_.optSet("key", "open sesame", true);
  map_.optSet("key", "~6162");
  (void)map_.optSecret("key", "");
  ASSERT_EQ(1U, platform.encrypted.size());
  ASSERT_EQ(1U, platform.decrypted.size());
  EXPECT_TRUE(wasWiped(platform.encrypted[0]));
  EXPECT_TRUE(wasWiped(platform.decrypted[0]));
}

TEST_F(Secret, CopiesInClearOfTheLibrarysOwnAreWiped) {
  map_.optSet("key", "open sesame", true); // the text of a literal
  EXPECT_EQ(2, wipes);
  wipes = 0;
  char buf[16] = "";
  map_.optGet("key", buf, sizeof buf, true);
  EXPECT_EQ(2, wipes);
  wipes = 0;
  std::string out;
  map_.optGet("key", out, true);
  EXPECT_EQ(2, wipes);
}

TEST_F(Secret, AFailedEncryptionStoresTheEmptyTextUnderTheDecryptName) {
  LogCapture log;
  platform.cryptCode = 0x1234;
  map_.optSet("key", "before");
  EXPECT_TRUE(map_.optSet("key", std::string("abc"), true));
  EXPECT_EQ("", stored(map_));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("option_map", 152, "KLIBCCryptSzDecrypt: " + kTriple)));
  EXPECT_TRUE(map_.optSet("key", "abc", true));
  EXPECT_EQ("", stored(map_));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("option_map", 152, "KLIBCCryptSzDecrypt: " + kTriple)));
}

TEST_F(Secret, AFailedDecryptionGivesTheEmptyText) {
  LogCapture log;
  map_.optSet("key", "abc", true);
  platform.cryptCode = 0x1234;
  const auto line = errLine("option_map", 132, "KLIBCCryptSzDecrypt: " + kTriple);
  EXPECT_EQ("", map_.optSecret("key", "def"));
  EXPECT_THAT(log.take(), ElementsAre(line));
  std::string out = "before";
  EXPECT_TRUE(map_.optGet("key", out, true));
  EXPECT_EQ("", out);
  EXPECT_THAT(log.take(), ElementsAre(line));
  char buf[8] = "before";
  EXPECT_TRUE(map_.optGet("key", buf, sizeof buf, true));
  EXPECT_STREQ("", buf);
  EXPECT_THAT(log.take(), ElementsAre(line));
}

TEST_F(Secret, NoMemoryForEncryptionStoresTheEmptyText) {
  LogCapture log;
  map_.optSet("key", "before");
  {
    const Fault fault("calloc", 1, ENOMEM);
    EXPECT_TRUE(map_.optSet("key", "abc", true));
    EXPECT_TRUE(fault.fired());
  }
  EXPECT_EQ("", stored(map_));
  EXPECT_THAT(platform.encrypted, IsEmpty());
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("option_map", 148, "calloc: Cannot allocate memory")));
}

TEST_F(Secret, NoMemoryForDecryptionGivesTheEmptyText) {
  LogCapture log;
  map_.optSet("key", "abc", true);
  {
    const Fault fault("calloc", 1, ENOMEM);
    EXPECT_EQ("", map_.optSecret("key", "def"));
    EXPECT_TRUE(fault.fired());
  }
  EXPECT_THAT(platform.decrypted, IsEmpty());
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("option_map", 128, "calloc: Cannot allocate memory")));
}

TEST_F(Secret, AValueThatIsNoTextThrowsBeforeThePlatformIsAsked) {
  map_.optSet("key", std::list<std::string>{"x"});
  EXPECT_THROW(map_.optSecret("key", ""), Json::LogicError);
  EXPECT_THAT(platform.decrypted, IsEmpty());
}
