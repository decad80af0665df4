// When the name of a volume session's link is taken, another name is reserved under a lock.

#include "tests/session/session_fixture.h"
#include "tests/support/alloc_failure.h"
#include "tests/support/census.h"
#include "tests/support/counting_loop.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <fcntl.h>
#include <filesystem>
#include <sys/file.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace KOVA::Backup;
using namespace KovaTest;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::MatchesRegex;

namespace {

constexpr const char *kModule = "session";
const std::string kRoot = "/tmp/kovabackup/session";
const std::string kLock = "__sess__.lock";

// Observes the lock: called before each flock, with its operation.
void (*watchFlock)(int fd, int operation) = nullptr;

// The fixture of tests in which the name of the first link is always taken.
class SessionLink : public Sessions {
protected:
  SessionLink() : platform(volume.path) {
    std::filesystem::create_directories(kRoot);
    std::filesystem::create_symlink("stale", kRoot + "/seln.AAAAAA");
  }
  ~SessionLink() override { watchFlock = nullptr; }

  // The names in the session root, except the stale link and the lock file.
  static std::set<std::string> newNames() {
    std::set<std::string> names = namesIn(kRoot);
    names.erase("seln.AAAAAA");
    names.erase(kLock);
    return names;
  }

  const std::string path = volume.path + "/seln.AAAAAA";
  FakeVolumes platform;
  ChosenName chosen{"AAAAAA"};
};

} // namespace

extern "C" int flock(int fd, int operation) noexcept {
  static auto *const real = realFunction<int(int, int)>("flock");
  if (watchFlock != nullptr) {
    watchFlock(fd, operation);
  }
  return failsNow("flock") ? -1 : real(fd, operation);
}

TEST_F(SessionLink, ThatIsTakenGetsAnotherName) {
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  EXPECT_THAT(session.getId(), MatchesRegex("seln\\.[A-Za-z0-9]{6}"));
  EXPECT_NE("seln.AAAAAA", session.getId());
  EXPECT_EQ(path, session.getPath());
  EXPECT_THAT(newNames(), ElementsAre(session.getId()));
  EXPECT_EQ(path, Session::getPathById(session.getId()));
  EXPECT_EQ("stale", Session::getPathById("seln.AAAAAA")) << "what stood there stays";

  Session other;
  ASSERT_TRUE(other.load(session.getId()));
  EXPECT_TRUE(other.destroy());
  EXPECT_THAT(newNames(), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionLink, ThatIsTakenMakesAnEmptyLockFileThatOnlyItsOwnerReads) {
  for (const mode_t mask : {0U, 0377U}) {
    const ScopedUmask umask(mask);
    Session session;
    ASSERT_TRUE(session.create(anyVolume()));
    EXPECT_EQ(0400, modeOf(kRoot + "/" + kLock)) << mask;
    EXPECT_EQ("", readFile(kRoot + "/" + kLock));
    EXPECT_TRUE(session.destroy());
    EXPECT_TRUE(isThere(kRoot + "/" + kLock)) << "it is never removed";
    std::filesystem::remove(kRoot + "/" + kLock);
  }
}

TEST_F(SessionLink, UsesALockFileThatIsThere) {
  writeFile(kRoot + "/" + kLock, "text");
  Session session;
  ASSERT_TRUE(session.create(anyVolume()));
  EXPECT_EQ("text", readFile(kRoot + "/" + kLock));
}

TEST_F(SessionLink, KeepsItsPlaceholderUntilTheLockIsHeldAndTheLockUntilTheLinkStands) {
  static std::vector<std::string> seen;
  static int before;
  seen.clear();
  before = countOpenDescriptors();
  watchFlock = [](int fd, int operation) {
    const std::set<std::string> names = newNames();
    ASSERT_EQ(1U, names.size());
    const std::string place = kRoot + "/" + *names.begin();
    seen.push_back(operation == LOCK_EX   ? "lock"
                   : operation == LOCK_UN ? "unlock"
                                          : "another operation");
    seen.emplace_back(std::filesystem::is_symlink(place) ? "link" : "file");
    EXPECT_EQ(before + 1, countOpenDescriptors()) << "the placeholder's is closed already";
    EXPECT_EQ(FD_CLOEXEC, ::fcntl(fd, F_GETFD));
    EXPECT_EQ(O_RDONLY, ::fcntl(fd, F_GETFL) & O_ACCMODE) << "its mode allows no more";
    EXPECT_EQ(kRoot + "/" + kLock,
              std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(fd)).string());
  };
  Session session;
  EXPECT_TRUE(session.create(anyVolume()));
  EXPECT_THAT(seen, ElementsAre("lock", "file", "unlock", "link"));
  EXPECT_EQ(before, countOpenDescriptors());
}

