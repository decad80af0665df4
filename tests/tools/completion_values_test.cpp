// The completions offer what exists on the machine: sessions, lock tokens, sections, options, files
// and commands; and looking for it changes nothing.
#include "tests/tools/completion_shells.h"
#include "tests/tools/run_tool.h"
#include "tests/tools/session_support.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <set>
#include <sstream>

namespace {

using namespace KovaTest;
using KOVA::Backup::Path::createIpcLockFile;
using KOVA::Base::UniqueFd;
using testing::AllOf;
using testing::Contains;
using testing::ElementsAre;
using testing::EndsWith;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;
using testing::UnorderedElementsAre;

// What __complete answers: its lines.
std::vector<std::string> answer(std::vector<std::string> words) {
  words.insert(words.begin(), {"__complete", "--"});
  const ToolResult result = runTool(words);
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.messages);
  std::vector<std::string> lines;
  std::istringstream out(result.out);
  for (std::string line; std::getline(out, line);) {
    lines.push_back(line);
  }
  return lines;
}

class ToolCompletionValues : public testing::TestWithParam<std::string> {
protected:
  void SetUp() override {
    if (!hasShell(GetParam())) {
      GTEST_SKIP() << "skipped: there is no " << GetParam();
    }
    writeFile(file_, "[task1]\nname=\"x\"\nsize=3\n[task2]\nname=\"y\"\n");
  }

  std::set<std::string> offered(const std::string &words, const std::string &last) const {
    return askShell(GetParam(), {{words, last}})[words];
  }

  // The same last word after several lines. One shell is asked for all: zsh takes long to start.
  Offered offeredAfterEach(const std::vector<std::string> &lines, const std::string &last) const {
    std::vector<Typed> typed;
    typed.reserve(lines.size());
    for (const std::string &words : lines) {
      typed.push_back({words, last});
    }
    Offered offered = askShell(GetParam(), typed);
    EXPECT_EQ(lines.size(), offered.size());
    return offered;
  }

  const TestFolder folder_;
  const std::string file_ = folder_ / "task.conf";
};

TEST_P(ToolCompletionValues, OffersSessions) {
  const std::string id = makeLocal();
  for (const auto &[words, offers] :
       offeredAfterEach({"session show", "session path", "session destroy"}, "")) {
    EXPECT_THAT(offers, Contains(id)) << words;
  }
  EXPECT_THAT(offered("session destroy " + id, id.substr(0, 6)), Contains(id)) << "another one";
  EXPECT_THAT(offered("session show " + id, ""), IsEmpty()) << "it takes only one";
  runTool({"session", "destroy", id});
}

TEST_P(ToolCompletionValues, OffersLockTokens) {
  const UniqueFd lock(createIpcLockFile("completed.lock"));
  EXPECT_THAT(offered("lock show", ""), Contains("completed.lock"));
  EXPECT_THAT(offered("option unset " + file_ + " task1 --lock", "comp"),
              Contains("completed.lock"));
}

TEST_P(ToolCompletionValues, OffersSectionsAndTheirOptions) {
  for (const auto &[words, offers] :
       offeredAfterEach({"option list " + file_, "option get " + file_, "option set " + file_,
                         "option unset " + file_},
                        "")) {
    EXPECT_THAT(offers, UnorderedElementsAre("task1", "task2")) << words;
  }
  const std::string arguments = " --no-color " + file_ + " task1";
  for (const auto &[words, offers] : offeredAfterEach(
           {"option get" + arguments, "option set" + arguments, "option unset" + arguments}, "")) {
    EXPECT_THAT(offers, UnorderedElementsAre("name", "size")) << words;
  }
}

TEST_P(ToolCompletionValues, OffersCommandsAfterHelp) {
  EXPECT_THAT(offered("help", ""), AllOf(Contains("session"), Contains("doctor")));
  EXPECT_THAT(offered("help lock", ""), AllOf(Contains("show"), Not(Contains("session"))));
  EXPECT_THAT(offered("help option get", ""), IsEmpty()) << "help takes no arguments";
}

TEST_P(ToolCompletionValues, OffersPathsOfAVolumeRule) {
  for (const auto &[words, offers] :
       offeredAfterEach({"volume pick", "session create --volume"}, "same:" + (folder_ / "ta"))) {
    EXPECT_THAT(offers, ElementsAre(EndsWith("task.conf"))) << words;
  }
  EXPECT_THAT(offered("session create", "--volume=same:" + (folder_ / "ta")),
              ElementsAre(EndsWith("task.conf")));
}

TEST_P(ToolCompletionValues, OffersFixedChoices) {
  EXPECT_THAT(offered("option set --type", ""),
              UnorderedElementsAre("string", "int", "bool", "list"));
  for (const auto &[words, offers] :
       offeredAfterEach({"session prune --older-than", "doctor --older-than"}, "")) {
    EXPECT_THAT(offers, UnorderedElementsAre("1d", "7d", "30d")) << words;
  }
  for (const auto &[words, offers] :
       offeredAfterEach({"volume pick", "session create --volume"}, "")) {
    EXPECT_THAT(offers, UnorderedElementsAre("max", "max-ext", "max-ext-btrfs", "same:")) << words;
  }
}

TEST_P(ToolCompletionValues, OffersFiles) {
  for (const auto &[words, offers] :
       offeredAfterEach({"option sections", "option list", "option get", "option set",
                         "option unset", "template fill", "template fill --json",
                         "filter test --patterns", "run --stdout", "run --stderr"},
                        folder_ / "ta")) {
    EXPECT_THAT(offers, ElementsAre(EndsWith("task.conf"))) << words;
  }
}

