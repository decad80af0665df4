// What the section-file services make of a file's text, byte for byte. core_section_replace_test
// covers how the file itself is replaced.

#include "tests/platform/core_support.h"

#include <gmock/gmock.h>

using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

const std::string kNul(1, '\0');

std::vector<std::string> namesOf(const std::string &text) {
  const TestFolder dir;
  writeFile(dir / "conf", text);
  clearError();
  std::vector<std::string> names = sectionNames(dir / "conf");
  EXPECT_EQ(0, errorCode());
  return names;
}

// The text after section "s" was set, or "<result code>" when that failed.
std::string afterSet(const std::string &text, const Pairs &pairs) {
  const TestFolder dir;
  writeFile(dir / "conf", text);
  clearError();
  const int result = setSection(dir / "conf", "s", pairs);
  EXPECT_EQ(result != 1, errorCode() != 0);
  if (result != 1) {
    EXPECT_EQ(text, readFile(dir / "conf"));
    return "<" + std::to_string(result) + " " + std::to_string(errorCode()) + ">";
  }
  return readFile(dir / "conf");
}

std::string afterAdd(const std::string &text, const Pairs &pairs) {
  const TestFolder dir;
  writeFile(dir / "conf", text);
  clearError();
  const int result = addSection(dir / "conf", "s", pairs);
  EXPECT_EQ(result < 0, errorCode() != 0);
  if (result < 0) {
    EXPECT_EQ(text, readFile(dir / "conf"));
    return "<" + std::to_string(errorCode()) + ">";
  }
  return readFile(dir / "conf");
}

std::string afterRemove(const std::string &text) {
  const TestFolder dir;
  writeFile(dir / "conf", text);
  clearError();
  const int result = removeSection(dir / "conf", "s");
  EXPECT_EQ(result != 1, errorCode() != 0);
  if (result != 1) {
    EXPECT_EQ(text, readFile(dir / "conf"));
    return "<" + std::to_string(result) + " " + std::to_string(errorCode()) + ">";
  }
  return readFile(dir / "conf");
}

std::string failure(int result, int code) {
  return "<" + std::to_string(result) + " " + std::to_string(code) + ">";
}

std::string refusal(int code) {
  return "<" + std::to_string(code) + ">";
}

} // namespace

TEST(SectionEnum, ListsNamesInFileOrder) {
  EXPECT_THAT(namesOf("[task3]\na=1\n[task10]\n[other]\n\n[task]\n"),
              ElementsAre("task3", "task10", "other", "task"));
}

TEST(SectionEnum, ListsNothingOfAFileWithoutHeaders) {
  EXPECT_THAT(namesOf(""), IsEmpty());
  EXPECT_THAT(namesOf("\n\n"), IsEmpty());
  EXPECT_THAT(namesOf("a=1\n# [no]\nx [no]\n=[no]\n"), IsEmpty());
}

TEST(SectionEnum, TakesALineThatTrimmedBeginsAndEndsWithBrackets) {
  EXPECT_THAT(namesOf(" \t\r[a]\t \r\n[b]"), ElementsAre("a", "b"));
  EXPECT_THAT(namesOf("[a] x\n[b\n]\nc]\n[\n"), IsEmpty());
  EXPECT_THAT(namesOf("\v[a]\n[b]\f\n\xef\xbb\xbf[c]\n"), IsEmpty()); // not white space
}

TEST(SectionEnum, TakesAllBetweenTheBracketsForTheName) {
  EXPECT_THAT(namesOf("[a]b]\n[[c]\n[]\n[ d ]\n[e=\"1\"]\n[#f]\n[]]\n"),
              ElementsAre("a]b", "[c", "", " d ", "e=\"1\"", "#f", "]"));
}

TEST(SectionEnum, LeavesOutABrokenHeader) {
  EXPECT_THAT(namesOf("[task1]\n[task12x\n"), ElementsAre("task1"));
}

TEST(SectionEnum, LeavesOutANameThatNoStringCanHold) {
  EXPECT_THAT(namesOf("[a" + kNul + "b]\n[c]\n"), ElementsAre("c"));
}

