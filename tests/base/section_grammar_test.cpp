#include "base/section_grammar.h"

#include <gmock/gmock.h>
#include <random>
#include <string>
#include <vector>

using namespace KOVA::Base::SectionGrammar;
using namespace std::string_literals;

namespace {

struct Parsed {
  std::string line;
  LineKind kind;
  std::string name = {};
  std::string key = {};
  std::string value = {};
};

// The rules once more, character by character and without the functions under test.
namespace Plain {

bool isWhite(char c) {
  return c == ' ' || c == '\t' || c == '\n' || c == '\r';
}

std::string trimmed(std::string text) {
  while (!text.empty() && isWhite(text.back())) {
    text.pop_back();
  }
  while (!text.empty() && isWhite(text.front())) {
    text.erase(text.begin());
  }
  return text;
}

// The line is split as it is, before anything is trimmed.
Parsed parse(const std::string &line) {
  const std::string text = trimmed(line);
  if (text.empty()) {
    return {line, LineKind::Blank};
  }
  if (text[0] == '[') {
    std::string name(text, 1);
    if (name.empty() || name.back() != ']') {
      return {line, LineKind::BrokenHeader};
    }
    name.pop_back();
    return {line, LineKind::Header, name};
  }
  std::string key;
  std::string value;
  bool split = false;
  for (const char c : line) {
    if (!split && c == '=') {
      split = true;
    } else {
      (split ? value : key) += c;
    }
  }
  key = trimmed(key);
  if (!key.empty() && key[0] == '#') {
    return {line, LineKind::Comment};
  }
  return split ? Parsed{line, LineKind::Option, {}, key, trimmed(value)}
               : Parsed{line, LineKind::Other};
}

bool isTakenForHeaderOf(const std::string &line, const std::string &name) {
  std::string text = trimmed(line);
  if (text.empty()) {
    return false;
  }
  text.pop_back(); // whichever character it is
  return text == "[" + name;
}

std::vector<std::string> lines(const std::string &text) {
  std::vector<std::string> found;
  bool open = false;
  for (const char c : text) {
    if (!open) {
      found.emplace_back();
    }
    found.back() += c;
    open = c != '\n';
  }
  return found;
}

} // namespace Plain

std::vector<std::string> linesOf(std::string_view text) {
  std::vector<std::string> lines;
  while (!text.empty()) {
    lines.emplace_back(takeLine(text));
  }
  return lines;
}

void expectParsed(const Parsed &expected) {
  SCOPED_TRACE(testing::PrintToString(expected.line));
  const Line line = parse(expected.line);
  EXPECT_EQ(expected.kind, line.kind);
  EXPECT_EQ(expected.name, line.name);
  EXPECT_EQ(expected.key, line.key);
  EXPECT_EQ(expected.value, line.value);
  EXPECT_EQ(Plain::trimmed(expected.line), line.text);
  EXPECT_EQ(expected.kind == LineKind::Header || expected.kind == LineKind::BrokenHeader,
            line.endsSection());
}

void expectAllParsed(const std::vector<Parsed> &table) {
  for (const Parsed &expected : table) {
    expectParsed(expected);
  }
}

// Random texts of what matters to the grammar.
class Texts {
public:
  explicit Texts(unsigned seed) : random_(seed) {}

  std::string next() {
    static const std::string pieces[] = {"[", "]", "=",  "#",  " ",   "\t",  "\r",  "\n",
                                         "a", "b", "\v", "\f", "\0"s, "[a]", "a=b", "\r\n"};
    std::string text;
    for (auto count = random_() % 8; count > 0; --count) {
      text += pieces[random_() % std::size(pieces)];
    }
    return text;
  }

private:
  std::mt19937 random_;
};

using LinesAndNames = std::vector<std::pair<std::string, std::string>>;

constexpr unsigned kSeed = 20261122;
constexpr int kRounds = 100000;

} // namespace