TEST_P(ToolCompletionValues, OffersValuesAfterAnEqualsSign) {
  EXPECT_THAT(offered("option set", "--type=st"), ElementsAre(EndsWith("string")));
  EXPECT_THAT(offered("filter test", "--patterns=" + (folder_ / "ta")),
              ElementsAre(EndsWith("task.conf")));
  EXPECT_THAT(offered("option set", "--secret="), IsEmpty()) << "it takes no value";
}

TEST_P(ToolCompletionValues, OffersCommandsToRunAndTheirFiles) {
  EXPECT_THAT(offered("run --", "mkfif"), Contains("mkfifo"));
  EXPECT_THAT(offered("run --env A=b --", "mkfif"), Contains("mkfifo"));
  EXPECT_THAT(offered("run -- cat", folder_ / "ta"), ElementsAre(EndsWith("task.conf")));
}

TEST_P(ToolCompletionValues, OffersNothingForFreeText) {
  for (const auto &[words, offers] : offeredAfterEach(
           {"net probe", "net probe --timeout", "filter test --include", "template fill --set",
            "run --env", "doctor", "session list", "frobnicate", "session frobnicate"},
           "")) {
    EXPECT_THAT(offers, IsEmpty()) << words;
  }
}

TEST_P(ToolCompletionValues, NeverRunsWhatAFileNames) {
  const std::string made = folder_ / "made";
  writeFile(file_, "[$(touch " + made + ")]\nname=\"x\"\n[`touch " + made + "`]\nname=\"y\"\n");
  EXPECT_EQ(2U, offered("option list " + file_, "").size());
  EXPECT_FALSE(std::filesystem::exists(made));
}

INSTANTIATE_TEST_SUITE_P(Shells, ToolCompletionValues, testing::Values("bash", "fish", "zsh"),
                         [](const auto &shell) { return shell.param; });

TEST(ToolComplete, ExplainsWords) {
  const UniqueFd lock(createIpcLockFile("tasks"));
  EXPECT_THAT(answer({"lock", ""}),
              ElementsAre("words", "show\tShow which processes hold a lock token or wait for it",
                          "list\tList all lock tokens and the processes that use them"));
  EXPECT_THAT(answer({"lock", "show", ""}), AllOf(Contains("tasks\t"), Contains("words")));
}

TEST(ToolComplete, TellsFilesAndOtherCommandsFromWords) {
  EXPECT_THAT(answer({"option", "list", ""}), ElementsAre("files"));
  EXPECT_THAT(answer({"run", "--", ""}), ElementsAre("command 2"));
  EXPECT_THAT(answer({"run", "--background", "--", "ls", "-"}), ElementsAre("command 3"));
  EXPECT_THAT(answer({"run", ""}), ElementsAre("command 1"));
}

TEST(ToolComplete, SaysWhereAPathBegins) {
  EXPECT_THAT(answer({"volume", "pick", "same:/v"}), ElementsAre("files 5"));
  EXPECT_THAT(answer({"session", "create", "--volume=same:/v"}), ElementsAre("files 14"));
  EXPECT_THAT(answer({"filter", "test", "--patterns=/v"}), ElementsAre("files 11"));
}

TEST(ToolComplete, OffersNoOptionsAfterTwoDashes) {
  EXPECT_THAT(answer({"session", "list", "--", "-"}), ElementsAre("words"));
}

TEST(ToolComplete, GivesOptionsTheMeaningThatTheCommandGivesThem) {
  EXPECT_THAT(answer({"template", "fill", "--json", ""}), ElementsAre("files"));
  EXPECT_THAT(answer({"--json", "template", "fill", "x", ""}), ElementsAre("words"));
}

TEST(ToolComplete, AnswersWordsThatMakeNoSense) {
  for (const std::vector<std::string> &words :
       std::vector<std::vector<std::string>>{{},
                                             {"--bogus", ""},
                                             {"frobnicate", "--", ""},
                                             {"lock", "show", "a", "b", ""},
                                             {"option", "list", "/nonexistent", ""},
                                             {"option", "get", "/", "\x01", ""},
                                             {"session", "list", "--json=x", "-"}}) {
    EXPECT_THAT(answer(words), Contains("words"));
  }
}

TEST(ToolComplete, LeavesOutWordsThatALineCannotCarry) {
  const TestFolder folder;
  writeFile(folder / "conf", "[a\tb]\nname=\"x\"\n[c]\nname=\"y\"\n");
  EXPECT_THAT(answer({"option", "list", folder / "conf", ""}), ElementsAre("words", "c\t"));
}

TEST(ToolComplete, DoesNothingThatTheWordsSay) {
  const std::string id = makeLocal(2 * kDay);
  answer({"session", "destroy", id, ""});
  answer({"session", "prune", "--older-than", "1d", "--yes", ""});
  EXPECT_EQ(0, runTool({"session", "path", id}).exitCode);
  EXPECT_THAT(answer({"session", "list", "--json", "--help", "--version", ""}),
              ElementsAre("words"));
  runTool({"session", "destroy", id});
}

TEST(ToolComplete, IsShownNowhere) {
  EXPECT_THAT(runTool({"--help"}).out, Not(HasSubstr("__complete")));
  EXPECT_THAT(answer({""}), Not(Contains(StartsWith("__complete"))));
  EXPECT_EQ("kovabackup: unknown command '__complet'\nTry 'kovabackup --help'.\n",
            runTool({"__complet"}).messages);
}

} // namespace
