// The option store on the real section files and encryption of the stand-ins: what is read back
// from a file, what cannot be written to one, and many processes at once.

#include "kovabackup/option_map.h"
#include "kovaplatform/kovacore.h"
#include "tests/support/child_process.h"
#include "tests/support/files.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <climits>
#include <csignal>
#include <cstdlib>
#include <gmock/gmock.h>
#include <random>
#include <set>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

namespace {

class OptionStore : public testing::Test {
protected:
  OptionStore() {
    writeFile(dir_ / "platform.conf", "[secret]\nkeyFile=\"" + dir_ / "key" + "\"\n");
    ::setenv("KOVA_PLATFORM_CONF", (dir_ / "platform.conf").c_str(), 1);
  }
  ~OptionStore() override { ::unsetenv("KOVA_PLATFORM_CONF"); }

  OptionMap loaded(const std::string &prefix, int id) const {
    OptionMap map;
    EXPECT_TRUE(map.optSectionLoad(path_, prefix, id)) << prefix << id;
    return map;
  }

  TestFolder dir_;
  std::string path_ = dir_ / "task.conf";
};
class OptionSmuggling : public OptionStore {};
class OptionProcesses : public OptionStore {};

// Matches a line with that number and prefix; the rest is the place where the platform failed.
testing::Matcher<const LogLine &> errBegins(int number, const std::string &text) {
  return testing::Field(&LogLine::text,
                        testing::StartsWith(errLine("option_map", number, text).text));
}

} // namespace

TEST_F(OptionStore, EveryTypeComesBackFromTheFile) {
  std::string bytes;
  for (int byte = 0; byte < 256; ++byte) {
    bytes += static_cast<char>(byte);
  }
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  map.optSet("bool", true);
  map.optSet("int", INT_MIN);
  map.optSet("unsigned", 4294967295LL);
  map.optSet("text", "a b");
  map.optSet("bytes", bytes);
  map.optSet("list", std::list<std::string>{"x", "", bytes, "[task9]"});
  map.optSet("none", std::list<std::string>());
  ASSERT_TRUE(map.optSectionSave());
  const OptionMap back = loaded("task", 1);
  EXPECT_EQ(map.optToJsonString(), back.optToJsonString());
  EXPECT_EQ(bytes, back.optString("bytes", ""));
}

TEST_F(OptionStore, TheFileHasTheTextsOfTheHeader) {
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", 12));
  EXPECT_EQ("[task12]\n", readFile(path_));
  map.optSet("a", "a b");
  map.optSet("b", -3);
  map.optSet("c", true);
  map.optSet("d", std::list<std::string>{"x", "y"});
  ASSERT_TRUE(map.optSectionSave());
  EXPECT_EQ("[task12]\na=\"a b\"\nb=-3\nc=true\nd=[\"x\",\"y\"]\n", readFile(path_));
}

TEST_F(OptionStore, ASecretComesBackAndNeverStandsInTheFile) {
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  for (const std::string &clear : {std::string("open sesame"), std::string(), std::string("x"),
                                   std::string(5000, 's'), std::string("\xff\x01\n=[")}) {
    map.optSet("key", clear, true);
    ASSERT_TRUE(map.optSectionSave());
    EXPECT_EQ(clear, loaded("task", 1).optSecret("key", "def"));
    if (clear.size() > 1) {
      EXPECT_THAT(readFile(path_), Not(HasSubstr(clear)));
    }
  }
}

TEST_F(OptionStore, APlainTextReadAsASecretIsAFailureThatIsSaid) {
  LogCapture log;
  OptionMap map;
  map.optSet("key", "never encrypted");
  EXPECT_EQ("", map.optSecret("key", "def"));
  EXPECT_THAT(log.take(), ElementsAre(errBegins(132, "KLIBCCryptSzDecrypt: [0xF403 ")));
}

TEST_F(OptionStore, ASaveLeavesTheOtherSectionsAsTheyStand) {
  const std::string before = "# head\r\nloose=1\n[task1]\n# mine\na=1\n\n[other]\n b = 2 # x\nc";
  writeFile(dir_ / "task.conf", before);
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  EXPECT_EQ("task2", map.optSectionGetName());
  EXPECT_EQ(before + "\n[task2]\n", readFile(path_));
  map.optSet("z", 1);
  ASSERT_TRUE(map.optSectionSave());
  EXPECT_EQ(before + "\n[task2]\nz=1\n", readFile(path_));
  ASSERT_TRUE(map.optSectionRemove());
  EXPECT_EQ(before + "\n", readFile(path_));
}

