#ifndef KOVABACKUP_TESTS_PLATFORM_CONF_H
#define KOVABACKUP_TESTS_PLATFORM_CONF_H

/// @file A configuration file of the stand-ins for one test, instead of the machine's.

#include "tests/support/files.h"

#include <cstdlib>
#include <string>
#include <sys/stat.h>
#include <unistd.h>

namespace KovaTest {

class PlatformConf {
public:
  PlatformConf() {
    ::setenv("KOVA_PLATFORM_CONF", path.c_str(), 1);
    write("");
  }
  ~PlatformConf() {
    ::unlink(path.c_str());
    ::unsetenv("KOVA_PLATFORM_CONF");
  }
  PlatformConf(const PlatformConf &) = delete;
  PlatformConf &operator=(const PlatformConf &) = delete;

  void write(const std::string &text) const {
    writeFile(path, text);
    ::chmod(path.c_str(), 0644); // regardless of the umask
  }

  const std::string path = "/tmp/platform.conf";
};

} // namespace KovaTest

#endif