TEST_F(SessionLink, WaitsThroughSignals) {
  const Fault fault("flock", 1, EINTR);
  Session session;
  EXPECT_TRUE(session.create(anyVolume()));
  EXPECT_EQ(3, fault.calls());
}

TEST_F(SessionLink, WaitsForTheLockOfAnotherProcess) {
  static int waiting[2];
  ASSERT_EQ(0, ::pipe(waiting));
  const int lock = ::open((kRoot + "/" + kLock).c_str(), O_RDONLY | O_CREAT, 0400);
  ASSERT_EQ(0, ::flock(lock, LOCK_EX));
  const pid_t child = ::fork();
  if (child == 0) {
    watchFlock = [](int, int operation) {
      if (operation == LOCK_EX) {
        (void)!::write(waiting[1], "w", 1);
      } else if (!isThere(kRoot + "/released")) {
        ::_exit(2); // continued while the lock was held
      }
    };
    Session session;
    ::_exit(session.create(anyVolume()) ? 0 : 1);
  }
  char byte = 0;
  EXPECT_EQ(1, ::read(waiting[0], &byte, 1));
  writeFile(kRoot + "/released", "");
  EXPECT_EQ(0, ::flock(lock, LOCK_UN));
  int status = -1;
  EXPECT_EQ(child, ::waitpid(child, &status, 0));
  EXPECT_EQ(0, status);
  for (const int fd : {lock, waiting[0], waiting[1]}) {
    ::close(fd);
  }
}

// --- failing calls ---

TEST_F(SessionLink, LogsAPlaceholderThatCannotBeMade) {
  const Fault fault("mkstemp", 1, ENOSPC);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  EXPECT_THAT(
      log.take(),
      ElementsAre(bareLine(7, "temp_manager/temp_manager", 207,
                           "mkstemp failed, No space left on device [" + kRoot + "/seln.XXXXXX]"),
                  errLine(kModule, 41, "ScopedTempFile failed[" + kRoot + "/seln]"),
                  errLine(kModule, 113, "failed to create_sesslink[" + path + "]")));
  EXPECT_THAT(newNames(), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionLink, LogsALockFileThatCannotBeOpened) {
  const Fault fault("open", 1, EACCES);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  EXPECT_EQ("", session.getId());
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 49, "failed to open file[" + kRoot + "/" + kLock + "]"),
                          errLine(kModule, 113, "failed to create_sesslink[" + path + "]")));
  EXPECT_THAT(newNames(), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionLink, LogsAFolderInTheLockFilesPlace) {
  std::filesystem::create_directory(kRoot + "/" + kLock);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 49, "failed to open file[" + kRoot + "/" + kLock + "]"),
                          errLine(kModule, 113, "failed to create_sesslink[" + path + "]")));
  EXPECT_THAT(newNames(), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionLink, LogsALockThatCannotBeTaken) {
  const Fault fault("flock", 1, ENOLCK);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine(kModule, 53, "failed to flock[" + kRoot + "/" + kLock + "]"),
                          errLine(kModule, 113, "failed to create_sesslink[" + path + "]")));
  EXPECT_THAT(newNames(), IsEmpty());
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionLink, LogsASecondLinkThatCannotBeMade) {
  const Fault fault("symlink", 2, EDQUOT);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  const std::vector<LogLine> lines = log.take();
  ASSERT_EQ(2U, lines.size());
  EXPECT_THAT(lines[0].text, MatchesRegex(".*session:60 failed to create symlink\\[" + path +
                                          "\\]\\[" + kRoot + "/seln\\.[A-Za-z0-9]{6}\\]"));
  EXPECT_EQ(errLine(kModule, 113, "failed to create_sesslink[" + path + "]"), lines[1]);
  EXPECT_THAT(newNames(), IsEmpty()) << "the placeholder is gone already";
  EXPECT_THAT(namesIn(volume.path), IsEmpty());
}

