#ifndef KOVABACKUP_TESTS_PATH_UTIL_LIBGEN_H
#define KOVABACKUP_TESTS_PATH_UTIL_LIBGEN_H

/// @file The two functions named basename as a caller sees them, in a source file that includes
/// <libgen.h> before path_util.h, in one that includes it afterwards and in one that does not.

#include <string>

namespace PathUtilLibgen {

struct Caller {
  std::string (*qualified)(const std::string &path); ///< KOVA::Backup::Path::basename(path)
  std::string (*used)(const std::string &path);      ///< using namespace Path: basename(path)
  std::string (*declared)(const std::string &path);  ///< using Path::basename: basename(path)
  std::string (*own)(char *path);                    ///< basename(path), the caller's own
  std::string (*ownBesideUsed)(char *path);          ///< the same under using namespace Path
};

Caller callerBefore();
Caller callerAfter();
Caller callerNever();

} // namespace PathUtilLibgen

#endif
