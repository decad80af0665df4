#ifndef KOVABACKUP_TESTS_SERVICE_SESSION_STORE_SUPPORT_H
#define KOVABACKUP_TESTS_SERVICE_SESSION_STORE_SUPPORT_H

/// @file Sessions of every kind and age on a volume of the test, and what the store says of them.

#include "kovabackup/path_util.h"
#include "kovabackup/service/session_store.h"
#include "tests/session/session_fixture.h"

#include <ctime>
#include <fcntl.h>
#include <filesystem>
#include <gtest/gtest.h>
#include <string>
#include <sys/stat.h>
#include <vector>

namespace KovaTest {

using KOVA::Backup::Session;
using KOVA::Backup::Service::Error;
using KOVA::Backup::Service::SessionInfo;
using KOVA::Backup::Service::SessionRemoval;
using KOVA::Backup::Service::SessionStore;
using KOVA::Backup::Service::SessionUser;
using State = KOVA::Backup::Service::SessionInfo::State;

constexpr int kHour = 3600;
constexpr int kDay = 24 * kHour;

/// Sets the modification time of an entry, of a link its own.
inline void setAge(const std::string &path, int seconds) {
  const timespec then = {std::time(nullptr) - seconds, 123456789};
  const timespec times[] = {then, then};
  ASSERT_EQ(0, ::utimensat(AT_FDCWD, path.c_str(), times, AT_SYMLINK_NOFOLLOW)) << path;
}

inline timespec modifiedOf(const std::string &path) {
  struct stat info = {};
  EXPECT_EQ(0, ::lstat(path.c_str(), &info)) << path;
  return info.st_mtim;
}

inline std::vector<std::string> failuresOf(const std::vector<Error> &errors) {
  std::vector<std::string> failures;
  failures.reserve(errors.size());
  for (const Error &error : errors) {
    failures.push_back(error.step + " " + error.path + ": " + std::to_string(error.code));
  }
  return failures;
}

class SessionStoreTest : public Sessions {
protected:
  SessionStoreTest() : platform(volume.path) { platform.mountOf["/volume1"] = "/volume1"; }

  /// A local session with a file of five bytes; returns its id.
  std::string makeLocal(int ageSeconds = 0) {
    Session session;
    EXPECT_TRUE(session.create());
    fill(session.getPath(), ageSeconds);
    return session.getId();
  }

  /// A session on the volume with such a file; returns its id, which is also its directory's name.
  std::string makeOnVolume(int ageSeconds = 0) {
    Session session;
    EXPECT_TRUE(session.create(anyVolume()));
    fill(session.getPath(), ageSeconds);
    return session.getId();
  }

  /// A directory with such a file to which no link leads; returns its path.
  std::string makeLost(int ageSeconds = kDay) {
    const std::string id = makeOnVolume(ageSeconds);
    EXPECT_TRUE(std::filesystem::remove(linkOf(id)));
    return folderOf(id);
  }

  /// A link to a directory that does not exist; returns its id.
  static std::string makeDangling(const std::string &id, int ageSeconds = 0) {
    (void)KOVA::Backup::Path::createIpcTempPath("session", 0700);
    std::filesystem::create_symlink("/tmp/gone/seln.Zz9Zz9", linkOf(id));
    setAge(linkOf(id), ageSeconds);
    return id;
  }

  std::string folderOf(const std::string &id) const { return volume.path + "/" + id; }

  static void fill(const std::string &folder, int ageSeconds) {
    writeFile(folder + "/file", "12345");
    setAge(folder, ageSeconds);
  }

  /// Lists; fails the test when the list is not complete.
  std::vector<SessionInfo> list() {
    std::vector<SessionInfo> sessions;
    Error failure;
    EXPECT_TRUE(store.list(sessions, failure)) << failure.step << " " << failure.path;
    return sessions;
  }

  SessionInfo find(const std::string &id) {
    SessionInfo session;
    Error failure;
    EXPECT_TRUE(store.find(id, session, failure))
        << id << ": " << failure.step << " " << failure.code;
    return session;
  }

  SessionInfo findLost(const std::string &path) {
    for (const SessionInfo &session : list()) {
      if (session.state == State::Lost && session.path == path) {
        return session;
      }
    }
    ADD_FAILURE() << path << " is not listed as lost";
    return {};
  }

  /// Removes; error is that of the call.
  bool remove(const SessionInfo &session, const SessionRemoval &how = {}) {
    error = {};
    return store.remove(session, error, how);
  }

  bool prune(int ageSeconds, bool dryRun = false) {
    return store.prune(std::chrono::seconds(ageSeconds), dryRun, removed, failed);
  }

  FakeVolumes platform;
  SessionStore store;
  Error error;
  std::vector<SessionInfo> removed;
  std::vector<Error> failed;
};

} // namespace KovaTest

#endif
