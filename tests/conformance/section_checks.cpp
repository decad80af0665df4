// libkovacore: section files, as the library reads them.

#include "tests/conformance/check.h"

#include "kovaplatform/kovacore.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <list>
#include <map>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaConformance {
namespace {

namespace fs = std::filesystem;

constexpr int kNoSuchFile = 0x0900;
constexpr int kNoSuchSection = 0x2000;
constexpr char kFile[] = "section.conf";
constexpr char kContent[] = "# a remark before all sections\n"
                            "[task1]\n"
                            "name=\"nightly\"\n"
                            "[task2]\n"
                            "# a remark of task2\n"
                            "name=\"weekly\"\n"
                            "retries=3\n"
                            "[other]\n"
                            "name=\"other\"\n";

using Options = std::map<std::string, std::string>;

void write(const std::string &text) {
  std::ofstream(kFile, std::ios::trunc) << text;
}

std::string content() {
  std::ifstream in(kFile);
  return {std::istreambuf_iterator<char>(in), {}};
}

std::string trimmed(const std::string &text) {
  const std::size_t first = text.find_first_not_of(" \t\r\n");
  return first == std::string::npos
             ? ""
             : text.substr(first, text.find_last_not_of(" \t\r\n") - first + 1);
}

// The options of a section, by the rules by which the library reads. Returns: false when absent.
bool readSection(const std::string &name, Options &options) {
  std::ifstream in(kFile);
  std::string line;
  bool inside = false;
  while (std::getline(in, line)) {
    line = trimmed(line);
    if (!line.empty() && line[0] == '[') {
      if (inside) {
        break;
      }
      inside = line == "[" + name + "]";
      continue;
    }
    const std::size_t equals = line.find('=');
    if (inside && equals != std::string::npos && line[0] != '#') {
      options[trimmed(line.substr(0, equals))] = trimmed(line.substr(equals + 1));
    }
  }
  return inside;
}

void expectSection(const std::string &name, const Options &expected, const std::string &after) {
  Options found;
  expect(readSection(name, found), after + ": no section [" + name + "] in the file");
  expect(found == expected, after + ": section [" + name + "] holds " +
                                std::to_string(found.size()) + " options, or others than expected");
}

class Hash {
public:
  explicit Hash(const Options &options) : hash_(KLIBCSzHashAlloc(1024)) {
    for (auto [key, value] : options) {
      given_.push_back(key);
      std::string &givenKey = given_.back();
      given_.push_back(value);
      std::string &givenValue = given_.back();
      expect(hash_ != nullptr &&
                 KLIBCSzHashSetValue(&hash_, givenKey.c_str(), givenValue.c_str()) >= 0,
             "KLIBCSzHashSetValue refused " + inQuotes(key));
      givenKey.assign(givenKey.size(), '?'); // the hash must have copies
      givenValue.assign(givenValue.size(), '?');
    }
  }
  ~Hash() { KLIBCSzHashFree(hash_); }
  Hash(const Hash &) = delete;
  Hash &operator=(const Hash &) = delete;

