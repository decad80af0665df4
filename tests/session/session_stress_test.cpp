// Many processes create, find, load and destroy sessions at the same time. They form a ring: each
// creates sessions and passes their IDs on to the next one, which checks and removes them.

#include "tests/session/session_fixture.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <fstream>
#include <sys/wait.h>
#include <unistd.h>
#include <vector>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

constexpr int kProcesses = 8;
constexpr int kRounds = 250; // 2,000 sessions
constexpr std::size_t kIdBytes = 11;

struct Pipe {
  Pipe() {
    int ends[2] = {-1, -1};
    if (::pipe2(ends, O_CLOEXEC) == 0) {
      read = ends[0];
      write = ends[1];
    }
  }
  int read = -1;
  int write = -1;
};

enum class Kind { Local, Volume, VolumeWithTakenName };

class Worker {
public:
  Worker(int own, int former, const boost::shared_ptr<FilterVolume> &filter, std::string complaints)
      : own_(own), former_(former), filter_(filter), complaints_(std::move(complaints)) {}

  // Returns the exit status of the process.
  int run() {
    for (int round = 0; round < kRounds; ++round) {
      if (!make(static_cast<Kind>(round % 3)) || !take(round % 2 == 0)) {
        return 1;
      }
    }
    return 0;
  }

private:
  bool make(Kind kind) {
    Session session;
    if (!create(session, kind)) {
      return complain("not created: " + std::to_string(static_cast<int>(kind)));
    }
    const std::string id = session.getId();
    if (id.size() != kIdBytes || id.substr(0, 5) != (kind == Kind::Local ? "sess." : "seln.")) {
      return complain("id " + id);
    }
    std::filesystem::create_directory(session.getPath() + "/folder");
    writeFile(session.getPath() + "/folder/owner", id);
    return ::write(own_, id.data(), id.size()) == static_cast<ssize_t>(id.size()) ||
           complain("not passed on");
  }

  bool create(Session &session, Kind kind) {
    if (kind == Kind::Local) {
      return session.create();
    }
    const Fault taken("symlink", kind == Kind::VolumeWithTakenName ? 1 : 0, EEXIST);
    return session.create(filter_);
  }

  bool take(bool loading) {
    std::string id(kIdBytes, '\0');
    if (::read(former_, id.data(), id.size()) != static_cast<ssize_t>(id.size())) {
      return complain("nothing came");
    }
    const std::string path = Session::getPathById(id);
    if (readFile(path + "/folder/owner") != id) {
      return complain(id + " leads to another session: " + path);
    }
    Session session;
    const bool removed = loading
                             ? session.load(id) && session.getPath() == path && session.destroy()
                             : Session::destroyById(id);
    return (removed && !isThere(path)) || complain(id + " is not removed");
  }

  bool complain(const std::string &text) const {
    std::ofstream(complaints_, std::ios::app) << text << "\n";
    return false;
  }

  const int own_;
  const int former_;
  const boost::shared_ptr<FilterVolume> filter_;
  const std::string complaints_;
};

} // namespace

TEST_F(Sessions, OfManyProcessesAtOnceAreNeitherLostNorLeft) {
  const TestFolder scratch;
  FakeVolumes platform(volume.path);
  const std::string complaints = scratch / "complaints";
  const auto filter = anyVolume();
  std::vector<pid_t> children;
  {
    LogCapture log(complaints); // a log line counts as a complaint, too
    std::vector<Pipe> ring(kProcesses);
    for (int i = 0; i < kProcesses; ++i) {
      const pid_t child = ::fork();
      if (child == 0) {
        const int own = ring[static_cast<std::size_t>(i)].write;
        const int former = ring[static_cast<std::size_t>((i + kProcesses - 1) % kProcesses)].read;
        for (const Pipe &pipe : ring) { // so that the end of a neighbour is noticed
          (void)(pipe.read == former ? 0 : ::close(pipe.read));
          (void)(pipe.write == own ? 0 : ::close(pipe.write));
        }
        ::_exit(Worker(own, former, filter, complaints).run());
      }
      children.push_back(child);
    }
    for (const Pipe &pipe : ring) {
      ::close(pipe.read);
      ::close(pipe.write);
    }
    for (const pid_t child : children) {
      int status = -1;
      EXPECT_EQ(child, ::waitpid(child, &status, 0));
      EXPECT_EQ(0, status);
    }
  }
  EXPECT_EQ("", readFile(complaints));
  EXPECT_THAT(namesIn("/tmp/kovabackup/session"), ElementsAre("__sess__.lock"));
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}
