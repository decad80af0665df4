// Uses every kind of declaration in the headers: functions, classes, a virtual base, JSON.
#include <kovabackup/option_map.h>
#include <kovabackup/path_filter.h>
#include <kovabackup/path_util.h>
#include <kovabackup/session.h>
#include <kovabackup/string_util.h>
#include <kovabackup/subprocess.h>
#include <kovabackup/temp_manager.h>

#include <iostream>
#include <map>
#include <string>

using namespace KOVA::Backup;

int main() {
  std::map<std::string, std::string> vars;
  vars["name"] = "nightly";
  if (replaceMustache("task {{name}}", vars) != "task nightly") {
    return 1;
  }
  if (Path::join("/volume1/", "share") != "/volume1/share") {
    return 2;
  }
  OptionMap options;
  options.optSet("count", 3);
  if (options.optInt("count", 0) != 3) {
    return 3;
  }
  PathFilter filter;
  filter.addExcludePattern("/a/**");
  if (!filter.filterOut("/a/b/c")) {
    return 4;
  }
  SubProcess command("/bin/true");
  if (command.call() != 0) {
    return 5;
  }
  if (TempManager::maxVolume(5, 2, false)->getSignature() != "FilterMaxVolume:5:2:0") {
    return 6;
  }
  if (!Session().getId().empty()) {
    return 7;
  }
  std::cout << "the installed library works\n";
  return 0;
}