TEST_F(OptionStore, ASectionThatWasSavedIsListedAndItsIdGrows) {
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  ASSERT_TRUE(OptionMap::optSectionCreateUniqueId(path_, "task", 5));
  ASSERT_TRUE(OptionMap::optSectionCreateUniqueName(path_, "nightly"));
  EXPECT_FALSE(OptionMap::optSectionCreateUniqueId(path_, "task", 5));
  EXPECT_FALSE(OptionMap::optSectionCreateUniqueName(path_, "nightly"));
  EXPECT_EQ(6, OptionMap::optSectionGetUniqueId(path_, "task"));
  std::list<int> ids;
  EXPECT_TRUE(OptionMap::optSectionListId(path_, "task", ids));
  EXPECT_THAT(ids, ElementsAre(1, 5, 6));
  std::list<std::string> names;
  EXPECT_TRUE(OptionMap::optSectionListName(path_, names));
  EXPECT_THAT(names, ElementsAre("task1", "task5", "nightly", "task6"));
}

TEST_F(OptionStore, AMissingFileLeavesThePlatformsLastErrorCode) {
  KLIBCErrSetEx(0x4321, "caller.c", 1);
  std::list<int> ids;
  std::list<std::string> names;
  EXPECT_TRUE(OptionMap::optSectionListId(path_, "task", ids));
  EXPECT_EQ(0x4321, KLIBCErrGet());
  EXPECT_TRUE(OptionMap::optSectionListName(path_, names));
  EXPECT_EQ(0x4321, KLIBCErrGet());
  EXPECT_EQ(1, OptionMap::optSectionGetUniqueId(path_, "task"));
  EXPECT_EQ(0x4321, KLIBCErrGet());
  EXPECT_EQ("[task1]\n", readFile(path_));
  EXPECT_TRUE(OptionMap().optSectionExport(dir_ / "new.conf", "task", true));
  EXPECT_EQ(0x4321, KLIBCErrGet());
  EXPECT_EQ("[task]\n", readFile(dir_ / "new.conf"));
  EXPECT_TRUE(OptionMap().optSectionExport(path_, "added", true));
  EXPECT_EQ(0x4321, KLIBCErrGet());
  EXPECT_EQ("[task1]\n[added]\n", readFile(path_));
  KLIBCErrSetEx(0, nullptr, 0);
}

TEST_F(OptionStore, AMapThatFoundNoSectionCanBeSavedOnceThereIsOne) {
  LogCapture log;
  OptionMap map;
  EXPECT_FALSE(map.optSectionLoad(path_, "task", 1));
  map.optSet("a", 1);
  EXPECT_THAT(log.take(), IsEmpty());
  EXPECT_FALSE(map.optSectionSave()) << "no file";
  EXPECT_THAT(log.take(), ElementsAre(errBegins(379, "KLIBFileSetSection failed.: [0x0900 ")));
  EXPECT_NE(0, ::access(path_.c_str(), F_OK)) << "nothing is made";
  writeFile(dir_ / "task.conf", "[other]\n");
  EXPECT_FALSE(map.optSectionSave()) << "no section";
  EXPECT_THAT(log.take(), ElementsAre(errBegins(379, "KLIBFileSetSection failed.: [0x2000 ")));
  ASSERT_TRUE(OptionMap::optSectionCreateUniqueId(path_, "task", 1));
  EXPECT_TRUE(map.optSectionSave());
  EXPECT_EQ("[other]\n[task1]\na=1\n", readFile(path_));
  EXPECT_THAT(log.take(), IsEmpty());
}

// A user who edits the file can write values that no setter would store.
TEST_F(OptionStore, AnOptionWithoutAKeyIsLoadedAndRemovedButNotSaved) {
  LogCapture log;
  writeFile(dir_ / "task.conf", "[task1]\n=5\na=1\n");
  OptionMap map = loaded("task", 1);
  EXPECT_EQ(5, map.optInt("", 0));
  EXPECT_FALSE(map.optSectionSave());
  EXPECT_THAT(log.take(), ElementsAre(errBegins(692, "KLIBCSzHashSetValue: [0xF201 ")));
  EXPECT_TRUE(map.optRemove(""));
  EXPECT_TRUE(map.optSectionSave());
  EXPECT_EQ("[task1]\na=1\n", readFile(path_));
}

