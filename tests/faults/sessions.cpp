#include "tests/faults/sessions.h"

#include "kovabackup/path_util.h"

#include <ctime>
#include <filesystem>
#include <fstream>
#include <sys/stat.h>
#include <utime.h>

namespace KovaTest::Faults {

void makeSession(const std::string &folder, int ageSec) {
  std::filesystem::create_directories(folder + "/below");
  std::ofstream(folder + "/file") << "12345";
  std::ofstream(folder + "/below/file") << "1";
  ::chmod(folder.c_str(), 0700);
  const std::time_t then = std::time(nullptr) - ageSec;
  const struct utimbuf times = {then, then};
  ::utime(folder.c_str(), &times);
}

void makeLocalSessions() {
  (void)KOVA::Backup::Path::createIpcTempPath("session", 0700);
  makeSession(kOld, 7200);
  makeSession(kYoung, 10);
}

} // namespace KovaTest::Faults
