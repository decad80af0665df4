// The command explains every line of the catalogue as the documents do, without the documents.
#include "tests/tools/run_tool.h"

#include <gmock/gmock.h>
#include <map>
#include <sstream>

namespace {

using namespace KovaTest;
using testing::HasSubstr;

const char *const kExplanation =
    "session:126 (LOG_ERR)\n"
    "    failed to getVolumePath()\n"
    "  Written by: Session::create with a rule\n"
    "  Meaning: No volume satisfies the rule, and the rule has no fallback. No session was "
    "created.\n"
    "  What to do: `kovabackup volume pick RULE` shows what each volume lacks. Usually no data "
    "volume is mounted, or none is writable.\n";

TEST(ToolExplain, ExplainsAModuleAndNumber) {
  const ToolResult result = runTool({"explain", "session:126"});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_EQ(kExplanation, result.out);
  EXPECT_EQ("", result.messages);
}

TEST(ToolExplain, ExplainsALineOfTheSystemLog) {
  const std::string line = "(812) [err] session:126 failed to getVolumePath()";
  EXPECT_EQ(kExplanation, runTool({"explain", line}).out);
  EXPECT_EQ(kExplanation, runTool({"explain"}, {line}).out);
  EXPECT_EQ(kExplanation,
            runTool({"explain"}, {"Nov 22 07:00:01 nas backupd[812]: " + line + "\n"}).out);
  // A program may have the name of a module.
  EXPECT_EQ(kExplanation, runTool({"explain", "Nov 22 07:00:01 nas session: " + line}).out);
}

TEST(ToolExplain, ExplainsEachMessageOnce) {
  const std::string line = "(812) [err] session:126 failed to getVolumePath()\n";
  EXPECT_EQ(kExplanation, runTool({"explain"}, {line + "cron:1 of another program\n" + line}).out);
}

TEST(ToolExplain, ExplainsTheMessagesOfSeveralLines) {
  const std::string lines = "(8) [err] session:126 failed\nnetwork/network:97 bad parameter\n";
  EXPECT_THAT(runTool({"explain"}, {lines}).out,
              testing::AllOf(HasSubstr("session:126 (LOG_ERR)\n"),
                             HasSubstr("network/network:97 (LOG_ERR, plain)\n")));
}

TEST(ToolExplain, ExplainsPlainLines) {
  EXPECT_THAT(runTool({"explain"}, {"network/network:97 bad parameter\n"}).out,
              testing::StartsWith("network/network:97 (LOG_ERR, plain)\n    bad parameter\n"));
}

TEST(ToolExplain, ExplainsThePlatformsErrorOfALine) {
  const std::string line = "(1) [err] option_map:379 KLIBFileSetSection failed.: [0x0900 a.cpp:1]";
  EXPECT_THAT(runTool({"explain", line}).out,
              testing::EndsWith("\n\nPlatform error 0x0900: no such file\n"));
  const Json::Value codes = document(runTool({"explain", "--json", line}))["codes"];
  ASSERT_EQ(1U, codes.size());
  EXPECT_EQ("0x0900", codes[0]["code"].asString());
  EXPECT_EQ("no such file", codes[0]["meaning"].asString());
}

TEST(ToolExplain, TakesZeroForAPlatformError) {
  EXPECT_THAT(runTool({"explain", "0x0000"}).out, HasSubstr("Platform error 0x0000: "));
  EXPECT_THAT(runTool({"explain", "session:126 failed.: [0x0000 a.cpp:1]"}).out,
              HasSubstr("\n\nPlatform error 0x0000: "));
}

// The platform's error of a log line is the one in brackets, whatever its text quotes.
TEST(ToolExplain, ExplainsTheErrorInBracketsOfALineThatQuotesAnother) {
  for (const std::string code : {"0x0000", "0x0901"}) {
    const std::string line =
        "session:126 failed (platform error 0x0900 at a.cpp:1).: [" + code + " a.cpp:1]";
    const Json::Value codes = document(runTool({"explain", "--json", line}))["codes"];
    ASSERT_EQ(1U, codes.size()) << codes;
    EXPECT_EQ(code, codes[0]["code"].asString());
  }
}

TEST(ToolExplain, ExplainsAPlatformErrorWithoutALine) {
  for (const char *text : {"0x0900", "[0x0900 core/x.cpp:1]"}) {
    const ToolResult result = runTool({"explain", text});
    EXPECT_EQ(0, result.exitCode) << result;
    EXPECT_EQ("Platform error 0x0900: no such file\n", result.out);
    EXPECT_EQ("", result.messages);
  }
  EXPECT_THAT(runTool({"explain", "0x0900", "0x0901"}).out, HasSubstr("no such file\n\nPlatform "));
}

TEST(ToolExplain, TakesNoOtherTextForAPlatformError) {
  for (const char *text : {"0x", "0x09zz", "0900"}) {
    EXPECT_EQ(3, runTool({"explain", text}).exitCode) << text;
  }
  EXPECT_EQ(3, runTool({"explain"}, {"kernel: [0x0900 other]\n"}).exitCode);
}

TEST(ToolExplain, PrintsADocument) {
  const Json::Value messages = document(runTool({"explain", "session:126", "--json"}))["messages"];
  ASSERT_EQ(1U, messages.size());
  EXPECT_EQ("session:126", messages[0]["id"].asString());
  EXPECT_EQ("LOG_ERR", messages[0]["priority"].asString());
  EXPECT_FALSE(messages[0]["plain"].asBool());
  EXPECT_EQ("failed to getVolumePath()", messages[0]["text"].asString());
}

TEST(ToolExplain, TellsWhichNumbersExist) {
  const ToolResult result = runTool({"explain", "proc/signal:1", "session:126"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ(kExplanation, result.out);
  EXPECT_THAT(result.messages, testing::MatchesRegex("kovabackup: there is no message "
                                                     "proc/signal:1; those of proc/signal "
                                                     "are [0-9]+(, [0-9]+)*\n"));
}

TEST(ToolExplain, SuggestsTheMessageThatWasMeant) {
  const ToolResult result = runTool({"explain", "sesion:126"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("kovabackup: 'sesion:126' names no message; did you mean 'session:126'?\n",
            result.messages);
  EXPECT_EQ(
      "kovabackup: 'x' names no message: expected MODULE:NUMBER, as in session:126, a complete "
      "log line, or a platform error code, as in 0x0900\n",
      runTool({"explain", "x"}).messages);
}

TEST(ToolExplain, Says3WhenNoLineHasAMessage) {
  const ToolResult result = runTool({"explain"}, {"nothing\nof ours: 12:30\n"});
  EXPECT_EQ(3, result.exitCode);
  EXPECT_EQ("", result.out);
  EXPECT_EQ("kovabackup: no line names a message of the libraries: expected MODULE:NUMBER, as in "
            "session:126\n",
            result.messages);
}

// The text of docs/messages.md under each "### MODULE:NUMBER".
std::map<std::string, std::string> documentedMessages() {
  std::map<std::string, std::string> parts;
  std::istringstream lines(readFile(std::string(KOVA_SOURCE_DIR) + "/docs/messages.md"));
  std::string id;
  for (std::string line; std::getline(lines, line);) {
    if (line.rfind("## ", 0) == 0) {
      id.clear();
    } else if (line.rfind("### ", 0) == 0) {
      id = line.substr(4);
    } else if (!id.empty()) {
      parts[id] += line + "\n";
    }
  }
  return parts;
}

TEST(ToolExplain, KnowsEveryMessageOfTheDocuments) {
  const std::map<std::string, std::string> documented = documentedMessages();
  ASSERT_GE(documented.size(), 100U);
  std::vector<std::string> words{"explain", "--json"};
  for (const auto &[id, text] : documented) {
    words.push_back(id);
  }
  const ToolResult result = runTool(words);
  EXPECT_EQ(0, result.exitCode) << result.messages;
  const Json::Value messages = document(result)["messages"];
  ASSERT_EQ(documented.size(), messages.size());
  for (const Json::Value &message : messages) {
    const std::string expected = "\n    " + message["text"].asString() + "\n\n" +
                                 message["priority"].asString() +
                                 (message["plain"].asBool() ? ", plain" : "") +
                                 ". Written by: " + message["writtenBy"].asString() + ".\n\n" +
                                 message["meaning"].asString() + "\n\n**What to do:** " +
                                 message["action"].asString() + "\n";
    EXPECT_THAT(documented.at(message["id"].asString()), testing::StartsWith(expected));
  }
}

TEST(ToolExplain, ExplainsALineOfAStandIn) {
  const std::string line = "kovaplatform: /etc/kovaplatform/platform.conf:2: unknown key 'sise'";
  const ToolResult result = runTool({"explain", line});
  EXPECT_EQ(0, result.exitCode) << result;
  EXPECT_THAT(result.out, testing::StartsWith("kovaplatform:unknown-key (LOG_ERR, plain)\n"
                                              "    kovaplatform: %s:%d: unknown key '%s'\n"));
  EXPECT_EQ(result.out, runTool({"explain"}, {"Nov 22 07:00:01 nas x[8]: " + line + "\r\n"}).out);
  EXPECT_EQ(result.out, runTool({"explain", "kovaplatform:unknown-key"}).out);
}

// What a line of the format could look like.
std::string filled(std::string format) {
  for (const auto &[conversion, value] :
       {std::pair{"%s", "/a: b"}, std::pair{"%d", "12"}, std::pair{"%zu", "35"},
        std::pair{"%m", "Permission denied"}}) {
    for (std::size_t at; (at = format.find(conversion)) != std::string::npos;) {
      format.replace(at, std::string(conversion).size(), value);
    }
  }
  return format;
}

TEST(ToolExplain, TellsTheLinesOfTheStandInsApart) {
  int count = 0;
  for (const auto &[id, text] : documentedMessages()) {
    if (id.rfind("kova", 0) == 0) {
      const std::string format = text.substr(5, text.find('\n', 5) - 5);
      const Json::Value found =
          document(runTool({"explain", "--json", filled(format)}))["messages"];
      ASSERT_EQ(1U, found.size()) << format;
      EXPECT_EQ(id, found[0]["id"].asString());
      ++count;
    }
  }
  EXPECT_GE(count, 18);
}

TEST(ToolExplain, TakesNoOtherLineForOneOfAStandIn) {
  for (const char *line : {"kovasdk: the mount table cannot be read today", "kovasdk: x",
                           "the mount table cannot be read", "kovasdk:", "kovaplatform: x:y"}) {
    EXPECT_EQ(3, runTool({"explain", line}).exitCode) << line;
  }
}

// The codes of the table at the end of the documents.
TEST(ToolExplain, HasWordsForEveryPlatformError) {
  std::istringstream lines(readFile(std::string(KOVA_SOURCE_DIR) + "/docs/messages.md"));
  std::vector<std::string> words{"explain", "--json"};
  for (std::string line; std::getline(lines, line);) {
    if (line.rfind("| 0x", 0) == 0) {
      words.push_back(line.substr(2, 6));
    }
  }
  const Json::Value codes = document(runTool(words))["codes"];
  ASSERT_GE(codes.size(), 40U);
  for (const Json::Value &code : codes) {
    EXPECT_TRUE(code["meaning"].isString()) << code;
  }
}

TEST(ToolExplain, ExplainsThePlatformErrorOfAMessageOfTheCommand) {
  const std::string message = "kovabackup: cannot write section 'a' of b: the file cannot be read "
                              "(platform error 0xf303 at core/regular_file.cpp:85)";
  EXPECT_EQ("Platform error 0xf303: the file cannot be read\n", runTool({"explain", message}).out);
}

TEST(ToolExplain, BreaksLinesAtWordsOnATerminal) {
  TerminalTool tool({"explain", "session:126"}, {"", {{"NO_COLOR", "1"}}});
  EXPECT_THAT(tool.wait().out,
              HasSubstr("Usually no data volume is\r\n  mounted, or none is writable.\r\n"));
}

TEST(ToolExplain, SaysThatItReadsATerminal) {
  TerminalTool tool({"explain"});
  tool.expect("reading log lines from standard input");
  tool.send("session:126\n\x04");
  EXPECT_THAT(tool.wait().out, HasSubstr("Session::create with a rule"));
}

} // namespace
