#include "tests/tools/option_edit_support.h"

#include "kovabackup/option_map.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <sys/mount.h>

namespace {

using namespace KovaTest;
using KOVA::Backup::OptionMap;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;
namespace fs = std::filesystem;

TEST_F(ToolOptionEdit, WritesWhatTheEditorLeft) {
  writeFile(file_, "# top\n[s]\n# about a\na=\"old\"\nb=2\nc=true\n[t]\na=3\n");
  const ToolResult result =
      edit("sed -i -e 's/old/new/' -e '/^b=/d' \"$1\" && echo 'd=[\"x\"]' >>\"$1\"");
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("", result.messages);
  EXPECT_EQ("# top\n[s]\n# about a\na=\"new\"\nc=true\nd=[\"x\"]\n[t]\na=3\n", content());
}

TEST_F(ToolOptionEdit, ShowsTheSectionAsItIsInTheFile) {
  writeFile(file_, "[r]\nx=1\n[s]\n# about a\n  a = \"old\"\n\nno option\nb=oops\n[t]\ny=2\n");
  EXPECT_EQ(0, edit("cp \"$1\" " + file("shown")).exitCode);
  const std::string shown = readFile(file("shown"));
  EXPECT_THAT(shown, HasSubstr("# Section 's' of " + file_ + "\n"));
  EXPECT_THAT(shown, HasSubstr("\n\n# about a\n  a = \"old\"\n\nno option\nb=oops\n"));
  EXPECT_THAT(shown, AllOf(Not(HasSubstr("x=1")), Not(HasSubstr("y=2"))));
}

TEST_F(ToolOptionEdit, TheTextIsPrivateAndRemovedAfterwards) {
  writeFile(file_, "[s]\na=1\n");
  const ToolResult result = edit(
      "stat -c %a \"$1\" \"$(dirname \"$1\")\"; touch \"$1~\"; sed -i s/1/2/ \"$1\"; echo \"$1\"");
  EXPECT_EQ(0, result.exitCode) << result;
  ASSERT_THAT(result.out, testing::StartsWith("600\n700\n"));
  const std::string path = result.out.substr(8, result.out.size() - 9);
  EXPECT_FALSE(fs::exists(fs::path(path).parent_path())) << path;
  EXPECT_EQ("[s]\na=2\n", content());
}

TEST_F(ToolOptionEdit, SecretsAreShownAsCipherText) {
  EXPECT_EQ(0, option({"set", file_, "s", "pw", "--secret"}, "open sesame").exitCode);
  const std::string before = content();
  EXPECT_EQ(0, edit("cp \"$1\" " + file("shown") + "; echo 'b=1' >>\"$1\"").exitCode);
  EXPECT_THAT(readFile(file("shown")), Not(HasSubstr("sesame")));
  EXPECT_THAT(content(), HasSubstr(before.substr(before.find("pw="))));
  EXPECT_EQ("open sesame\n", option({"get", file_, "s", "pw", "--reveal"}).out);
}

TEST_F(ToolOptionEdit, NothingIsWrittenWhenNothingWasChanged) {
  writeFile(file_, "[s]\na = 1\na=2\n"); // a save would rewrite this
  for (const std::string body : {"true", "touch \"$1\""}) {
    const ToolResult result = edit(body);
    EXPECT_EQ(0, result.exitCode) << result;
    EXPECT_EQ("kovabackup: no option was changed; nothing was written\n", result.messages);
    EXPECT_EQ("[s]\na = 1\na=2\n", content());
  }
  writeFile(file_, "[s]\na = 1\n");
  EXPECT_EQ(0, edit("sed -i 's/a = 1/a=1/' \"$1\"").exitCode);
  EXPECT_EQ("[s]\na = 1\n", content());
}

TEST_F(ToolOptionEdit, SaysThatChangesToCommentsAreNotSaved) {
  writeFile(file_, "[s]\n# about a\na=1\n");
  const ToolResult result = edit("sed -i -e 's/about a/all about a/' -e 's/=1/=2/' \"$1\"");
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("changes to comments are not saved"));
  EXPECT_EQ("[s]\n# about a\na=2\n", content());
  EXPECT_EQ("", edit("sed -i -e '1,/^$/d' -e 's/=2/=3/' \"$1\"").messages) << "its own comments";
  EXPECT_EQ("[s]\n# about a\na=3\n", content());
}

