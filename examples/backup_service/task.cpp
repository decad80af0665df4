#include "task.h"

#include <algorithm>
#include <json/reader.h>
#include <kovabackup/service/run_lock.h>
#include <kovabackup/service/section_update.h>
#include <regex>
#include <sstream>

using namespace KOVA::Backup;

namespace {

constexpr char kPrefix[] = "task";                  // sections are named "task<id>"
constexpr char kWriters[] = "backup_service.tasks"; // the lock of all that write a task file
constexpr std::chrono::seconds kWritersLimit(10);

// The initial value of every setting, which also determines its type. All settings are stored in
// every task, so that one which an edit by hand has lost or misspelt is detected: a run without its
// exclude patterns would store too much, and one without its passphrase would not encrypt.
constexpr char kInitial[] = R"({"name": "", "source": [], "destination": "", "exclude": [],
    "include": [], "one-file-system": false, "keep": 0, "level": 3, "recipient": "",
    "passphrase": ""})";

// The getters of OptionMap convert: they read a list that became a text as an empty list.
void checkTypes(const OptionMap &task) {
  Json::Value initial, stored;
  std::istringstream(kInitial) >> initial;
  std::istringstream(task.optToJsonString()) >> stored;
  for (const std::string &key : initial.getMemberNames()) {
    const Json::Value &value = stored[key];
    require(value.type() == initial[key].type() &&
                (!value.isArray() ||
                 std::all_of(value.begin(), value.end(), std::mem_fn(&Json::Value::isString))),
            "option \"" + key + "\" is missing or has the wrong type");
  }
}

void checkValues(const OptionMap &task) {
  const std::string name = task.optString("name", "");
  const int level = task.optInt("level", 0);
  require(!name.empty() && name.size() <= 150 && name.front() != '.' && printable(name) == name &&
              name.find('/') == std::string::npos,
          "a name has 1 to 150 bytes, no '/', no control character and no leading '.'");
  const std::list<std::string> sources = listOf(task, "source");
  require(!sources.empty(), "there is no source");
  const std::regex notNormal("/\\.{0,2}/");
  for (const std::string &source : sources) { // which are compared with paths of the walk
    require(source == "/" || (source.front() == '/' && !std::regex_search(source + "/", notNormal)),
            "a source is an absolute path without '.', '..' and a '/' at its end: " + source);
  }
  require(isSet(task, "destination"), "there is no destination");
  require(task.optInt("keep", 0) >= 0, "the number of archives to keep must not be negative");
  require(level >= 1 && level <= 19, "the level of compression must be 1 to 19");
  require(!isSet(task, "passphrase") || !isSet(task, "recipient"),
          "archives are encrypted to a recipient or with a passphrase, but not both");
  require(!isSet(task, "passphrase") || !task.optSecret("passphrase", "").empty(),
          "the passphrase cannot be decrypted: has the key file changed?");
}

} // namespace

TaskFile::TaskFile(const std::string &path) : path_(fs::weakly_canonical(fs::absolute(path))) {
  require(!fs::is_regular_file(path_) || openFile(path_, "r"), path_); // says why it is unreadable
}

std::list<int> TaskFile::ids() const {
  std::list<int> ids;
  require(OptionMap::optSectionListId(path_, kPrefix, ids), "cannot read " + path_);
  ids.remove_if([](int id) { return id < 1; }); // sections that only resemble a task
  return ids;
}

OptionMap TaskFile::load(int id) const {
  OptionMap task;
  require(task.optSectionLoad(path_, kPrefix, id), stringf("no task %d in ", id) + path_);
  return task;
}

void TaskFile::check(const OptionMap &task, int id) const {
  checkTypes(task);
  checkValues(task);
  for (const int other : ids()) { // they would remove each other's archives
    require(other == id || load(other).optString("name", "") != task.optString("name", ""),
            stringf("task %d has the same name", other));
  }
}

int TaskFile::add(const OptionMap &given) {
  fs::create_directories(fs::path(path_).parent_path());
  (void)openFile(path_, "a"); // says why the file cannot be written
  Service::RunLock lock(kWriters);
  Service::Error error;
  require(lock.take(error, kWritersLimit), "cannot lock the tasks", error);
  const std::list<int> taken = ids();
  const int id = taken.empty() ? 1 : *std::max_element(taken.begin(), taken.end()) + 1;
  OptionMap task;
  require(task.optLoadJsonString(kInitial), "the initial settings are not JSON");
  task.optAppendJsonString(given.optToJsonString());
  check(task, id);
  // In one step: a task never exists without some of its settings.
  require(task.optSectionExport(path_, kPrefix + std::to_string(id), true),
          "cannot write " + path_ + "; the system log says why");
  return id;
}

void TaskFile::change(int id, const std::function<void(OptionMap &)> &set) {
  const auto save = [&set](OptionMap &task) { return set(task), true; };
  Service::Error error;
  require(Service::updateSection(path_, kPrefix, id, kWriters, save, kWritersLimit, &error) ==
              Service::Update::Saved,
          stringf("cannot change task %d", id), error);
}

void TaskFile::edit(int id, const OptionMap &given) {
  (void)load(id); // says if there is no such task
  change(id, [&](OptionMap &task) {
    task.optAppendJsonString(given.optToJsonString());
    check(task, id);
  });
}

void TaskFile::remove(int id) {
  Service::RunLock run(runLock(id));
  Service::Error error;
  require(run.take(error), "the task may be running", error);
  OptionMap task = load(id);
  require(task.setLockToken(kWriters) && task.optSectionRemove(),
          "cannot write " + path_ + "; the system log says why");
}

// Another file may have a task of the same id, so the name includes a hash of the file's path.
std::string TaskFile::runLock(int id) const {
  return stringf("backup_service.run.%zx.%d", std::hash<std::string>()(path_), id);
}

std::list<std::string> listOf(const OptionMap &task, const std::string &key) {
  std::list<std::string> values;
  task.optGet(key, values);
  values.sort();
  values.unique();
  values.remove(""); // what an edit gives to clear a list
  return values;
}

bool isArchiveName(const OptionMap &task, const std::string &fileName) {
  static const std::regex form("(.*)-[0-9]{8}T[0-9]{6}\\.[0-9]{3}Z\\.tar\\.zst(\\.age|\\.gpg)?");
  std::smatch parts;
  return std::regex_match(fileName, parts, form) && parts[1] == task.optString("name", "");
}

std::vector<std::string> archivesOf(const OptionMap &task) {
  std::vector<std::string> found;
  for (const fs::path &path : fs::directory_iterator(task.optString("destination", ""))) {
    if (isArchiveName(task, path.filename())) {
      found.push_back(path);
    }
  }
  std::sort(found.begin(), found.end());
  return found;
}
