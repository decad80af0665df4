// Options in section files: read, saved, created, removed, listed, updated, and secrets with the
// first key.

#include "kovabackup/option_map.h"
#include "kovabackup/service/section_update.h"
#include "tests/faults/report.h"
#include "tests/faults/scenario.h"
#include "tests/faults/world.h"

#include <fstream>
#include <list>
#include <string>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest::Faults {
namespace {

using KOVA::Backup::OptionMap;
using KOVA::Backup::Service::Update;
using KOVA::Backup::Service::updateSection;

const std::string kFile = std::string(kWork) + "/task.conf";
constexpr const char *kToken = "task.conf";
constexpr const char *kBefore = "# first line\n[task1]\nname=\"old\"\npaths=[\"/a\",\"/b\"]\n"
                                "retries=3\n[task2]\nname=\"second\"\n[other]\nx=1\n";

// After these the file may be changed although failure is reported: the lock was not released, the
// folder not synced, or memory ran out after the file was written.
constexpr const char *kLate = "flock fsync close memory";

void prepareFile() {
  std::ofstream(kFile) << kBefore;
}

void checkReplaced(const Seen &seen, Findings &findings, const std::string &key) {
  const std::string content = seen.contentOf(kFile);
  const bool isOld = content == seen.before.at(kFile);
  const bool isNew = seen.clean != nullptr && content == seen.clean->contentOf(kFile);
  findings.expect(isOld || isNew || seen.clean == nullptr, "torn:\n" + content);
  findings.expect(!seen.isTrue(key) || isNew || seen.clean == nullptr,
                  key + ", but the file is unchanged");
  findings.expect(!isNew || isOld || seen.isTrue(key) || seen.killed() || seen.failedIn(kLate),
                  "not " + key + ", but the file is changed");
}

auto replaces(const std::string &key) {
  return [key](const Seen &seen, Findings &findings) { checkReplaced(seen, findings, key); };
}

// What is said with success must be what the clean run says.
auto saysTheSame(const std::string &key) {
  return [key](const Seen &seen, Findings &findings) {
    for (const auto &[name, value] : seen.said) {
      findings.expect(!seen.isTrue(key) || seen.clean == nullptr ||
                          value == seen.clean->valueOf(name),
                      key + ", but " + name + " is " + value);
    }
    findings.expect(!seen.isTrue(key) || seen.clean == nullptr ||
                        seen.said.size() == seen.clean->said.size(),
                    key + ", but something is missing");
  };
}

template <typename Items>
std::string joined(const Items &items) {
  std::string text;
  for (const auto &item : items) {
    text += item + " ";
  }
  return text;
}

void load() {
  OptionMap map;
  const bool loaded = map.optSectionLoad(kFile, "task", 1);
  say("json", map.optToJsonString());
  say("loaded", loaded);
}

void save() {
  OptionMap map;
  say("token", map.setLockToken(kToken));
  if (map.optSectionLoad(kFile, "task", 1)) {
    map.optSet("name", "new and longer than before");
    map.optSet("paths", std::list<std::string>{"/c"});
    say("saved", map.optSectionSave());
  }
}

void create() {
  OptionMap map;
  say("token", map.setLockToken(kToken));
  say("created", map.optSectionCreate(kFile, "task", true));
  say("section", map.optSectionGetName());
}

// A header is added to the end of the file, so a kill leaves a part of it at most.
void checkCreated(const Seen &seen, Findings &findings) {
  if (seen.killed()) {
    const std::string content = seen.contentOf(kFile);
    const std::string complete = seen.clean->contentOf(kFile);
    const std::string old = seen.exists(kFile) ? kBefore : "";
    findings.expect(complete.compare(0, content.size(), content) == 0 &&
                        content.compare(0, old.size(), old) == 0,
                    "torn:\n" + content);
    return;
  }
  checkReplaced(seen, findings, "created");
  findings.expect(!seen.isTrue("created") || seen.valueOf("section") == "task3" ||
                      !seen.valueOf("threw").empty(),
                  "another section was created");
}

void remove() {
  OptionMap map;
  say("token", map.setLockToken(kToken));
  if (map.optSectionLoad(kFile, "task", 1)) {
    say("removed", map.optSectionRemove());
  }
}

void list() {
  std::list<int> ids;
  std::list<std::string> names;
  const bool listed = OptionMap::optSectionListId(kFile, "task", ids) &&
                      OptionMap::optSectionListName(kFile, names);
  std::list<std::string> words;
  for (const int id : ids) {
    words.push_back(std::to_string(id));
  }
  say("ids", joined(words));
  say("names", joined(names));
  say("listed", listed);
}

const std::string kExported = std::string(kWork) + "/exported.conf";

void exportToNewFile() {
  OptionMap map;
  map.optSet("name", "exported");
  say("exported", map.optSectionExport(kExported, "task9", true));
}

void checkExported(const Seen &seen, Findings &findings) {
  const std::string content = seen.contentOf(kExported);
  const bool complete = seen.clean == nullptr || content == seen.clean->contentOf(kExported);
  findings.expect(content.empty() || complete, "torn:\n" + content);
  findings.expect(!seen.isTrue("exported") || complete, "exported, but the file is not complete");
}

void saveSecret() {
  OptionMap map;
  say("token", map.setLockToken(kToken));
  if (map.optSectionLoad(kFile, "task", 1)) {
    say("set", map.optSet("password", "open sesame", true));
    say("saved", map.optSectionSave());
  }
}

// Whether the secret can be read by another process.
bool secretIs(const std::string &text) {
  const pid_t pid = ::fork();
  if (pid == 0) {
    OptionMap map;
    const bool same =
        map.optSectionLoad(kFile, "task", 1) && map.optSecret("password", "none") == text;
    ::_exit(same ? 0 : 1);
  }
  int status = 0;
  (void)::waitpid(pid, &status, 0);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0;
}

void checkSecret(const Seen &seen, Findings &findings) {
  findings.expect(!seen.exists(kKeyFile) || seen.contentOf(kKeyFile).size() == 32,
                  "the key is not complete");
  const std::string content = seen.contentOf(kFile);
  const bool hasSecret = content.find("password=") != std::string::npos;
  findings.expect(hasSecret || content == kBefore, "torn:\n" + content);
  findings.expect(hasSecret || !seen.isTrue("saved"), "saved, but the file is unchanged");
  // A secret that cannot be encrypted is stored as "", which is logged.
  if (hasSecret && !secretIs("open sesame")) {
    findings.expect(content.find("password=\"\"") != std::string::npos && !seen.log.empty(),
                    "the secret cannot be read:\n" + content);
  }
}

void update() {
  KOVA::Backup::Service::Error error;
  const Update done = updateSection(
      kFile, "task", 1, kToken, [](OptionMap &map) { return map.optSet("retries", 4); },
      std::chrono::seconds(1), &error);
  say("error", error.code);
  say("updated", done == Update::Saved);
  say("attempted", done == Update::Saved || done == Update::SaveFailed);
}

void checkUpdated(const Seen &seen, Findings &findings) {
  checkReplaced(seen, findings, "updated");
  findings.expect(!seen.isFalse("attempted") || seen.contentOf(kFile) == kBefore,
                  "not attempted, but the file is changed");
  findings.expect(!seen.isFalse("updated") || seen.valueOf("error") != "0",
                  "not updated, but there is no error");
}

} // namespace

void addOptionScenarios(Scenarios &all) {
  all.push_back({"option load", prepareFile, load, saysTheSame("loaded"), {}});
  all.push_back({"option save", prepareFile, save, replaces("saved"), {}});
  all.push_back({"option create", prepareFile, create, checkCreated, {}});
  all.push_back({"option remove", prepareFile, remove, replaces("removed"), {}});
  all.push_back({"option list", prepareFile, list, saysTheSame("listed"), {}});
  all.push_back({"option export", [] {}, exportToNewFile, checkExported, {}});
  all.push_back({"option secret, first key", prepareFile, saveSecret, checkSecret, {}});
  // A map whose lock cannot be released still holds it, as option_map.h says.
  for (Scenario &scenario : all) {
    scenario.keepsDescriptorsIf = scenario.name.rfind("option ", 0) == 0 ? "flock" : "";
  }
  all.push_back({"option update", prepareFile, update, checkUpdated, {}});
}

} // namespace KovaTest::Faults