TEST(SectionEnum, ListsARepeatedNameEachTime) {
  EXPECT_THAT(namesOf("[a]\n[a]\n"), ElementsAre("a", "a"));
}

TEST(SectionEnum, AppendsToTheList) {
  const TestFolder dir;
  writeFile(dir / "conf", "[a]\n[b]\n");
  KLIBCSzList *list = KLIBCSzListAlloc(1);
  for (int times = 0; times < 600; ++times) {
    ASSERT_LE(0, KLIBCFileEnumSection((dir / "conf").c_str(), &list));
  }
  EXPECT_EQ(1200, list->count);
  EXPECT_LE(1200, list->capacity);
  EXPECT_STREQ("a", KLIBCSzListGet(list, 1198));
  EXPECT_STREQ("b", KLIBCSzListGet(list, 1199));
  EXPECT_EQ(nullptr, KLIBCSzListGet(list, 1200));
  KLIBCSzListFree(list);
}

TEST(SectionSet, ReplacesTheOptionsInTheOrderOfTheHash) {
  EXPECT_EQ("[s]\nz=1\na=2\nm=3\n", afterSet("[s]\n", {{"z", "1"}, {"a", "2"}, {"m", "3"}}));
  EXPECT_EQ("[s]\nb=3\na=4\n", afterSet("[s]\na=1\nb=2\nc=3\n", {{"b", "3"}, {"a", "4"}}));
}

TEST(SectionSet, EmptiesASectionForAnEmptyHash) {
  EXPECT_EQ("[s]\n", afterSet("[s]\na=1\n=2\n b = 3\n", {}));
  EXPECT_EQ("[s]", afterSet("[s]", {}));
}

TEST(SectionSet, KeepsAKeysPlaceWhenItsValueIsSetAgain) {
  EXPECT_EQ("[s]\na=3\nb=2\n", afterSet("[s]\n", {{"a", "1"}, {"b", "2"}, {"a", "3"}}));
}

TEST(SectionSet, KeepsAllElseByteForByte) {
  const std::string before = "x=1\r\n\n# top\n [a] \r\nb = 2 \n\n#c\n";
  const std::string after = " [t] \n\r\n#d=1\nno option\n" + kNul + "\xff=\n[task\nz=1";
  EXPECT_EQ(before + "[s]\nk=\"v\"\n" + after,
            afterSet(before + "[s]\nold=1\n" + after, {{"k", "\"v\""}}));
}

TEST(SectionSet, KeepsItsHeaderAsItStands) {
  EXPECT_EQ(" \t[s]  \nk=1\n", afterSet(" \t[s]  \nk=0\n", {{"k", "1"}}));
}

TEST(SectionSet, EndsNewLinesAsTheHeaderDoes) {
  EXPECT_EQ("a=1\n[s]\r\nk=1\r\nl=2\r\n[t]\n",
            afterSet("a=1\n[s]\r\nk=0\r\n[t]\n", {{"k", "1"}, {"l", "2"}}));
  EXPECT_EQ("a=1\r\n[s]\nk=1\n[t]\r\n", afterSet("a=1\r\n[s]\nk=0\r\n[t]\r\n", {{"k", "1"}}));
}

TEST(SectionSet, EndsTheLinesBelowAHeaderWithoutEndAsTheFirstLine) {
  EXPECT_EQ("[s]\nk=1\n", afterSet("[s]", {{"k", "1"}}));
  EXPECT_EQ("[a]\n[s]\nk=1\n", afterSet("[a]\n[s]", {{"k", "1"}}));
  EXPECT_EQ("[a]\r\n[s]\r\nk=1\r\n", afterSet("[a]\r\n[s]", {{"k", "1"}}));
}

TEST(SectionSet, KeepsAMissingLastLineEndElsewhere) {
  EXPECT_EQ("[s]\nk=1\n[t]\na=1", afterSet("[s]\nk=0\n[t]\na=1", {{"k", "1"}}));
  EXPECT_EQ("[s]\nk=1\n# end", afterSet("[s]\nk=0\n# end", {{"k", "1"}}));
  EXPECT_EQ("[s]\nk=1\n# end", afterSet("[s]\n# end", {{"k", "1"}}));
  EXPECT_EQ("[s]\nk=1\n", afterSet("[s]\nk=0", {{"k", "1"}}));
}

