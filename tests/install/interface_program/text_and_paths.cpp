#include "check.h"

#include <kovabackup/path_filter.h>
#include <kovabackup/path_kova.h>
#include <kovabackup/path_util.h>
#include <kovabackup/string_util.h>

#include <cstdarg>
#include <list>
#include <map>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

using namespace KOVA::Backup;

namespace {

using Patterns = std::list<std::string>;

__attribute__((format(printf, 1, 2))) std::string formatted(const char *format, ...) {
  va_list args;
  va_start(args, format);
  const std::string text = vstringf(format, args);
  va_end(args);
  return text;
}

bool upperA(const std::string &name, std::string &value) {
  value = "A";
  return name == "a";
}

void callText() {
  check(stringf("%s-%d", "a", 3) == "a-3", "stringf");
  check(formatted("%s-%d", "a", 3) == "a-3", "vstringf");
  std::map<std::string, std::string> vars;
  vars["name"] = "nightly";
  Json::Value json;
  json["name"] = "nightly";
  std::string value;
  check(_VarsMapperMapString(vars)("name", value) && value == "nightly", "_VarsMapperMapString");
  value.clear();
  check(_VarsMapperJson(json, false)("name", value) && value == "nightly", "_VarsMapperJson");
  check(replaceMustache("<{{a}}>", upperA) == "<A>", "replaceMustache by a function");
  check(replaceMustache("<{{name}}>", vars) == "<nightly>", "replaceMustache by a map");
  check(replaceMustache("<{{name}}>", json, false) == "<nightly>", "replaceMustache by JSON");
}

void callPathAlgebra() {
  check(Path::dirname("/a/b") == "/a", "dirname");
  check(Path::basename("/a/b") == "b", "basename");
  check(Path::join("a/", "/b") == "a/b", "join of two");
  check(Path::join("/", "b", "c", "d", "e", "f", "g") == "/b/c/d/e/f/g", "join of seven");
  std::vector<std::string> parts;
  check(Path::split("/a/b", parts) && parts.size() == 3, "split");
  check(Path::join(parts.begin(), parts.end()) == "/a/b", "join of a range");
  check(Path::join(parts) == "/a/b", "join of a vector");
  check(Path::token("/a/b", 1) == "a", "token");
  check(Path::common("/a/b/c", "/a/b/d") == "/a/b", "common");
  check(Path::relative("/a/b/c", "/a") == "b/c", "relative");
  check(Path::absPath("/a/../b") == "/a/../b", "absPath");
}

void callPathsOnDisk() {
  check(Path::getIpcTempPath() == "/tmp/kovabackup", "getIpcTempPath");
  const std::string dir = Path::createIpcTempPath("interface", 0710);
  struct stat info = {};
  check(dir == "/tmp/kovabackup/interface" && ::stat(dir.c_str(), &info) == 0 &&
            (info.st_mode & 07777) == 0710,
        "createIpcTempPath");
  check(removeAll(dir) && ::access(dir.c_str(), F_OK) != 0, "removeAll");
  const int lock = Path::createIpcLockFile("interface");
  check(lock >= 0 && ::close(lock) == 0 && ::unlink("/tmp/kovabackup/lock/interface") == 0,
        "createIpcLockFile");
  check(ConfigPath::shareName("/music/a/b") == "music", "ConfigPath::shareName");
  check(ConfigPath::shareRelativePath("/music/a/b") == "a/b", "ConfigPath::shareRelativePath");
  check(Path::getShareName("/mnt/music") == "music", "getShareName");
  check(Path::isInKovaEaDir("/volume1/music/@eaDir/a") != Path::isInKovaEaDir("/volume1/music/a"),
        "isInKovaEaDir");
}

void callFilter() {
  PathFilter filter;
  Patterns include(1, "/a/keep/**");
  Patterns exclude(1, "/a/**");
  check(filter.addIncludePattern(include) && include.empty(), "addIncludePattern of a list");
  check(filter.addExcludePattern(exclude) && exclude.empty(), "addExcludePattern of a list");
  check(filter.addIncludePattern("/a/also"), "addIncludePattern");
  check(filter.addExcludePattern("/b"), "addExcludePattern");
  check(filter.filterOut("/a/b") && filter.filterOut("/b"), "filterOut of what is excluded");
  check(!filter.filterOut("/a/keep/c") && !filter.filterOut("/a/also"),
        "filterOut of what is included");
  Patterns found;
  check(filter.getIncludePattern(found, "/a") && found == (Patterns{"/a/keep/**", "/a/also"}),
        "getIncludePattern");
  found.clear();
  check(filter.getExcludePattern(found, "/a") && found == Patterns(1, "/a/**"),
        "getExcludePattern");
}

} // namespace

void callTextAndPaths() {
  callText();
  callPathAlgebra();
  callPathsOnDisk();
  callFilter();
}
