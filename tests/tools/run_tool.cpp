#include "tests/tools/run_tool.h"

#include "base/unique_fd.h"
#include "tests/support/machine_mounts.h"

#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <gtest/gtest.h>
#include <memory>
#include <poll.h>
#include <pty.h>
#include <sys/mman.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace KovaTest {
namespace {

using KOVA::Base::UniqueFd;

constexpr int kPatienceMs = 60000;
constexpr int kCannotStart = 126;
constexpr uid_t kNobody = 65534;

// A configuration of the platform without any volume, for all tests that bring none of their own:
// commands on sessions search the volumes, and must not find those of the machine.
class NoVolumes : public testing::Environment {
public:
  void SetUp() override {
    writeFile(kPath, "[mounts]\nexclude=" + machineMounts() + "\n");
    ::chmod(kPath, 0644); // regardless of the umask
    ::setenv("KOVA_PLATFORM_CONF", kPath, 1);
  }

private:
  static constexpr const char *kPath = "/tmp/no_volumes.conf";
};

testing::Environment *const noVolumes = testing::AddGlobalTestEnvironment(new NoVolumes);

// The pointers that execve requires, to texts that do not move.
class Words {
public:
  explicit Words(std::vector<std::string> words) : words_(std::move(words)) {
    for (std::string &word : words_) {
      pointers_.push_back(word.data());
    }
    pointers_.push_back(nullptr);
  }
  char *const *get() const { return pointers_.data(); }

private:
  std::vector<std::string> words_;
  std::vector<char *> pointers_;
};

std::vector<std::string> argumentWords(const std::vector<std::string> &arguments) {
  std::vector<std::string> words{KOVA_TOOL_PATH};
  words.insert(words.end(), arguments.begin(), arguments.end());
  return words;
}

// Options of the sanitizers and the platform's configuration must reach the child, too.
std::vector<std::string> environmentWords(const ToolSetup &setup) {
  std::map<std::string, std::string> variables{{"PATH", "/usr/bin:/bin"}, {"TERM", "xterm"}};
  for (const char *name :
       {"ASAN_OPTIONS", "UBSAN_OPTIONS", "LSAN_OPTIONS", "TSAN_OPTIONS", "KOVA_PLATFORM_CONF"}) {
    if (const char *value = std::getenv(name)) {
      variables[name] = value;
    }
  }
  for (const auto &[name, value] : setup.environment) {
    variables[name] = value;
  }
  std::vector<std::string> words;
  for (const auto &[name, value] : variables) {
    words.push_back(name + "=" + value);
  }
  return words;
}

[[noreturn]] void become(const ToolSetup &setup, const Words &arguments, const Words &environment) {
  if (setup.memoryLimit > 0) {
    const struct rlimit limit = {setup.memoryLimit, setup.memoryLimit};
    ::setrlimit(RLIMIT_AS, &limit);
  }
  if (setup.asNobody && (::setgid(kNobody) != 0 || ::setuid(kNobody) != 0)) {
    ::_exit(kCannotStart);
  }
  if (::chdir(setup.folder.c_str()) == 0) {
    ::execve(KOVA_TOOL_PATH, arguments.get(), environment.get());
  }
  ::_exit(kCannotStart);
}

UniqueFd memoryFile(const std::string &content = "") {
  UniqueFd fd(::memfd_create("stream", MFD_CLOEXEC));
  EXPECT_TRUE(fd) << std::strerror(errno);
  EXPECT_EQ(static_cast<ssize_t>(content.size()),
            ::write(fd.get(), content.data(), content.size()));
  ::lseek(fd.get(), 0, SEEK_SET);
  return fd;
}

std::string contentOf(int fd) {
  std::string content(static_cast<std::size_t>(::lseek(fd, 0, SEEK_END)), '\0');
  EXPECT_EQ(static_cast<ssize_t>(content.size()), ::pread(fd, content.data(), content.size(), 0));
  return content;
}

void useOrClose(int from, int to) {
  if (from == -2) {
    ::close(to);
  } else {
    ::dup2(from, to);
  }
}

ToolResult resultOf(int status) {
  ToolResult result;
  result.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  result.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
  return result;
}

} // namespace

