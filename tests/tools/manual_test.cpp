// What the manual pages show works as they show it: commands, the sample of a section file, names
// of the library, a line of the log. The options of each command are compared in
// completion_test.cpp, the synopsis of the library's page by install.installed_tree.
#include "tests/tools/session_support.h"

#include "kovabackup/option_map.h"
#include "kovabackup/service/run_lock.h"
#include "kovabackup/session.h"
#include "tests/support/child_process.h"
#include "tests/support/log_capture.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <list>
#include <regex>
#include <set>
#include <sstream>
#include <unistd.h>

namespace {

namespace fs = std::filesystem;
using namespace KovaTest;
using KOVA::Backup::OptionMap;
using KOVA::Backup::Session;
using testing::ElementsAre;
using testing::HasSubstr;

std::string pageOf(const std::string &name) {
  return readFile(std::string(KOVA_SOURCE_DIR) + "/tools/man/" + name + ".scd");
}

// The text under a heading, up to the next one. Headings are in capitals, comments in a block not.
std::string under(const std::string &page, const std::string &heading) {
  const std::size_t begin = page.find("\n# " + heading + "\n");
  EXPECT_NE(std::string::npos, begin) << heading;
  const std::string rest = page.substr(begin + 1);
  static const std::regex kNext("\n# [A-Z]");
  std::smatch next;
  return std::regex_search(rest, next, kNext)
             ? rest.substr(0, static_cast<std::size_t>(next.position()) + 1)
             : rest;
}

// The text of the first fenced block.
std::string fenced(const std::string &text) {
  const std::size_t begin = text.find("```\n") + 4;
  return text.substr(begin, text.find("```\n", begin) - begin);
}

void replaceIn(std::string &text, const std::string &from, const std::string &to) {
  const std::size_t at = text.find(from);
  ASSERT_NE(std::string::npos, at) << "no " << from << " in: " << text;
  text.replace(at, from.size(), to);
}

// The commands in the fenced blocks under EXAMPLES, each on one line. The page writes a backslash
// twice.
std::vector<std::string> exampleCommands() {
  static const std::regex kContinued(R"(\\\\\n +)");
  const std::string text =
      std::regex_replace(under(pageOf("kovabackup.1"), "EXAMPLES"), kContinued, "");
  std::vector<std::string> commands;
  std::istringstream lines(text);
  bool inBlock = false;
  for (std::string line; std::getline(lines, line);) {
    if (line == "```") {
      inBlock = !inBlock;
    } else if (inBlock) {
      commands.push_back(line);
    }
  }
  return commands;
}

// Runs a line as the reader would, in a shell that finds the command; both streams are returned.
std::string runLine(const std::string &line, const std::string &folder) {
  const std::string program = fs::path(KOVA_TOOL_PATH).parent_path().string();
  const std::string script =
      "cd '" + folder + "' && { PATH='" + program + "':\"$PATH\"; " + line + "; } 2>&1";
  const ShellResult result = runShell(script);
  EXPECT_EQ(0, result.exitCode) << line << "\n" << result.output;
  return result.output;
}

TEST(ToolManual, EveryExampleOfTheCommandIsTriedHere) {
  EXPECT_THAT(exampleCommands(),
              ElementsAre(HasSubstr("session prune"), HasSubstr("option set"), HasSubstr("cp "),
                          HasSubstr("option edit"), HasSubstr("option diff"),
                          HasSubstr("filter test"), HasSubstr("lock list"), HasSubstr("lock show"),
                          HasSubstr("doctor"), HasSubstr("| kovabackup explain")));
}

TEST(ToolManual, TheExampleOfPruneShowsWhatIsLeftOver) {
  const std::string id = makeLocal(8 * kDay);
  const std::string young = makeLocal(6 * kDay);
  const std::string shown = runLine(exampleCommands().at(0), "/");
  EXPECT_THAT(shown, HasSubstr(id + "\t"));
  EXPECT_THAT(shown, testing::Not(HasSubstr(young)));
  EXPECT_THAT(shown, HasSubstr("would remove 1 session, 5 B\n"));
  EXPECT_TRUE(Session::destroyById(id));
  EXPECT_TRUE(Session::destroyById(young));
}

TEST(ToolManual, TheExampleOfOptionSetChangesAnOption) {
  const TestFolder folder;
  writeFile(folder / "task.conf", "[task12]\nname=\"weekly\"\nretries=1\n");
  std::string line = exampleCommands().at(1);
  replaceIn(line, "/etc/backup/task.conf", folder / "task.conf");
  EXPECT_EQ("", runLine(line, "/"));
  OptionMap task;
  ASSERT_TRUE(task.optSectionLoad(folder / "task.conf", "task", 12));
  EXPECT_EQ(3, task.optInt("retries", 0));
  EXPECT_TRUE(fs::exists("/tmp/kovabackup/lock/task.conf")) << "the lock of the example's token";
}

TEST(ToolManual, TheExampleOfOptionEditChangesASection) {
  const TestFolder folder;
  writeFile(folder / "task.conf", "[task12]\nname=\"weekly\"\nretries=1\n");
  std::string line;
  for (int i = 2; i <= 4; ++i) {
    line += exampleCommands().at(static_cast<std::size_t>(i)) + (i == 4 ? "" : " && ");
  }
  replaceIn(line, "nano", "'sed -i s/1$/3/'");
  for (int uses = 0; uses < 3; ++uses) {
    replaceIn(line, "/etc/backup/task.conf", folder / "task.conf");
  }
  EXPECT_EQ("-\ttask12\tretries=1\n+\ttask12\tretries=3\n",
            runLine("{ " + line + "; } || test $? = 3", folder.path()));
}

TEST(ToolManual, TheExampleOfFilterTestTellsThePatternThatDecided) {
  const TestFolder folder;
  writeFile(folder / "rules", "# what nobody needs\n- **.tmp\n+ /photos/keep/**\n");
  EXPECT_EQ("drop\t- **.tmp\t/photos/a.tmp\n", runLine(exampleCommands().at(5), folder.path()));
}

TEST(ToolManual, TheExamplesOfLocksTellWhoHoldsOne) {
  KOVA::Backup::Service::RunLock lock("nightly");
  KOVA::Backup::Service::Error error;
  ASSERT_TRUE(lock.take(error));
  EXPECT_EQ("holds\t" + std::to_string(::getpid()) + "\ttool_manual_tes\tnightly\n",
            runLine(exampleCommands().at(6), "/"));
  EXPECT_THAT(runLine(exampleCommands().at(7), "/"), HasSubstr(" took the lock "));
}

TEST(ToolManual, TheExamplesOfDoctorAndExplainAreUnderstood) {
  EXPECT_THAT(runLine("{ " + exampleCommands().at(8) + "; } || test $? = 3", "/"),
              HasSubstr("summary\t"));
  std::string line = exampleCommands().at(9);
  replaceIn(line, "journalctl -t backupd -n 20", "echo 'session:126 x'");
  EXPECT_THAT(runLine(line, "/"), HasSubstr("What to do: "));
}

TEST(ToolManual, TheSampleOfASectionFileIsReadAsThePageSays) {
  const TestFolder folder;
  const std::string sample = fenced(under(pageOf("kovabackup-section-file.5"), "DESCRIPTION"));
  writeFile(folder / "sample", sample);
  std::list<std::string> names;
  ASSERT_TRUE(OptionMap::optSectionListName(folder / "sample", names));
  EXPECT_THAT(names, ElementsAre("task1", "task12"));

  OptionMap task;
  ASSERT_TRUE(task.optSectionLoad(folder / "sample", "task", 1));
  EXPECT_EQ("nightly", task.optString("name", ""));
  EXPECT_EQ(3, task.optInt("retries", 0));
  EXPECT_TRUE(task.optBool("enabled", false));
  std::list<std::string> paths;
  EXPECT_TRUE(task.optGet("paths", paths));
  EXPECT_THAT(paths, ElementsAre("/volume1/photo", "/volume1/music"));
  EXPECT_EQ("kf8Zr3w1lQ0VnU4xJbWmTg", task.optString("password", "")) << "cipher text";

  task.optSet("retries", 4);
  ASSERT_TRUE(task.optSectionSave());
  std::string changed = readFile(folder / "sample");
  for (const std::string kept : {"# text before the first section belongs to none\n\n[task1]\n",
                                 "# written by hand\n", "\n[task12]\nname=\"weekly\"\n"}) {
    EXPECT_THAT(sample, HasSubstr(kept));
    EXPECT_THAT(changed, HasSubstr(kept));
  }
}

// What a library's page names: headers, and the declarations that it mentions with them.
struct Named {
  std::set<std::string> headers;
  int declarations = 0;
};

// A paragraph that begins with names of headers names what they declare.
Named namedBy(const std::string &page, const std::string &headers) {
  static const std::regex kName("\\*([A-Za-z_]+\\.h|[A-Za-z]+(::[A-Za-z]+)?)\\*(?!\\()");
  Named named;
  std::string declared; // the text of the present paragraph's headers
  std::istringstream lines(under(pageOf(page), "DESCRIPTION"));
  for (std::string line; std::getline(lines, line);) {
    declared = line.empty() ? "" : declared;
    for (std::sregex_iterator it(line.begin(), line.end(), kName), end; it != end; ++it) {
      const std::string name = (*it)[1];
      if (name.find('.') != std::string::npos) {
        named.headers.insert(name);
        declared += readFile(headers + name);
      } else if (!declared.empty()) {
        const std::string last =
            name.substr(name.find_last_of(':') + 1); // all of it when there is none
        EXPECT_TRUE(std::regex_search(declared, std::regex("\\b" + last + "\\b"))) << name;
        ++named.declarations;
      }
    }
  }
  return named;
}

std::set<std::string> headersIn(const std::string &folder) {
  std::set<std::string> found;
  for (const fs::directory_entry &entry : fs::directory_iterator(folder)) {
    if (entry.is_regular_file()) { // the second library's folder is inside the first one's
      found.insert(entry.path().filename());
    }
  }
  return found;
}

TEST(ToolManual, TheLibrarysPageNamesWhatTheHeadersDeclare) {
  const std::string headers = std::string(KOVA_SOURCE_DIR) + "/include/kovabackup/";
  const Named named = namedBy("libkovabackup-util.7", headers);
  EXPECT_GE(named.declarations, 15);
  EXPECT_EQ(headersIn(headers), named.headers);
}

TEST(ToolManual, TheServiceLibrarysPageNamesWhatTheHeadersDeclare) {
  const std::string headers = std::string(KOVA_SOURCE_DIR) + "/include/kovabackup/service/";
  const Named named = namedBy("libkovabackup-service.7", headers);
  EXPECT_GE(named.declarations, 4);
  EXPECT_EQ(headersIn(headers), named.headers);
}

TEST(ToolManual, TheLibrarysPageShowsALogLineAsItIsWritten) {
  std::string shown = fenced(under(pageOf("libkovabackup-util.7"), "CONVENTIONS"));
  shown.pop_back(); // its line end
  shown.replace(0, shown.find(')'), "(" + std::to_string(::getpid()));
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.load("sess.a1B2c3"));
  const std::vector<LogLine> lines = log.take();
  ASSERT_EQ(1U, lines.size());
  EXPECT_EQ(shown, lines[0].text);
}

} // namespace
