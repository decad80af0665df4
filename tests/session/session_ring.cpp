#include "tests/session/session_ring.h"

#include "base/unique_fd.h"
#include "tests/support/files.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

namespace KovaTest {
namespace {

using KOVA::Backup::Session;
using KOVA::Base::UniqueFd;

constexpr std::size_t kIdBytes = 11;

// What a process passes on to the next one. When names are few, an ID and its path return at once
// with another session; the owner of a session is written once in a run.
struct Passed {
  char id[kIdBytes];
  int process;
  int round;

  std::string name() const { return {id, kIdBytes}; }
  std::string owner() const {
    return name() + " " + std::to_string(process) + " " + std::to_string(round);
  }
};

struct Pipe {
  Pipe() {
    int ends[2] = {-1, -1};
    EXPECT_EQ(0, ::pipe2(ends, O_CLOEXEC));
    out.reset(ends[0]);
    in.reset(ends[1]);
  }
  UniqueFd out;
  UniqueFd in;
};

class Worker {
public:
  // own, former: where its IDs go, and where those of the process before it come from.
  Worker(const SessionRing &ring, int number, int own, int former)
      : ring_(ring), number_(number), own_(own), former_(former) {}

  // Returns the exit status of the process.
  int run() {
    for (int round = 0; round < ring_.rounds; ++round) {
      if (!make(round) || !take(round % 2 == 0)) {
        return 1;
      }
    }
    return 0;
  }

private:
  bool make(int round) {
    Session session;
    if (!ring_.create(session, number_, round)) {
      return complain("not created: round " + std::to_string(round));
    }
    const std::string id = session.getId();
    const bool local = session.getPath() == "/tmp/kovabackup/session/" + id;
    if (id.size() != kIdBytes || id.substr(0, 5) != (local ? "sess." : "seln.")) {
      return complain("id " + id);
    }
    Passed made = {{}, number_, round};
    id.copy(made.id, kIdBytes);
    std::filesystem::create_directory(session.getPath() + "/folder");
    writeFile(session.getPath() + "/folder/owner", made.owner());
    return ::write(own_, &made, sizeof made) == static_cast<ssize_t>(sizeof made) ||
           complain("not passed on");
  }

  bool take(bool loading) {
    Passed passed = {};
    if (::read(former_, &passed, sizeof passed) != static_cast<ssize_t>(sizeof passed)) {
      return complain("nothing came");
    }
    const std::string id = passed.name();
    const std::string path = Session::getPathById(id);
    if (readFile(path + "/folder/owner") != passed.owner()) {
      return complain(id + " leads to another session: " + path);
    }
    Session session;
    const bool removed = loading
                             ? session.load(id) && session.getPath() == path && session.destroy()
                             : Session::destroyById(id);
    if (!removed) {
      return complain(id + " could not be removed");
    }
    return isGone(path, passed.owner()) || complain(id + " is still there");
  }

  // Another process may already have another session at the path.
  static bool isGone(const std::string &path, const std::string &owner) {
    std::ifstream file(path + "/folder/owner");
    std::string there;
    return !std::getline(file, there) || there != owner;
  }

  bool complain(const std::string &text) const {
    std::ofstream(ring_.complaints, std::ios::app) << text << "\n";
    return false;
  }

  const SessionRing &ring_;
  const int number_;
  const int own_;
  const int former_;
};

} // namespace

void runRing(const SessionRing &ring) {
  std::vector<Pipe> pipes(static_cast<std::size_t>(ring.processes));
  std::vector<pid_t> children;
  for (int i = 0; i < ring.processes; ++i) {
    const pid_t child = ::fork();
    if (child == 0) {
      UniqueFd own = std::move(pipes[static_cast<std::size_t>(i)].in);
      const int before = (i + ring.processes - 1) % ring.processes;
      UniqueFd former = std::move(pipes[static_cast<std::size_t>(before)].out);
      pipes.clear(); // so that the end of a neighbour is noticed
      ::_exit(Worker(ring, i, own.get(), former.get()).run());
    }
    children.push_back(child);
  }
  pipes.clear();
  for (const pid_t child : children) {
    int status = -1;
    EXPECT_EQ(child, ::waitpid(child, &status, 0));
    EXPECT_EQ(0, status);
  }
}

} // namespace KovaTest
