// backup_service: tasks in a section file, runs that other processes can look into. README.md tells
// how to make a service of one's own of it.

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

Exit status: 0 done, 1 failed, 2 wrong usage, 3 archived but for some files ('status' names them).
An interrupted run ends by the signal that it got.)";

int add(const std::string &file, TaskSettings settings, bool withPassphrase) {
  const std::string &name = settings.name;
  if (name.empty() || name.size() > 200 || name.front() == '.' ||
      name.find_first_of("/\n") != std::string::npos) {
    throw std::invalid_argument("a name begins the archive's file name: 1 to 200 bytes, no '/', "
                                "no line end, no '.' at its begin");
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
    std::cout << "died, left session " << session << '\n';
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
  // A run shall not end because nobody reads its progress any more.
  (void)std::signal(SIGPIPE, SIG_IGN);
  // Whoever started us may have ignored it, but the children are waited for.
  (void)std::signal(SIGCHLD, SIG_DFL);
  const int status = BackupRun(task).run();
  if (status > 128) {
    (void)std::raise(status - 128); // whoever waits for us shall see what ended the run
  }
  return status;
}

void describeSettings(CLI::App &command, TaskSettings &settings) {
  command.add_option("--name", settings.name, "Begins the archive's name")->required();
  command.add_option("--source", settings.sources, "A tree to back up; links to it are resolved")
      ->required();
  command.add_option("--include", settings.includes, "Pattern of paths to keep");
  command.add_option("--exclude", settings.excludes, "Pattern of paths to leave out");
  command.add_option("--destination", settings.destination, "Folder of the archives")->required();
  command.add_option("--probe", settings.probeHost, "Host that must answer before a run");
  command.add_option("--probe-port", settings.probePort, "TCP port to ask it on, by default 22")
      ->check(CLI::Range(1, 65535));
  command.add_option("--probe-timeout", settings.probeTimeoutSec, "Seconds to wait, by default 5")
      ->check(CLI::Range(0, 3600));
  command.add_option("--volume", settings.volumeRule,
                     "Where a run's own files go: max, max-ext, max-ext-btrfs or same:PATH");
  command.add_option("--template", settings.reportTemplate, "The report, with {{names}}");
}

int dispatch(int argc, char **argv) {
  CLI::App app{"Backs trees up as tasks of a section file."};
  app.require_subcommand(1);
  app.footer(kFooter);
  std::string file = "/var/lib/backup_service/tasks.conf";
  app.add_option("--tasks", file, "The file of the tasks")->capture_default_str();
  int exitStatus = 0;

  TaskSettings settings;
  bool withPassphrase = false;
  CLI::App *addCommand = app.add_subcommand("add", "Make a task; prints its id");
  describeSettings(*addCommand, settings);
  addCommand->add_flag("--passphrase-stdin", withPassphrase, "Encrypt; reads one line");
  addCommand->callback([&] { exitStatus = add(file, settings, withPassphrase); });

  int id = 0;
  const auto addWithId = [&](const char *name, const char *what, const auto &command) {
    CLI::App *described = app.add_subcommand(name, what);
    described->add_option("ID", id, "The task's id")->required();
    described->callback([&, command] { exitStatus = command(Task(file, id)); });
  };
  addWithId("run", "Run a task", &run);
  addWithId("plan", "Print what a run would keep, NUL-terminated", &plan);
  addWithId("status", "Look into a run, or at the last one", &status);
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
