#ifndef KOVABACKUP_TESTS_OPTION_EDIT_SUPPORT_H
#define KOVABACKUP_TESTS_OPTION_EDIT_SUPPORT_H

/// @file Editors, and the texts that `option edit` keeps, for its tests.

#include "tests/tools/option_support.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <regex>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace KovaTest {

/// Shell scripts stand in for editors. "$1" is the file that they are given.
class ToolOptionEdit : public ToolOption {
protected:
  std::string script(const std::string &body, const std::string &name = "fake-editor") const {
    writeFile(folder_ / name, "#!/bin/sh\n" + body + "\n");
    ::chmod((folder_ / name).c_str(), 0755);
    return folder_ / name;
  }

  ToolSetup with(const std::string &editor) const {
    ToolSetup prepared = setup();
    prepared.environment["EDITOR"] = editor;
    return prepared;
  }

  static std::vector<std::string> words(std::vector<std::string> more) {
    more.insert(more.begin(), {"option", "edit"});
    return more;
  }

  /// Edits section "s" with a script.
  ToolResult edit(const std::string &body, std::vector<std::string> more = {}) const {
    more.insert(more.begin(), {file_, "s"});
    return runTool(words(more), with(script(body)));
  }

  std::string file(const std::string &name) const { return folder_ / name; }
};

/// The file that a message names, which the test removes with its directory.
inline std::string takeKept(const ToolResult &result) {
  static const std::regex kKept(
      "the edited text is kept in (/tmp/kovabackup-edit\\.[^/]+)(/[^ ;\r\n]+)");
  std::smatch found;
  if (!std::regex_search(result.messages, found, kKept)) {
    ADD_FAILURE() << "names no kept text: " << result;
    return "";
  }
  std::string text = readFile(found.str(1) + found.str(2));
  std::filesystem::remove_all(found.str(1));
  return text;
}

} // namespace KovaTest

#endif
