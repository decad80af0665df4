// The command kovabackup: looks after what the backup services use, over the public headers of
// libkovabackup-util only.

#include "tools/kovabackup/commands/groups.h"
#include "tools/kovabackup/frame/cli.h"

#include <CLI/CLI.hpp>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <exception>
#include <fcntl.h>
#include <fmt/format.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

// A closed standard descriptor would be given to the first file that is opened, and results would
// go into it. It is filled with what refuses to be read or written, as if it were still closed.
void fillStandardDescriptors() {
  for (const int fd : {0, 1, 2}) {
    if (::fcntl(fd, F_GETFD) == -1) {
      (void)::open("/dev/null", fd == 0 ? O_WRONLY : O_RDONLY); // takes the lowest number: fd
    }
  }
}

void ignoreQuietly(int) {}

// A reader that goes away is a failed write, told by its errno. A handler rather than SIG_IGN:
// commands that are started must find the signal as it usually is.
void survivePipes() {
  struct sigaction action;
  std::memset(&action, 0, sizeof action);
  action.sa_handler = ignoreQuietly;
  action.sa_flags = SA_RESTART;
  ::sigemptyset(&action.sa_mask);
  (void)::sigaction(SIGPIPE, &action, nullptr);
}

void registerAll(CLI::App &app, Context &context) {
  registerSession(app, context);
  registerOption(app, context);
  registerFilter(app, context);
  registerVolume(app, context);
  registerNet(app, context);
  registerTemplate(app, context);
  registerLock(app, context);
  registerRun(app, context);
  registerDoctor(app, context);
}

int runAction(Context &context) {
  try {
    return context.action(context);
  } catch (const Failure &failure) {
    context.fail(failure);
    return failure.exitCode();
  } catch (const std::exception &exception) {
    context.reportError(kFailed, fmt::format("unexpected failure: {}", exception.what()));
    return kFailed;
  }
}

// Writes what is left. A result that nobody could read is no result, whatever the verb said.
int finish(Context &context, int exitCode, bool document) {
  if (document) {
    context.writeDocument();
  }
  const int error = context.out.flush();
  if (error != 0 && context.undo) {
    context.undo();
  }
  if (error == EPIPE) { // whoever read has seen enough, as in: kovabackup session list | head
    exitCode = exitCode == kDone ? kFailed : exitCode;
  } else if (error != 0) {
    context.messages.line(
        fmt::format("kovabackup: cannot write to standard output: {}", std::strerror(error)));
    exitCode = exitCode == kDone ? kFailed : exitCode;
  }
  (void)context.messages.flush(); // nowhere is left to tell of it
  return exitCode;
}

int run(int argc, const char *const *argv) {
  Context context;
  const std::unique_ptr<CLI::App> app = makeApp(context);
  registerAll(*app, context);
  const std::optional<int> ended = parse(*app, context, argc, argv);
  const int exitCode = ended ? *ended : runAction(context);
  const bool document = context.json && (!ended || exitCode != kDone);
  return finish(context, exitCode, document);
}

} // namespace
} // namespace KOVA::Backup::Tool

int main(int argc, char **argv) {
  KOVA::Backup::Tool::fillStandardDescriptors();
  KOVA::Backup::Tool::survivePipes();
  return KOVA::Backup::Tool::run(argc, argv);
}
