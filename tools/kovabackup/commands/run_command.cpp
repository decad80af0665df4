#include "tools/kovabackup/commands/groups.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"
#include "kovabackup/subprocess.h"
#include "tools/kovabackup/frame/child_signals.h"
#include "tools/kovabackup/frame/program.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <cstring>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

struct RunOptions {
  std::vector<std::string> command;
  std::vector<std::string> environment;
  std::optional<std::string> standardOutput;
  std::optional<std::string> standardError;
  bool background = false;
  bool newSession = false;
};

// The exit codes of shells and env(1), which scripts know already.
constexpr int kCannotStart = 126;
constexpr int kNotFound = 127;
constexpr int kSignalBase = 128;

// The library starts exactly the path that it is given, with "/" as the working directory. So a
// name is looked up on PATH here, and a relative path is made absolute while the working directory
// is still the user's.
std::string resolveProgram(const std::string &name) {
  if (name.find('/') != std::string::npos) {
    return Path::absPath(name);
  }
  std::string program = findProgram(name);
  if (program.empty()) {
    throw Failure(kNotFound, fmt::format("not started: there is no command '{}' on PATH", name));
  }
  return program;
}

// Checked before the start, because the child could report it only to the system log.
void requireStartable(const std::string &program) {
  if (::access(program.c_str(), F_OK) != 0) {
    throw Failure(kNotFound, fmt::format("not started: {}: {}", program, std::strerror(errno)));
  }
  if (!isProgram(program)) {
    throw Failure(kCannotStart, fmt::format("not started: {} is not an executable file", program));
  }
}

// The file for a stream, as an absolute path, since the child starts in "/". It is opened here as
// the child will open it, so that a failure is reported instead of being logged.
std::string outputFile(const std::string &file) {
  std::string path = Path::absPath(file);
  const KOVA::Base::UniqueFd fd(
      ::open(path.c_str(), O_RDWR | O_CREAT | O_APPEND | O_CLOEXEC, 0600));
  if (!fd) {
    throw Failure(kFailed,
                  fmt::format("not started: cannot write {}: {}", shownFile(file), reason(errno)));
  }
  return path;
}

// In the foreground the child shares our streams unless a file is named; with --json standard
// output is reserved for the document. In the background the library's default applies: /dev/null.
void redirect(SubProcess &process, const RunOptions &options, bool json) {
  if (options.standardOutput) {
    process.setStdOutput(outputFile(*options.standardOutput), 0);
  } else if (!options.background) {
    process.setStdOutput(json ? STDERR_FILENO : STDOUT_FILENO);
  }
  if (options.standardError) {
    process.setStdError(outputFile(*options.standardError), 0);
  } else if (!options.background) {
    process.setStdError(STDERR_FILENO);
  }
}

void setEnvironment(SubProcess &process, const std::vector<std::string> &pairs) {
  for (const std::string &pair : pairs) {
    const std::size_t equals = pair.find('=');
    if (equals == std::string::npos || equals == 0) {
      throw Failure(kUsage, fmt::format("--env requires NAME=VALUE, not '{}'", pair));
    }
    process.setEnv(pair.substr(0, equals), pair.substr(equals + 1));
  }
}

int endOf(Context &context, int status, const std::string &program) {
  if (status == -1) {
    throw Failure(kFailed, "the command could not be started or waited for; see the system log");
  }
  context.document["exitCode"] =
      WIFEXITED(status) ? Json::Value(WEXITSTATUS(status)) : Json::Value();
  context.document["signal"] = WIFSIGNALED(status) ? Json::Value(WTERMSIG(status)) : Json::Value();
  if (WIFSIGNALED(status)) {
    if (!context.json) {
      context.remark(fmt::format("{} was terminated by signal {} ({})", program, WTERMSIG(status),
                                 ::strsignal(WTERMSIG(status))));
    }
    return kSignalBase + WTERMSIG(status);
  }
  if (WEXITSTATUS(status) == kNotFound && !context.json) {
    context.remark(fmt::format("{} ended with 127: either this is its own exit code or the system "
                               "could not run it; see the system log",
                               program));
  }
  return WEXITSTATUS(status);
}

int run(Context &context, const RunOptions &options) {
  if (options.newSession && !options.background) {
    throw Failure(kUsage, "--new-session requires --background");
  }
  std::vector<std::string> command = options.command;
  command[0] = resolveProgram(command[0]);
  SubProcess process(command);
  setEnvironment(process, options.environment);
  requireStartable(command[0]);
  redirect(process, options, context.json);
  context.document["program"] = jsonName(command[0]);
  context.document["background"] = options.background;
  makeChildrenWaitable();
  if (options.background) {
    if (!process.callBackground(options.newSession)) {
      throw Failure(kFailed, "the command could not be started; see the system log");
    }
    return kDone;
  }
  const LeaveKeysToTheChild keys;
  return endOf(context, process.call(), command[0]);
}

} // namespace

void registerRun(CommandGroup &root) {
  auto options = std::make_shared<RunOptions>();
  root.command("run", "Run a command as the services run theirs")
      .arguments(options->command, "COMMAND", "the command and its arguments, after --")
      .completes(Completes::CommandLine)
      .flag(options->background, "--background", "start it and do not wait for it")
      .flag(options->newSession, "--new-session", "with --background: start it in a new session")
      .option(options->standardOutput, "--stdout", "FILE", "append its standard output to a file")
      .completes(Completes::Files)
      .option(options->standardError, "--stderr", "FILE", "append its standard error to a file")
      .completes(Completes::Files)
      .repeated(options->environment, "--env", "NAME=VALUE",
                "set a variable; may be given several times")
      .note(
          "The command starts in / with standard input from /dev/null. Its environment is PATH "
          "and what --env sets. A command without a slash is looked up on PATH. In the background "
          "its output is discarded unless a file is named, and its process ID is not printed; if "
          "it matters, the command itself can write it to a file.")
      .note("Ends with the exit code of the command, or with 128 plus the number of the signal "
            "that terminated it. Ends with 127 when there is no such command and with 126 when it "
            "is not executable; a message that begins with 'not started' distinguishes these from "
            "the command's own codes. With --json the command's output goes to standard error.")
      .example("kovabackup run -- tar -tf /volume1/backup.tar")
      .example("kovabackup run --env LANG=C --stdout /tmp/list -- ls -l /volume1")
      .example("kovabackup run --background --new-session -- /usr/local/bin/rebuild")
      .example("kovabackup run --background -- sh -c 'echo $$ >/run/x.pid; exec rebuild'")
      .action([options](Context &c) { return run(c, *options); });
}

} // namespace KOVA::Backup::Tool