TEST_F(ToolOptionEdit, RefusesWhatCouldNotBeReadBack) {
  const std::string before = "[s]\nn=5\ntext\n"; // lines 6 and 7 of what is shown
  writeFile(file_, before);
  const std::vector<std::pair<std::string, std::string>> wrong = {
      {"[t]", "line 8: a line that begins with [ would begin another section"},
      {"[t", "line 8: a line that begins with [ would begin another section"},
      {"retries 3", "line 8: 'retries 3' is not an option: expected NAME=VALUE, or # before a"},
      {"=3", "line 8: there is no name before the ="},
      {"n=6", "line 8: option 'n' is in line 6 already"},
      {"a=oops",
       "line 8: the value of option 'a' is not JSON: text needs quotes, as in a=\"text\""},
      {"a=1.5", "line 8: option 'a' is a real, which no section can hold: expected \"text\", an "
                "integer from -2147483648 to 4294967295, true, false or a list of texts"},
      {"a=4294967296", "line 8: option 'a' is an integer out of range, which no section can hold"},
      {"a=null", "line 8: option 'a' is null, which no section can hold"},
      {"a={}", "line 8: option 'a' is an object, which no section can hold"},
      {"a=[\"x\",1]", "line 8: option 'a' is a list with an element that is not text"},
      {"a\rb=1", "line 8: 'a\rb' cannot name an option"}};
  for (const auto &[line, message] : wrong) {
    writeFile(file("line"), line + "\n");
    const ToolResult result = edit("cat " + file("line") + " >>\"$1\"");
    EXPECT_EQ(1, result.exitCode) << result;
    EXPECT_THAT(result.messages, HasSubstr(message));
    EXPECT_THAT(takeKept(result), HasSubstr("\n" + line + "\n"));
    EXPECT_EQ(before, content());
  }
}

TEST_F(ToolOptionEdit, RefusesANameWithANulByte) {
  writeFile(file_, "[s]\nn=5\n");
  const ToolResult result = edit("printf 'a\\0b=1\\n' >>\"$1\"");
  EXPECT_EQ(1, result.exitCode) << result;
  takeKept(result);
  EXPECT_EQ("[s]\nn=5\n", content());
}

TEST_F(ToolOptionEdit, AnEmptyTextRemovesNothing) {
  writeFile(file_, "[s]\na=1\n");
  const ToolResult result = edit(": >\"$1\"");
  EXPECT_EQ(1, result.exitCode) << result;
  EXPECT_THAT(result.messages, HasSubstr("the text is empty"));
  takeKept(result);
  EXPECT_EQ("[s]\na=1\n", content());
  EXPECT_EQ(0, edit("sed -i '/^a=/d' \"$1\"").exitCode);
  EXPECT_EQ("[s]\n", content());
}

TEST_F(ToolOptionEdit, KeepsTypesUnlessARetypeIsAllowed) {
  writeFile(file_, "[s]\nl=[\"a\"]\nn=5\n");
  const std::string body = "sed -i 's/^l=.*/l=\"a\"/' \"$1\"";
  const ToolResult refused = edit(body);
  EXPECT_EQ(1, refused.exitCode);
  EXPECT_THAT(refused.messages,
              HasSubstr("line 6: option 'l' was a list and would be a string, which the services "
                        "may not expect; --retype allows it"));
  takeKept(refused);
  EXPECT_EQ("[s]\nl=[\"a\"]\nn=5\n", content());
  const ToolResult allowed = edit(body, {"--retype"});
  EXPECT_EQ(0, allowed.exitCode) << allowed;
  EXPECT_EQ("kovabackup: option 'l' was a list and is a string now\n", allowed.messages);
  EXPECT_EQ("[s]\nl=\"a\"\nn=5\n", content());
}

