// Passes a session on a volume from process to process. Each process receives only its id.
//
//     session_relay [TREE]        creates a session and starts the three processes below
//     session_relay fill ID TREE  copies TREE (by default /usr/share/doc) into the session
//     session_relay check ID TREE compares every regular file of the copy, size and content
//     session_relay destroy ID    removes the session
//
// Exit status: 0 if every check passed and nothing is left behind, 1 if not, 2 if no volume
// qualifies or the arguments are invalid.

#include "examples/session_relay_tree.h"
#include "kovabackup/path_util.h"
#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"
#include "kovaplatform/kovasdk.h"

#include <array>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <memory>
#include <spawn.h>
#include <stdexcept>
#include <string>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace fs = std::filesystem;
namespace Path = KOVA::Backup::Path;
using KOVA::Backup::Session;
using KOVA::Backup::TempManager;
using KOVA::Backup::VolumePathManager;

namespace {

constexpr const char *kDefaultTree = "/usr/share/doc";
constexpr const char *kCopyName = "tree";

enum ExitStatus { kSuccess = 0, kFailed = 1, kNotPossible = 2 };

// --- output ---

// Each line names the process that writes it.
void say(const std::string &text) {
  std::printf("  process %-7d %s\n", static_cast<int>(::getpid()), text.c_str());
  std::fflush(stdout);
}

void headline(const char *text) {
  std::printf("\n%s\n", text);
  std::fflush(stdout);
}

class Stopwatch {
public:
  std::string elapsed() const {
    const std::chrono::duration<double, std::milli> passed = Clock::now() - start_;
    std::array<char, 64> text{};
    std::snprintf(text.data(), text.size(), "%.1f ms", passed.count());
    return text.data();
  }

private:
  using Clock = std::chrono::steady_clock;
  Clock::time_point start_ = Clock::now();
};

// --- the volumes ---

using VolumeList = std::unique_ptr<KOVAVOLInfo, decltype(&KOVAMountVolInfoFree)>;

const char *typeName(std::int32_t fsType) {
  switch (fsType) {
  case 1:
    return "ext2/3";
  case 2:
    return "ext4";
  case 3:
    return "btrfs";
  default:
    return "other";
  }
}

void showVolume(const KOVAVOLInfo &volume) {
  const std::string state = std::string(volume.status != 0 ? "mounted" : "not mounted") + ", " +
                            (volume.accessStatus != 0 ? "writable" : "not writable");
  std::printf("  %-35s %-7s %12s  %s\n", volume.mountPath, typeName(volume.fsType),
              readableSize(volume.size).c_str(), state.c_str());
}

void showVolumes() {
  headline("Volumes that the platform reports");
  const VolumeList volumes(KOVAMountVolAllEnum(0, KOVAVolumeSupportLocGet(), 1),
                           &KOVAMountVolInfoFree);
  if (!volumes) {
    std::printf("  none\n");
  }
  for (const KOVAVOLInfo *volume = volumes.get(); volume != nullptr; volume = volume->next) {
    showVolume(*volume);
  }
  std::fflush(stdout);
}

void explainMissingVolume() {
  std::fputs(
      "\nNo mounted, writable volume with an ext or btrfs file system was found. Mount one, or\n"
      "name a directory outside /tmp as a volume in /etc/kovaplatform/platform.conf (or in\n"
      "the file that KOVA_PLATFORM_CONF names):\n\n"
      "  [volume demo]\n"
      "  path=\"/srv/demo\"\n"
      "  fsType=2\n\n"
      "The system log holds further errors.\n",
      stderr);
}

// --- the processes ---

std::string pathOf(const std::string &id) {
  std::string path = Session::getPathById(id);
  if (path.empty()) {
    throw std::runtime_error("no session " + id);
  }
  return path;
}

int fill(const std::string &id, const std::string &tree) {
  const Stopwatch watch;
  Session session;
  if (!session.load(id)) {
    throw std::runtime_error("cannot load session " + id);
  }
  const Tally tally = copyTree(tree, Path::join(session.getPath(), kCopyName));
  say("filled    " + id + " from " + tree + ": " + tally.text() + ", " + watch.elapsed());
  return kSuccess;
}

int check(const std::string &id, const std::string &tree) {
  const Stopwatch watch;
  const std::string path = pathOf(id);
  say("resolved  " + id + " to " + path);
  const Tally tally = compareTrees(tree, Path::join(path, kCopyName));
  say("checked   " + id + ": " + tally.text() + ", all equal, " + watch.elapsed());
  return kSuccess;
}

int destroy(const std::string &id) {
  const Stopwatch watch;
  Session session;
  if (!session.load(id) || !session.destroy()) {
    throw std::runtime_error("cannot load and destroy session " + id);
  }
  say("destroyed " + id + ", " + watch.elapsed());
  return kSuccess;
}

// Runs this program with other arguments and waits until it ends. The new process knows nothing
// about the session but its id.
void runProcess(std::vector<std::string> args) {
  args.insert(args.begin(), "session_relay");
  std::vector<char *> argv;
  argv.reserve(args.size() + 1);
  for (std::string &arg : args) {
    argv.push_back(arg.data());
  }
  argv.push_back(nullptr);
  pid_t pid = -1;
  const int error = ::posix_spawn(&pid, "/proc/self/exe", nullptr, nullptr, argv.data(), environ);
  if (error != 0) {
    throw std::runtime_error("cannot start '" + args[1] + "': " + std::strerror(error));
  }
  int status = -1;
  if (::waitpid(pid, &status, 0) != pid || status != 0) {
    throw std::runtime_error("the process for '" + args[1] + "' failed");
  }
}

// Removes the session if a step fails before the last process has removed it.
class SessionRemover {
public:
  explicit SessionRemover(std::string id) : id_(std::move(id)) {}
  ~SessionRemover() {
    if (!id_.empty()) {
      (void)Session::destroyById(id_); // a failure is logged; the step that failed is reported
    }
  }
  SessionRemover(const SessionRemover &) = delete;
  SessionRemover &operator=(const SessionRemover &) = delete;
  void release() { id_.clear(); }

private:
  std::string id_;
};

void requireGone(const std::string &id, const std::string &path) {
  if (fs::exists(fs::symlink_status(path)) || !Session::getPathById(id).empty()) {
    throw std::runtime_error("something of session " + id + " is left behind");
  }
  say("found     nothing left of " + id);
}

void createSession(const boost::shared_ptr<KOVA::Backup::FilterVolume> &filter, Session &session) {
  const Stopwatch watch;
  if (!session.create(filter)) {
    throw std::runtime_error("cannot create a session; see the system log");
  }
  const std::string id = session.getId();
  say("created   " + id + ", " + watch.elapsed());
  say("          directory " + session.getPath());
  say("          link      " + Path::join(Path::getIpcTempPath(), Path::join("session", id)));
}

// Copying a tree into itself would never end.
void requireOutside(const std::string &path, const std::string &tree) {
  const std::string real = fs::canonical(path).string();
  const std::string realTree = fs::canonical(tree).string();
  if (real == realTree || !Path::relative(real, realTree).empty()) {
    throw std::runtime_error("the session's directory lies in " + tree + "; give another tree");
  }
}

// A local session would not demonstrate volumes and links.
void requireLinked(const std::string &id) {
  if (id.compare(0, 4, "seln") != 0) {
    throw std::runtime_error("the volume is under /tmp, where sessions are local; configure a "
                             "directory elsewhere");
  }
}

int relay(const std::string &tree) {
  const Stopwatch watch;
  showVolumes();
  headline("A session on the largest ext or btrfs volume");
  const auto filter = TempManager::maxExtBtrfsVolume();
  std::string dir;
  if (!VolumePathManager::getInstance().getVolumePath(filter, dir)) {
    explainMissingVolume();
    return kNotPossible;
  }
  Session session;
  createSession(filter, session);
  const std::string id = session.getId();
  const std::string path = session.getPath();
  SessionRemover remover(id);
  requireLinked(id);
  requireOutside(path, tree);
  runProcess({"fill", id, tree});
  runProcess({"check", id, tree});
  runProcess({"destroy", id});
  requireGone(id, path);
  remover.release();
  headline(("All checks passed, " + watch.elapsed() + ".").c_str());
  return kSuccess;
}

int usage() {
  std::fputs("usage: session_relay [TREE]\n"
             "       session_relay fill ID TREE\n"
             "       session_relay check ID TREE\n"
             "       session_relay destroy ID\n",
             stderr);
  return kNotPossible;
}

int run(const std::vector<std::string> &args) {
  const std::string command = args.empty() ? "" : args[0];
  if (args.size() == 3 && command == "fill") {
    return fill(args[1], args[2]);
  }
  if (args.size() == 3 && command == "check") {
    return check(args[1], args[2]);
  }
  if (args.size() == 2 && command == "destroy") {
    return destroy(args[1]);
  }
  const bool isCommand = command == "fill" || command == "check" || command == "destroy";
  if (args.size() > 1 || isCommand || command.compare(0, 1, "-") == 0) {
    return usage();
  }
  return relay(args.empty() ? kDefaultTree : Path::absPath(command));
}

} // namespace

int main(int argc, char **argv) {
  try {
    return run({argv + 1, argv + argc});
  } catch (const std::exception &error) {
    std::fprintf(stderr, "session_relay: %s\n", error.what());
    return kFailed;
  }
}
