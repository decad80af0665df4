#ifndef KOVABACKUP_TESTS_RUN_TOOL_H
#define KOVABACKUP_TESTS_RUN_TOOL_H

/// @file The built command kovabackup as a child of the test, on plain files or on a terminal.
///
///     const ToolResult result = runTool({"lock", "show", "tasks", "--json"});
///     EXPECT_EQ(3, result.exitCode) << result;
///     EXPECT_FALSE(document(result)["held"].asBool());
///
///     TerminalTool tool({"session", "prune", "--older-than", "7d"});
///     tool.expect("[y/N]");
///     tool.send("y\n");
///     EXPECT_EQ(0, tool.wait().exitCode);

#include "tests/support/files.h"

#include <json/json.h>
#include <map>
#include <ostream>
#include <string>
#include <sys/types.h>
#include <vector>

namespace KovaTest {

struct ToolResult {
  int exitCode = -1;    ///< -1 when a signal ended it
  int signal = 0;       ///< the signal that ended it
  std::string out;      ///< standard output; on a terminal all that was shown
  std::string messages; ///< standard error
};

std::ostream &operator<<(std::ostream &os, const ToolResult &result);

struct ToolSetup {
  std::string input = "";                              ///< standard input
  std::map<std::string, std::string> environment = {}; ///< besides PATH and TERM
  std::string folder = "/";                            ///< working directory
  int outFd = -1;        ///< standard output instead of the one that is collected; -2 to close it
  bool closeIn = false;  ///< run it without standard input
  int inFd = -1;         ///< standard input instead of the given text
  bool asNobody = false; ///< as user and group 65534, when the test runs as root
  std::size_t memoryLimit = 0;  ///< most bytes of address space; 0 for no limit
  unsigned short columns = 100; ///< of the terminal
};

ToolResult runTool(const std::vector<std::string> &arguments, const ToolSetup &setup = {});

/// The result's document; fails the test unless it is a JSON document with the schema's version.
Json::Value document(const ToolResult &result);

/// The command with a terminal for all three streams.
class TerminalTool {
public:
  explicit TerminalTool(const std::vector<std::string> &arguments, const ToolSetup &setup = {});
  ~TerminalTool();
  TerminalTool(const TerminalTool &) = delete;
  TerminalTool &operator=(const TerminalTool &) = delete;

  /// Waits until text has been shown. Fails the test when the command ends or a minute passes.
  void expect(const std::string &text);
  void send(const std::string &text) const;
  pid_t pid() const { return pid_; }
  /// The terminal's own side; its settings are those that the command sees.
  int terminal() const { return master_; }
  /// Reads to the end and waits.
  ToolResult wait();

private:
  bool readMore();

  pid_t pid_ = -1;
  int master_ = -1;
  std::string shown_;
  std::size_t seen_ = 0;
};

} // namespace KovaTest

#endif
