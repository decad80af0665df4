#include "tests/conformance/check.h"

#include "kovaplatform/kovacore.h"

#include <array>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaConformance {
namespace {

constexpr unsigned kMostSeconds = 60;

int verdictPipe = -1; // in the process of a check

[[noreturn]] void end(char verdict, const std::string &why) {
  const std::string text = verdict + why;
  (void)!::write(verdictPipe, text.data(), text.size()); // nothing to do if there is no reader
  ::_exit(0);
}

[[noreturn]] void runChild(const Check &check, const std::string &folder) {
  ::alarm(kMostSeconds);
  std::error_code error;
  std::filesystem::create_directory(folder, error);
  if (::chdir(folder.c_str()) != 0) {
    end('F', "no working directory " + folder + ": " + std::strerror(errno));
  }
  check.run();
  end('P', "");
}

std::string readAll(int fd) {
  std::string text;
  std::array<char, 4096> part{};
  ssize_t size = 0;
  while ((size = ::read(fd, part.data(), part.size())) > 0) {
    text.append(part.data(), static_cast<std::size_t>(size));
  }
  return text;
}

// How a process ended that gave no verdict.
std::string withoutVerdict(int status) {
  if (WIFSIGNALED(status) && WTERMSIG(status) == SIGALRM) {
    return "Fnot done within " + std::to_string(kMostSeconds) + " seconds";
  }
  if (WIFSIGNALED(status)) {
    return "Fended by signal " + std::to_string(WTERMSIG(status));
  }
  return "Fended without a verdict";
}

const char *wordOf(char verdict) {
  switch (verdict) {
  case 'P':
    return "PASS";
  case 'S':
    return "SKIP";
  case 'N':
    return "NOTE";
  default:
    return "FAIL";
  }
}

} // namespace

void fail(const std::string &why) {
  end('F', why);
}

void skip(const std::string &why) {
  end('S', why);
}

void note(const std::string &why) {
  end('N', why);
}

void expectErrorRecorded(const std::string &after) {
  expect(KLIBCErrGet() != 0, after + ": no error code is recorded");
  expect(KLIBCErrorGetFile() != nullptr, after + ": the error's source file is null");
}

void expectErrorCode(int code, const std::string &after) {
  std::array<char, 80> text{};
  std::snprintf(text.data(), text.size(), ": error code 0x%04X instead of 0x%04X", KLIBCErrGet(),
                code);
  expect(KLIBCErrGet() == code, after + text.data());
}

std::string inQuotes(const std::string &text) {
  constexpr std::size_t kShown = 60;
  return "\"" + text.substr(0, kShown) + (text.size() > kShown ? "...\"" : "\"");
}

std::string textIn(const std::string &buffer) {
  return buffer.substr(0, buffer.find('\0'));
}

char runCheck(const Check &check, const std::string &scratch) {
  std::array<int, 2> ends{};
  if (::pipe(ends.data()) != 0) {
    std::perror("pipe");
    return 'F';
  }
  const pid_t child = ::fork();
  if (child == 0) {
    ::close(ends[0]);
    verdictPipe = ends[1];
    runChild(check, scratch + "/" + check.name);
  }
  ::close(ends[1]);
  std::string answer = readAll(ends[0]);
  ::close(ends[0]);
  int status = 0;
  if (child < 0 || ::waitpid(child, &status, 0) != child) {
    answer = "Fno process for the check";
  } else if (answer.empty()) {
    answer = withoutVerdict(status);
  }
  std::printf("%s %s: %s\n", wordOf(answer[0]), check.name,
              answer[0] == 'P' ? check.claim : answer.c_str() + 1);
  std::fflush(stdout);
  return answer[0];
}

} // namespace KovaConformance
