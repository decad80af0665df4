// Section files with bytes that no editor shows, names that no shell likes, and files that others
// change, replace or link at the same time.
#include "tests/hostile/surroundings.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/section_update.h"

#include <climits>
#include <filesystem>
#include <unistd.h>

namespace {

using namespace KovaTest;
using namespace KovaTest::Hostile;
using namespace KOVA::Backup;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
namespace fs = std::filesystem;

class HostileContent : public HostileTest {
protected:
  Outcome get() const { return runCommand({"option", "get", file_, "s", "k"}); }
  Outcome set() const { return runCommand({"option", "set", file_, "s", "k", "new"}); }

  const std::string file_ = stage() + "/task.conf";
};

TEST_F(HostileContent, NulBytesInAValueCostThatOptionAlone) {
  writeFile(file_, std::string("[s]\nk=\"a\0b\"\nm=\"x\"\n", 19));
  EXPECT_EQ("x\n", runCommand({"option", "get", file_, "s", "m"}).out);
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ("new\n", get().out);
  EXPECT_EQ("x\n", runCommand({"option", "get", file_, "s", "m"}).out);
}

TEST_F(HostileContent, NulBytesInAHeaderMakeItNoHeaderOfTheSection) {
  writeFile(file_, std::string("[s\0]\nk=\"a\"\n", 11));
  EXPECT_EQ(3, get().exitCode);
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ(std::string("[s\0]\nk=\"a\"\n[s]\nk=\"new\"\n", 23), readFile(file_));
}

TEST_F(HostileContent, CarriageReturnsAreKept) {
  writeFile(file_, "[s]\r\nk=\"a\"\r\nm=1\r\n");
  EXPECT_EQ("a\n", get().out);
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ("[s]\r\nk=\"new\"\r\nm=1\r\n", readFile(file_));
}

TEST_F(HostileContent, AByteOrderMarkHidesTheFirstHeaderAndIsLostByNoWriter) {
  writeFile(file_, "\xef\xbb\xbf[s]\nk=\"a\"\n");
  EXPECT_EQ(3, get().exitCode);
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ("\xef\xbb\xbf[s]\nk=\"a\"\n[s]\nk=\"new\"\n", readFile(file_));
}

TEST_F(HostileContent, InvalidUtf8IsKeptByteByByte) {
  writeFile(file_, "[s]\nk=\"a\xff\xfe\"\nm=\"\xc3\"\n");
  EXPECT_EQ("a\xff\xfe\n", get().out);
  EXPECT_EQ(0, set().exitCode);
  EXPECT_THAT(readFile(file_), HasSubstr("m=\"\xc3\"\n"));
}

TEST_F(HostileContent, AMissingLastLineEndIsNoHindrance) {
  writeFile(file_, "[s]\nk=\"a\"");
  EXPECT_EQ("a\n", get().out);
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ("[s]\nk=\"new\"\n", readFile(file_));
}

TEST_F(HostileContent, ALineOfTenMegabytesIsReadAndKept) {
  const std::string line = "[s]\nl=\"" + std::string(10000000, 'x') + "\"\n";
  writeFile(file_, line + "k=\"a\"\n");
  EXPECT_EQ("a\n", get().out);
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ(line.size() + sizeof "k=\"new\"\n" - 1, fs::file_size(file_));
}

TEST_F(HostileContent, AnEmptyFileGetsItsFirstSection) {
  writeFile(file_, "");
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ("[s]\nk=\"new\"\n", readFile(file_));
}

TEST_F(HostileContent, PatternsMayEndWithoutALineEndAndHoldAnyByte) {
  writeFile(file_, "- /\xff\xfe\n+ /b\n- /**");
  const Outcome outcome = runProgram({{"kovabackup", "filter", "test", "--patterns", file_},
                                      Program::usual(),
                                      Program::command(),
                                      "/\xff\xfe\n/a\n/b\n"});
  EXPECT_EQ("/b\n", outcome.out) << outcome;
}

TEST_F(HostileContent, AByteOrderMarkBeforeThePatternsIsNamedWithItsLine) {
  writeFile(file_, "\xef\xbb\xbf- /a\n");
  const Outcome outcome = runCommand({"filter", "test", "--patterns", file_});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr("line 1")) << outcome;
}

