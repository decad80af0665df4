// The calls of path_util_libgen.h. Each source file includes this at its end, hence no include
// guard.

#include "tests/path/path_util_libgen.h"

#include <cstring>

namespace {

std::string qualified(const std::string &path) {
  return KOVA::Backup::Path::basename(path);
}

std::string used(const std::string &path) {
  using namespace KOVA::Backup::Path; // NOLINT(google-build-using-namespace): what callers do
  return basename(path);
}

std::string declared(const std::string &path) {
  using KOVA::Backup::Path::basename;
  return basename(path);
}

std::string own(char *path) {
  return basename(path);
}

std::string ownBesideUsed(char *path) {
  using namespace KOVA::Backup::Path; // NOLINT(google-build-using-namespace): what callers do
  return basename(path);
}

PathUtilLibgen::Caller calls() {
  const PathUtilLibgen::Caller caller = {&qualified, &used, &declared, &own, &ownBesideUsed};
  return caller;
}

} // namespace
