// Who counts as a user of a session, with live processes and the machine's own /proc.
#include "tests/service/session_store_support.h"

#include "base/unique_fd.h"
#include "tests/support/child_process.h"

#include <cerrno>
#include <csignal>
#include <fcntl.h>
#include <fstream>
#include <poll.h>
#include <sched.h>
#include <sys/mman.h>
#include <sys/mount.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>

namespace {

using namespace KovaTest;
using KOVA::Base::UniqueFd;
using testing::IsEmpty;
namespace fs = std::filesystem;

// A user of its own for each process: tests that run at the same time see each other's processes.
const uid_t kOther = 20000 + static_cast<uid_t>(::getpid()) % 40000;

// A child that does something and then waits to be killed.
class LiveChild {
public:
  enum class FirstThread { Waits, Ends };

  explicit LiveChild(const std::function<bool()> &begin, FirstThread first = FirstThread::Waits) {
    int ends[2] = {-1, -1};
    EXPECT_EQ(0, ::pipe2(ends, O_CLOEXEC));
    pid_ = ::fork();
    if (pid_ == 0) {
      const char done = begin() ? 'y' : 'n';
      if (first == FirstThread::Ends) {
        std::thread([main = ::pthread_self(), end = ends[1], done] {
          (void)::pthread_join(main, nullptr);
          report(end, done);
        }).detach();
        ::syscall(SYS_exit, 0); // of this thread alone
      }
      report(ends[1], done);
    }
    ::close(ends[1]);
    char done = 'n';
    ready_ = ::read(ends[0], &done, 1) == 1 && done == 'y';
    ::close(ends[0]);
  }
  ~LiveChild() {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
  LiveChild(const LiveChild &) = delete;
  LiveChild &operator=(const LiveChild &) = delete;

  bool ready() const { return ready_; }
  pid_t pid() const { return pid_; }

private:
  [[noreturn]] static void report(int end, char done) {
    if (::write(end, &done, 1) != 1) {
      ::_exit(1);
    }
    for (;;) {
      ::pause();
    }
  }

  pid_t pid_ = -1;
  bool ready_ = false;
};

// Does something in a thread with a working directory of its own, which then waits for ever.
bool doneByThread(const std::function<bool()> &work) {
  int ends[2] = {-1, -1};
  if (::pipe2(ends, O_CLOEXEC) != 0) {
    return false;
  }
  std::thread([&work, end = ends[1]] {
    const char answer = ::unshare(CLONE_FS) == 0 && work() ? 'y' : 'n';
    (void)!::write(end, &answer, 1);
    for (;;) {
      ::pause();
    }
  }).detach();
  char answer = 'n';
  return ::read(ends[0], &answer, 1) == 1 && answer == 'y';
}

// Shows a folder at another place as well, to this process alone.
bool mountAt(const std::string &folder, const std::string &point) {
  return ::unshare(CLONE_NEWNS) == 0 &&
         ::mount(folder.c_str(), point.c_str(), nullptr, MS_BIND, nullptr) == 0;
}

// An empty file system on /proc.
class NoProc {
public:
  NoProc() : mounted(::mount("tmpfs", "/proc", "tmpfs", 0, "") == 0) {}
  ~NoProc() {
    if (mounted) {
      ::umount2("/proc", MNT_DETACH);
    }
  }
  NoProc(const NoProc &) = delete;
  NoProc &operator=(const NoProc &) = delete;
  const bool mounted;
};

class SessionStoreUsers : public SessionStoreTest {
protected:
  std::vector<pid_t> usersOf(const SessionInfo &session) {
    std::vector<SessionUser> users;
    EXPECT_TRUE(store.users(session, users));
    std::vector<pid_t> pids;
    for (const SessionUser &user : users) {
      pids.push_back(user.pid);
    }
    return pids;
  }

