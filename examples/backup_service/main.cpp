// backup_service: backs up directory trees. README.md explains how to turn it into a service of
// your own.

#include "archive.h"
#include "backup_run.h"

#include <CLI/CLI.hpp>
#include <csignal>
#include <kovabackup/service/run_lock.h>
#include <new>
#include <sys/stat.h>

using namespace KOVA::Backup;

namespace {

constexpr char kFooter[] = R"(Exit status: 0 success, 1 failure, 2 invalid usage, 3 some paths were
not stored ('status' lists them). What a signal interrupts ends by that signal.)";

volatile std::sig_atomic_t lastSignal = 0;

void onSignal(int signal) {
  lastSignal = signal;
  stop().request();
}

// Describes the settings of a task; those that the user gives are stored in given.
void describeSettings(CLI::App &verb, OptionMap &given) {
  const auto add = [&](auto initial, const std::string &key, const std::string &help) {
    return verb.add_option_function<decltype(initial)>(
        "--" + key, [&given, key](const auto &value) { given.optSet(key, value); }, help);
  };
  const auto resolved = [](const std::string &path) { return fs::canonical(path).string(); };
  add(std::string(), "name", "Name of the task, with which the names of its archives begin");
  add(std::list<std::string>(), "source", "Tree to back up; links in its path are resolved")
      ->transform(resolved);
  add(std::string(), "destination", "Folder for the archives")->transform(resolved);
  add(std::list<std::string>(), "exclude", "Pattern of paths to leave out, such as '**.tmp'");
  add(std::list<std::string>(), "include", "Pattern of paths to store although they are excluded");
  add(0, "keep", "Number of archives to keep; 0, the initial value, keeps all");
  add(0, "level", "Level of compression, 1 to 19; initially 3");
  add(false, "one-file-system", "Whether to stay on the file system of each source");
  add(std::string(), "recipient", "Encrypt archives to this recipient of age");
}

void showList(const TaskFile &tasks) {
  for (const int id : tasks.ids()) {
    const OptionMap task = tasks.load(id);
    std::cout << id << '\t' << task.optString("name", "") << '\t'
              << task.optString("lastResult", "never run") << '\n';
  }
}

void showStatus(const TaskFile &tasks, int id) {
  const OptionMap task = tasks.load(id);
  Service::LockHolder holder;
  if (Service::RunLock::holder(tasks.runLock(id), holder)) {
    std::cout << "running: process " << holder.taker << '\n';
  }
  for (const char *key : {"name", "lastRun", "lastReport"}) {
    std::cout << key << ": " << task.optString(key, "") << '\n';
  }
  for (const std::string &message : listOf(task, "messages")) {
    std::cout << "  " << message << '\n';
  }
}

struct Request {
  std::string file = "/var/lib/backup_service/tasks.conf";
  int id = 0;
  OptionMap settings;
  bool isDry = false;
  std::string archive;
  Key key;
  bool withPassphrase = false;
  std::vector<std::string> paths;
  std::string folder;
  int exitStatus = 0;
};

