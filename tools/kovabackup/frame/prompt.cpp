#include "tools/kovabackup/frame/prompt.h"

#include "base/retry_on_eintr.h"
#include "base/unique_fd.h"
#include "tools/kovabackup/frame/text.h"

#include <array>
#include <cerrno>
#include <csignal>
#include <poll.h>
#include <sys/signalfd.h>
#include <termios.h>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

using KOVA::Base::retryOnEintr;
using KOVA::Base::UniqueFd;

// The signals with which a user or the system ends or stops the command at the prompt.
constexpr std::array<int, 7> kSignals = {SIGINT,  SIGTERM, SIGHUP, SIGQUIT,
                                         SIGTSTP, SIGTTIN, SIGTTOU};

// Holds the signals back while it exists. One that came meanwhile stays pending and does its
// default work when the destructor unblocks it.
class HeldSignals {
public:
  HeldSignals() {
    sigset_t held;
    ::sigemptyset(&held);
    for (const int sig : kSignals) {
      ::sigaddset(&held, sig);
    }
    fd_.reset(::signalfd(-1, &held, SFD_CLOEXEC));
    if (!fd_) { // held back unseen they could not end a prompt that waits
      throw Failure(kFailed, "cannot watch for signals: " + reason(errno));
    }
    ::pthread_sigmask(SIG_BLOCK, &held, &before_);
  }
  ~HeldSignals() { ::pthread_sigmask(SIG_SETMASK, &before_, nullptr); }
  HeldSignals(const HeldSignals &) = delete;
  HeldSignals &operator=(const HeldSignals &) = delete;

  /// Readable while a signal is pending.
  int fd() const { return fd_.get(); }

private:
  sigset_t before_ = {};
  UniqueFd fd_;
};

// While it exists, what is typed on standard input is not shown.
class SilentTerminal {
public:
  SilentTerminal() {
    known_ = ::tcgetattr(STDIN_FILENO, &before_) == 0;
    struct termios silent = before_;
    silent.c_lflag &= ~static_cast<tcflag_t>(ECHO);
    silent.c_lflag |= ECHONL; // the line end is shown, so that the next line begins at the left
    known_ = known_ && ::tcsetattr(STDIN_FILENO, TCSAFLUSH, &silent) == 0;
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

// Reads one byte of standard input. Returns: false at the end of the input.
bool readByte(char &c) {
  return retryOnEintr([&c] { return ::read(STDIN_FILENO, &c, 1); }) == 1;
}

// Waits for a key. Returns: false when a signal came first.
bool waitForKey(const HeldSignals &signals) {
  std::array<struct pollfd, 2> watched = {{{STDIN_FILENO, POLLIN, 0}, {signals.fd(), POLLIN, 0}}};
  (void)retryOnEintr([&watched] { return ::poll(watched.data(), watched.size(), -1); });
  return watched[1].revents == 0;
}

// Asks once. Returns: false when a signal came first. The order of the two objects matters: the
// terminal shows what is typed again before the signal ends or stops the command.
bool askSilently(const std::string &question, std::string &answer) {
  answer.clear();
  const HeldSignals signals;
  const SilentTerminal silent;
  (void)!::write(STDERR_FILENO, question.data(), question.size()); // the prompt may go unseen
  char c = 0;
  while (waitForKey(signals)) {
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
  (void)context.messages.flush(); // messages that cannot be written have nowhere to go
  std::string answer;
  char c = 0;
  while (readByte(c) && c != '\n') { // byte by byte: what follows the line is left for others
    answer += c;
  }
  if (c != '\n') { // at the end of the input the cursor is still behind the question
    context.messages.write("\n");
  }
  return answer == "y" || answer == "Y" || answer == "yes";
}

std::string askSecret(Context &context, const std::string &question) {
  (void)context.messages.flush();
  std::string answer;
  while (!askSilently(context.messages.name(question), answer)) {
    // The signal stopped the command and it was resumed; one that ends it does not return here.
  }
  if (answer.empty()) {
    throw Failure(kFailed, "nothing was entered");
  }
  return answer;
}

} // namespace KOVA::Backup::Tool
