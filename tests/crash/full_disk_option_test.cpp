// Options and secrets on a full disk: the failure is reported, the old content remains, and with
// some room everything works again.
#include "tests/crash/full_disk.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/section_update.h"
#include "tests/tools/run_tool.h"

namespace {

using namespace KovaTest;
using KOVA::Backup::OptionMap;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::Update;
using testing::AllOf;
using testing::ElementsAre;
using testing::Field;
using testing::HasSubstr;
using testing::IsEmpty;

const std::string kFile = "/mnt/disk/task.conf";

auto line(const std::string &part) {
  return Field("text", &LogLine::text, HasSubstr(part));
}

class FullDiskOption : public FullDisk {
protected:
  void SetUp() override {
    FullDisk::SetUp();
    if (IsSkipped()) {
      return;
    }
    OptionMap map;
    map.optSet("name", "old");
    ASSERT_TRUE(map.optSectionExport(kFile, "task1", true));
    before = readFile(kFile);
  }

  // 0xF304: no new file can be created, 0xF305: it cannot be written. Which is first when there is
  // no block depends on the file system.
  static auto code() {
    return testing::ContainsRegex(lacksBlocks() ? "\\[0xF30[45] " : "\\[0xF304 ");
  }

  std::string before;
  LogCapture log;
};

TEST_P(FullDiskOption, SaveKeepsTheOldContent) {
  OptionMap map;
  ASSERT_TRUE(map.optSectionLoad(kFile, "task", 1));
  map.optSet("name", "new");
  fill();
  EXPECT_FALSE(map.optSectionSave());
  EXPECT_THAT(log.take(),
              ElementsAre(AllOf(line("option_map:379 "), Field("text", &LogLine::text, code()))));
  EXPECT_EQ(before, readFile(kFile));
  EXPECT_THAT(names(), ElementsAre("task.conf"));
  makeRoom();
  EXPECT_TRUE(map.optSectionSave());
  EXPECT_THAT(readFile(kFile), HasSubstr("\"new\""));
  EXPECT_THAT(log.take(), IsEmpty());
}

TEST_P(FullDiskOption, UpdateReportsThatThereIsNoSpace) {
  const auto change = [](OptionMap &map) { return map.optSet("name", "new"); };
  const auto update = [&](Error &error) {
    return KOVA::Backup::Service::updateSection(kFile, "task", 1, "full", change,
                                                KOVA::Backup::Service::Millis(-1), &error);
  };
  fill();
  Error error;
  EXPECT_EQ(Update::SaveFailed, update(error));
  EXPECT_EQ(ENOSPC, error.code);
  EXPECT_EQ(before, readFile(kFile));
  EXPECT_THAT(log.take(), ElementsAre(line("option_map:379 ")));
  makeRoom();
  EXPECT_EQ(Update::Saved, update(error));
  std::filesystem::remove_all("/tmp/kovabackup");
}

// A header is added to the end of the file: what the last block of the file still holds is not
// enough here. Without inodes, a file that exists can grow.
TEST_P(FullDiskOption, CreateLeavesNoPartOfAHeader) {
  constexpr std::size_t kBlock = 4096;
  const std::string text = before + "#" + std::string(kBlock - before.size() - 2, '.') + "\n";
  writeFile(kFile, text);
  const std::string path = lacksBlocks() ? kFile : "/mnt/disk/other.conf";
  fill();
  OptionMap map;
  EXPECT_FALSE(map.optSectionCreate(path, "task", true));
  EXPECT_THAT(log.take(), ElementsAre(AllOf(line(lacksBlocks() ? "option_map:740 fprintf"
                                                               : "option_map:735 fopen"),
                                            line("No space left on device"))));
  EXPECT_EQ("", map.optSectionGetName());
  EXPECT_EQ(text, readFile(kFile));
  EXPECT_THAT(names(), ElementsAre("task.conf"));
  makeRoom();
  EXPECT_TRUE(map.optSectionCreate(path, "task", true));
  EXPECT_TRUE(map.optSectionSave());
}

TEST_P(FullDiskOption, AFirstSecretIsNotStoredWithoutAKey) {
  fill();
  OptionMap map;
  EXPECT_TRUE(map.optSet("password", "open sesame", true));
  EXPECT_THAT(log.take(), ElementsAre(line("option_map:152 KLIBCCryptSzDecrypt")));
  EXPECT_EQ("", map.optString("password", "none"));
  EXPECT_THAT(namesIn(kKeys), IsEmpty());
  makeRoom();
  EXPECT_TRUE(map.optSet("password", "open sesame", true));
  EXPECT_EQ("open sesame", map.optSecret("password", ""));
  EXPECT_THAT(namesIn(kKeys), ElementsAre("secret.key"));
}

TEST_P(FullDiskOption, AStoredSecretCanBeRead) {
  OptionMap map;
  ASSERT_TRUE(map.optSectionLoad(kFile, "task", 1));
  map.optSet("password", "open sesame", true);
  ASSERT_TRUE(map.optSectionSave());
  fill();
  OptionMap again;
  EXPECT_TRUE(again.optSectionLoad(kFile, "task", 1));
  EXPECT_EQ("open sesame", again.optSecret("password", ""));
}

TEST_P(FullDiskOption, TheCommandKeepsTheOldContentAndSaysWhy) {
  const std::vector<std::string> command = {"option", "set", kFile, "task1", "name", "new"};
  fill();
  const ToolResult failed = runTool(command);
  EXPECT_EQ(1, failed.exitCode) << failed;
  EXPECT_THAT(failed.messages, HasSubstr("No space left on device")) << failed;
  EXPECT_EQ(before, readFile(kFile));
  EXPECT_THAT(names(), ElementsAre("task.conf"));
  makeRoom();
  EXPECT_EQ(0, runTool(command).exitCode);
  EXPECT_THAT(readFile(kFile), HasSubstr("\"new\""));
}

INSTANTIATE_TEST_SUITE_P(On, FullDiskOption, allFullDisks(), nameOfDisk);

} // namespace