  KLIBCSzHash *get() const { return hash_; }

private:
  KLIBCSzHash *hash_;
  std::list<std::string> given_;
};

int set(const std::string &name, const Options &options) {
  return KLIBCFileSetSection(kFile, name.c_str(), nullptr, Hash(options).get(), 0);
}

int add(const std::string &name, const Options &options) {
  return KLIBCFileAddSection(kFile, name.c_str(), Hash(options).get(), 0);
}

// Returns: what the platform returned.
int listSections(std::vector<std::string> &names) {
  KLIBCSzList *list = KLIBCSzListAlloc(1024);
  expect(list != nullptr, "KLIBCSzListAlloc(1024) gave null");
  const int result = KLIBCFileEnumSection(kFile, &list);
  for (int i = 0; result >= 0 && i < list->count; ++i) {
    const char *name = KLIBCSzListGet(list, i);
    expect(name != nullptr, "KLIBCSzListGet gave null for index " + std::to_string(i));
    names.emplace_back(name);
  }
  KLIBCSzListFree(list);
  return result;
}

void listsInFileOrder() {
  write(std::string(kContent) + "[empty]\n[with ] inside]\n \t[between blanks] \r\n");
  std::vector<std::string> names;
  expect(listSections(names) >= 0, "KLIBCFileEnumSection failed");
  const std::vector<std::string> expected = {"task1", "task2",         "other",
                                             "empty", "with ] inside", "between blanks"};
  std::string shown;
  for (const std::string &name : names) {
    shown += " " + inQuotes(name);
  }
  expect(names == expected, "the sections are listed as" + shown);
}

void listsManySections() {
  constexpr std::size_t kSections = 3000; // more than the list has room for at first
  std::string text;
  for (std::size_t i = 0; i < kSections; ++i) {
    text += "[task" + std::to_string(i) + "]\n";
  }
  write(text);
  std::vector<std::string> names;
  expect(listSections(names) >= 0, "KLIBCFileEnumSection failed");
  expect(names.size() == kSections && names.back() == "task2999",
         std::to_string(names.size()) + " of 3000 sections are listed");
}

void tellsAMissingFile() {
  std::vector<std::string> names;
  expect(listSections(names) < 0, "KLIBCFileEnumSection of a missing file did not fail");
  expectErrorCode(kNoSuchFile, "KLIBCFileEnumSection of a missing file");
  expect(set("task1", {}) < 0, "KLIBCFileSetSection in a missing file gave no negative result");
  expectErrorCode(kNoSuchFile, "KLIBCFileSetSection in a missing file");
  expect(!fs::exists(kFile), "KLIBCFileSetSection made the missing file");
}

void tellsAMissingSection() {
  write(kContent);
  const int result = set("task3", {{"name", "\"x\""}});
  expect(result == 0, "KLIBCFileSetSection of a missing section gave " + std::to_string(result));
  expectErrorCode(kNoSuchSection, "KLIBCFileSetSection of a missing section");
  expect(content() == kContent, "KLIBCFileSetSection of a missing section changed the file");
}

void replacesASection() {
  write(kContent);
  const Options options = {{"name", "\"monthly\""}, {"paths", "[\"/a\",\"/b\"]"}, {"on", "true"}};
  const int result = set("task2", options);
  expect(result == 1, "KLIBCFileSetSection gave " + std::to_string(result) + " and not 1");
  expectSection("task2", options, "KLIBCFileSetSection");
  expectSection("task1", {{"name", "\"nightly\""}}, "KLIBCFileSetSection of another");
  expectSection("other", {{"name", "\"other\""}}, "KLIBCFileSetSection of another");
  expect(set("task2", {}) == 1, "KLIBCFileSetSection without options did not give 1");
  expectSection("task2", {}, "KLIBCFileSetSection without options");
}

void addsASection() {
  write(kContent);
  const Options options = {{"name", "\"new\""}, {"retries", "-1"}};
  expect(add("task3", options) >= 0, "KLIBCFileAddSection failed");
  expectSection("task3", options, "KLIBCFileAddSection");
  expectSection("other", {{"name", "\"other\""}}, "KLIBCFileAddSection");
  std::vector<std::string> names;
  expect(listSections(names) >= 0 && !names.empty() && names.back() == "task3",
         "the new section is not listed last");
  write("[task1]\nname=\"nightly\"");
  expect(add("task2", options) >= 0, "KLIBCFileAddSection behind a line without an end failed");
  expectSection("task1", {{"name", "\"nightly\""}}, "adding behind a line without an end");
  expectSection("task2", options, "adding behind a line without an end");
  write("");
  expect(add("first", options) >= 0, "KLIBCFileAddSection to an empty file failed");
  expectSection("first", options, "KLIBCFileAddSection to an empty file");
}

void removesASection() {
  write(kContent);
  const int result = KLIBCFileRemoveSection(kFile, "task2");
  expect(result == 1, "KLIBCFileRemoveSection gave " + std::to_string(result) + " and not 1");
  Options gone;
  expect(!readSection("task2", gone), "KLIBCFileRemoveSection left the section");
  expectSection("task1", {{"name", "\"nightly\""}}, "KLIBCFileRemoveSection of another");
  expectSection("other", {{"name", "\"other\""}}, "KLIBCFileRemoveSection of another");
  expect(KLIBCFileRemoveSection(kFile, "task2") != 1,
         "KLIBCFileRemoveSection of a missing section gave 1");
  expectErrorRecorded("KLIBCFileRemoveSection of a missing section");
}

void comparesNamesExactly() {
  write("[task12]\na=1\n[TASK1]\na=1\n[task1]\na=1\n");
  expect(set("task1", {{"a", "2"}}) == 1, "KLIBCFileSetSection did not give 1");
  expectSection("task1", {{"a", "2"}}, "KLIBCFileSetSection beside [task12] and [TASK1]");
  expect(set("task", {{"a", "2"}}) == 0, "KLIBCFileSetSection found [task], which is not there");
  expect(KLIBCFileRemoveSection(kFile, "task1") == 1, "KLIBCFileRemoveSection did not give 1");
  Options gone;
  expect(!readSection("task1", gone), "KLIBCFileRemoveSection left the section");
  for (const char *other : {"task12", "TASK1"}) {
    expectSection(other, {{"a", "1"}}, "after changes of [task1]");
  }
}

void keepsHostileValues() {
  const Options options = {
      {"equals", "\"a=b=c\""},
      {"bracket", "\"[task1]\""},
      {"hash", "\"# no remark\""},
      {"escapes", "\"line\\nquote\\\"slash\\\\\""},
      {"unicode", "\"gr\xC3\xBC\xC3\x9F \xF0\x9F\x98\x80\""},
      {"bytes", "\"\xFF\xFE\""},
      {"inner blank", "1"},
      {"long", "\"" + std::string(100000, 'x') + "\""},
      {"list", "[]"},
      {"quote'd", "\"it's\""},
  };
  write("[task1]\n");
  expect(set("task1", options) == 1, "KLIBCFileSetSection refused a value");
  expectSection("task1", options, "hostile values");
  expect(set("task1", options) == 1, "KLIBCFileSetSection refused what it had written");
  expectSection("task1", options, "hostile values, written twice");
}

// Checks both options, because a half-written file lacks the last one, and either may be last.
bool isWhole(const std::string &big) {
  Options found;
  const bool there = readSection("task1", found) && found.size() == 2;
  const std::string &value = found["value"];
  return there && found["end"] == "\"end\"" && value.size() > big.size() && value.back() == '"';
}

void showsReadersWholeFiles() {
  const std::string big(200000, 'x');
  write("[task1]\nvalue=\"" + big + "\"\nend=\"end\"\n");
  const pid_t writer = ::fork();
  if (writer == 0) {
    for (int i = 0; i < 200; ++i) {
      const std::string value = "\"" + big + std::to_string(i) + "\"";
      if (set("task1", {{"end", "\"end\""}, {"value", value}}) != 1) {
        ::_exit(1);
      }
    }
    ::_exit(0);
  }
  int status = 0;
  int torn = 0;
  for (bool writing = true; writing;) {
    writing = ::waitpid(writer, &status, WNOHANG) == 0;
    torn += isWhole(big) ? 0 : 1;
  }
  expect(status == 0, "the writer failed");
  expect(torn == 0, "a reader saw " + std::to_string(torn) + " files in part");
}

void keepsTheRestOfTheFile() {
  const std::string text = kContent;
  write(text);
  (void)set("task1", {{"name", "\"changed\""}});
  const std::string rest = text.substr(text.find("[task2]"));
  const std::string now = content();
  if (now.rfind("# a remark before all sections\n", 0) != 0 ||
      now.find(rest) == std::string::npos) {
    note("bytes outside the section are not kept, or remarks are lost");
  }
}

void keepsModeAndLink() {
  write(kContent);
  (void)::chmod(kFile, 0640);
  fs::rename(kFile, "target.conf");
  fs::create_symlink("target.conf", kFile);
  (void)set("task1", {{"name", "\"changed\""}});
  struct stat info {};
  if (!fs::is_symlink(kFile)) {
    note("a symbolic link is replaced by a file");
  }
  if (::stat("target.conf", &info) != 0 || (info.st_mode & 07777) != 0640) {
    note("the file's mode is not kept");
  }
}

} // namespace

std::vector<Check> sectionChecks() {
  return {
      {"core.section.list", "sections are listed in file order, by the reader's rules",
       listsInFileOrder},
      {"core.section.list-many", "the list grows past its first capacity", listsManySections},
      {"core.section.no-file", "a missing file is told by a negative result and code 0x0900",
       tellsAMissingFile},
      {"core.section.no-section", "a missing section is told by 0 and code 0x2000",
       tellsAMissingSection},
      {"core.section.set", "setting a section gives 1, replaces its options and no others",
       replacesASection},
      {"core.section.add", "a section is added at the end, also to an empty file", addsASection},
      {"core.section.remove", "removing a section gives 1 and leaves the others", removesASection},
      {"core.section.names", "names are compared exactly, to their end and with case",
       comparesNamesExactly},
      {"core.section.values", "values of any content and length come back", keepsHostileValues},
      {"core.section.atomic", "a reader sees the old content or the new, never half of either",
       showsReadersWholeFiles},
      {"core.section.rest", "bytes outside a section are kept", keepsTheRestOfTheFile},
      {"core.section.attributes", "mode and symbolic link are kept", keepsModeAndLink},
  };
}

} // namespace KovaConformance