std::ostream &operator<<(std::ostream &os, const ToolResult &result) {
  return os << "exit " << result.exitCode << " signal " << result.signal << "\nout: " << result.out
            << "\nmessages: " << result.messages;
}

ToolResult runTool(const std::vector<std::string> &arguments, const ToolSetup &setup) {
  const Words argumentList(argumentWords(arguments));
  const Words environment(environmentWords(setup));
  const UniqueFd in = memoryFile(setup.input);
  const UniqueFd out = memoryFile();
  const UniqueFd messages = memoryFile();
  const pid_t pid = ::fork();
  if (pid == 0) {
    const int given = setup.inFd == -1 ? in.get() : setup.inFd;
    useOrClose(setup.closeIn ? -2 : given, 0);
    useOrClose(setup.outFd == -1 ? out.get() : setup.outFd, 1);
    useOrClose(messages.get(), 2);
    become(setup, argumentList, environment);
  }
  int status = 0;
  EXPECT_EQ(pid, ::waitpid(pid, &status, 0));
  ToolResult result = resultOf(status);
  result.out = contentOf(out.get());
  result.messages = contentOf(messages.get());
  return result;
}

Json::Value document(const ToolResult &result) {
  Json::CharReaderBuilder builder;
  Json::CharReaderBuilder::strictMode(&builder.settings_);
  const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
  Json::Value value;
  std::string errors;
  const char *text = result.out.data();
  EXPECT_TRUE(reader->parse(text, text + result.out.size(), &value, &errors)) << errors << result;
  EXPECT_EQ(1, value["schemaVersion"].asInt()) << result;
  return value;
}

TerminalTool::TerminalTool(const std::vector<std::string> &arguments, const ToolSetup &setup) {
  const Words argumentList(argumentWords(arguments));
  const Words environment(environmentWords(setup));
  struct winsize size = {};
  size.ws_row = 50;
  size.ws_col = setup.columns;
  pid_ = ::forkpty(&master_, nullptr, nullptr, &size);
  if (pid_ == 0) {
    become(setup, argumentList, environment);
  }
  ::fcntl(master_, F_SETFD, FD_CLOEXEC);
}

TerminalTool::~TerminalTool() {
  ::close(master_);
  if (pid_ > 0) {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
}

bool TerminalTool::readMore() {
  struct pollfd watched = {master_, POLLIN, 0};
  if (::poll(&watched, 1, kPatienceMs) != 1) {
    return false;
  }
  char buffer[4096];
  const ssize_t got = ::read(master_, buffer, sizeof buffer);
  if (got <= 0) { // EIO once no process has the terminal open
    return false;
  }
  shown_.append(buffer, static_cast<std::size_t>(got));
  return true;
}

void TerminalTool::expect(const std::string &text) {
  // What is drawn again and again must not keep the test waiting.
  const auto end = std::chrono::steady_clock::now() + std::chrono::milliseconds(kPatienceMs);
  std::size_t found = shown_.find(text, seen_);
  while (found == std::string::npos && std::chrono::steady_clock::now() < end && readMore()) {
    found = shown_.find(text, seen_);
  }
  ASSERT_NE(std::string::npos, found) << "never shown: " << text << "\nshown: " << shown_;
  seen_ = found + text.size();
}

void TerminalTool::send(const std::string &text) const {
  ASSERT_EQ(static_cast<ssize_t>(text.size()), ::write(master_, text.data(), text.size()));
}

ToolResult TerminalTool::wait() {
  while (readMore()) {
  }
  int status = 0;
  EXPECT_EQ(pid_, ::waitpid(pid_, &status, 0));
  pid_ = -1;
  ToolResult result = resultOf(status);
  result.out = shown_;
  return result;
}

} // namespace KovaTest
