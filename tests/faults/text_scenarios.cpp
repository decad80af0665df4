// Texts, paths and filters: operations on memory alone.

#include "kovabackup/network.h"
#include "kovabackup/path_filter.h"
#include "kovabackup/path_kova.h"
#include "kovabackup/path_util.h"
#include "kovabackup/string_util.h"
#include "tests/faults/allocations.h"
#include "tests/faults/attempt.h"
#include "tests/faults/world.h"

#include <list>
#include <map>
#include <string>
#include <vector>

namespace KovaTest::Faults {
namespace {

namespace ConfigPath = KOVA::Backup::ConfigPath;
namespace Path = KOVA::Backup::Path;
using KOVA::Backup::PathFilter;
using KOVA::Backup::replaceMustache;
using KOVA::Backup::stringf;

// Longer than any buffer for short texts.
const std::string kLong(60, 'x');

using Variables = std::map<std::string, std::string>;

Json::Value makeValues() {
  const UncountedAllocations pause;
  Json::Value values;
  values["task"] = kLong;
  values["count"] = 5;
  return values;
}

void formatTexts() {
  const Json::Value values = makeValues();
  attempt("short", [] { return stringf("%s-%03d", "task", 7); });
  attempt("long", [] { return stringf("%s-%03d", kLong.c_str(), 7); });
  attempt("from a map", [] {
    return replaceMustache("{{task}} ended. {{why}}", Variables{{"task", kLong}});
  });
  attempt("from JSON", [&] { return replaceMustache("{{task}}: {{count}}", values, false); });
  attempt("as JSON", [&] { return replaceMustache("{{task}}: {{count}}", values, true); });
  attempt("from a mapper", [] {
    return replaceMustache("{{a}}{{b}}", [](const std::string &name, std::string &value) {
      value = name + kLong;
      return true;
    });
  });
  attempt("mapped from JSON", [&] {
    std::string value = "unchanged";
    return KOVA::Backup::_VarsMapperJson(values, true)("task", value) ? value : "";
  });
  attempt("mapped", [] {
    const Variables variables{{"task", kLong}};
    std::string value = "unchanged";
    return KOVA::Backup::_VarsMapperMapString(variables)("task", value) ? value : "";
  });
}

std::string joined(const std::vector<std::string> &parts) {
  std::string text;
  for (const std::string &part : parts) {
    text += part + " ";
  }
  return text;
}

const std::string kFolder = "/the/first/folder/of/all/of/them";
const std::string kPath = kFolder + "/and/a/file/below/it";

void handlePaths() {
  attempt("dirname", [] { return Path::dirname(kPath); });
  attempt("basename", [] { return Path::basename(kPath + "/" + kLong); });
  attempt("join", [] { return Path::join(kFolder, kPath); });
  attempt("join seven", [] { return Path::join(kFolder, "b", "c", "d", "e", "f", kLong); });
  attempt("split", [] {
    std::vector<std::string> parts{"what was there"};
    return Path::split(kPath, parts) ? joined(parts) + Path::join(parts) : "";
  });
  attempt("token", [] { return Path::token(kPath, 3); });
  attempt("common", [] { return Path::common(kFolder + "/x", kPath); });
  attempt("relative", [] { return Path::relative(kPath, kFolder); });
  attempt("absolute", [] { return Path::absPath(kFolder); });
  attempt("root", [] { return Path::getIpcTempPath(); });
  attempt("share",
          [] { return ConfigPath::shareName(kPath) + ConfigPath::shareRelativePath(kPath); });
  attempt("in @eaDir", [] { return Path::isInKovaEaDir(kPath + "/@eaDir/x"); });
  attempt("address", [] { return KOVA::Backup::Net::getIpFromAddr("2001:db8:1111:2222:3333::1"); });
}

// absPath returns the path as it is where the working directory cannot be read.
void absolute() {
  attempt("absolute", [] { return Path::absPath("some/relative/path/to/a/file"); });
}

void checkAbsolute(const Seen &seen, Findings &findings) {
  if (seen.killed() || !seen.failedIn("getcwd")) {
    checkAttempts(seen, findings);
  } else {
    findings.expect(seen.valueOf("absolute") == "some/relative/path/to/a/file",
                    "absolute is " + seen.valueOf("absolute"));
  }
}

// The platform knows no share there, and says so in the log.
void share() {
  attempt("share", [] { return Path::getShareName(volume() + "/photo/2021"); });
}

int countOf(PathFilter &filter) {
  const UncountedAllocations pause;
  std::list<std::string> includes;
  std::list<std::string> excludes;
  (void)filter.getIncludePattern(includes, "");
  (void)filter.getExcludePattern(excludes, "");
  return static_cast<int>(includes.size() * 10 + excludes.size());
}

// After each addition, both lists are said: the filter's and the caller's.
void fillFilter(PathFilter &filter) {
  std::list<std::string> includes{"/first/folder/**.raw", "/first/folder/**.tif"};
  attempt("exclude", [&] { return filter.addExcludePattern("/first/folder/with/a/long/name/**"); });
  say("after exclude", countOf(filter));
  attempt("include", [&] { return filter.addIncludePattern("/first/folder/**.jpeg and more"); });
  say("after include", countOf(filter));
  attempt("merge", [&] { return filter.addIncludePattern(includes); });
  say("after merge", countOf(filter));
  say("not merged", static_cast<int>(includes.size()));
}

void filterPaths() {
  PathFilter filter;
  fillFilter(filter);
  attempt("filtered", [&] {
    return filter.filterOut("/first/folder/with/a/long/name/" + std::string(20000, 'a'));
  });
  std::list<std::string> found{"what was there"};
  attempt("below", [&] { return filter.getIncludePattern(found, "/first/folder"); });
  say("found", static_cast<int>(found.size()));
}

// An addition that runs out of memory changes nothing.
void checkFilter(const Seen &seen, Findings &findings) {
  if (seen.clean == nullptr || seen.killed() || !seen.valueOf("threw").empty()) {
    return;
  }
  const bool excluded = seen.isTrue("exclude");
  const bool included = seen.isTrue("include");
  const bool merged = seen.isTrue("merge");
  const int first = excluded ? 1 : 0;
  const int second = first + (included ? 10 : 0);
  const int third = second + (merged ? 20 : 0);
  findings.expect(seen.valueOf("after exclude") == std::to_string(first), "after exclude");
  findings.expect(seen.valueOf("after include") == std::to_string(second), "after include");
  findings.expect(seen.valueOf("after merge") == std::to_string(third), "after merge");
  findings.expect(seen.valueOf("not merged") == (merged ? "0" : "2"), "the caller's list");
  for (const std::string name : {"exclude", "include", "merge", "below"}) {
    checkAttempt(seen, findings, name);
  }
  findings.expect(!excluded || seen.valueOf("filtered") != "false", "not filtered");
  const int patterns = (included ? 1 : 0) + (merged ? 2 : 0);
  findings.expect(seen.valueOf("found") == std::to_string(seen.isTrue("below") ? 1 + patterns : 1),
                  "found " + seen.valueOf("found"));
}

} // namespace

void addTextScenarios(Scenarios &all) {
  all.push_back({"texts", [] {}, formatTexts, checkAttempts, {}});
  all.push_back({"paths", [] {}, handlePaths, checkAttempts, {}});
  all.push_back({"absolute path", [] {}, absolute, checkAbsolute, {}});
  all.push_back({"share name", [] {}, share, checkAttempts, {}});
  all.push_back({"path filter", [] {}, filterPaths, checkFilter, {}});
}

} // namespace KovaTest::Faults
