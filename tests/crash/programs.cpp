#include "tests/crash/programs.h"

#include <cstdio>
#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest::Crash {

void becomeProgram(const std::vector<std::string> &arguments, const std::string &output) {
  std::vector<std::string> words = arguments;
  std::vector<char *> pointers;
  for (std::string &word : words) {
    pointers.push_back(word.data());
  }
  pointers.push_back(nullptr);
  const int in = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
  const int out = ::open(output.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
  (void)::dup2(in, STDIN_FILENO);
  (void)::dup2(out, STDOUT_FILENO);
  (void)::dup2(out, STDERR_FILENO);
  (void)::execv(pointers.front(), pointers.data());
  ::_exit(127);
}

int runProgram(const std::vector<std::string> &arguments, const std::string &output) {
  std::fflush(nullptr);
  const pid_t pid = ::fork();
  if (pid == 0) {
    becomeProgram(arguments, output);
  }
  int status = 0;
  (void)::waitpid(pid, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

} // namespace KovaTest::Crash
