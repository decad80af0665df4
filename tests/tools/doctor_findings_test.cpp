// What doctor says about boot, about texts that were never saved, and to whom it keeps quiet.
#include "tests/tools/option_edit_support.h"
#include "tests/tools/run_tool.h"

#include "kovabackup/path_util.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::Path::createIpcLockFile;
using testing::HasSubstr;
using testing::Not;
namespace fs = std::filesystem;

// A machine whose /run and /etc/tmpfiles.d are the test's own.
class ToolDoctorBoot : public testing::Test {
protected:
  void SetUp() override {
    if (!mountOver("/run") || !mountOver("/etc") || !mountOver("/usr/lib/tmpfiles.d") ||
        !mountOver("/usr/local")) {
      GTEST_SKIP() << "skipped: no file system can be mounted here";
    }
    fs::create_directory("/etc/tmpfiles.d");
  }

  void TearDown() override {
    for (auto folder = mounted_.rbegin(); folder != mounted_.rend(); ++folder) {
      ::umount2(folder->c_str(), MNT_DETACH);
    }
  }

  static std::string row() {
    const std::string out = runTool({"doctor"}).out;
    const std::size_t at = out.find("\tboot\t");
    const std::size_t begin = out.rfind('\n', at) + 1;
    return at == std::string::npos ? "" : out.substr(begin, out.find('\n', at) - begin);
  }

private:
  bool mountOver(const std::string &folder) {
    if (!fs::exists(folder)) {
      return true; // where there is no such folder there is nothing to hide
    }
    if (::mount("tmpfs", folder.c_str(), "tmpfs", 0, "mode=0755") != 0) {
      return false;
    }
    mounted_.push_back(folder);
    return true;
  }

  std::vector<std::string> mounted_;
};

TEST_F(ToolDoctorBoot, NotesThatNothingCreatesTheRootWithoutSystemd) {
  writeFile("/etc/tmpfiles.d/kova.conf", "d /tmp/kovabackup 0755 root root -\n");
  EXPECT_EQ("note\tboot\tthis machine does not run systemd, so nothing creates /tmp/kovabackup at "
            "boot: the first user who needs it will own it\trun at boot: "
            "install -d -m 0755 /tmp/kovabackup",
            row());
}

TEST_F(ToolDoctorBoot, NotesThatSystemdHasNoEntry) {
  fs::create_directories("/run/systemd/system");
  writeFile("/etc/tmpfiles.d/other.conf", "# d /tmp/kovabackup\nd /tmp/kovabackup/lock 0770\n");
  writeFile("/etc/tmpfiles.d/kova.conf.old", "d /tmp/kovabackup 0755 root root -\n");
  EXPECT_EQ("note\tboot\ttmpfiles.d(5) has no entry, so nothing creates /tmp/kovabackup at boot: "
            "the first user who needs it will own it\tadd the line 'd /tmp/kovabackup 0755 root "
            "root -' to /etc/tmpfiles.d/kovabackup.conf",
            row());
}

TEST_F(ToolDoctorBoot, IsContentWithAnEntry) {
  fs::create_directories("/run/systemd/system");
  writeFile("/etc/tmpfiles.d/kova.conf", "# ours\nd /tmp/kovabackup 0755 root root -\n");
  EXPECT_EQ("ok\tboot\tsystemd creates /tmp/kovabackup at boot", row());
}

TEST(ToolDoctorQuiet, PrintsFindingsOnly) {
  ::close(createIpcLockFile("x"));
  ::chmod("/tmp/kovabackup", 0777);
  const ToolResult result = runTool({"-q", "doctor"});
  EXPECT_EQ(3, result.exitCode) << result;
  EXPECT_THAT(result.out, HasSubstr("wrong\tipc root\t/tmp/kovabackup has mode 0777"));
  EXPECT_THAT(result.out, Not(HasSubstr("ok\t")));
  EXPECT_THAT(result.out, Not(HasSubstr("summary")));
  EXPECT_THAT(runTool({"doctor"}).out, HasSubstr("ok\tlock folder\t"));
  const Json::Value all = document(runTool({"doctor", "--json"}))["findings"];
  EXPECT_EQ(all, document(runTool({"-q", "doctor", "--json"}))["findings"]);
}

class ToolKeptEdit : public ToolOptionEdit {
protected:
  void SetUp() override {
    ToolOptionEdit::SetUp();
    writeFile(file_, "[s]\na=1\n[t]\nb=1\n");
  }

