#include "tools/kovabackup/frame/text_editor.h"

#include "base/unique_fd.h"
#include "kovabackup/path_util.h"
#include "kovabackup/service/command.h"
#include "tools/kovabackup/frame/child_signals.h"
#include "tools/kovabackup/frame/context.h"
#include "tools/kovabackup/frame/input.h"
#include "tools/kovabackup/frame/program.h"
#include "tools/kovabackup/frame/text.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <filesystem>
#include <fmt/format.h>
#include <sys/file.h>
#include <system_error>
#include <unistd.h>

namespace KOVA::Backup::Tool {
namespace {

using Service::Command;
using Service::Result;

// Commands of the shell itself, with which a value may begin as well.
bool isBuiltIn(const std::string &word) {
  return word == ":" || word == "." || word == "exec" || word == "command" || word == "eval";
}

// The shell would complain of a program that it cannot find, and not say who named it. A value that
// begins with more than a plain word is left to the shell.
void requireEditor(const char *variable, const std::string &value) {
  static const std::string kPlain = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789"
                                    "_-+./,:@%";
  const std::size_t end = value.find_first_not_of(kPlain);
  const std::string word = value.substr(0, end);
  if (word.empty() || (end != std::string::npos && value[end] != ' ')) {
    return;
  }
  const bool isPath = word.find('/') != std::string::npos;
  if (isPath ? !isProgram(word) : findProgram(word).empty() && !isBuiltIn(word)) {
    throw Failure(kFailed, fmt::format("{} names the editor '{}', which {}", variable, word,
                                       isPath ? "is not a program"
                                              : "is not in any directory of "
                                                "PATH"));
  }
}

std::string editor() {
  for (const char *name : {"VISUAL", "EDITOR"}) {
    const char *value = std::getenv(name);
    if (value != nullptr && *value != '\0') {
      requireEditor(name, value);
      return value;
    }
  }
  for (const char *name : {"sensible-editor", "editor", "vi"}) {
    if (!findProgram(name).empty()) {
      return name;
    }
  }
  throw Failure(kFailed, "there is no editor: set VISUAL or EDITOR to one");
}

// The variables hold a command line, such as "emacs -nw", so a shell takes it apart. The shell must
// survive the keys that its editor handles: a trap, unlike an ignored signal, is not inherited.
std::vector<std::string> commandLine(const std::string &editor, const std::string &file) {
  std::error_code gone; // the directory may have been removed; then the editor starts in "/"
  const std::string folder = std::filesystem::current_path(gone).string();
  return {"/bin/sh",
          "-c",
          "trap : INT QUIT; cd \"$1\"; shift; " + editor + " \"$@\"",
          "kovabackup",
          gone ? "/" : folder,
          file};
}

void passEnvironment(Command &command) {
  for (char **entry = environ; entry != nullptr && *entry != nullptr; ++entry) {
    const std::string pair = *entry;
    const std::size_t equals = pair.find('=');
    if (equals != std::string::npos) {
      command.env(pair.substr(0, equals), pair.substr(equals + 1));
    }
  }
}

void requireSuccess(const std::string &editor, const Result &result) {
  if (result.ok()) {
    return;
  }
  const std::string name = fmt::format("the editor '{}'", editor);
  switch (result.end) {
  case Result::End::Exited:
    throw Failure(kFailed, fmt::format("{} ended with exit status {}{}", name, result.code,
                                       result.code == 127 ? ", which usually means that a program "
                                                            "was not found"
                                                          : ""));
  case Result::End::Signalled:
    throw Failure(kFailed, fmt::format("{} was terminated by signal {} ({})", name, result.code,
                                       ::strsignal(result.code)));
  case Result::End::NotStarted:
  case Result::End::StatusLost:
    break;
  }
  throw Failure(kFailed, fmt::format("cannot run {}: {}", name, reason(result.error.code)));
}

} // namespace

EditedText::EditedText(const std::string &text, const std::string &subject)
    : folder_(std::string(kFolderPrefix) + "XXXXXX") {
  if (!folder_.isValid()) {
    throw Failure(kFailed, fmt::format("cannot create a directory in /tmp for the editor: {}",
                                       reason(errno)));
  }
  // Without the lock the text is only taken for one that was left behind.
  lock_.reset(::open(folder_.getPath().c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
  (void)::flock(lock_.get(), LOCK_SH | LOCK_NB);
  write(kTextName, text);
  write(kSubjectName, subject);
}

void EditedText::write(const char *name, const std::string &text) const {
  const std::string file = Path::join(folder_.getPath(), name);
  const Base::UniqueFd fd(
      ::open(file.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
  const int error = fd ? writeAll(fd.get(), text) : errno;
  if (error != 0) {
    throw Failure(kFailed, fmt::format("cannot write {}: {}", file, reason(error)));
  }
}

// The lock that is tried here is gone when the caller closes the directory.
bool EditedText::isOpen(int folder) {
  return ::flock(folder, LOCK_EX | LOCK_NB) != 0 && errno == EWOULDBLOCK;
}

EditedText::~EditedText() {
  if (kept_) {
    (void)folder_.preserve();
  }
}

void EditedText::edit(const Context &context) const {
  const std::string name = editor();
  Command command(commandLine(name, path()));
  passEnvironment(command);
  command.inputFd(STDIN_FILENO)
      .toFd(Service::Stream::Out, context.json ? STDERR_FILENO : STDOUT_FILENO)
      .toFd(Service::Stream::Err, STDERR_FILENO)
      .diesWithUs(false); // a killed editor would leave the terminal in its own state
  makeChildrenWaitable();
  const LeaveKeysToTheChild keys;
  requireSuccess(name, command.run());
}

std::string EditedText::read() const {
  try {
    return readAll(path());
  } catch (const Failure &failure) { // also of a file that the editor removed: not "not found"
    throw Failure(kFailed, failure.what());
  }
}

std::string EditedText::path() const {
  return Path::join(folder_.getPath(), kTextName);
}

} // namespace KOVA::Backup::Tool
