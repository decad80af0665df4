#include "tests/hostile/surroundings.h"

#include "tests/support/log_capture.h"
#include "tests/support/machine_mounts.h"
#include "tests/support/private_tmp.h"

#include "base/unique_fd.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <fcntl.h>
#include <filesystem>
#include <grp.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <sysexits.h>
#include <unistd.h>

namespace KovaTest::Hostile {
namespace {

namespace fs = std::filesystem;
using KOVA::Base::UniqueFd;

constexpr int kLackingCode = EX_UNAVAILABLE;
constexpr int kDescriptors = 200; // more than any test opens

// A folder that can be hidden, because neither the sources nor the programs are in it.
std::string unusedFolder() {
  for (const std::string folder : {"/mnt", "/opt", "/srv", "/media"}) {
    const bool isUsed = std::string(KOVA_TEST_SOURCE_DIR).rfind(folder + "/", 0) == 0 ||
                        std::string(KOVA_TEST_BINARY_DIR).rfind(folder + "/", 0) == 0;
    if (!isUsed && fs::is_directory(folder)) {
      return folder;
    }
  }
  return "";
}

// Everything in a folder, but not what is mounted there.
void addPaths(const std::string &folder, dev_t device, std::set<std::string> &paths) {
  std::error_code ignored;
  for (const fs::directory_entry &entry : fs::directory_iterator(folder, ignored)) {
    struct stat info = {};
    const std::string path = entry.path().string();
    if (::lstat(path.c_str(), &info) != 0 || info.st_dev != device) {
      continue;
    }
    paths.insert(path);
    if (S_ISDIR(info.st_mode)) {
      addPaths(path, device, paths);
    }
  }
}

std::set<std::string> pathsOf(const std::vector<std::string> &folders) {
  std::set<std::string> paths;
  for (const std::string &folder : folders) {
    struct stat info = {};
    if (::stat(folder.c_str(), &info) == 0) {
      addPaths(folder, info.st_dev, paths);
    }
  }
  return paths;
}

// What a child writes, to be read when it has ended. A pipe, because no limit of file sizes applies
// to it.
class Capture {
public:
  Capture() {
    int ends[2] = {-1, -1};
    EXPECT_EQ(0, ::pipe2(ends, O_CLOEXEC | O_NONBLOCK)) << std::strerror(errno);
    from_.reset(ends[0]);
    to_.reset(ends[1]);
    ::fcntl(to_.get(), F_SETFL, 0);
    ::fcntl(to_.get(), F_SETPIPE_SZ, kBytes);
  }
  int fd() const { return to_.get(); }
  std::string text() const {
    std::string all(kBytes, '\0');
    std::size_t size = 0;
    for (ssize_t got = 1; got > 0; size += got > 0 ? static_cast<std::size_t>(got) : 0) {
      got = ::read(from_.get(), &all[size], all.size() - size);
    }
    all.resize(size);
    return all;
  }

private:
  static constexpr int kBytes = 1 << 20;

  UniqueFd from_;
  UniqueFd to_;
};

UniqueFd inputOf(const std::string &content) {
  UniqueFd fd(::memfd_create("input", MFD_CLOEXEC));
  EXPECT_EQ(static_cast<ssize_t>(content.size()),
            ::write(fd.get(), content.data(), content.size()));
  ::lseek(fd.get(), 0, SEEK_SET);
  return fd;
}

std::vector<std::string> linesOf(const std::string &text) {
  std::vector<std::string> lines;
  for (std::size_t start = 0; start < text.size();) {
    const std::size_t end = text.find('\n', start);
    lines.push_back(text.substr(start, end - start));
    start = end == std::string::npos ? text.size() : end + 1;
  }
  return lines;
}

// The pointers that execve requires.
std::vector<char *> pointersTo(const std::vector<std::string> &words) {
  std::vector<char *> pointers;
  for (const std::string &word : words) {
    pointers.push_back(const_cast<char *>(word.c_str())); // execve changes nothing
  }
  pointers.push_back(nullptr);
  return pointers;
}

// The streams of one child, and where the reason for Lacking and the log lines arrive.
struct Streams {
  explicit Streams(const std::string &input) : in(inputOf(input)) {}