TEST_F(HostileContent, AByteOrderMarkInTheConfigurationIsNamedWithItsLine) {
  writeFile(configuration(), "\xef\xbb\xbf[volume v]\npath=\"" + volume() + "\"\n");
  const Outcome outcome = runCommand({"volume", "list"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr(configuration() + ":1")) << outcome;
}

TEST_F(HostileContent, CarriageReturnsInTheConfigurationAreRead) {
  writeFile(configuration(), "[volume v]\r\npath=\"" + volume() + "\"\r\n");
  EXPECT_THAT(runCommand({"volume", "list"}).out, HasSubstr("\t" + volume() + "\n"));
}

TEST_F(HostileContent, AHardLinkedFileIsReplacedUnderItsOwnNameAlone) {
  writeFile(file_, "[s]\nk=\"a\"\n");
  fs::create_hard_link(file_, stage() + "/other");
  EXPECT_EQ(0, set().exitCode);
  EXPECT_EQ("[s]\nk=\"new\"\n", readFile(file_));
  EXPECT_EQ("[s]\nk=\"a\"\n", readFile(stage() + "/other")) << "never torn, never half new";
}

TEST_F(HostileContent, AFileThatIsReplacedDuringAnUpdateIsWrittenWhole) {
  writeFile(file_, "[s]\nk=\"a\"\n");
  const Outcome outcome = runLibrary([&] {
    const auto change = [&](OptionMap &map) {
      writeFile(stage() + "/new", "[t]\nx=1\n[s]\nk=\"b\"\n");
      return ::rename((stage() + "/new").c_str(), file_.c_str()) == 0 && map.optSet("k", "c");
    };
    return Service::updateSection(file_, "s", -1, "t", change) == Service::Update::Saved;
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("[t]\nx=1\n[s]\nk=\"c\"\n", readFile(file_)) << "other sections are the other's";
}

TEST_F(HostileContent, AFileThatIsTruncatedDuringAnUpdateIsNotFilledByHalf) {
  writeFile(file_, "[s]\nk=\"a\"\n");
  const Outcome outcome = runLibrary([&] {
    const auto change = [&](OptionMap &map) {
      return ::truncate(file_.c_str(), 0) == 0 && map.optSet("k", "c");
    };
    return Service::updateSection(file_, "s", -1, "t", change) == Service::Update::SaveFailed;
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_EQ("", readFile(file_)) << "the section is gone, so nothing is saved";
}

TEST_F(HostileContent, AFileThatIsRemovedDuringAnUpdateIsNotMadeAgain) {
  writeFile(file_, "[s]\nk=\"a\"\n");
  const Outcome outcome = runLibrary([&] {
    const auto change = [&](OptionMap &map) { return fs::remove(file_) && map.optSet("k", "c"); };
    return Service::updateSection(file_, "s", -1, "t", change) == Service::Update::SaveFailed;
  });
  EXPECT_EQ(0, outcome.exitCode) << outcome;
  EXPECT_FALSE(isThere(file_));
}

/// The parameter is the name of a section file.
class HostileName : public HostileTest, public testing::WithParamInterface<std::string> {};

TEST_P(HostileName, NamesASectionFile) {
  const std::string file = stage() + "/" + GetParam();
  EXPECT_EQ(0, runCommand({"option", "set", file, "s", "k", "v"}).exitCode);
  EXPECT_EQ("v\n", runCommand({"option", "get", file, "s", "k"}).out);
  EXPECT_EQ(0, runCommand({"option", "set", file, "s", "k", "w"}).exitCode);
  EXPECT_EQ("[s]\nk=\"w\"\n", readFile(file));
  EXPECT_EQ(left(), std::set<std::string>{file});
}

TEST_P(HostileName, NamesALockToken) {
  const std::string file = stage() + "/task.conf";
  EXPECT_EQ(0, runCommand({"option", "set", file, "s", "k", "v", "--lock", GetParam()}).exitCode);
  EXPECT_THAT(namesIn(kLockFolder), ElementsAre(GetParam()));
}

INSTANTIATE_TEST_SUITE_P(Of, HostileName,
                         testing::Values("a\nb", "\t",
                                         "\xe2\x80\xae"
                                         "gnp.exe",
                                         "\xff\xfe", "-rf", "...", " ", "*", "$(reboot)",
                                         std::string(255, 'n')));

class HostilePath : public HostileTest {
protected:
  // A path of that many bytes, in folders that exist.
  static std::string ofLength(std::size_t length) {
    std::string path = stage();
    while (path.size() + 202 < length) {
      path += "/" + std::string(200, 'd');
    }
    fs::create_directories(path);
    return path + "/" + std::string(length - path.size() - 1, 'f');
  }
};

TEST_F(HostilePath, OfTheLargestLengthNamesASectionFile) {
  const std::string file = ofLength(PATH_MAX - 1);
  EXPECT_EQ(0, runCommand({"option", "set", file, "s", "k", "v"}).exitCode);
  EXPECT_EQ("v\n", runCommand({"option", "get", file, "s", "k"}).out);
}

TEST_F(HostilePath, OfMoreBytesIsNamedAsTooLong) {
  const Outcome outcome = runCommand({"option", "set", ofLength(PATH_MAX), "s", "k", "v"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_THAT(outcome.messages, HasSubstr("File name too long"));
}

TEST_F(HostilePath, WithAnEmptyNameIsShownAsOne) {
  const Outcome outcome = runCommand({"option", "set", "", "s", "k", "v"});
  EXPECT_EQ(1, outcome.exitCode);
  EXPECT_EQ("kovabackup: cannot create '': No such file or directory\n", outcome.messages);
}

TEST_F(HostilePath, OfALockTokenThatLeadsElsewhereIsRefused) {
  for (const std::string token : {".", "..", "../../etc/passwd", "/etc/passwd"}) {
    const Outcome outcome =
        runCommand({"option", "set", stage() + "/f", "s", "k", "v", "--lock", token});
    EXPECT_NE(0, outcome.exitCode) << token << outcome;
  }
  EXPECT_THAT(left().count(stage() + "/f"), 0U);
}

TEST_F(HostilePath, OfASessionIdThatLeadsElsewhereIsRefused) {
  for (const std::string id : {"..", "sess./../x", "sess.AAAAA/", "seln.", "/", "sess.\n12345"}) {
    EXPECT_EQ(2, runCommand({"session", "destroy", "--", id}).exitCode) << id;
  }
}

} // namespace