TEST_F(OptionStore, ANameWithABlankAtAnEndIsReservedButNotSavedOrRemoved) {
  LogCapture log;
  for (const char *name : {" a", "a\t"}) {
    OptionMap map;
    EXPECT_TRUE(map.optSectionCreate(path_, name, false));
    const std::string before = readFile(path_);
    EXPECT_FALSE(map.optSectionSave());
    EXPECT_FALSE(map.optSectionRemove());
    EXPECT_EQ(before, readFile(path_));
    EXPECT_THAT(log.take(),
                ElementsAre(errBegins(379, "KLIBFileSetSection failed.: [0xF203 "),
                            errBegins(719, "rm [" + path_ + "][" + name + "]: [0xF203 ")));
  }
}

TEST_F(OptionStore, RemovingTwiceFails) {
  LogCapture log;
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  EXPECT_TRUE(map.optSectionRemove());
  EXPECT_EQ("", readFile(path_));
  EXPECT_FALSE(map.optSectionRemove());
  EXPECT_THAT(log.take(), ElementsAre(errBegins(719, "rm [" + path_ + "][task1]: [0x2000 ")));
}

TEST_F(OptionStore, ASaveGoesThroughALink) {
  ASSERT_EQ(0, ::mkdir((dir_ / "sub").c_str(), 0700));
  ASSERT_EQ(0, ::symlink("sub/real.conf", path_.c_str()));
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  map.optSet("a", 1);
  ASSERT_TRUE(map.optSectionSave());
  EXPECT_EQ("[task1]\na=1\n", readFile(dir_ / "sub/real.conf"));
  struct stat link {};
  ASSERT_EQ(0, ::lstat(path_.c_str(), &link));
  EXPECT_TRUE(S_ISLNK(link.st_mode));
}

TEST_F(OptionStore, AHundredThousandSectionsAway) {
  std::string content;
  for (int id = 1; id <= 100000; ++id) {
    content += "[task" + std::to_string(id) + "]\nname=\"task " + std::to_string(id) + "\"\n";
  }
  writeFile(dir_ / "task.conf", content);
  EXPECT_EQ("task 100000", loaded("task", 100000).optString("name", ""));
  EXPECT_EQ(100001, OptionMap::optSectionGetUniqueId(path_, "task"));
}

// Keys that could add a line to the file, or that would not be read back unchanged.
TEST_F(OptionSmuggling, ThroughAKeyIsRefusedBeforeTheFileIsTouched) {
  LogCapture log;
  ASSERT_TRUE(OptionMap::optSectionCreateUniqueName(path_, "victim"));
  OptionMap map;
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  const std::string before = readFile(path_);
  for (const std::string &key :
       {std::string("a=1\n[victim]\nadmin"), std::string("a\nadmin"), std::string("a\radmin"),
        std::string("admin=true"), std::string("[victim]"), std::string("[x"), std::string("#a"),
        std::string(""), std::string(" a"), std::string("a\t"), std::string("a\0b", 3)}) {
    map.optClear();
    ASSERT_TRUE(map.optSectionLoad(path_, "task", 1));
    map.optSet("fine", 1);
    map.optSet(key, true);
    EXPECT_FALSE(map.optSectionSave()) << testing::PrintToString(key);
    EXPECT_EQ(before, readFile(path_)) << testing::PrintToString(key);
    const auto lines = log.take();
    EXPECT_THAT(lines, ElementsAre(errBegins(692, "KLIBCSzHashSetValue: [0xF201 ")));
  }
  EXPECT_EQ("{}", loaded("victim", -1).optToJsonString());
}

TEST_F(OptionSmuggling, ThroughAValueStaysInItsValue) {
  OptionMap map;
  ASSERT_TRUE(OptionMap::optSectionCreateUniqueName(path_, "victim"));
  ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
  const std::string text = "x\"\n[victim]\nadmin=true\r\n#";
  map.optSet("text", text);
  map.optSet("list", std::list<std::string>{text});
  ASSERT_TRUE(map.optSectionSave());
  EXPECT_EQ("{}", loaded("victim", -1).optToJsonString());
  EXPECT_EQ(text, loaded("task", 1).optString("text", ""));
}