  // Leaves a text of section "s" that cannot be read back, and returns its folder.
  std::string leave() const {
    (void)edit("echo a=x > \"$1\"");
    for (const fs::directory_entry &entry : fs::directory_iterator("/tmp")) {
      if (entry.path().string().rfind("/tmp/kovabackup-edit.", 0) == 0) {
        return entry.path();
      }
    }
    ADD_FAILURE() << "nothing was kept";
    return "";
  }
};

TEST_F(ToolKeptEdit, IsListedByDoctor) {
  const std::string folder = leave();
  EXPECT_THAT(runTool({"doctor"}, setup()).out,
              testing::ContainsRegex("note\tedited text\t" + folder +
                                     "/section.conf: section 's' of " + file_ +
                                     ", edited [0-9]+s ago, was not saved\ttake from it what is "
                                     "needed, then: rm -r " +
                                     folder + "\n"));
  fs::remove_all(folder);
  EXPECT_THAT(runTool({"doctor"}, setup()).out, Not(HasSubstr("edited text")));
}

TEST_F(ToolKeptEdit, IsMentionedWhenTheSameSectionIsEdited) {
  const std::string folder = leave();
  const ToolResult result = edit("cat \"$1\"");
  const std::string earlier = "was not saved: " + folder + "/section.conf\n";
  EXPECT_THAT(result.messages, HasSubstr(earlier));
  EXPECT_THAT(result.out, testing::ContainsRegex("# a text of this section [^\n]*" + earlier));
  EXPECT_THAT(edit("sed -i s/a=1/a=2/ \"$1\"").messages, HasSubstr(earlier));
  EXPECT_EQ("[s]\na=2\n[t]\nb=1\n", content());
  const ToolResult other = runTool(words({file_, "t"}), with(script("cat \"$1\"")));
  EXPECT_THAT(other.messages + other.out, Not(HasSubstr(folder)));
  fs::remove_all(folder);
}

TEST_F(ToolKeptEdit, IsNotOneThatIsBeingEdited) {
  const ToolResult result = edit("\"" KOVA_TOOL_PATH "\" doctor");
  EXPECT_THAT(result.out, HasSubstr("\tlock folder\t"));
  EXPECT_THAT(result.out, Not(HasSubstr("edited text")));
}

// Any user may create such names.
TEST_F(ToolKeptEdit, IsReadWithoutFollowingLinks) {
  fs::create_directory("/tmp/kovabackup-edit.aaaaaa");
  fs::create_symlink(file_, "/tmp/kovabackup-edit.aaaaaa/section.conf");
  fs::create_directory("/tmp/kovabackup-edit.bbbbbb");
  writeFile("/tmp/kovabackup-edit.bbbbbb/section.conf", "");
  fs::create_symlink(file_, "/tmp/kovabackup-edit.bbbbbb/subject");
  const std::string out = runTool({"doctor"}, setup()).out;
  EXPECT_THAT(out, Not(HasSubstr("edit.aaaaaa")));
  EXPECT_THAT(out, HasSubstr("edit.bbbbbb/section.conf: a section, edited "));
  fs::remove_all("/tmp/kovabackup-edit.aaaaaa");
  fs::remove_all("/tmp/kovabackup-edit.bbbbbb");
}

TEST_F(ToolOptionEdit, NamesTheVariableOfAnEditorThatDoesNotExist) {
  writeFile(file_, "[s]\na=1\n");
  const ToolResult word = runTool(words({file_, "s"}), with("nonexist -w"));
  EXPECT_EQ(1, word.exitCode);
  EXPECT_EQ(
      "kovabackup: EDITOR names the editor 'nonexist', which is not in any directory of PATH; "
      "nothing was changed\n",
      word.messages);
  ToolSetup visual = with("true");
  visual.environment["VISUAL"] = folder_.path();
  EXPECT_EQ("kovabackup: VISUAL names the editor '" + folder_.path() +
                "', which is not a program; nothing was changed\n",
            runTool(words({file_, "s"}), visual).messages);
  EXPECT_THAT(runTool(words({file_, "s"}), with("'no such' -w")).messages,
              HasSubstr("ended with exit status 127, which usually means that a program was not "
                        "found; nothing was changed\n"));
  EXPECT_EQ(0, runTool(words({file_, "s"}), with("exec true")).exitCode);
}

} // namespace