  // The child is the only user, also after the renaming, and keeps both kinds of sessions.
  void expectUser(const std::function<bool(const std::string &path)> &begin) {
    for (const bool onVolume : {false, true}) {
      const SessionInfo session = find(onVolume ? makeOnVolume(kDay) : makeLocal(kDay));
      {
        const LiveChild child([&] { return begin(session.path); });
        ASSERT_TRUE(child.ready());
        EXPECT_THAT(usersOf(session), testing::ElementsAre(child.pid()));
        EXPECT_FALSE(remove(session));
        EXPECT_EQ(EBUSY, error.code);
        EXPECT_FALSE(prune(kHour));
        EXPECT_THAT(failuresOf(failed),
                    testing::ElementsAre("refused " + session.path + ": " + std::to_string(EBUSY)));
        EXPECT_TRUE(isThere(session.path + "/file"));
      }
      EXPECT_THAT(usersOf(session), IsEmpty());
      EXPECT_TRUE(remove(session)) << error.step << " " << error.path;
    }
  }

  // The child mounts the session in a place of its own, which only the renaming shows.
  void expectUserOfMount(
      const std::function<bool(const std::string &path, const std::string &place)> &begin) {
    for (const bool onVolume : {false, true}) {
      const SessionInfo session = find(onVolume ? makeOnVolume(kDay) : makeLocal(kDay));
      const TestFolder place;
      fs::create_directory(place / "with space");
      {
        const LiveChild child([&] { return begin(session.path, place.path()); });
        ASSERT_TRUE(child.ready());
        EXPECT_FALSE(remove(session));
        EXPECT_EQ(EBUSY, error.code) << error.step << " " << error.path;
        EXPECT_FALSE(prune(kHour));
        EXPECT_TRUE(isThere(session.path + "/file"));
      }
      EXPECT_TRUE(remove(session)) << error.step << " " << error.path;
    }
  }
};

TEST_F(SessionStoreUsers, AreThoseWithAFileOpen) {
  expectUser([](const std::string &path) {
    return ::open((path + "/file").c_str(), O_RDONLY | O_CLOEXEC) >= 0;
  });
}

TEST_F(SessionStoreUsers, AreThoseWithTheDirectoryOpenAsAPath) {
  expectUser([](const std::string &path) { return ::open(path.c_str(), O_PATH | O_CLOEXEC) >= 0; });
}

TEST_F(SessionStoreUsers, AreThoseThatWorkInIt) {
  expectUser([](const std::string &path) { return ::chdir(path.c_str()) == 0; });
}

TEST_F(SessionStoreUsers, AreThoseWithAFileMapped) {
  expectUser([](const std::string &path) {
    const UniqueFd file(::open((path + "/file").c_str(), O_RDONLY | O_CLOEXEC));
    return ::mmap(nullptr, 1, PROT_READ, MAP_PRIVATE, file.get(), 0) != MAP_FAILED;
  });
}

// An open file that was removed keeps its place in the directory that is gone for others.
TEST_F(SessionStoreUsers, AreThoseWithARemovedFileOpen) {
  expectUser([](const std::string &path) {
    const std::string file = path + "/removed";
    const int fd = ::open(file.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    setAge(path, kDay);
    const bool gone = ::unlink(file.c_str()) == 0;
    setAge(path, kDay);
    return fd >= 0 && gone;
  });
}

// One thread may have descriptors and a working directory of its own.
TEST_F(SessionStoreUsers, AreThoseWithAThreadThatWorksInIt) {
  expectUser([](const std::string &path) {
    return doneByThread([&] { return ::chdir(path.c_str()) == 0; });
  });
}

// Nothing is shown for a first thread that has ended.
TEST_F(SessionStoreUsers, AreThoseWhoseFirstThreadHasEnded) {
  const SessionInfo session = find(makeLocal(kDay));
  const LiveChild child(
      [&] { return ::open((session.path + "/file").c_str(), O_RDONLY | O_CLOEXEC) >= 0; },
      LiveChild::FirstThread::Ends);
  ASSERT_TRUE(child.ready());
  EXPECT_THAT(usersOf(session), testing::ElementsAre(child.pid()));
  EXPECT_FALSE(remove(session));
}

TEST_F(SessionStoreUsers, AreThoseTooDeepInItForThePathToBeShown) {
  expectUser([](const std::string &path) {
    if (::chdir(path.c_str()) != 0) {
      return false;
    }
    const std::string name(200, 'd');
    for (int depth = 0; depth < 30; ++depth) {
      if (::mkdir(name.c_str(), 0700) != 0 || ::chdir(name.c_str()) != 0) {
        return false;
      }
    }
    setAge(path, kDay);
    return true;
  });
}

// As in a container, where the session has another path. Its fresh name shows which one it is.
TEST_F(SessionStoreUsers, AreThoseThatHaveItMountedAtAnotherPlace) {
  expectUserOfMount([](const std::string &path, const std::string &place) {
    const std::string point = place + "/with space";
    return mountAt(path, point) && ::open((point + "/file").c_str(), O_RDONLY | O_CLOEXEC) >= 0;
  });
}

// The kernel lists the mount points relative to the root directory of the process.
TEST_F(SessionStoreUsers, AreThoseThatHaveItMountedInOrAsTheirChroot) {
  for (const std::string &inner : std::initializer_list<std::string>{"/with space", "/"}) {
    expectUserOfMount([&](const std::string &path, const std::string &place) {
      return mountAt(path, place + inner) && ::chroot(place.c_str()) == 0 &&
             ::chdir(inner.c_str()) == 0;
    });
  }
}

// A thread that lists fewer mounts, because of its chroot, is examined first.
TEST_F(SessionStoreUsers, AreThoseThatHaveItMountedOutsideTheChrootOfAnotherThread) {
  expectUserOfMount([](const std::string &path, const std::string &place) {
    const std::string point = place + "/with space";
    return mountAt(path, point) && doneByThread([&] { return ::chdir(point.c_str()) == 0; }) &&
           ::chroot("/usr") == 0 && ::chdir("/") == 0;
  });
}

TEST_F(SessionStoreUsers, AreThoseThatHaveItMountedInOrOverAnotherSession) {
  const SessionInfo outer = find(makeLocal());
  fs::create_directory(outer.path + "/inner");
  for (const char *inner : {"/inner", ""}) {
    expectUserOfMount([&](const std::string &path, const std::string &place) {
      const std::string point = place + inner;
      return mountAt(outer.path, place) && mountAt(path, point) && ::chdir(point.c_str()) == 0;
    });
  }
}

TEST_F(SessionStoreUsers, AreNotThoseOfALongerName) {
  const SessionInfo session = find(makeLocal(kDay));
  fs::create_directory(session.path + "x");
  const UniqueFd open(::open((session.path + "x").c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  EXPECT_THAT(usersOf(session), IsEmpty());
  EXPECT_TRUE(remove(session));
}

TEST_F(SessionStoreUsers, OfALinkThatLeadsElsewhereAreNotLookedFor) {
  (void)makeLocal();
  fs::create_symlink("/etc", linkOf("seln.000000"));
  const UniqueFd open(::open("/etc", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  EXPECT_THAT(usersOf(find("seln.000000")), IsEmpty());
}

TEST_F(SessionStoreUsers, AreUnknownWithoutProc) {
  const SessionInfo session = find(makeLocal(kDay));
  std::vector<SessionUser> users(1);
  const NoProc noProc;
  if (!noProc.mounted) {
    GTEST_SKIP() << "skipped: no file system can be mounted on /proc";
  }
  EXPECT_FALSE(store.users(session, users));
  EXPECT_THAT(users, IsEmpty());
  EXPECT_FALSE(remove(session));
  EXPECT_EQ("readlink /proc/self: 2", failuresOf({error})[0]);
  EXPECT_FALSE(prune(0));
  EXPECT_THAT(failuresOf(failed), testing::ElementsAre("readlink /proc/self: 2"));
  EXPECT_FALSE(prune(0, true));
  EXPECT_THAT(removed, IsEmpty());
  EXPECT_TRUE(isThere(session.path + "/file"));
  SessionRemoval how;
  how.evenInUse = true;
  EXPECT_TRUE(remove(session, how));
}

// The process itself is there, but not process 1.
TEST_F(SessionStoreUsers, AreUnknownWhereProcHidesProcesses) {
  const SessionInfo session = find(makeLocal(kDay));
  const int outcome = runInChild([&] {
    if (::mount("proc", "/proc", "proc", 0, "hidepid=2") != 0) {
      return 2;
    }
    const bool asOther = ::chown(session.path.c_str(), kOther, kOther) == 0 &&
                         ::chown("/tmp/kovabackup", kOther, kOther) == 0 &&
                         ::chown(kSessionRoot, kOther, kOther) == 0 && ::setgid(kOther) == 0 &&
                         ::setuid(kOther) == 0;
    const bool kept = asOther && !remove(session) && isThere(session.path);
    const bool why = failuresOf({error})[0] == "lstat /proc/1: 2";
    return kept && why ? 0 : 1;
  });
  if (outcome == 2) {
    GTEST_SKIP() << "skipped: /proc cannot be mounted with hidepid";
  }
  ::umount2("/proc", MNT_DETACH);
  EXPECT_EQ(0, outcome);
}

// A process of the owner that cannot be examined may use the session.
TEST_F(SessionStoreUsers, AreUnknownWhenAProcessOfTheOwnerCannotBeExamined) {
  const SessionInfo session = find(makeLocal(kDay));
  if (::chown(session.path.c_str(), kOther, kOther) != 0) {
    GTEST_SKIP() << "skipped: not root";
  }
  ASSERT_EQ(0, ::chown("/tmp/kovabackup", kOther, kOther));
  ASSERT_EQ(0, ::chown(kSessionRoot, kOther, kOther));
  const LiveChild closed([&] {
    return ::setgid(kOther) == 0 && ::setuid(kOther) == 0 && ::prctl(PR_SET_DUMPABLE, 0) == 0;
  });
  ASSERT_TRUE(closed.ready());
  const int outcome = runInChild([&] {
    if (::setgid(kOther) != 0 || ::setuid(kOther) != 0 || ::prctl(PR_SET_DUMPABLE, 1) != 0) {
      return 2;
    }
    std::vector<SessionUser> users;
    const std::string process = "/proc/" + std::to_string(closed.pid()) + "/";
    const bool kept = !store.users(session, users) && !remove(session) && error.code == EACCES &&
                      error.path.rfind(process, 0) == 0;
    return kept && isThere(session.path) ? 0 : 1;
  });
  EXPECT_EQ(0, outcome);
  // Root can examine it, but does not trust the folder of another user.
  EXPECT_THAT(usersOf(session), IsEmpty());
  EXPECT_FALSE(remove(session));
  EXPECT_EQ("refused /tmp/kovabackup: 1", failuresOf({error})[0]);
}

// Processes of other users do not count: they cannot enter a directory with mode 0700.
TEST_F(SessionStoreUsers, AreKnownToAnOrdinaryUserAmongProcessesOfOthers) {
  const SessionInfo session = find(makeLocal(kDay));
  if (::chown(session.path.c_str(), kOther, kOther) != 0) {
    GTEST_SKIP() << "skipped: not root";
  }
  ASSERT_EQ(0, ::chown("/tmp/kovabackup", kOther, kOther));
  ASSERT_EQ(0, ::chown(kSessionRoot, kOther, kOther));
  const int outcome = runInChild([&] {
    if (::setgid(kOther) != 0 || ::setuid(kOther) != 0 || ::prctl(PR_SET_DUMPABLE, 1) != 0) {
      return 2;
    }
    return remove(session) && !isThere(session.path) ? 0 : 1;
  });
  EXPECT_EQ(0, outcome);
}

TEST_F(SessionStoreUsers, AreThoseThatRunAProgramFromIt) {
  const SessionInfo session = find(makeLocal(kDay));
  fs::copy_file("/bin/sleep", session.path + "/program");
  setAge(session.path, kDay);
  const pid_t pid = ::fork();
  if (pid == 0) {
    ::execl((session.path + "/program").c_str(), "program", "600", nullptr);
    ::_exit(127);
  }
  // It is running once its executable is shown as that of the session.
  const std::string exe = "/proc/" + std::to_string(pid) + "/exe";
  std::error_code ignored;
  while (fs::read_symlink(exe, ignored) != session.path + "/program") {
    ASSERT_EQ(0, ::waitpid(pid, nullptr, WNOHANG));
    std::this_thread::yield();
  }
  EXPECT_THAT(usersOf(session), testing::ElementsAre(pid));
  ::kill(pid, SIGKILL);
  ::waitpid(pid, nullptr, 0);
  EXPECT_TRUE(remove(session));
}

} // namespace
