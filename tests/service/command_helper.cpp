// The command that the tests of Command start for their streams and signals; for what a command is
// given they start tests/proc/process_helper.cpp.
//
//   copy                   copies its input to its output
//   flood OUT ERR          writes OUT bytes to its output and ERR to its errors, in turns
//   seals                  reports the seals of its input, and whether it can be written
//   await FD [SIG]         ignores SIG, writes "ready" to its output, closes that, and reads FD to
//                          its end
//   family FD              as await, in a child of its own that ignores SIGTERM; the parent writes
//                          "ready" to its output and waits to be ended
//   away FD                as await, in the process group of its parent
//   leave FD               leaves a child behind that holds all its descriptors, ignores SIGPIPE
//                          and ends when FD ends, and writes "left" to its output
//   drown FD               leaves a child behind that writes to its output until that fails; ends
//                          once it has written 100000 bytes; FD is held open by the child
//   numbers COUNT          writes the numbers from 1 to COUNT, one a line
//   orphan SIG FD PROGRAM...
//                          runs PROGRAM by Command, hands it FD and FD + 1, and raises SIG in
//                          itself once the command has written to its output

#include "kovabackup/service/command.h"

#include <array>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fcntl.h>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

namespace {

using namespace KOVA::Backup::Service;

void writeText(int fd, const std::string &text) {
  for (std::size_t done = 0; done < text.size();) {
    const ssize_t written = ::write(fd, text.data() + done, text.size() - done);
    if (written <= 0) {
      ::_exit(97);
    }
    done += static_cast<std::size_t>(written);
  }
}

void readToEnd(int fd) {
  std::array<char, 4096> buffer;
  while (::read(fd, buffer.data(), buffer.size()) > 0) {
  }
}

int copy() {
  std::array<char, 4096> buffer;
  ssize_t got = 0;
  while ((got = ::read(0, buffer.data(), buffer.size())) > 0) {
    writeText(1, std::string(buffer.data(), static_cast<std::size_t>(got)));
  }
  return got == 0 ? 0 : 96;
}

int flood(std::size_t out, std::size_t err) {
  while (out > 0 || err > 0) {
    const std::size_t toOut = out < 1000 ? out : 1000;
    const std::size_t toErr = err < 1000 ? err : 1000;
    writeText(1, std::string(toOut, 'o'));
    writeText(2, std::string(toErr, 'e'));
    out -= toOut;
    err -= toErr;
  }
  return 0;
}

int seals() {
  const int sealed = ::fcntl(0, F_GET_SEALS);
  const bool refused = ::ftruncate(0, 0) != 0 && ::write(0, "x", 1) < 0;
  std::printf("%d %s\n", sealed, refused ? "refused" : "written");
  return 0;
}

int await(int fd, int ignored) {
  if (ignored != 0) {
    ::signal(ignored, SIG_IGN);
  }
  writeText(1, "ready\n");
  ::close(1);
  readToEnd(fd);
  return 5;
}

int family(int fd) {
  if (::fork() == 0) {
    return await(fd, SIGTERM);
  }
  ::close(fd); // so that its end shows the child's
  readToEnd(fd + 1);
  return 6;
}

int leave(int fd) {
  if (::fork() == 0) {
    ::signal(SIGPIPE, SIG_IGN);
    readToEnd(fd);
    return 0;
  }
  writeText(1, "left\n");
  return 0;
}

int drown(int fd) {
  std::array<int, 2> started{};
  if (::pipe(started.data()) != 0) {
    return 95;
  }
  if (::fork() == 0) {
    for (int turn = 0;; ++turn) {
      writeText(1, std::string(1000, 'd'));
      if (turn == 100) {
        ::close(started[0]);
        ::close(started[1]);
      }
    }
  }
  ::close(started[1]);
  readToEnd(started[0]);
  ::close(fd);
  return 0;
}

int numbers(int count) {
  for (int i = 1; i <= count; ++i) {
    std::printf("%d\n", i);
  }
  return std::fflush(stdout) == 0 ? 0 : 94;
}

int orphan(int sig, const std::vector<std::string> &argv, int fd) {
  Command command(argv);
  command.passFd(fd, fd).passFd(fd + 1, fd + 1).lines(Stream::Out, [sig](std::string_view) {
    ::raise(sig);
  });
  return command.run().ok() ? 0 : 93;
}

int run(const std::vector<std::string> &words) {
  const std::string &what = words.at(0);
  const auto number = [&words](std::size_t index) {
    return index < words.size() ? std::stoi(words[index]) : 0;
  };
  if (what == "copy") {
    return copy();
  }
  if (what == "flood") {
    return flood(std::stoul(words.at(1)), std::stoul(words.at(2)));
  }
  if (what == "seals") {
    return seals();
  }
  if (what == "await") {
    return await(number(1), number(2));
  }
  if (what == "away") {
    return ::setpgid(0, ::getpgid(::getppid())) == 0 ? await(number(1), 0) : 92;
  }
  if (what == "family") {
    return family(number(1));
  }
  if (what == "leave") {
    return leave(number(1));
  }
  if (what == "drown") {
    return drown(number(1));
  }
  if (what == "numbers") {
    return numbers(number(1));
  }
  return what == "orphan" ? orphan(number(1), {words.begin() + 3, words.end()}, number(2)) : 98;
}

} // namespace

int main(int argc, char **argv) {
  return run({argv + 1, argv + argc});
}