TEST_F(ToolOptionEdit, ARealThatIsAnIntegerIsNoChange) {
  writeFile(file_, "[s]\na=5\nb=3\nc=3.0\n");
  const ToolResult result =
      edit("sed -i -e s/a=5/a=5.0/ -e s/b=3/b=3E0/ -e s/c=3.0/c=3/ \"$1\"", {"--retype"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("kovabackup: no option was changed; nothing was written\n", result.messages);
  EXPECT_EQ(0, edit("sed -i -e s/a=5/a=4E9/ \"$1\"").exitCode);
  EXPECT_THAT(content(), HasSubstr("a=4000000000\nb=3\n"));
}

TEST_F(ToolOptionEdit, MendsAnOptionThatServicesCannotRead) {
  writeFile(file_, "[s]\na=oops\nb=nonsense\nc=1.5\n");
  EXPECT_EQ(0, edit("sed -i -e 's/oops/\"mended\"/' -e '/^b=/d' -e 's/1.5/1/' \"$1\"", {"--retype"})
                   .exitCode);
  EXPECT_EQ("[s]\na=\"mended\"\nc=1\n", content());
  writeFile(file_, "[s]\na=oops\nb=1\n");
  const ToolResult result = edit("sed -i '/^a=/d' \"$1\"");
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("[s]\nb=1\n", content());
}

TEST_F(ToolOptionEdit, ListsWhatWasChangedInTheDocument) {
  writeFile(file_, "[s]\na=1\nb=2\nc=oops\nd=4\n");
  const ToolResult result =
      edit("echo drawn; sed -i -e s/a=1/a=2/ -e '/^[bc]=/d' \"$1\"; echo e=5 >>\"$1\"", {"--json"});
  EXPECT_EQ("drawn\n", result.messages) << "the editor writes to standard error";
  const Json::Value changed = document(result)["changed"];
  EXPECT_EQ((std::vector<std::string>{"a", "b", "c", "e"}),
            (std::vector<std::string>{changed[0].asString(), changed[1].asString(),
                                      changed[2].asString(), changed[3].asString()}));
  EXPECT_EQ(4U, changed.size());
  const ToolResult refused = edit("echo oops >>\"$1\"", {"--json"});
  EXPECT_EQ(1, refused.exitCode);
  const std::string message = document(refused)["errors"][0]["message"].asString();
  takeKept({1, 0, "", message});
}

TEST_F(ToolOptionEdit, EditsOnlyWhatExists) {
  const std::string editor = script("touch " + file("opened"));
  EXPECT_EQ(3, runTool(words({file_, "s"}), with(editor)).exitCode);
  writeFile(file_, "[t]\n");
  EXPECT_EQ(3, runTool(words({file_, "s"}), with(editor)).exitCode);
  EXPECT_EQ(2, runTool(words({file_, "t", "--lock-timeout", "1"}), with(editor)).exitCode);
  EXPECT_FALSE(fs::exists(file("opened")));
}

TEST_F(ToolOptionEdit, OpensNoEditorOnWhatCannotBeWritten) {
  fs::create_directory(file("mount"));
  if (::mount("tmpfs", file("mount").c_str(), "tmpfs", 0, nullptr) != 0) {
    GTEST_SKIP() << "skipped: no file system can be mounted";
  }
  const std::string mounted = writeFile(file("mount/task.conf"), "[s]\na=1\n");
  EXPECT_EQ(0, ::mount(nullptr, file("mount").c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr));
  const ToolResult result = runTool(words({mounted, "s"}), with(script("touch " + file("opened"))));
  ::umount2(file("mount").c_str(), MNT_DETACH);
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: cannot write " + mounted + ": Read-only file system\n", result.messages);
  EXPECT_FALSE(fs::exists(file("opened")));
}

TEST_F(ToolOptionEdit, FailsWhenTheEditorRemovesTheText) {
  writeFile(file_, "[s]\na=1\n");
  const ToolResult result = edit("rm \"$1\"");
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages, HasSubstr("section.conf: No such file or directory\n"));
  EXPECT_EQ("[s]\na=1\n", content());
}

TEST_F(ToolOptionEdit, VisualComesBeforeEditorAndMayHaveArguments) {
  writeFile(file_, "[s]\na=1\n");
  ToolSetup prepared = with(script("exit 9"));
  prepared.environment["VISUAL"] = script("sed -i \"s/1/$1/\" \"$2\"", "visual") + " 7";
  EXPECT_EQ(0, runTool(words({file_, "s"}), prepared).exitCode);
  EXPECT_EQ("[s]\na=7\n", content());
  prepared.environment["VISUAL"] = "";
  EXPECT_EQ(1, runTool(words({file_, "s"}), prepared).exitCode);
}

TEST_F(ToolOptionEdit, TheEditorHasTheUsersEnvironmentAndFolder) {
  writeFile(file_, "[s]\na=1\n");
  ToolSetup prepared = with(script("pwd; echo \"$FLAVOUR\""));
  prepared.environment["FLAVOUR"] = "a = b";
  prepared.folder = folder_.path();
  EXPECT_EQ(folder_.path() + "\na = b\n", runTool(words({"task.conf", "s"}), prepared).out);
}

TEST_F(ToolOptionEdit, WithoutVariablesTheSystemsEditorIsUsed) {
  writeFile(file_, "[s]\na=1\n");
  fs::create_directory(file("bin"));
  ToolSetup prepared = setup();
  prepared.environment["PATH"] = file("bin");
  const ToolResult none = runTool(words({file_, "s"}), prepared);
  EXPECT_EQ(1, none.exitCode);
  EXPECT_EQ("kovabackup: there is no editor: set VISUAL or EDITOR to one; nothing was changed\n",
            none.messages);
  for (const std::string name : {"vi", "editor", "sensible-editor"}) { // each before the last one
    script("echo " + name, "bin/" + name);
    EXPECT_EQ(name + "\n", runTool(words({file_, "s"}), prepared).out);
  }
}

TEST_F(ToolOptionEdit, AFailingEditorChangesNothing) {
  writeFile(file_, "[s]\na=1\n");
  const ToolResult result = edit("exit 5");
  EXPECT_EQ(1, result.exitCode);
  EXPECT_EQ("kovabackup: the editor '" + file("fake-editor") +
                "' ended with exit status 5; nothing was changed\n",
            result.messages);
  const ToolResult saved = edit("sed -i s/1/2/ \"$1\"; exit 5");
  EXPECT_EQ(1, saved.exitCode);
  EXPECT_THAT(saved.messages, HasSubstr("' ended with exit status 5; the edited text is kept in "));
  EXPECT_THAT(takeKept(saved), HasSubstr("\na=2\n"));
  const ToolResult killed = edit("kill -KILL $$");
  EXPECT_EQ(1, killed.exitCode);
  EXPECT_THAT(killed.messages, HasSubstr("; nothing was changed\n"));
  EXPECT_EQ("[s]\na=1\n", content());
}

TEST_F(ToolOptionEdit, RefusesWhatAnotherProcessChangedMeanwhile) {
  writeFile(file_, "[s]\na=1\nb=2\n");
  const ToolResult result =
      edit("sed -i s/a=1/a=5/ \"$1\"; sed -i s/b=2/b=3/ " + file_, {"--lock", "task.conf"});
  EXPECT_EQ(1, result.exitCode);
  EXPECT_THAT(result.messages,
              HasSubstr("kovabackup: another process changed section 's' of " + file_ +
                        " meanwhile; nothing was written; the edited text is kept in "));
  EXPECT_THAT(takeKept(result), HasSubstr("\na=5\nb=2\n"));
  EXPECT_EQ("[s]\na=1\nb=3\n", content());
  const ToolResult removed = edit("sed -i s/a=1/a=5/ \"$1\"; : >" + file_);
  EXPECT_EQ(3, removed.exitCode);
  takeKept(removed);
}

TEST_F(ToolOptionEdit, AChangeOfAnotherSectionDoesNotMatter) {
  writeFile(file_, "[s]\na=1\n[t]\nb=2\n");
  EXPECT_EQ(0, edit("sed -i s/a=1/a=5/ \"$1\"; sed -i s/b=2/b=3/ " + file_).exitCode);
  EXPECT_EQ("[s]\na=5\n[t]\nb=3\n", content());
}

TEST_F(ToolOptionEdit, TheLockIsFreeWhileTheEditorIsOpen) {
  writeFile(file_, "[s]\na=1\n");
  const std::string lock = "/tmp/kovabackup/lock/task.conf";
  EXPECT_EQ(0, option({"set", file_, "s", "b", "x", "--lock", "task.conf"}).exitCode);
  const ToolResult result = edit("flock -n " + lock + " echo free; sed -i s/1/2/ \"$1\"",
                                 {"--lock", "task.conf", "--lock-timeout", "0"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("free\n", result.out);
  EXPECT_EQ("[s]\na=2\nb=\"x\"\n", content());
}

TEST_F(ToolOptionEdit, WaitsForTheLockNoLongerThanAsked) {
  writeFile(file_, "[s]\na=1\n");
  OptionMap holder;
  ASSERT_TRUE(holder.setLockToken("task.conf"));
  ASSERT_TRUE(holder.lock());
  const ToolResult result =
      edit("sed -i s/1/2/ \"$1\"", {"--lock", "task.conf", "--lock-timeout", "0"});
  EXPECT_EQ(4, result.exitCode) << result;
  EXPECT_THAT(takeKept(result), HasSubstr("\na=2\n"));
  EXPECT_EQ("[s]\na=1\n", content());
  ASSERT_TRUE(holder.unlock());
}

TEST_F(ToolOptionEdit, WaitsForTheEditorEvenIfChildrenAreIgnored) {
  writeFile(file_, "[s]\na=1\n");
  const std::string editor = script("sed -i s/1/2/ \"$1\"");
  const ToolResult result =
      runTool({"run", "--env", "EDITOR=" + editor, "--", "env", "--ignore-signal=CHLD",
               KOVA_TOOL_PATH, "option", "edit", file_, "s"},
              setup());
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ("[s]\na=2\n", content());
}

} // namespace
