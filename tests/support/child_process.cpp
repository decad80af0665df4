#include "tests/support/child_process.h"

#include "tests/support/shared_memory.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <gtest/gtest.h>
#include <new>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace KovaTest {
namespace {

int exitCodeOf(int status) {
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

pid_t startChild(const std::function<int()> &work) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::_exit(work());
  }
  EXPECT_GT(child, 0) << std::strerror(errno);
  return child;
}

int awaitChild(pid_t child) {
  int status = -1;
  EXPECT_EQ(child, ::waitpid(child, &status, 0));
  return exitCodeOf(status);
}

} // namespace

int runInChild(const std::function<int()> &work) {
  return awaitChild(startChild(work));
}

void runInChildren(int count, const std::function<bool(int)> &work) {
  std::vector<pid_t> children;
  children.reserve(static_cast<std::size_t>(count));
  for (int number = 0; number < count; ++number) {
    children.push_back(startChild([&] { return work(number) ? 0 : 1; }));
  }
  for (const pid_t child : children) {
    EXPECT_EQ(0, awaitChild(child));
  }
}

ShellResult runShell(const std::string &command) {
  std::FILE *const pipe = ::popen(command.c_str(), "re");
  if (pipe == nullptr) {
    return {-1, std::strerror(errno)};
  }
  ShellResult result;
  std::array<char, 4096> part{};
  while (const std::size_t size = std::fread(part.data(), 1, part.size(), pipe)) {
    result.output.append(part.data(), size);
  }
  result.exitCode = exitCodeOf(::pclose(pipe));
  return result;
}

SharedCounter::SharedCounter() : counter_(makeShared<std::atomic<int>>()) {
  if (counter_ == nullptr) {
    throw std::bad_alloc();
  }
}

SharedCounter::~SharedCounter() {
  ::munmap(counter_, sizeof(std::atomic<int>));
}

} // namespace KovaTest