TEST(Parse, BlankLines) {
  expectAllParsed({{"", LineKind::Blank},
                   {"\n", LineKind::Blank},
                   {"\r\n", LineKind::Blank},
                   {" \t\r\n", LineKind::Blank}});
}

TEST(Parse, CommentsWithAndWithoutEqualsSign) {
  expectAllParsed({{"#", LineKind::Comment},
                   {" \t# text\r\n", LineKind::Comment},
                   {"#key=1\n", LineKind::Comment},
                   {"#=", LineKind::Comment},
                   {"#[a]", LineKind::Comment},
                   {"#a\0=1"s, LineKind::Comment}});
}

TEST(Parse, HeadersWhoseNameIsAllBetweenTheBrackets) {
  expectAllParsed({{"[a]", LineKind::Header, "a"},
                   {"[a]\n", LineKind::Header, "a"},
                   {"\t [a] \r\n", LineKind::Header, "a"},
                   {"[]", LineKind::Header, ""},
                   {"[]]", LineKind::Header, "]"},
                   {"[a]b]", LineKind::Header, "a]b"},
                   {"[[a]]", LineKind::Header, "[a]"},
                   {"[ a ]", LineKind::Header, " a "},
                   {"[a=1]", LineKind::Header, "a=1"},
                   {"[#]", LineKind::Header, "#"},
                   {"[a\rb]", LineKind::Header, "a\rb"},
                   {"[a\0b]"s, LineKind::Header, "a\0b"s},
                   {"[\v]", LineKind::Header, "\v"}});
}

TEST(Parse, BrokenHeaders) {
  expectAllParsed({{"[", LineKind::BrokenHeader},
                   {" [ \n", LineKind::BrokenHeader},
                   {"[a", LineKind::BrokenHeader},
                   {"[ax", LineKind::BrokenHeader},
                   {"[a] # note", LineKind::BrokenHeader},
                   {"[a]=1", LineKind::BrokenHeader},
                   {"[a=1", LineKind::BrokenHeader},
                   {"[a]\v", LineKind::BrokenHeader},
                   {"[a]\0"s, LineKind::BrokenHeader}});
}

TEST(Parse, OptionsSplitAtTheFirstEqualsSign) {
  expectAllParsed({{"a=1", LineKind::Option, "", "a", "1"},
                   {"a=1\r\n", LineKind::Option, "", "a", "1"},
                   {" \ta \t=\r 1 \n", LineKind::Option, "", "a", "1"},
                   {"a=b=c", LineKind::Option, "", "a", "b=c"},
                   {"a==", LineKind::Option, "", "a", "="},
                   {"a=", LineKind::Option, "", "a", ""},
                   {"=1", LineKind::Option, "", "", "1"},
                   {"=", LineKind::Option, "", "", ""},
                   {" = ", LineKind::Option, "", "", ""},
                   {"=#1", LineKind::Option, "", "", "#1"},
                   {"a#b=#1", LineKind::Option, "", "a#b", "#1"},
                   {"a b=1 2", LineKind::Option, "", "a b", "1 2"},
                   {"a[=[b]", LineKind::Option, "", "a[", "[b]"},
                   {"]=1", LineKind::Option, "", "]", "1"},
                   {"a\rb=1\r2", LineKind::Option, "", "a\rb", "1\r2"}});
}

TEST(Parse, VerticalTabFormFeedAndNulAreText) {
  expectAllParsed({{"\v", LineKind::Other},
                   {"\f\n", LineKind::Other},
                   {"\0"s, LineKind::Other},
                   {"\v[a]", LineKind::Other},
                   {"\0[a]"s, LineKind::Other},
                   {"\v#a", LineKind::Other},
                   {"\v#a=1", LineKind::Option, "", "\v#a", "1"},
                   {"\va\f=\v1\f", LineKind::Option, "", "\va\f", "\v1\f"},
                   {"a\0=\0"s, LineKind::Option, "", "a\0"s, "\0"s}});
}