TEST(SectionSet, KeepsLinesAboveTheFirstOptionAndBelowTheLast) {
  EXPECT_EQ("[s]\n# top\n\nb=1\na=2\n\n# next\n[t]\n",
            afterSet("[s]\n# top\n\na=1\n\n# next\n[t]\n", {{"b", "1"}, {"a", "2"}}));
  EXPECT_EQ("[s]\n# top\nnew=1\n# end\n", afterSet("[s]\n# top\nold=1\n# end\n", {{"new", "1"}}));
  EXPECT_EQ("[s]\n# top\n# end\n", afterSet("[s]\n# top\nold=1\n# end\n", {}));
}

TEST(SectionSet, TakesALineBetweenOptionsAlongWithTheOptionBelow) {
  EXPECT_EQ("[s]\n# of b\n\nb=3\na=4\n",
            afterSet("[s]\na=1\n# of b\n\nb=2\n", {{"b", "3"}, {"a", "4"}}));
}

TEST(SectionSet, KeepsTheLinesAboveAnOptionThatGoes) {
  EXPECT_EQ("[s]\na=1\n# of b\n# of c\nc=3\n",
            afterSet("[s]\na=1\n# of b\nb=2\n# of c\nc=3\n", {{"a", "1"}, {"c", "3"}}));
  EXPECT_EQ("[s]\na=1\n# of b\n# end\n", afterSet("[s]\na=1\n# of b\nb=2\n# end\n", {{"a", "1"}}));
}

TEST(SectionSet, PutsOptionsAboveTheLinesOfASectionWithoutAny) {
  EXPECT_EQ("[s]\nk=1\n\n# of t\n[t]\n", afterSet("[s]\n\n# of t\n[t]\n", {{"k", "1"}}));
}

TEST(SectionSet, MakesOneLineOfARepeatedKey) {
  EXPECT_EQ("[s]\n#1\n#2\n#3\na=5\nb=6\n",
            afterSet("[s]\n#1\na=1\n#2\na =2\n#3\n\ta= 3\nb=4\n", {{"a", "5"}, {"b", "6"}}));
}

TEST(SectionSet, KnowsCommentsAndOptionsApartAsReadersDo) {
  // A comment may contain '=', a line without '=' is not an option, and a vertical tab is part of a
  // key.
  EXPECT_EQ("[s]\n #a=1\n#=\na\n\rb\n\nc=1\n",
            afterSet("[s]\n #a=1\n#=\na\n\rb\n\n\v#d=1\n = \nx#=1\n", {{"c", "1"}}));
  EXPECT_EQ("[s]\na=2\n", afterSet("[s]\na" + kNul + "=1\na\rb=1\n", {{"a", "2"}}));
}

TEST(SectionSet, EndsTheSectionAtABrokenHeader) {
  EXPECT_EQ("[s]\nk=1\n[broken\nk=0\n", afterSet("[s]\nk=0\n[broken\nk=0\n", {{"k", "1"}}));
}

TEST(SectionSet, ComparesTheWholeNameWithCase) {
  const std::string missing = failure(0, KLIBC_ERR_NO_SECTION);
  EXPECT_EQ(missing, afterSet("[S]\n[ss]\n[s ]\n[ s]\n[]\n[s]]\n[s] x\n#[s]\n", {}));
  EXPECT_EQ(missing, afterSet("", {}));
  EXPECT_EQ("[ss]\na=1\n[s]\nk=1\n", afterSet("[ss]\na=1\n[s]\n", {{"k", "1"}}));
}

TEST(SectionSet, ChangesTheFirstSectionOfARepeatedName) {
  EXPECT_EQ("[s]\nk=1\n[s]\nk=0\n", afterSet("[s]\nk=0\n[s]\nk=0\n", {{"k", "1"}}));
}

TEST(SectionSet, FindsNoSectionBehindABrokenHeader) {
  EXPECT_EQ(failure(0, KLIBC_ERR_NO_SECTION), afterSet("[sx\nk=0\n", {{"k", "1"}}));
}

