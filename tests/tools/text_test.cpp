#include "tools/kovabackup/frame/text.h"

#include <clocale>
#include <gtest/gtest.h>
#include <utility>

namespace {

using namespace KOVA::Backup::Tool;
using std::chrono::seconds;

TEST(EscapeControls, LeavesPrintableTextAlone) {
  EXPECT_EQ("", escapeControls(""));
  EXPECT_EQ("plain \\ text", escapeControls("plain \\ text"));
  EXPECT_EQ("na\xc3\xafve \xe2\x82\xac \xf0\x9f\x98\x80",
            escapeControls("na\xc3\xafve \xe2\x82\xac \xf0\x9f\x98\x80"));
}

TEST(EscapeControls, ShowsControlBytes) {
  EXPECT_EQ("a\\nb\\tc", escapeControls("a\nb\tc"));
  EXPECT_EQ("\\x1b[31m\\x7f\\x0d", escapeControls("\x1b[31m\x7f\r"));
  EXPECT_EQ(std::string("\\x00"), escapeControls(std::string(1, '\0')));
}

TEST(EscapeControls, ShowsC1ControlsWrittenAsTwoBytes) {
  EXPECT_EQ("\\xc2\\x9b31m", escapeControls("\xc2\x9b"
                                            "31m"));
  EXPECT_EQ("\xc2\xa0", escapeControls("\xc2\xa0")); // a space that does not break the line
}

// Each of them changes how a terminal shows what follows it, or begins a line there.
TEST(EscapeControls, ShowsWhatChangesTheDirectionOfText) {
  EXPECT_EQ("a\\xe2\\x80\\xaetxt.exe", escapeControls("a\xe2\x80\xaetxt.exe"));
  for (const std::string mark :
       {"\xd8\x9c", "\xe2\x80\x8e", "\xe2\x80\x8f", "\xe2\x80\xa8", "\xe2\x80\xa9", "\xe2\x80\xaa",
        "\xe2\x80\xab", "\xe2\x80\xac", "\xe2\x80\xad", "\xe2\x80\xae", "\xe2\x81\xa6",
        "\xe2\x81\xa7", "\xe2\x81\xa8", "\xe2\x81\xa9"}) {
    EXPECT_NE(mark, escapeControls(mark));
  }
  for (const std::string plain : {"\xd8\xa7", "\xe2\x80\xa6", "\xe2\x80\xaf", "\xe2\x81\xaa"}) {
    EXPECT_EQ(plain, escapeControls(plain));
  }
}

TEST(EscapeControls, ShowsBytesThatAreNotUtf8) {
  EXPECT_EQ("\\xff\\xfe", escapeControls("\xff\xfe"));
  EXPECT_EQ("a\\xc3", escapeControls("a\xc3"));                          // cut off
  EXPECT_EQ("\\xc0\\xaf", escapeControls("\xc0\xaf"));                   // overlong
  EXPECT_EQ("\\xed\\xa0\\x80", escapeControls("\xed\xa0\x80"));          // half of a surrogate pair
  EXPECT_EQ("\\xf4\\x90\\x80\\x80", escapeControls("\xf4\x90\x80\x80")); // past the last one
}

TEST(EscapeControls, KeepsLinesOfATextWhenAsked) {
  EXPECT_EQ("a\n\tb\\x1b", escapeControls("a\n\tb\x1b", Lines::Keep));
}

TEST(Shortened, LeavesOutTheMiddleOfLongText) {
  const std::string fits(5000, 'x');
  EXPECT_EQ(fits, shortened(fits));
  EXPECT_EQ(std::string(300, 'x') + " [4401 bytes left out] " + std::string(300, 'x'),
            shortened(fits + "x"));
}

TEST(Shortened, CutsNoCharacter) {
  std::string text = "x";
  for (int i = 0; i < 3000; ++i) {
    text += "\xe2\x82\xac";
  }
  text += "x";
  const std::string cut = shortened(text);
  EXPECT_EQ(cut, escapeControls(cut)); // no character was cut
  EXPECT_LT(cut.size(), 700U);
}

TEST(Shortened, CutsWhatIsNotText) {
  EXPECT_LT(shortened(std::string(6000, '\x80')).size(), 700U);
}

// Puts LC_CTYPE back at its end.
class CharacterType {
public:
  explicit CharacterType(const char *locale) : before_(std::setlocale(LC_CTYPE, nullptr)) {
    set_ = std::setlocale(LC_CTYPE, locale) != nullptr;
  }
  ~CharacterType() { std::setlocale(LC_CTYPE, before_.c_str()); }
  CharacterType(const CharacterType &) = delete;
  CharacterType &operator=(const CharacterType &) = delete;
  bool set() const { return set_; }

private:
  std::string before_;
  bool set_ = false;
};

TEST(Wrapped, BreaksLinesAtSpaces) {
  EXPECT_EQ("one two\nthree", wrapped("one two three", 0, 8));
  EXPECT_EQ("one two three", wrapped("one two three", 0, 13));
  EXPECT_EQ("one two three", wrapped("one two three", 0, 0)) << "no limit";
  EXPECT_EQ("", wrapped("", 4, 10));
}

TEST(Wrapped, IndentsAllLinesButTheFirst) {
  EXPECT_EQ("one\n    two\n    three", wrapped("one two three", 4, 10));
}

TEST(Wrapped, BreaksNoWord) {
  EXPECT_EQ("a\nbbbbbbbbbbbb\nc", wrapped("a bbbbbbbbbbbb c", 0, 5));
}

TEST(Wrapped, KeepsSpacesThatMayBelongToAName) {
  EXPECT_EQ("a  b ", wrapped("a  b ", 0, 20));
}

TEST(Wrapped, CountsColumnsRatherThanBytes) {
  EXPECT_EQ("\xc3\xa4\xc3\xa4 \xc3\xa4\xc3\xa4",
            wrapped("\xc3\xa4\xc3\xa4 \xc3\xa4\xc3\xa4", 0, 5));
}

constexpr const char *kWide = "\xe6\x97\xa5\xe6\x9c\xac"; // two ideographs
constexpr const char *kCombining = "e\xcc\x81";           // an e and an acute accent on it

TEST(Columns, CountsWideCharactersTwiceAndCombiningOnesNotAtAll) {
  const CharacterType type("C.UTF-8");
  ASSERT_TRUE(type.set());
  EXPECT_EQ(0U, columns(""));
  EXPECT_EQ(5U, columns("plain"));
  EXPECT_EQ(4U, columns(kWide));
  EXPECT_EQ(1U, columns(kCombining));
  EXPECT_EQ(2U, columns("\xf0\x9f\x98\x80"));
  EXPECT_EQ(5U, columns("na\xc3\xafve"));
}

TEST(Columns, CountsWhatTheLocaleDoesNotKnowOnce) {
  const CharacterType type("C");
  ASSERT_TRUE(type.set());
  EXPECT_EQ(5U, columns("plain"));
  EXPECT_EQ(2U, columns(kWide));
  EXPECT_EQ(2U, columns(kCombining));
}

TEST(Columns, CountsBytesThatAreNotTextOnceEach) {
  for (const char *locale : {"C", "C.UTF-8"}) {
    const CharacterType type(locale);
    EXPECT_EQ(3U, columns("\xff\xfe\xc3")) << locale;
  }
}

TEST(HumanBytes, PicksTheUnit) {
  EXPECT_EQ("0 B", humanBytes(0));
  EXPECT_EQ("1023 B", humanBytes(1023));
  EXPECT_EQ("1.0 KiB", humanBytes(1024));
  EXPECT_EQ("1.5 KiB", humanBytes(1536));
  EXPECT_EQ("1.0 MiB", humanBytes(1024 * 1024 - 1));
  EXPECT_EQ("16.0 EiB", humanBytes(UINT64_MAX));
}

// A value that would be printed as 1024.0 takes the next unit.
TEST(HumanBytes, ChangesTheUnitWhereRoundingWould) {
  EXPECT_EQ("1023.9 KiB", humanBytes(1048524));
  EXPECT_EQ("1.0 MiB", humanBytes(1048525));
}

TEST(HumanAge, ShowsTheTwoLargestUnits) {
  EXPECT_EQ("0s", humanAge(seconds(-5)));
  EXPECT_EQ("59s", humanAge(seconds(59)));
  EXPECT_EQ("1m 0s", humanAge(seconds(60)));
  EXPECT_EQ("23h 59m", humanAge(seconds(86399)));
  EXPECT_EQ("9d 3h", humanAge(seconds(9 * 86400 + 3 * 3600 + 59)));
}

TEST(ParseAge, ReadsEachUnit) {
  EXPECT_EQ(seconds(0), parseAge("0s"));
  EXPECT_EQ(seconds(90), parseAge("90s"));
  EXPECT_EQ(seconds(900), parseAge("15m"));
  EXPECT_EQ(seconds(129600), parseAge("36h"));
  EXPECT_EQ(seconds(604800), parseAge("7d"));
  EXPECT_EQ(seconds(1209600), parseAge("2w"));
}

// The same span in every unit.
TEST(ParseAge, ReadsUpTo100000Weeks) {
  const seconds most(60480000000);
  for (const auto &[text, more] : {std::pair{"100000w", "100001w"},
                                   {"700000d", "700001d"},
                                   {"16800000h", "16800001h"},
                                   {"1008000000m", "1008000001m"},
                                   {"60480000000s", "60480000001s"}}) {
    EXPECT_EQ(most, parseAge(text)) << text;
    EXPECT_EQ(std::nullopt, parseAge(more)) << more;
  }
}

TEST(ParseAge, RefusesEverythingElse) {
  for (const char *text : {"", "7", "d", "-1d", "+1d", "1.5d", " 7d", "7d ", "7 d", "7D", "7days",
                           "99999999999999999999d", "9223372036854775807w"}) {
    EXPECT_EQ(std::nullopt, parseAge(text)) << text;
  }
}

TEST(ParseNumber, ReadsWholeNumbersWithinLimits) {
  EXPECT_EQ(0, parseNumber("0", 0, 9));
  EXPECT_EQ(9, parseNumber("9", 0, 9));
  EXPECT_EQ(-3, parseNumber("-3", -3, 3));
  EXPECT_EQ(std::nullopt, parseNumber("-4", -3, 3));
  EXPECT_EQ(std::nullopt, parseNumber("10", 0, 9));
  EXPECT_EQ(std::nullopt, parseNumber("", 0, 9));
  EXPECT_EQ(std::nullopt, parseNumber("5x", 0, 9));
  EXPECT_EQ(std::nullopt, parseNumber("99999999999999999999", 0, 9));
}

TEST(Nearest, FindsTheWordThatWasMeant) {
  EXPECT_EQ("list", nearest("lst", {"show", "list", "destroy"}));
  EXPECT_EQ("destroy", nearest("detsroy", {"show", "list", "destroy"}));
  EXPECT_EQ("session", nearest("sessions", {"option", "session"}));
}

TEST(Nearest, FindsNothingWhenNothingIsNear) {
  EXPECT_EQ("", nearest("frobnicate", {"show", "list"}));
  EXPECT_EQ("", nearest("xy", {"ab"}));
  EXPECT_EQ("", nearest("", {"ab"}));
  EXPECT_EQ("", nearest("list", {}));
}

} // namespace
