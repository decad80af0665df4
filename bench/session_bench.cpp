// Creating and removing sessions, temporary folders and temporary files, raced against the bare
// system calls for the same result. Every job checks that it worked.
//
// Sessions have a fixed place under /tmp. So the program moves into a mount namespace of its own,
// with an empty file system in memory on /tmp and another one on /mnt as the volume. Without the
// right to do so, the races are skipped.

#include "kovabackup/session.h"
#include "kovabackup/temp_manager.h"

#include "bench/race.h"
#include "tests/support/private_tmp.h"

#include <benchmark/benchmark.h>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <ftw.h>
#include <string>
#include <sys/mount.h>
#include <sys/stat.h>
#include <unistd.h>

namespace {

using KOVA::Backup::ScopedTempFile;
using KOVA::Backup::ScopedTempFolder;
using KOVA::Backup::Session;
using KOVA::Backup::TempManager;
using KovaBench::Race;
using KovaBench::rounds;

constexpr char kRoot[] = "/tmp/kovabackup";
constexpr char kSessions[] = "/tmp/kovabackup/session";
constexpr char kVolume[] = "/mnt/volume1";
constexpr char kVolumeTmp[] = "/mnt/volume1/.kova_tmp";

// Returns: why the races cannot be run, "" when they can.
std::string prepare() {
  const std::string failure = KovaTest::enterPrivateTmp();
  if (!failure.empty()) {
    return failure;
  }
  if (::mount("tmpfs", "/mnt", "tmpfs", 0, "mode=0755") != 0 || ::mkdir(kVolume, 0755) != 0) {
    return std::string("a volume on /mnt: ") + std::strerror(errno);
  }
  constexpr char kConf[] = "/tmp/platform.conf";
  // The largest volume is chosen, so this one is larger than the machine's.
  std::ofstream(kConf) << "[volume data]\npath=\"" << kVolume
                       << "\"\nfsType=2\nsize=1000000000000000000\n";
  ::chmod(kConf, 0644); // the platform ignores a file that others may write
  ::setenv("KOVA_PLATFORM_CONF", kConf, 1);
  return "";
}

bool ready(benchmark::State &state) {
  static const std::string failure = prepare();
  if (!failure.empty()) {
    state.SkipWithError(failure.c_str());
  }
  return failure.empty();
}

// --- the library ---

bool localSession() {
  Session session;
  return session.create() && session.destroy();
}

bool volumeSession() {
  static const boost::shared_ptr<KOVA::Backup::FilterVolume> rule =
      TempManager::maxExtBtrfsVolume();
  Session session;
  return session.create(rule) && session.getPath().find(kVolumeTmp) == 0 && session.destroy();
}

bool scopedFolder() {
  return ScopedTempFolder("").isValid();
}

bool scopedFile() {
  return ScopedTempFile("", false).isValid();
}

// --- the bare calls ---

// With its mode also when another program made it, and under any umask.
bool makeDirectory(const char *path, mode_t mode) {
  return (::mkdir(path, mode) == 0 || errno == EEXIST) && ::chmod(path, mode) == 0;
}

bool makeSessions() {
  return makeDirectory(kRoot, 0755) && makeDirectory(kSessions, 0700);
}

// Removes an empty folder, which the bare calls know to be empty.
bool removeEmpty(const char *path) {
  return ::rmdir(path) == 0;
}

// Removes a folder with what it may hold, as the library does.
bool removeTree(const char *path) {
  const auto remove = [](const char *entry, const struct stat *, int type, struct FTW *) {
    return type == FTW_DP ? ::rmdir(entry) : ::unlink(entry);
  };
  return ::nftw(path, remove, 20, FTW_PHYS | FTW_MOUNT | FTW_DEPTH) == 0;
}

using Remove = bool (*)(const char *);

template <Remove remove>
bool bareLocalSession() {
  char path[] = "/tmp/kovabackup/session/sess.XXXXXX";
  return makeSessions() && ::mkdtemp(path) != nullptr && ::chmod(path, 0700) == 0 && remove(path);
}

template <Remove remove>
bool bareVolumeSession() {
  char path[] = "/mnt/volume1/.kova_tmp/seln.XXXXXX";
  char link[] = "/tmp/kovabackup/session/seln.XXXXXX";
  if (!makeSessions() || ::mkdtemp(path) == nullptr || ::chmod(path, 0700) != 0) {
    return false;
  }
  std::strcpy(std::strrchr(link, '/'), std::strrchr(path, '/'));
  return ::symlink(path, link) == 0 && remove(path) && ::unlink(link) == 0;
}

template <Remove remove>
bool bareFolder() {
  char path[] = "/tmp/scoped_temp_folder.XXXXXX";
  return ::mkdtemp(path) != nullptr && remove(path);
}

bool bareFile() {
  char path[] = "/tmp/scoped_temp_file.XXXXXX";
  const int file = ::mkstemp(path);
  return file >= 0 && ::close(file) == 0 && ::unlink(path) == 0;
}

void sessionInTmp(benchmark::State &state) {
  if (ready(state)) {
    Race(state, localSession)
        .peer("bare_calls", bareLocalSession<removeEmpty>, 1.1)
        .peer("bare_nftw", bareLocalSession<removeTree>)
        .run();
  }
}
BENCHMARK(sessionInTmp)->Apply(rounds);

void sessionOnVolume(benchmark::State &state) {
  if (ready(state)) {
    Race(state, volumeSession)
        .peer("bare_calls", bareVolumeSession<removeEmpty>, 1.1)
        .peer("bare_nftw", bareVolumeSession<removeTree>)
        .run();
  }
}
BENCHMARK(sessionOnVolume)->Apply(rounds);

void folder(benchmark::State &state) {
  if (ready(state)) {
    Race(state, scopedFolder)
        .peer("mkdtemp_rmdir", bareFolder<removeEmpty>, 1.2)
        .peer("mkdtemp_nftw", bareFolder<removeTree>)
        .run();
  }
}
BENCHMARK(folder)->Apply(rounds);

void file(benchmark::State &state) {
  if (ready(state)) {
    Race(state, scopedFile).peer("mkstemp_unlink", bareFile).run();
  }
}
BENCHMARK(file)->Apply(rounds);

} // namespace
