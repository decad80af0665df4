#include "tools/kovabackup/frame/prompt.h"

#include "kovabackup/signal.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <fmt/format.h>
#include <poll.h>
#include <termios.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

// Signals by which a person or the system ends or stops the command at the prompt.
constexpr std::array<int, 7> kSignals = {SIGINT,  SIGTERM, SIGHUP, SIGQUIT,
                                         SIGTSTP, SIGTTIN, SIGTTOU};

volatile std::sig_atomic_t caught = 0;

void remember(int sig) {
  caught = sig;
}

// While it stands, what is typed on standard input is not shown.
class SilentTerminal {
public:
  SilentTerminal() {
    struct termios silent;
    known_ = ::tcgetattr(STDIN_FILENO, &before_) == 0;
    silent = before_;
    silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
    silent.c_lflag |= ECHONL; // the line end is shown, so that the next line begins at the left
    if (known_) {
      known_ = ::tcsetattr(STDIN_FILENO, TCSAFLUSH, &silent) == 0;
    }
  }
  ~SilentTerminal() {
    if (known_) {
      (void)::tcsetattr(STDIN_FILENO, TCSAFLUSH, &before_); // there is nothing else to try
    }
  }
  SilentTerminal(const SilentTerminal &) = delete;
  SilentTerminal &operator=(const SilentTerminal &) = delete;

private:
  struct termios before_ = {};
  bool known_ = false;
};

// Blocks the signals but while wait stands in ppoll: one that comes just before a read would
// otherwise be noticed only after the next key.
class BlockedSignals {
public:
  BlockedSignals() {
    sigset_t set;
    ::sigemptyset(&set);
    for (const int sig : kSignals) {
      ::sigaddset(&set, sig);
    }
    ::sigprocmask(SIG_BLOCK, &set, &before_);
  }
  ~BlockedSignals() { ::sigprocmask(SIG_SETMASK, &before_, nullptr); }
  BlockedSignals(const BlockedSignals &) = delete;
  BlockedSignals &operator=(const BlockedSignals &) = delete;

  /// False when a signal came first.
  bool wait() const {
    struct pollfd watched = {STDIN_FILENO, POLLIN, 0};
    while (::ppoll(&watched, 1, nullptr, &before_) < 0) {
      if (caught != 0 || errno != EINTR) {
        return caught == 0;
      }
    }
    return true;
  }

private:
  sigset_t before_ = {};
};

// One byte of standard input; false at its end.
bool readByte(char &c) {
  ssize_t got = -1;
  do {
    got = ::read(STDIN_FILENO, &c, 1);
  } while (got < 0 && errno == EINTR);
  return got == 1;
}

// Asks once. False when a signal came; the terminal and the signals' actions are back then.
bool askSilently(const std::string &question, std::string &answer) {
  answer.clear();
  caught = 0;
  const BlockedSignals blocked;
  std::array<ScopedTempSigHandler, kSignals.size()> handlers;
  for (std::size_t i = 0; i < kSignals.size(); ++i) {
    (void)handlers[i].setSignalHandler(kSignals[i], 0, remember); // true on every first call
  }
  const SilentTerminal silent;
  (void)!::write(STDERR_FILENO, question.data(), question.size()); // asked in vain then
  char c = 0;
  while (blocked.wait()) {
    if (!readByte(c) || c == '\n') {
      return true;
    }
    answer += c;
  }
  return false;
}

} // namespace

bool canAsk(const Context &context) {
  return ::isatty(STDIN_FILENO) == 1 && context.messages.terminal();
}

bool confirm(Context &context, const std::string &question) {
  context.messages.write(context.messages.name(question) + " [y/N] ");
  (void)context.messages.flush(); // asked in vain then
  std::string answer;
  char c = 0;
  while (readByte(c) && c != '\n') { // byte by byte: what follows the line stays
    answer += c;
  }
  if (c != '\n') { // the input has ended: what comes next begins on a line of its own
    context.messages.write("\n");
  }
  return answer == "y" || answer == "Y" || answer == "yes";
}

std::string askSecret(Context &context, const std::string &question) {
  (void)context.messages.flush();
  std::string answer;
  while (!askSilently(context.messages.name(question), answer)) {
    (void)::kill(::getpid(), caught); // as if it had not been caught; after a stop we ask again
  }
  if (answer.empty()) {
    throw Failure(kFailed, "nothing was entered");
  }
  return answer;
}

} // namespace KOVA::Backup::Tool