TEST(Parse, AnyOtherText) {
  expectAllParsed({{"text", LineKind::Other},
                   {" text # text\n", LineKind::Other},
                   {"]", LineKind::Other},
                   {"a]", LineKind::Other},
                   {"a [b]", LineKind::Other}});
}

TEST(Parse, AgreesWithThePlainRules) {
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Texts texts(kSeed);
  for (int round = 0; round < kRounds && !testing::Test::HasFailure(); ++round) {
    expectParsed(Plain::parse(texts.next()));
  }
}

TEST(TakenForHeader, WhateverTheLastCharacterIs) {
  for (const auto &[line, name] : LinesAndNames{{"[a]", "a"},
                                                {" [a]\r\n", "a"},
                                                {"[ax", "a"},
                                                {"[a[", "a"},
                                                {"[a\v", "a"},
                                                {"[a\0"s, "a"},
                                                {"[a]]", "a]"},
                                                {"[a]x", "a]"},
                                                {"[]", ""},
                                                {"[x", ""},
                                                {"[ a ]", " a "},
                                                {"[a\0b]"s, "a\0b"s}}) {
    EXPECT_TRUE(isTakenForHeaderOf(parse(line), name)) << testing::PrintToString(line);
  }
}

TEST(TakenForHeader, OnlyWithThisNameAfterTheBracket) {
  for (const auto &[line, name] : LinesAndNames{{"[a", "a"},
                                                {"[a ", "a"},
                                                {"[", ""},
                                                {"", ""},
                                                {"[A]", "a"},
                                                {"[ a]", "a"},
                                                {"[ab]", "a"},
                                                {"[a]x", "a"},
                                                {"a]]", "a"},
                                                {"xa]", "a"},
                                                {"\v[a]", "a"},
                                                {"#[a]", "a"},
                                                {"[]", "]"},
                                                {"[a\0b]"s, "a"}}) {
    EXPECT_FALSE(isTakenForHeaderOf(parse(line), name)) << testing::PrintToString(line);
  }
}

TEST(TakenForHeader, AgreesWithThePlainRules) {
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Texts texts(kSeed);
  int taken = 0;
  for (int round = 0; round < kRounds; ++round) {
    const std::string name = texts.next();
    const std::string line =
        round % 2 == 0 ? texts.next() : " [" + name + "]x"[round % 4 / 2] + "\n";
    const bool got = isTakenForHeaderOf(parse(line), name);
    ASSERT_EQ(Plain::isTakenForHeaderOf(line, name), got)
        << testing::PrintToString(line) << ' ' << testing::PrintToString(name);
    taken += got ? 1 : 0;
  }
  EXPECT_LT(kRounds / 4, taken);
}

TEST(TakeLine, EndsAtTheLineFeedOnly) {
  using Lines = std::vector<std::string>;
  EXPECT_EQ(Lines(), linesOf(""));
  EXPECT_EQ(Lines({"\n"}), linesOf("\n"));
  EXPECT_EQ(Lines({"a"}), linesOf("a"));
  EXPECT_EQ(Lines({"a\n"}), linesOf("a\n"));
  EXPECT_EQ(Lines({"a\n", "b"}), linesOf("a\nb"));
  EXPECT_EQ(Lines({"\n", "\n", "a\n"}), linesOf("\n\na\n"));
  EXPECT_EQ(Lines({"a\r\n", "b\r"}), linesOf("a\r\nb\r"));
  EXPECT_EQ(Lines({"a\v\f\0b\n"s, "\0"s}), linesOf("a\v\f\0b\n\0"s));
}

TEST(TakeLine, GivesAnEmptyViewOfAnEmptyText) {
  std::string_view text;
  EXPECT_TRUE(takeLine(text).empty());
  EXPECT_TRUE(text.empty());
}

TEST(TakeLine, AgreesWithThePlainRules) {
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Texts texts(kSeed);
  for (int round = 0; round < kRounds; ++round) {
    const std::string text = texts.next() + texts.next();
    ASSERT_EQ(Plain::lines(text), linesOf(text)) << testing::PrintToString(text);
  }
}

