#include "check.h"

#include <kovabackup/option_map.h>

#include <list>
#include <sstream>
#include <string>

using namespace KOVA::Backup;

namespace {

const char *const kFile = "/tmp/interface.conf";

using Texts = std::list<std::string>;

void callSetters(OptionMap &map) {
  check(map.optSet("text", std::string("a")), "optSet of a string");
  check(map.optSet("chars", "b"), "optSet of a C string");
  check(map.optSet("secret", std::string("hidden"), true), "optSet of a secret string");
  check(map.optSet("int", 7), "optSet of an int");
  check(map.optSet("long", 1LL << 40), "optSet of a long long");
  check(map.optSet("bool", true), "optSet of a bool");
  check(map.optSet("list", Texts(2, "x")), "optSet of a list");
}

void callGetters(const OptionMap &map) {
  check(map.optString("text", "") == "a", "optString");
  check(map.optSecret("secret", "") == "hidden", "optSecret");
  check(map.optInt("int", 0) == 7, "optInt");
  check(map.optBool("bool", false), "optBool");
  std::string text;
  check(map.optGet("chars", text) && text == "b", "optGet of a string");
  char chars[20] = "";
  check(map.optGet("secret", chars, sizeof chars, true) && std::string(chars) == "hidden",
        "optGet into a buffer");
  int number = 0;
  check(map.optGet("int", number) && number == 7, "optGet of an int");
  long long large = 0;
  check(map.optGet("long", large) && large == 1LL << 40, "optGet of a long long");
  bool flag = false;
  check(map.optGet("bool", flag) && flag, "optGet of a bool");
  Texts list;
  check(map.optGet("list", list) && list == Texts(2, "x"), "optGet of a list");
}

void callCopies(const OptionMap &map) {
  OptionMap copy(map);
  OptionMap assigned;
  assigned = copy;
  OptionMap clone;
  check(assigned.optCloneTo(clone) && clone.optInt("int", 0) == 7, "copies and optCloneTo");
  check(clone.optRemove("int") && clone.optInt("int", 0) == 0, "optRemove");
  check(clone.optClear() && clone.optString("text", "none") == "none", "optClear");
  check(!clone.optIsLoaded(), "optIsLoaded");
}

void callJson(const OptionMap &map) {
  OptionMap other;
  check(other.optLoadJsonString(map.optToJsonString()) && other.optInt("int", 0) == 7,
        "optToJsonString and optLoadJsonString");
  check(other.optAppendJsonString("{\"more\":1}") && other.optInt("more", 0) == 1,
        "optAppendJsonString");
  std::ostringstream os;
  os << map;
  check(!os.str().empty(), "operator<<");
}

void callSections() {
  check(OptionMap::optSectionGetUniqueId(kFile, "task") == 1, "optSectionGetUniqueId");
  check(OptionMap::optSectionCreateUniqueId(kFile, "task", 5), "optSectionCreateUniqueId");
  check(OptionMap::optSectionCreateUniqueName(kFile, "own"), "optSectionCreateUniqueName");
  std::list<int> ids;
  check(OptionMap::optSectionListId(kFile, "task", ids) && ids.size() == 2, "optSectionListId");
  Texts names;
  check(OptionMap::optSectionListName(kFile, names) && names.size() == 3, "optSectionListName");
  OptionMap map;
  check(map.optSectionCreate(kFile, "task", 7) && map.optSectionGetId() == 7,
        "optSectionCreate with an id");
  OptionMap named;
  check(named.optSectionCreate(kFile, "global", false) && !named.optSectionGetName().empty(),
        "optSectionCreate with a name");
  map.optSet("key", "value");
  check(map.setLockToken("interface") && map.lock() && map.unlock(), "the lock");
  check(map.optSectionSave(), "optSectionSave");
  OptionMap loaded;
  check(loaded.optSectionLoad(kFile, "task", 7) && loaded.optString("key", "") == "value",
        "optSectionLoad");
  check(loaded.optSectionExport(kFile, "copy", true), "optSectionExport");
  check(loaded.optSectionRemove(), "optSectionRemove");
}

} // namespace

void callOptions() {
  OptionMap map;
  callSetters(map);
  callGetters(map);
  callCopies(map);
  callJson(map);
  callSections();
}