// The library's loader does not look at a header's last character.
TEST(SectionSet, RefusesASectionBelowWhatReadersTakeForItsHeader) {
  EXPECT_EQ(failure(-1, KLIBC_ERR_SECTION_HIDDEN), afterSet("[sx\n[s]\nk=0\n", {{"k", "1"}}));
  EXPECT_EQ("[s]\nk=1\n[sx\n", afterSet("[s]\nk=0\n[sx\n", {{"k", "1"}}));
}

TEST(SectionAdd, AppendsHeaderAndOptions) {
  EXPECT_EQ("[s]\n", afterAdd("", {}));
  EXPECT_EQ("[s]\nb=2\na=1\n", afterAdd("", {{"b", "2"}, {"a", "1"}}));
  EXPECT_EQ("x\n[a]\nb=1\n\n[s]\nk=1\n", afterAdd("x\n[a]\nb=1\n\n", {{"k", "1"}}));
}

TEST(SectionAdd, EndsALastLineThatHasNoEnd) {
  EXPECT_EQ("[a]\nb=1\n[s]\nk=1\n", afterAdd("[a]\nb=1", {{"k", "1"}}));
  EXPECT_EQ("[a]\r\nb=1\r\n[s]\r\nk=1\r\n", afterAdd("[a]\r\nb=1", {{"k", "1"}}));
  EXPECT_EQ("#\n[s]\n", afterAdd("#", {}));
}

TEST(SectionAdd, EndsNewLinesAsTheFirstLineDoes) {
  EXPECT_EQ("a\r\nb\n[s]\r\nk=1\r\n", afterAdd("a\r\nb\n", {{"k", "1"}}));
  EXPECT_EQ("a\nb\r\n[s]\nk=1\n", afterAdd("a\nb\r\n", {{"k", "1"}}));
  EXPECT_EQ("\r\n[s]\r\nk=1\r\n", afterAdd("\r\n", {{"k", "1"}}));
  EXPECT_EQ("\n[s]\nk=1\n", afterAdd("\n", {{"k", "1"}}));
}

TEST(SectionAdd, RefusesASectionThatWouldNotBeRead) {
  EXPECT_EQ(refusal(KLIBC_ERR_SECTION_EXISTS), afterAdd("[s]\n", {{"k", "1"}}));
  EXPECT_EQ(refusal(KLIBC_ERR_SECTION_HIDDEN), afterAdd("[sx\n", {{"k", "1"}}));
  EXPECT_EQ("[s\n[tx\n[sxx\n[s]\nk=1\n", afterAdd("[s\n[tx\n[sxx\n", {{"k", "1"}}));
}

TEST(SectionRemove, RemovesHeaderAndLines) {
  EXPECT_EQ("", afterRemove("[s]"));
  EXPECT_EQ("", afterRemove("[s]\na=1"));
  EXPECT_EQ("x\n[a]\nb=1\n", afterRemove("x\n[a]\nb=1\n[s]\na=1\n#c\n"));
  EXPECT_EQ("#x\r\n[t]\nb=1", afterRemove("#x\r\n [s]\r\na=1\n\n# of t\n[t]\nb=1"));
  EXPECT_EQ("[broken\nb=1", afterRemove("[s]\na=1\n[broken\nb=1"));
}

TEST(SectionRemove, RemovesTheFirstOfARepeatedName) {
  EXPECT_EQ("[t]\n[s]\nb=1\n", afterRemove("[s]\na=1\n[t]\n[s]\nb=1\n"));
}

TEST(SectionRemove, FindsTheSectionOfTheExactNameOnly) {
  EXPECT_EQ(failure(0, KLIBC_ERR_NO_SECTION), afterRemove("[S]\n[ss]\n[s ]\n[sx\n"));
  EXPECT_EQ("[sx\n", afterRemove("[sx\n[s]\n"));
}