TEST(HoldsNul, SeesOneAnywhere) {
  EXPECT_FALSE(holdsNul(""));
  EXPECT_FALSE(holdsNul("a"));
  EXPECT_TRUE(holdsNul("\0"s));
  EXPECT_TRUE(holdsNul("\0a"s));
  EXPECT_TRUE(holdsNul("a\0"s));
}

TEST(IsTrimmed, OnlyWithoutOuterWhiteSpace) {
  for (const char *text : {"", "a", "a b", "\va\f", "a\rb"}) {
    EXPECT_TRUE(isTrimmed(text)) << testing::PrintToString(text);
  }
  for (const char *text : {" ", "\n", " a", "a ", "\ta", "a\t", "a\r", "\na"}) {
    EXPECT_FALSE(isTrimmed(text)) << testing::PrintToString(text);
  }
}

TEST(Storable, Keys) {
  for (const std::string &key : {"a"s, "a b"s, "a#"s, "a["s, "]"s, "\va\f"s, "a\0b"s, "\0"s}) {
    EXPECT_TRUE(isStorableKey(key)) << testing::PrintToString(key);
  }
  for (const std::string &key : {""s, " "s, " a"s, "a\t"s, "a=b"s, "="s, "a\nb"s, "a\rb"s, "a\n"s,
                                 "#"s, "#a"s, "["s, "[a"s, "[a]"s}) {
    EXPECT_FALSE(isStorableKey(key)) << testing::PrintToString(key);
  }
}

TEST(Storable, Values) {
  for (const std::string &value : {""s, " a "s, "a=b"s, "#a"s, "[a]"s, "\v"s, "a\0b"s}) {
    EXPECT_TRUE(isStorableValue(value)) << testing::PrintToString(value);
  }
  for (const std::string &value : {"\n"s, "\r"s, "a\nb"s, "a\rb"s, "a\r\n"s}) {
    EXPECT_FALSE(isStorableValue(value)) << testing::PrintToString(value);
  }
}

TEST(Storable, SectionNames) {
  for (const std::string &name :
       {"a"s, "a b"s, "]"s, "a]b"s, "["s, "[a]"s, "#a"s, "a=b"s, "\va\f"s, "a\0b"s}) {
    EXPECT_TRUE(isStorableSectionName(name)) << testing::PrintToString(name);
  }
  for (const std::string &name : {""s, " "s, " a"s, "a\t"s, "a\nb"s, "a\rb"s, "a\r"s}) {
    EXPECT_FALSE(isStorableSectionName(name)) << testing::PrintToString(name);
  }
}

// Refused although a reader would find them again: text with a carriage return, at which other
// programs end the line, the empty key and name, and a name with outer white space, which people do
// not see.
TEST(Storable, IsWhatComesBackFromAFile) {
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  Texts texts(kSeed);
  for (int round = 0; round < kRounds; ++round) {
    const std::string text = texts.next();
    SCOPED_TRACE(testing::PrintToString(text));
    const bool hasReturn = text.find('\r') != std::string::npos;

    const std::vector<std::string> options = linesOf(text + "=1\n");
    const Line option = parse(options[0]);
    const bool keyReturns =
        options.size() == 1 && option.kind == LineKind::Option && option.key == text;
    ASSERT_EQ(isStorableKey(text), keyReturns && !text.empty() && !hasReturn);

    const std::vector<std::string> values = linesOf("a=" + text + "\n");
    ASSERT_EQ(isStorableValue(text), values.size() == 1 && !hasReturn);

    const std::vector<std::string> headers = linesOf("[" + text + "]\n");
    const Line header = parse(headers[0]);
    const bool nameReturns =
        headers.size() == 1 && header.kind == LineKind::Header && header.name == text;
    ASSERT_EQ(isStorableSectionName(text),
              nameReturns && !text.empty() && !hasReturn && Plain::trimmed(text) == text);
  }
}
