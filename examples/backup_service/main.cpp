// backup_service: backs up directory trees. Tasks are stored in a section file, and other processes
// can follow a run. README.md explains how to turn this program into a service of your own.

#include "backup_run.h"
#include "filtered_tree.h"
#include "task.h"

#include <CLI/CLI.hpp>
#include <csignal>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <kovabackup/path_util.h>
#include <kovabackup/session.h>
#include <kovabackup/signal.h>
#include <list>
#include <stdexcept>
#include <string>

namespace fs = std::filesystem;
using namespace KOVA::Backup;

namespace {

constexpr int kWrongUsage = 2;

constexpr char kFooter[] = R"(Examples:
  backup_service add --name docs --source /usr/share/doc --exclude '**.gz' --destination /v/b
  backup_service plan 1 | tr '\0' '\n'
  backup_service run 1
  backup_service status 1

Exit status: 0 success, 1 failure, 2 invalid usage, 3 some files were not archived ('status' lists
them). A run that a signal interrupts is terminated by that signal.)";

int add(const std::string &file, TaskSettings settings, bool withPassphrase) {
  const std::string &name = settings.name;
  if (name.empty() || name.size() > 200 || name.front() == '.' ||
      name.find_first_of("/\n") != std::string::npos) {
    throw std::invalid_argument("invalid name: the archive's file name begins with it, so it must "
                                "have 1 to 200 bytes, no '/', no line end and no leading '.'");
  }
  if (withPassphrase &&
      (!std::getline(std::cin, settings.passphrase) || settings.passphrase.empty())) {
    throw std::runtime_error("no passphrase on standard input");
  }
  for (std::string &source : settings.sources) {
    source = fs::canonical(source).string();
  }
  settings.destination = fs::weakly_canonical(fs::absolute(settings.destination)).string();
  if (!fs::path(file).parent_path().empty()) {
    fs::create_directories(fs::path(file).parent_path());
  }
  std::cout << Task::create(file, settings) << '\n';
  return 0;
}

int plan(const Task &task) {
  PathFilter filter;
  task.fillFilter(filter);
  for (const std::string &source : task.sources()) {
    FilteredTree tree(source, filter);
    for (TreeEntry entry; tree.next(entry);) {
      if (entry.error != 0) {
        std::cerr << entry.path << ": " << std::strerror(entry.error) << '\n';
      }
      if (entry.kept) {
        std::cout << entry.path << '\0';
      }
    }
  }
  return std::cout.flush().good() ? 0 : 1;
}

void showSession(const std::string &id) {
  const std::string dir = Session::getPathById(id);
  std::cout << "archived: " << countLines(Path::join(dir, kSessionArchived)) << " files\n";
  for (const char *name : {kSessionProgress, kSessionLog}) {
    std::ifstream in(Path::join(dir, name));
    if (in.peek() != std::ifstream::traits_type::eof()) {
      std::cout << name << ":\n" << in.rdbuf();
    }
  }
}

int status(const Task &task) {
  std::cout << "task " << task.id() << " (" << task.text("name") << ")\n";
  const pid_t runner = task.runner();
  const std::string session = task.text("session");
  if (runner != 0) {
    std::cout << "running, process " << runner << ", session " << session << '\n';
  } else if (!session.empty()) {
    std::cout << "not running; the last run crashed and left session " << session << '\n';
  }
  if (!session.empty()) {
    showSession(session);
  }
  if (task.text("lastRun").empty()) {
    std::cout << "no run has ended yet\n";
    return 0;
  }
  for (const char *key :
       {"lastRun", "lastResult", "files", "bytes", "warnings", "archive", "archiveBytes"}) {
    std::cout << key << ": " << task.text(key) << '\n';
  }
  for (const std::string &message : task.list("messages")) {
    std::cout << "  " << message << '\n';
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

int run(Task task) {
  // Without this, a run would be killed when the reader of its progress goes away.
  (void)std::signal(SIGPIPE, SIG_IGN);
  // The parent process may have set it to be ignored, but SubProcess::call must be able to wait.
  (void)std::signal(SIGCHLD, SIG_DFL);
  const int status = BackupRun(task).run();
  if (status > 128) {
    (void)std::raise(status - 128); // so that the parent sees which signal ended the run
  }
  return status;
}

void describeSettings(CLI::App &command, TaskSettings &settings) {
  command.add_option("--name", settings.name, "Prefix of the archives' file names")->required();
  command
      .add_option("--source", settings.sources, "Tree to back up; links in its path are resolved")
      ->required();
  command.add_option("--include", settings.includes, "Pattern of paths to include");
  command.add_option("--exclude", settings.excludes, "Pattern of paths to exclude");
  command.add_option("--destination", settings.destination, "Folder for the archives")->required();
  command.add_option("--probe", settings.probeHost, "Host that must answer before a run starts");
  command.add_option("--probe-port", settings.probePort, "TCP port to probe (default: 22)")
      ->check(CLI::Range(1, 65535));
  command.add_option("--probe-timeout", settings.probeTimeoutSec, "Seconds to wait (default: 5)")
      ->check(CLI::Range(0, 3600));
  command.add_option("--volume", settings.volumeRule,
                     "Volume for a run's session: max, max-ext, max-ext-btrfs or same:PATH");
  command.add_option("--template", settings.reportTemplate,
                     "Template of the report, with {{name}} placeholders");
}

int dispatch(int argc, char **argv) {
  CLI::App app{"Backs up directory trees. The tasks are stored in a section file."};
  app.require_subcommand(1);
  app.footer(kFooter);
  std::string file = "/var/lib/backup_service/tasks.conf";
  app.add_option("--tasks", file, "Section file that holds the tasks")->capture_default_str();
  int exitStatus = 0;

  TaskSettings settings;
  bool withPassphrase = false;
  CLI::App *addCommand = app.add_subcommand("add", "Create a task and print its id");
  describeSettings(*addCommand, settings);
  addCommand->add_flag("--passphrase-stdin", withPassphrase,
                       "Encrypt archives; read the passphrase as one line from standard input");
  addCommand->callback([&] { exitStatus = add(file, settings, withPassphrase); });

  int id = 0;
  const auto addWithId = [&](const char *name, const char *what, const auto &command) {
    CLI::App *described = app.add_subcommand(name, what);
    described->add_option("ID", id, "ID of the task")->required();
    described->callback([&, command] { exitStatus = command(Task(file, id)); });
  };
  addWithId("run", "Run a task", &run);
  addWithId("plan", "Print the paths that a run would archive, each terminated by NUL", &plan);
  addWithId("status", "Show the current run and the result of the last one", &status);
  app.add_subcommand("list", "List the tasks")->callback([&] { exitStatus = list(file); });

  try {
    app.parse(argc, argv);
  } catch (const CLI::ParseError &error) {
    return app.exit(error) == 0 ? 0 : kWrongUsage;
  }
  return exitStatus;
}

} // namespace

int main(int argc, char **argv) {
  try {
    return dispatch(argc, argv);
  } catch (const std::exception &error) {
    std::cerr << "backup_service: " << error.what() << '\n';
    return dynamic_cast<const std::invalid_argument *>(&error) != nullptr ? kWrongUsage : 1;
  }
}