void describeVerbs(CLI::App &app, Request &request) {
  CLI::App *add = app.add_subcommand("add", "Create a task and print its number");
  CLI::App *edit = app.add_subcommand("edit", "Change settings of a task");
  CLI::App *remove = app.add_subcommand("remove", "Remove a task; its archives stay");
  CLI::App *list = app.add_subcommand("list", "List the tasks");
  CLI::App *status = app.add_subcommand("status", "Show whether a task runs, and its last result");
  CLI::App *run = app.add_subcommand("run", "Run a task");
  CLI::App *check = app.add_subcommand("check", "Check that an archive is complete and readable");
  CLI::App *restore = app.add_subcommand("restore", "Extract an archive, or some of its paths");
  for (CLI::App *verb : {edit, remove, status, run}) {
    verb->add_option("ID", request.id, "Number of the task")->required();
  }
  describeSettings(*add, request.settings);
  describeSettings(*edit, request.settings);
  for (CLI::App *verb : {check, restore}) {
    verb->add_option("ARCHIVE", request.archive, "Path of the archive")->required();
    verb->add_option("--identity", request.key.identity, "File with the identity of a recipient");
  }
  for (CLI::App *verb : {add, edit, check, restore}) {
    verb->add_flag("--passphrase-stdin", request.withPassphrase,
                   "Encrypt or decrypt with a passphrase, a line of standard input");
  }
  run->add_flag("--dry-run", request.isDry, "Only print what would be stored");
  restore->add_option("PATH", request.paths, "Path to extract, with everything below it");
  restore->add_option("--to", request.folder, "Folder to extract to")->required();

  add->callback([&r = request] { std::cout << TaskFile(r.file).add(r.settings) << '\n'; });
  edit->callback([&r = request] { TaskFile(r.file).edit(r.id, r.settings); });
  remove->callback([&r = request] { TaskFile(r.file).remove(r.id); });
  list->callback([&r = request] { showList(TaskFile(r.file)); });
  status->callback([&r = request] { showStatus(TaskFile(r.file), r.id); });
  run->callback([&r = request] { r.exitStatus = runTask(TaskFile(r.file), r.id, r.isDry); });
  check->callback([&r = request] { checkArchive(r.archive, r.key); });
  restore->callback([&r = request] { restoreArchive(r.archive, r.key, r.paths, r.folder); });
}

// Runs before the verb does.
void prepare(const CLI::App &app, Request &request) {
  if (request.withPassphrase) {
    std::getline(std::cin, request.key.passphrase);
    require(!request.key.passphrase.empty(), "no passphrase on standard input");
  }
  if (request.withPassphrase && (app.got_subcommand("add") || app.got_subcommand("edit"))) {
    request.settings.optSet("passphrase", request.key.passphrase, true);
    require(request.settings.optSecret("passphrase", "") == request.key.passphrase,
            "cannot encrypt the passphrase");
  }
  if (app.got_subcommand("run") || !request.archive.empty()) { // others end at once
    for (const int signal : {SIGINT, SIGTERM, SIGHUP}) {
      struct sigaction before = {};
      if (::sigaction(signal, nullptr, &before) == 0 && before.sa_handler != SIG_IGN) {
        (void)std::signal(signal, &onSignal); // one that nohup ignores stays ignored
      }
    }
  }
}

// Returns: the exit status.
int serve(int argc, char **argv) {
  CLI::App app{"Backs up directory trees."};
  Request request;
  try {
    app.require_subcommand(1)->footer(kFooter);
    app.add_option("--tasks", request.file, "File of the tasks")->capture_default_str();
    describeVerbs(app, request);
    app.parse_complete_callback([&] { prepare(app, request); });
    app.parse(argc, argv);
    const bool isRecorded = app.got_subcommand("run") && !request.isDry;
    require(isRecorded || std::cout.flush(), "cannot write to standard output");
  } catch (const CLI::ParseError &error) {
    return app.exit(error) == 0 ? 0 : 2;
  } catch (const std::exception &why) {
    const auto verb = app.get_subcommands();
    showMessage("backup_service: " + (verb.empty() ? "" : verb[0]->get_name() + ": ") + why.what());
    return 1;
  }
  return request.exitStatus;
}

} // namespace

int main(int argc, char **argv) {
  (void)::umask(077);                  // archives hold files of all users
  (void)std::signal(SIGPIPE, SIG_IGN); // a reader of the output may go away
  (void)std::signal(SIGCHLD, SIG_DFL); // a parent may have had it ignored
  int exitStatus = 1;
  try {
    exitStatus = serve(argc, argv);
  } catch (const std::bad_alloc &) {
    std::cerr << "backup_service: memory ran out\n"; // for which nothing is allocated
  }
  if (lastSignal != 0) { // the parent is to see which signal ended the process
    (void)std::signal(lastSignal, SIG_DFL);
    (void)std::raise(lastSignal);
  }
  return exitStatus;
}