  const UniqueFd in;
  const Capture out;
  const Capture messages;
  const Capture notes;
};

void writeNote(const Streams &streams, const std::string &note) {
  (void)!::write(streams.notes.fd(), note.data(), note.size());
}

// A child that never ends must not outlive the test.
void endWithTheTest() {
  constexpr rlim_t kSeconds = 20;
  const struct rlimit limits = {kSeconds, kSeconds};
  ::setrlimit(RLIMIT_CPU, &limits);
  ::prctl(PR_SET_PDEATHSIG, SIGKILL);
}

// Runs in the child. Returns: the exit code.
int playHost(const Streams &streams, const Step &surroundings, const std::function<int()> &guest) {
  endWithTheTest();
  ::dup2(streams.in.get(), STDIN_FILENO);
  ::dup2(streams.out.fd(), STDOUT_FILENO);
  ::dup2(streams.messages.fd(), STDERR_FILENO);
  try {
    if (surroundings) {
      surroundings();
    }
  } catch (const Lacking &why) {
    writeNote(streams, why.what());
    return kLackingCode;
  }
  return guest();
}

Outcome awaitChild(pid_t child, const Streams &streams) {
  int status = 0;
  EXPECT_EQ(child, ::waitpid(child, &status, 0));
  Outcome outcome;
  outcome.exitCode = WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  outcome.signal = WIFSIGNALED(status) ? WTERMSIG(status) : 0;
  outcome.out = streams.out.text();
  outcome.messages = streams.messages.text();
  const std::string notes = streams.notes.text();
  if (outcome.exitCode == kLackingCode) {
    outcome.lacking = notes;
  } else {
    outcome.log = linesOf(notes);
  }
  return outcome;
}

// The highest descriptor of a test is far below. /proc may be missing.
std::set<int> openDescriptors() {
  std::set<int> open;
  for (int fd = 0; fd < kDescriptors; ++fd) {
    if (::fcntl(fd, F_GETFD) != -1) {
      open.insert(fd);
    }
  }
  return open;
}

std::string withoutPid(const std::string &line) {
  const std::string pid = "(" + std::to_string(::getpid()) + ") ";
  return line.rfind(pid, 0) == 0 ? line.substr(pid.size()) : line;
}

// Runs in the child.
int callOperation(const Streams &streams, const std::function<bool()> &operation) {
  const std::set<int> before = openDescriptors();
  LogCapture log;
  bool done = false;
  try {
    done = operation();
  } catch (const std::exception &why) {
    writeNote(streams, std::string("threw ") + why.what() + "\n");
  }
  std::fflush(stdout);
  for (const LogLine &line : log.take()) {
    writeNote(streams, withoutPid(line.text) + "\n");
  }
  if (openDescriptors() != before) {
    writeNote(streams, "left a descriptor open\n");
  }
  if (::waitpid(-1, nullptr, WNOHANG) != -1) {
    writeNote(streams, "left a child\n");
  }
  return done ? 0 : 1;
}

} // namespace

void need(bool done, const std::string &what) {
  if (!done) {
    throw Lacking(what + ": " + std::strerror(errno));
  }
}

std::ostream &operator<<(std::ostream &os, const Outcome &outcome) {
  os << "exit " << outcome.exitCode << " signal " << outcome.signal << "\nout: " << outcome.out
     << "\nmessages: " << outcome.messages << "\nlog:\n";
  for (const std::string &line : outcome.log) {
    os << "  " << line << "\n";
  }
  return os;
}

std::string Program::command() {
  return KOVA_TOOL_PATH;
}

std::vector<std::string> Program::usual() {
  return {"PATH=/usr/bin:/bin", "KOVA_PLATFORM_CONF=" + configuration()};
}

Outcome runProgram(const Program &program, const Step &surroundings) {
  const Streams streams(program.input);
  const std::vector<char *> words = pointersTo(program.words);
  const std::vector<char *> environment = pointersTo(program.environment);
  const pid_t child = ::fork();
  if (child == 0) {
    ::_exit(playHost(streams, surroundings, [&] {
      // Those that a runner of tests leaves open would count against a limit.
      (void)::close_range(STDERR_FILENO + 1, ~0U, CLOSE_RANGE_CLOEXEC);
      ::execve(program.path.c_str(), words.data(), environment.data());
      writeNote(streams, program.path + " cannot be run: " + std::strerror(errno));
      return kLackingCode;
    }));
  }
  return awaitChild(child, streams);
}

Outcome runCommand(std::vector<std::string> arguments, const Step &surroundings) {
  arguments.insert(arguments.begin(), "kovabackup");
  return runProgram({arguments}, surroundings);
}

Outcome runLibrary(const std::function<bool()> &operation, const Step &surroundings) {
  const Streams streams("");
  const pid_t child = ::fork();
  if (child == 0) {
    ::_exit(playHost(streams, surroundings, [&] { return callOperation(streams, operation); }));
  }
  return awaitChild(child, streams);
}

const std::string &stage() {
  static const std::string folder = unusedFolder();
  return folder;
}

std::string volume() {
  return stage() + "/volume";
}

std::string configuration() {
  return stage() + "/platform.conf";
}

std::string keyFile() {
  return stage() + "/keys/secret.key";
}

void HostileTest::SetUp() {
  const std::string mounts = machineMounts();
  machine_ = ::open("/proc/self/ns/mnt", O_RDONLY | O_CLOEXEC);
  ASSERT_NE(-1, machine_);
  ASSERT_EQ("", enterPrivateTmp());
  if (stage().empty() || ::mount("tmpfs", stage().c_str(), "tmpfs", 0, "mode=0755") != 0) {
    GTEST_SKIP() << "skipped: there is no folder on which a stage could be mounted";
  }
  fs::create_directory(volume());
  ::mkdir((stage() + "/keys").c_str(), 0700);
  writeFile(configuration(), "[mounts]\nexclude=" + mounts + "\n[volume v]\npath=\"" + volume() +
                                 "\"\nfsType=2\n[secret]\nkeyFile=\"" + keyFile() + "\"\n");
  ::chmod(configuration().c_str(), 0644); // regardless of the umask
  ::setenv("KOVA_PLATFORM_CONF", configuration().c_str(), 1);
  before_ = pathsOf({"/tmp", stage()});
}

void HostileTest::TearDown() {
  ::unsetenv("KOVA_PLATFORM_CONF");
  if (machine_ == -1) {
    return;
  }
  const fs::path folder = fs::current_path();
  EXPECT_EQ(0, ::setns(machine_, CLONE_NEWNS)) << std::strerror(errno);
  fs::current_path(folder); // setns has changed it to /
  ::close(machine_);
}

std::set<std::string> HostileTest::left() const {
  std::set<std::string> paths = pathsOf({"/tmp", stage()});
  for (const std::string &path : before_) {
    paths.erase(path);
  }
  return paths;
}

void limit(int resource, unsigned long most) {
  const struct rlimit limits = {most, most};
  need(::setrlimit(static_cast<__rlimit_resource>(resource), &limits) == 0, "setrlimit");
}

void becomeNobody() {
  need(::setgroups(0, nullptr) == 0 && ::setgid(kNobody) == 0 && ::setuid(kNobody) == 0,
       "no other user is known here");
}

void mountOn(const std::string &target, const std::string &options) {
  need(::mount("tmpfs", target.c_str(), "tmpfs", 0, options.c_str()) == 0,
       "a tmpfs cannot be mounted on " + target);
}

void bindOn(const std::string &source, const std::string &target) {
  need(::mount(source.c_str(), target.c_str(), nullptr, MS_BIND, nullptr) == 0,
       source + " cannot be bound on " + target);
}

void makeReadOnly(const std::string &target) {
  need(::mount(nullptr, target.c_str(), nullptr, MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr) == 0,
       target + " cannot be made read-only");
}

} // namespace KovaTest::Hostile