TEST_F(SessionLink, LeavesItsLinkWhenTheLockCannotBeReleased) {
  const Fault fault("flock", 2, EIO);
  LogCapture log;
  Session session;
  EXPECT_FALSE(session.create(anyVolume()));
  EXPECT_EQ("", session.getId());
  EXPECT_THAT(
      log.take(),
      ElementsAre(errLine(kModule, 64, "failed to unlock flock[" + kRoot + "/" + kLock + "]"),
                  errLine(kModule, 113, "failed to create_sesslink[" + path + "]")));
  const std::set<std::string> names = newNames();
  ASSERT_EQ(1U, names.size());
  EXPECT_EQ(path, std::filesystem::read_symlink(kRoot + "/" + *names.begin()).string());
  EXPECT_THAT(namesIn(volume.path), IsEmpty()) << "the directory goes";
}

TEST_F(SessionLink, LeavesNothingElseWhenACallFails) {
  const int before = countOpenDescriptors();
  for (const char *function :
       {"symlink", "mkstemp", "open", "flock", "chmod", "strdup", "mkdir", "mkdtemp", "access"}) {
    forEachFailure(function, EIO, [&](Fault &fault) {
      LogCapture log;
      Session session;
      const bool created = createOrThrow(session, anyVolume());
      EXPECT_EQ(created, !session.getId().empty());
      EXPECT_TRUE(session.destroy());
      const std::string name = function;
      const bool failed = !created && fault.fired();
      EXPECT_TRUE(created != failed);
      if (name == "flock" && failed && fault.calls() == 2) {
        EXPECT_EQ(1U, newNames().size()) << "the link without its unlock";
      } else if (name == "chmod" && failed && fault.calls() == 4) {
        EXPECT_EQ(1U, newNames().size()) << "the placeholder without its mode";
      } else {
        EXPECT_THAT(newNames(), IsEmpty());
      }
      const bool modeOfTheDirectory = name == "chmod" && failed && fault.calls() == 3;
      EXPECT_EQ(modeOfTheDirectory ? 1U : 0U, namesIn(volume.path).size());
      for (const std::string &left : newNames()) {
        std::filesystem::remove(kRoot + "/" + left);
      }
      std::filesystem::remove(path);
      EXPECT_EQ(before, countOpenDescriptors());
    });
  }
}

// The folder of a session that was not created is removed while memory stays short.
TEST_F(SessionLink, LeavesNothingWhileMemoryStaysShort) {
  LogCapture log;
  Session session; // so the object itself exists
  const auto filter = boost::make_shared<FixedFilter>(volume.path);
  forEachMalloc([&] { (void)session.create(filter); },
                [&](bool threw) {
                  EXPECT_TRUE(!threw || session.getId().empty());
                  EXPECT_TRUE(session.destroy());
                  EXPECT_THAT(newNames(), IsEmpty());
                  EXPECT_THAT(namesIn(volume.path), IsEmpty());
                  log.take(); // some failures are logged
                },
                Failing::OnceAndLasting);
}

TEST_F(SessionLink, LeavesNothingWhenMemoryRunsOut) {
  const int before = countOpenDescriptors();
  Session session; // so the object itself exists
  forEachAllocation([&] { EXPECT_TRUE(session.create(anyVolume())); },
                    [&](bool threw) {
                      EXPECT_EQ(threw, session.getId().empty());
                      EXPECT_TRUE(session.destroy());
                      EXPECT_THAT(newNames(), IsEmpty());
                      EXPECT_THAT(namesIn(volume.path), IsEmpty());
                      EXPECT_EQ(before, countOpenDescriptors());
                    });
}