TEST_F(OptionSmuggling, ThroughANameIsRefusedBeforeTheFileIsTouched) {
  LogCapture log;
  writeFile(dir_ / "task.conf", "[victim]\n");
  const std::string hostile = "x]\n[victim]\nadmin=true\n[y";
  OptionMap map;
  map.optSet("a", 1);
  EXPECT_FALSE(map.optSectionCreate(path_, hostile, false));
  EXPECT_FALSE(map.optSectionCreate(path_, hostile, true));
  EXPECT_FALSE(map.optSectionCreate(path_, hostile, 7));
  EXPECT_FALSE(map.optSectionExport(path_, hostile, false));
  EXPECT_FALSE(map.optSectionExport(path_, hostile, true));
  EXPECT_FALSE(map.optSectionLoad(path_, hostile, -1));
  EXPECT_FALSE(map.optSectionSave());
  EXPECT_FALSE(map.optSectionRemove());
  EXPECT_EQ("[victim]\n", readFile(path_));
  // Every operation except the load, which finds no such section.
  const auto noHeader = errBegins(740, "fprintf: Invalid argument");
  const auto notWritten = errBegins(379, "KLIBFileSetSection failed.: [0xF203 ");
  const std::string set = "KLIBCFileSetSection(" + path_ + ", " + hostile + ")=-1: [0xF203 ";
  EXPECT_THAT(log.take(),
              ElementsAre(noHeader, noHeader, noHeader, notWritten, errBegins(392, set), notWritten,
                          errBegins(719, "rm [" + path_ + "][" + hostile + "]: [0xF203 ")));
}

TEST_F(OptionProcesses, TakeDistinctIdsUnderOneToken) {
  constexpr int kProcesses = 8;
  constexpr int kEach = 50;
  runInChildren(kProcesses, [&](int) {
    for (int i = 0; i < kEach; ++i) {
      OptionMap map;
      if (!map.setLockToken("ids") || !map.optSectionCreate(path_, "task", true)) {
        return false;
      }
    }
    return true;
  });
  std::list<int> ids;
  EXPECT_TRUE(OptionMap::optSectionListId(path_, "task", ids));
  EXPECT_EQ(static_cast<std::size_t>(kProcesses * kEach), ids.size());
  EXPECT_EQ(ids.size(), std::set<int>(ids.begin(), ids.end()).size());
  EXPECT_EQ(kProcesses * kEach, *std::max_element(ids.begin(), ids.end()));
}

TEST_F(OptionProcesses, LoseNothingWhenTheySaveAtOnce) {
  constexpr int kProcesses = 8;
  constexpr int kRounds = 40;
  runInChildren(kProcesses, [&](int number) {
    OptionMap map;
    if (!map.setLockToken("saves") || !map.optSectionCreate(path_, "task", number + 1)) {
      return false;
    }
    for (int round = 1; round <= kRounds; ++round) {
      map.optSet("round", round);
      map.optSet("own" + std::to_string(round), std::string(200, 'x'));
      if (!map.optSectionSave()) {
        return false;
      }
    }
    return true;
  });
  for (int id = 1; id <= kProcesses; ++id) {
    const OptionMap map = loaded("task", id);
    EXPECT_EQ(kRounds, map.optInt("round", 0));
    for (int round = 1; round <= kRounds; ++round) {
      EXPECT_EQ(200U, map.optString("own" + std::to_string(round), "").size());
    }
  }
}

