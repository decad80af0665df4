#ifndef KOVABACKUP_TESTS_OPTION_SUPPORT_H
#define KOVABACKUP_TESTS_OPTION_SUPPORT_H

/// @file A section file, and a key file of its own, for the tests of the option commands.

#include "tests/tools/run_tool.h"

#include <gtest/gtest.h>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace KovaTest {

class ToolOption : public testing::Test {
protected:
  void SetUp() override {
    writeFile(conf_, "[secret]\nkeyFile=\"" + (folder_ / "key/secret.key") + "\"\n");
    ::chmod(conf_.c_str(), 0644); // whatever the umask
  }

  ToolSetup setup(const std::string &input = "") const {
    return {input, {{"KOVA_PLATFORM_CONF", conf_}, {"NO_COLOR", "1"}}};
  }
  ToolResult option(std::vector<std::string> arguments, const std::string &input = "") const {
    arguments.insert(arguments.begin(), "option");
    return runTool(arguments, setup(input));
  }
  std::string content() const { return readFile(file_); }

  TestFolder folder_;
  std::string conf_ = folder_ / "platform.conf";
  std::string file_ = folder_ / "task.conf";
};

} // namespace KovaTest

#endif
