// The command that the process tests start. It reports what it was started with, or ends in a known
// way. Processes synchronise through FIFOs, so that neither side has to poll.
//
//   report FILE [CODE [GATE]]
//                          reads GATE to its end, writes the state of this process to FILE, ends
//                          with CODE (0)
//   exit CODE              ends with CODE
//   die SIG                ends by SIG
//   relay SIG GATE CODE    reads GATE to its end, sends SIG to the parent once that sleeps, ends
//                          with CODE when SIG arrives here
//   count SIG GATE         counts SIGs until GATE has been read to its end, then ends with the
//                          number
//   ignore SIG GATE CODE   ignores SIG, reads GATE to its end, ends with CODE
//   until SIG GATE CODE    unblocks SIG, reads GATE to its end, ends with CODE once SIG has arrived
//   stop GATE CODE         reads GATE to its end, stops, and ends with CODE once continued
//   hold READY GATE        writes "ready" to READY, reads GATE to its end, ends with 0

#include <cerrno>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <fstream>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <unistd.h>
#include <vector>

extern char **environ;

namespace {

volatile std::sig_atomic_t signalsSeen = 0;

void countSignal(int) {
  signalsSeen = signalsSeen + 1;
}

void catchSignal(int sig) {
  struct sigaction action = {};
  action.sa_handler = countSignal;
  ::sigaction(sig, &action, nullptr);
}

// Returns when the writer has closed its end. Signals do not interrupt it.
void readToEnd(const char *path) {
  int fd = -1;
  do {
    fd = ::open(path, O_RDONLY | O_CLOEXEC);
  } while (fd < 0 && errno == EINTR);
  char byte = 0;
  ssize_t got = 0;
  do {
    got = ::read(fd, &byte, 1);
  } while (got > 0 || (got < 0 && errno == EINTR));
  ::close(fd);
}

std::string slurp(const std::string &path) {
  std::ifstream in(path);
  std::ostringstream text;
  text << in.rdbuf();
  return text.str();
}

char stateOf(pid_t pid) {
  const std::string stat = slurp("/proc/" + std::to_string(pid) + "/stat");
  const std::size_t at = stat.rfind(')');
  return at == std::string::npos ? '?' : stat.at(at + 2);
}

// Waits until the parent sleeps: it then waits for this process.
void awaitSleepOf(pid_t pid) {
  while (stateOf(pid) != 'S') {
    const timespec tick = {0, 1000000};
    ::nanosleep(&tick, nullptr);
  }
}

void listDescriptors(std::ostream &out) {
  DIR *dir = ::opendir("/proc/self/fd");
  while (const dirent *entry = ::readdir(dir)) {
    const int fd = std::atoi(entry->d_name);
    if (entry->d_name[0] == '.' || fd == ::dirfd(dir)) {
      continue;
    }
    char target[4096] = "";
    (void)!::readlink(("/proc/self/fd/" + std::to_string(fd)).c_str(), target, sizeof target - 1);
    out << "fd " << fd << "=" << target << "\n";
    out << "flags " << fd << "=" << (::fcntl(fd, F_GETFL) & (O_ACCMODE | O_APPEND)) << "\n";
  }
  ::closedir(dir);
}

void listSignals(std::ostream &out) {
  std::istringstream status(slurp("/proc/self/status"));
  for (std::string line; std::getline(status, line);) {
    for (const char *name : {"SigBlk", "SigIgn", "SigPnd"}) {
      if (line.rfind(name, 0) == 0) {
        out << name << "=" << line.substr(line.rfind('\t') + 1) << "\n";
      }
    }
  }
  struct sigaction action = {};
  ::sigaction(SIGCHLD, nullptr, &action);
  out << "SIGCHLD flags=" << (action.sa_flags & ~0x04000000) << "\n";
}

int report(const char *path, int argc, char **argv) {
  std::ostringstream out;
  listDescriptors(out);
  listSignals(out);
  for (int i = 0; i < argc; ++i) {
    out << "arg " << i << "=" << argv[i] << "\n";
  }
  for (char **entry = environ; *entry != nullptr; ++entry) {
    out << "env " << *entry << "\n";
  }
  char cwd[4096] = "";
  (void)!::getcwd(cwd, sizeof cwd);
  const mode_t mask = ::umask(0);
  ::umask(mask);
  out << "cwd=" << cwd << "\numask=" << mask << "\npid=" << ::getpid() << "\nppid=" << ::getppid()
      << "\nsid=" << ::getsid(0) << "\npgid=" << ::getpgrp() << "\n";
  std::ofstream file(path);
  file << out.str() << std::flush;
  return file.good() ? 0 : 99;
}

int until(int sig, const char *gate, int code, bool relays) {
  sigset_t blocked;
  sigset_t rest;
  ::sigemptyset(&blocked);
  ::sigaddset(&blocked, sig);
  ::sigprocmask(SIG_BLOCK, &blocked, &rest);
  ::sigdelset(&rest, sig);
  catchSignal(sig);
  readToEnd(gate);
  if (relays) {
    awaitSleepOf(::getppid());
    ::kill(::getppid(), sig);
  }
  while (signalsSeen == 0) {
    ::sigsuspend(&rest);
  }
  return code;
}

int run(const std::vector<std::string> &words, int argc, char **argv) {
  const std::string &what = words.at(0);
  if (what == "report") {
    if (words.size() > 3) {
      readToEnd(words[3].c_str());
    }
    const int failed = report(words.at(1).c_str(), argc, argv);
    return failed != 0 || words.size() < 3 ? failed : std::stoi(words[2]);
  }
  if (what == "exit") {
    return std::stoi(words.at(1));
  }
  if (what == "die") {
    ::signal(std::stoi(words.at(1)), SIG_DFL);
    ::raise(std::stoi(words.at(1)));
  } else if (what == "relay" || what == "until") {
    return until(std::stoi(words.at(1)), words.at(2).c_str(), std::stoi(words.at(3)),
                 what == "relay");
  } else if (what == "count") {
    catchSignal(std::stoi(words.at(1)));
    readToEnd(words.at(2).c_str());
    return signalsSeen;
  } else if (what == "ignore") {
    ::signal(std::stoi(words.at(1)), SIG_IGN);
    readToEnd(words.at(2).c_str());
    return std::stoi(words.at(3));
  } else if (what == "stop") {
    readToEnd(words.at(1).c_str());
    ::raise(SIGSTOP);
    return std::stoi(words.at(2));
  } else if (what == "hold") {
    std::ofstream(words.at(1)) << "ready\n" << std::flush;
    readToEnd(words.at(2).c_str());
    return 0;
  }
  return 98;
}

} // namespace

int main(int argc, char **argv) {
  return run({argv + 1, argv + argc}, argc, argv);
}