// Each save writes the same number into all options, so a reader that saw parts of two saves would
// find two numbers.
TEST_F(OptionProcesses, ReadersSeeWholeSectionsOnly) {
  constexpr int kOptions = 50;
  constexpr int kSaves = 200;
  OptionMap first;
  ASSERT_TRUE(first.setLockToken("readers"));
  ASSERT_TRUE(first.optSectionCreate(path_, "task", 1));
  ASSERT_TRUE(first.optSectionCreate(path_, "task", 2));
  for (int option = 0; option < kOptions; ++option) {
    first.optSet("option" + std::to_string(option), 0);
  }
  ASSERT_TRUE(first.optSectionSave());
  SharedCounter writing;
  *writing = 2;
  runInChildren(4, [&](int number) {
    if (number < 2) { // one writes the section that is read, the other one another section
      OptionMap map;
      bool saved = map.setLockToken("readers");
      (void)map.optSectionLoad(path_, "task", number == 0 ? 2 : 1);
      for (int save = 1; save <= kSaves && saved; ++save) {
        for (int option = 0; option < kOptions; ++option) {
          map.optSet("option" + std::to_string(option), save);
        }
        saved = map.optSectionSave();
      }
      --*writing;
      return saved;
    }
    int reads = 0;
    for (; *writing > 0 || reads == 0; ++reads) {
      OptionMap map;
      if (!map.optSectionLoad(path_, "task", 2)) {
        return false;
      }
      const int save = map.optInt("option0", -1);
      for (int option = 0; option < kOptions; ++option) {
        if (map.optInt("option" + std::to_string(option), -1) != save) {
          return false;
        }
      }
    }
    return true;
  });
}

// A writer that is killed at any point leaves complete sections and no lock, and the next save
// removes whatever else it left next to the file.
TEST_F(OptionProcesses, AKilledWriterLeavesAWholeFile) {
  constexpr int kRounds = 150;
  constexpr unsigned kSeed = 99;
  SCOPED_TRACE(testing::Message() << "seed " << kSeed);
  std::mt19937 random(kSeed);
  SharedCounter steps;
  for (int round = 0; round < kRounds; ++round) {
    *steps = 0;
    const pid_t writer = ::fork();
    if (writer == 0) {
      for (int i = 0;; ++i, ++*steps) {
        OptionMap map;
        if (!map.setLockToken("killed") || !map.optSectionCreate(path_, "task", true)) {
          ::_exit(1);
        }
        ++*steps;
        map.optSet("id", map.optSectionGetId());
        map.optSet("text", std::string(3000, 'x'));
        map.optSet("last", map.optSectionGetId());
        if (!map.optSectionSave() || (i > 5 && !map.optSectionRemove())) {
          ::_exit(1);
        }
      }
    }
    const int until = static_cast<int>(random() % 12);
    while (*steps < until && ::waitpid(writer, nullptr, WNOHANG) == 0) {
    }
    for (auto spins = random() % 20000; spins > 0; --spins) {
      (void)steps->load();
    }
    ASSERT_EQ(0, ::kill(writer, SIGKILL));
    int status = 0;
    ASSERT_EQ(writer, ::waitpid(writer, &status, 0));
    ASSERT_TRUE(WIFSIGNALED(status)) << "it failed by itself";
    OptionMap map;
    ASSERT_TRUE(map.setLockToken("killed"));
    ASSERT_TRUE(map.lock());
    ASSERT_TRUE(map.unlock());
    std::list<std::string> names;
    ASSERT_TRUE(OptionMap::optSectionListName(path_, names));
    for (const std::string &name : names) {
      ASSERT_TRUE(map.optSectionLoad(path_, name, -1)) << name;
      if (map.optToJsonString() != "{}") { // reserved, not saved yet
        ASSERT_EQ(name, "task" + map.optString("id", ""));
        ASSERT_EQ(name, "task" + map.optString("last", ""));
        ASSERT_EQ(3000U, map.optString("text", "").size());
      }
    }
    map.optClear();
    ASSERT_TRUE(map.optSectionCreate(path_, "task", true));
    ASSERT_TRUE(map.optSectionSave()); // clears what a killed writer left
    ASSERT_EQ(2U, dir_.names().size()) << "the configuration and the file itself";
    ASSERT_EQ(0, ::unlink(path_.c_str()));
  }
}

TEST_F(OptionProcesses, EncryptForTheFirstTimeAtOnceWithOneKey) {
  constexpr int kProcesses = 8;
  runInChildren(kProcesses, [&](int number) {
    OptionMap map;
    if (!map.setLockToken("keys") || !map.optSectionCreate(path_, "task", number + 1)) {
      return false;
    }
    map.optSet("key", "open sesame", true);
    return map.optSectionSave();
  });
  for (int id = 1; id <= kProcesses; ++id) {
    EXPECT_EQ("open sesame", loaded("task", id).optSecret("key", ""));
  }
  EXPECT_THAT(readFile(path_), Not(HasSubstr("sesame")));
}
