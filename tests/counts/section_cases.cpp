// Sections of a file in memory. The size is the number of sections in the file unless a comment
// says otherwise.

#include "kovabackup/option_map.h"

#include "tests/counts/counted.h"

namespace KovaCounts {
namespace {

using KOVA::Backup::OptionMap;

constexpr int kFirstId = 100000; // ids of the same length

std::string sectionText(std::size_t index) {
  return "[task" + std::to_string(kFirstId + index) +
         "]\n# nightly\nenabled=true\nname=\"the task\"\nruns=0\n\n";
}

std::string fileOf(const std::string &text) {
  std::string path = scratchFolder() + "/sections.conf";
  writeFile(path, text);
  return path;
}

std::string fileOfSections(std::size_t sections) {
  std::string text;
  for (std::size_t i = 0; i < sections; ++i) {
    text += sectionText(i);
  }
  return fileOf(text);
}

int lastId(std::size_t sections) {
  return kFirstId + static_cast<int>(sections) - 1;
}

void load(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  count([&] {
    OptionMap map;
    return map.optSectionLoad(path, "task", lastId(sections)) &&
           map.optString("name", "") == "the task";
  });
}

void listIds(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  count([&] {
    std::list<int> ids;
    return OptionMap::optSectionListId(path, "task", ids) && ids.size() == sections;
  });
}

void listNames(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  count([&] {
    std::list<std::string> names;
    return OptionMap::optSectionListName(path, names) && names.size() == sections;
  });
}

void uniqueId(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  count([&] { return OptionMap::optSectionGetUniqueId(path, "task") > 0; });
}

// The ids are all taken from 1 on, so the free one is behind the last. A call reserves its id.
void uniqueIdLast(std::size_t sections) {
  std::string text;
  for (std::size_t i = 1; i <= sections; ++i) {
    text += "[task" + std::to_string(i) + "]\n";
  }
  const std::string path = fileOf(text);
  const int last = static_cast<int>(sections);
  count([&] { return OptionMap::optSectionGetUniqueId(path, "task") > last; });
}

void save(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  OptionMap map;
  require(map.optSectionLoad(path, "task", lastId(sections)), "the section");
  count([&] { return map.optSet("runs", 1) && map.optSectionSave(); });
}

// The second run finds one more section.
void create(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  count([&] {
    OptionMap map;
    return map.optSectionCreate(path, "task", true) && map.optSet("runs", 1) &&
           map.optSectionSave();
  });
}

void createUniqueName(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  std::string name = "name";
  count([&] { return OptionMap::optSectionCreateUniqueName(path, name += 'x'); });
}

void remove(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  int id = lastId(sections);
  count([&] {
    OptionMap map;
    return map.optSectionLoad(path, "task", id--) && map.optSectionRemove();
  });
}

void exportTo(std::size_t sections) {
  const std::string path = fileOfSections(sections);
  OptionMap map;
  require(map.optSet("runs", 1), "an option");
  const std::string name = "task" + std::to_string(lastId(sections));
  count([&] { return map.optSectionExport(path, name, false); });
}

// The size is the number of options in the section.
void options(std::size_t number) {
  std::string text = "[task1]\n";
  for (std::size_t i = 0; i < number; ++i) {
    text += "# comment\noption" + std::to_string(kFirstId + i) + "=\"value\"\n";
  }
  const std::string path = fileOf(text);
  count([&] {
    OptionMap map;
    return map.optSectionLoad(path, "task", 1) && map.optSectionSave();
  });
}

// Loads, lists and saves a file that holds the line.
void withLine(const std::string &line) {
  const std::string path = fileOf("[task1]\n" + line + "\n[task2]\nruns=0\n");
  count([&] {
    OptionMap map;
    OptionMap other;
    std::list<int> ids;
    return map.optSectionLoad(path, "task", 1) && other.optSectionLoad(path, "task", 2) &&
           OptionMap::optSectionListId(path, "task", ids) && ids.size() == 2 &&
           other.optSectionSave();
  });
}

// The size is that of the line.
void longValue(std::size_t bytes) {
  withLine("text=\"" + std::string(bytes, 'x') + "\"");
}
void longComment(std::size_t bytes) {
  withLine("#" + std::string(bytes, '='));
}
void whiteSpace(std::size_t bytes) {
  withLine(std::string(bytes / 2, ' ') + "runs=" + std::string(bytes / 2, '\t') + "1");
}
void nuls(std::size_t bytes) {
  withLine(std::string(bytes, '\0'));
}

// Longer than the block in which files are read: shorter lines cost one search.
constexpr std::size_t kLongLine = 131072;

constexpr Case kCases[] = {
    {"section.load", load, {10, 500}, 500},
    {"section.listIds", listIds, {10, 500}, 500},
    {"section.listNames", listNames, {10, 500}, 500},
    {"section.uniqueId", uniqueId, {10, 500}, 500, kLinearLog},
    {"section.uniqueId.last", uniqueIdLast, {10, 500}, 500, kLinearLog},
    {"section.save", save, {10, 500}, 500},
    {"section.create", create, {10, 500}, 500, kLinearLog},
    {"section.createUniqueName", createUniqueName, {10, 500}, 500},
    {"section.remove", remove, {10, 500}, 500},
    {"section.export", exportTo, {10, 500}, 500},
    {"section.options", options, {10, 250}, 250, kLinearLog},
    {"section.longValue", longValue, {4096}, kLongLine},
    {"section.longComment", longComment, {4096}, kLongLine},
    {"section.whiteSpace", whiteSpace, {4096}, kLongLine},
    {"section.nuls", nuls, {4096}, kLongLine},
};

} // namespace

Cases sectionCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
