// The command kovabackup: inspects and manages what the backup services use, through the public
// headers of libkovabackup-util only.

#include "base/json_memory.h"
#include "tools/kovabackup/commands/groups.h"
#include "tools/kovabackup/frame/cli.h"
#include "tools/kovabackup/frame/complete.h"
#include "tools/kovabackup/frame/invocation.h"

#include <cerrno>
#include <clocale>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <fcntl.h>
#include <fmt/format.h>
#include <new>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

// Occupies the standard descriptors that the caller left closed. Otherwise the first file that is
// opened would get such a number, and results would be written into it. The wrong direction is
// deliberate: reading or writing fails as it would on a closed descriptor.
void occupyClosedStandardDescriptors() {
  for (const int fd : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) {
    if (::fcntl(fd, F_GETFD) == -1) {
      (void)::open("/dev/null", fd == STDIN_FILENO ? O_WRONLY : O_RDONLY); // gets the lowest: fd
    }
  }
}

void doNothing(int) {}

// Lets a write to a pipe without readers fail with EPIPE, and one beyond the limit of file sizes
// with EFBIG, instead of ending the process, so that the exit code can say so and changes can be
// undone. A handler rather than SIG_IGN, because an ignored signal stays ignored across exec:
// commands that are started must find its usual action.
void ignoreSignalsOfWrites() {
  for (const int signal : {SIGPIPE, SIGXFSZ}) {
    struct sigaction action = {};
    action.sa_handler = doNothing;
    action.sa_flags = SA_RESTART;
    ::sigemptyset(&action.sa_mask);
    (void)::sigaction(signal, &action, nullptr); // fails for no valid signal number
  }
}

void registerAll(CommandGroup root) {
  registerSession(root);
  registerOption(root);
  registerFilter(root);
  registerVolume(root);
  registerNet(root);
  registerTemplate(root);
  registerLock(root);
  registerRun(root);
  registerDoctor(root);
  registerExplain(root);
}

// Writes out what is buffered. Results that could not be written are a failure, whatever the
// command reported.
int flushAll(Context &context, int exitCode) {
  const int error = context.out.flush();
  if (error != 0 && context.undo) {
    context.undo();
  }
  if (error != 0 && error != EPIPE) { // a reader that has seen enough, such as head, is normal
    context.messages.line(
        fmt::format("kovabackup: cannot write to standard output: {}", std::strerror(error)));
  }
  (void)context.messages.flush(); // when standard error fails, there is nowhere left to report it
  return error != 0 && exitCode == kDone ? kFailed : exitCode;
}

int runCommand(const std::vector<std::string> &words) {
  Context context;
  const std::unique_ptr<Declaration> root = declareRoot(context);
  registerAll(CommandGroup(*root));
  declareComplete(*root);
  return flushAll(context, invoke(*root, words, context));
}

// Nothing may be allocated for the message.
void sayThatMemoryRanOut() {
  static const char kMessage[] = "kovabackup: memory ran out\n";
  (void)!::write(STDERR_FILENO, kMessage, sizeof kMessage - 1); // the exit code says it as well
}

std::terminate_handler runtimesHandler = nullptr;

// The runtime ends the program without an exception where memory does not even suffice for
// std::bad_alloc. With an exception there is an error in the program, which the runtime's own
// handler describes.
[[noreturn]] void onTerminate() {
  if (std::current_exception()) {
    runtimesHandler();
    std::abort(); // not reached with the handler of any known runtime
  }
  sayThatMemoryRanOut();
  ::_exit(kFailed);
}

// While the command runs, failures are reported by it. Before and after that only memory can fail.
int run(int argc, char **argv) {
  try {
    // argv may lack even its own name
    const std::vector<std::string> words(argv + (argc > 0 ? 1 : 0), argv + argc);
    return Base::JsonMemory::withBadAlloc([&] { return runCommand(words); });
  } catch (const std::bad_alloc &) {
    sayThatMemoryRanOut();
    return kFailed;
  }
}

} // namespace
} // namespace KOVA::Backup::Tool

int main(int argc, char **argv) {
  KOVA::Backup::Tool::runtimesHandler = std::set_terminate(KOVA::Backup::Tool::onTerminate);
  KOVA::Backup::Tool::occupyClosedStandardDescriptors();
  (void)std::setlocale(LC_CTYPE, ""); // for the width of characters; nothing else depends on it
  KOVA::Backup::Tool::ignoreSignalsOfWrites();
  return KOVA::Backup::Tool::run(argc, argv);
}
