// backup_service: tasks in a section file, runs that other processes can look into.
//
//     backup_service add --name docs --source /usr/share/doc --exclude '**.gz' --destination /v/b
//     backup_service run 1
//     backup_service status 1

#include "backup_run.h"
#include "task.h"

#include <CLI/CLI.hpp>
#include <fstream>
#include <iostream>
#include <kovabackup/path_util.h>
#include <kovabackup/session.h>
#include <list>
#include <stdexcept>
#include <string>
#include <unistd.h>

using namespace KOVA::Backup;

namespace {

constexpr char kDefaultTemplate[] =
    "task {{task}}: {{result}}; {{files}} files, {{bytes}} bytes -> {{archive}} "
    "({{archiveBytes}} bytes)";

int add(const std::string &file, TaskSettings settings, bool withPassphrase) {
  if (withPassphrase && !std::getline(std::cin, settings.passphrase)) {
    throw std::runtime_error("no passphrase on standard input");
  }
  if (settings.name.find('/') != std::string::npos) {
    throw std::runtime_error("a name begins the archive's file name: no '/' in it");
  }
  for (std::string &source : settings.sources) {
    source = Path::absPath(source);
  }
  settings.destination = Path::absPath(settings.destination);
  std::cout << Task::create(file, settings) << '\n';
  return 0;
}

int plan(const std::string &file, int id) {
  const Task task(file, id);
  PathFilter filter;
  task.fillFilter(filter);
  TreeTotals totals;
  const auto print = [](const std::string &path) {
    std::cout << path << '\0';
    return std::cout.good();
  };
  for (const std::string &source : task.list("sources")) {
    walkFiltered(source, filter, print, totals);
  }
  return std::cout.flush().good() ? 0 : 1;
}

void printFile(const char *title, const std::string &path) {
  std::ifstream in(path);
  if (in.peek() != std::ifstream::traits_type::eof()) {
    std::cout << title << ": " << in.rdbuf();
  }
}

int status(const std::string &file, int id) {
  const Task task(file, id);
  std::cout << "task " << id << " (" << task.text("name") << ")\n";
  const std::string session = task.text("session");
  if (!session.empty()) {
    const int lock = task.tryRunLock();
    std::cout << (lock < 0 ? "running, session " : "died, left session ") << session << '\n';
    if (lock >= 0) {
      ::close(lock);
    }
    const std::string dir = Session::getPathById(session);
    printFile("progress", Path::join(dir, kSessionProgress));
    printFile("errors", Path::join(dir, kSessionLog));
  }
  for (const char *key : {"lastRun", "lastResult", "files", "bytes", "archive", "archiveBytes"}) {
    std::cout << key << ": " << task.text(key) << '\n';
  }
  return 0;
}

int list(const std::string &file) {
  std::list<int> ids;
  if (!OptionMap::optSectionListId(file, kTaskPrefix, ids)) {
    throw std::runtime_error("cannot read " + file);
  }
  for (const int id : ids) {
    const Task task(file, id);
    std::cout << id << '\t' << task.text("name") << '\t' << task.text("lastResult") << '\n';
  }
  return 0;
}

} // namespace

int main(int argc, char **argv) {
  CLI::App app{"Backs trees up as tasks of a section file."};
  app.require_subcommand(1);
  std::string file = "/var/lib/backup_service/tasks.conf";
  app.add_option("--tasks", file, "The file of the tasks")->capture_default_str();

  TaskSettings settings;
  settings.volumeRule = "max-ext-btrfs";
  settings.reportTemplate = kDefaultTemplate;
  bool withPassphrase = false;
  CLI::App *addCommand = app.add_subcommand("add", "Make a task; prints its id");
  addCommand->add_option("--name", settings.name, "Begins the archive's name")->required();
  addCommand->add_option("--source", settings.sources, "A tree to back up")->required();
  addCommand->add_option("--include", settings.includes, "Pattern of paths to keep");
  addCommand->add_option("--exclude", settings.excludes, "Pattern of paths to leave out");
  addCommand->add_option("--destination", settings.destination, "Folder of the archives")
      ->required();
  addCommand->add_option("--probe", settings.probeHost, "Host that must answer before a run");
  addCommand->add_option("--probe-port", settings.probePort, "TCP port to ask it on");
  addCommand->add_option("--probe-timeout", settings.probeTimeoutSec, "Seconds to wait for it");
  addCommand->add_option("--volume", settings.volumeRule, "Where a run's files go");
  addCommand->add_option("--template", settings.reportTemplate, "The report, with {{names}}");
  addCommand->add_flag("--passphrase-stdin", withPassphrase, "Encrypt; reads one line");

  int id = 0;
  const auto withId = [&](const char *name, const char *what) {
    CLI::App *command = app.add_subcommand(name, what);
    command->add_option("ID", id, "The task's id")->required();
    return command;
  };
  const CLI::App *runCommand = withId("run", "Run a task");
  const CLI::App *statusCommand = withId("status", "Look into a run, or at the last one");
  const CLI::App *planCommand = withId("plan", "Print what a run would keep, NUL-terminated");
  const CLI::App *listCommand = app.add_subcommand("list", "List the tasks");
  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError &error) {
    return app.exit(error) == 0 ? 0 : 2;
  }

  try {
    if (*addCommand) {
      return add(file, settings, withPassphrase);
    }
    if (*listCommand) {
      return list(file);
    }
    if (*planCommand) {
      return plan(file, id);
    }
    if (*statusCommand) {
      return status(file, id);
    }
    if (*runCommand) {
      Task task(file, id);
      return BackupRun(task).run();
    }
  } catch (const std::exception &error) {
    std::cerr << "backup_service: " << error.what() << '\n';
  }
  return 1;
}