TEST(SectionName, IsRefusedWhenItCouldNotBeReadBack) {
  const TestFolder dir;
  const std::string text = "[]\n[ a]\n[a\rb]\n";
  writeFile(dir / "conf", text);
  for (const char *name :
       {"", " ", " a", "a ", "\ta", "a\r", "\na", "a\n", "a\nb", "a\rb", "a]\nsmuggled=1\n[b"}) {
    clearError();
    EXPECT_GT(0, setSection(dir / "conf", name, {})) << name;
    EXPECT_EQ(KLIBC_ERR_BAD_SECTION_NAME, errorCode()) << name;
    clearError();
    EXPECT_GT(0, addSection(dir / "conf", name, {})) << name;
    EXPECT_EQ(KLIBC_ERR_BAD_SECTION_NAME, errorCode()) << name;
    clearError();
    EXPECT_GT(0, removeSection(dir / "conf", name)) << name;
    EXPECT_EQ(KLIBC_ERR_BAD_SECTION_NAME, errorCode()) << name;
  }
  EXPECT_EQ(text, readFile(dir / "conf"));
}

TEST(SectionName, MayHoldWhatHeadersAndOptionsHold) {
  const TestFolder dir;
  const std::vector<std::string> names = {"a]b", "]", "[", "[]", "#a", "a=b", "a b", "\va", "\xff"};
  writeFile(dir / "conf", "");
  for (const std::string &name : names) {
    clearError();
    EXPECT_LE(0, addSection(dir / "conf", name, {{"k", "0"}})) << name;
    EXPECT_EQ(1, setSection(dir / "conf", name, {{"k", "1"}})) << name;
    EXPECT_EQ(0, errorCode()) << name;
  }
  EXPECT_EQ(names, sectionNames(dir / "conf"));
  for (const std::string &name : names) {
    EXPECT_EQ(1, removeSection(dir / "conf", name)) << name;
  }
  EXPECT_EQ("", readFile(dir / "conf"));
}

TEST(SectionFile, RefusesNullAndReservedArguments) {
  const TestFolder dir;
  const std::string path = dir / "conf";
  writeFile(path, "[s]\nk=0\n");
  const Hash hash(Pairs{{"k", "1"}});
  KLIBCSzList *list = KLIBCSzListAlloc(1);
  KLIBCSzList *none = nullptr;
  const auto refused = [](int result) {
    const bool bad = result < 0 && errorCode() == KLIBC_ERR_BAD_PARAMETER;
    clearError();
    return bad;
  };
  clearError();
  EXPECT_TRUE(refused(KLIBCFileEnumSection(nullptr, &list)));
  EXPECT_TRUE(refused(KLIBCFileEnumSection(path.c_str(), nullptr)));
  EXPECT_TRUE(refused(KLIBCFileEnumSection(path.c_str(), &none)));
  EXPECT_TRUE(refused(KLIBCFileSetSection(nullptr, "s", nullptr, hash.get(), 0)));
  EXPECT_TRUE(refused(KLIBCFileSetSection(path.c_str(), nullptr, nullptr, hash.get(), 0)));
  EXPECT_TRUE(refused(KLIBCFileSetSection(path.c_str(), "s", "x", hash.get(), 0)));
  EXPECT_TRUE(refused(KLIBCFileSetSection(path.c_str(), "s", nullptr, nullptr, 0)));
  EXPECT_TRUE(refused(KLIBCFileSetSection(path.c_str(), "s", nullptr, hash.get(), 1)));
  EXPECT_TRUE(refused(KLIBCFileAddSection(nullptr, "t", hash.get(), 0)));
  EXPECT_TRUE(refused(KLIBCFileAddSection(path.c_str(), nullptr, hash.get(), 0)));
  EXPECT_TRUE(refused(KLIBCFileAddSection(path.c_str(), "t", nullptr, 0)));
  EXPECT_TRUE(refused(KLIBCFileAddSection(path.c_str(), "t", hash.get(), 1)));
  EXPECT_TRUE(refused(KLIBCFileRemoveSection(nullptr, "s")));
  EXPECT_TRUE(refused(KLIBCFileRemoveSection(path.c_str(), nullptr)));
  EXPECT_EQ("[s]\nk=0\n", readFile(path));
  EXPECT_EQ(0, list->count);
  KLIBCSzListFree(list);
}
