#include "kovabackup/path_kova.h"

#include "common/log.h"
#include "kovaplatform/kovasdk.h"

#include <cstring>
#include <string_view>

namespace KOVA::Backup::Path {
namespace {

constexpr char kModule[] = "path/path_kova";
constexpr std::string_view kEaDir = "@eaDir";
// The sizes that the platform expects of its callers' buffers.
constexpr int kShareNameBytes = 492;
constexpr int kSharePathBytes = 4095;

} // namespace

std::string getShareName(const std::string &path) {
  char name[kShareNameBytes] = "";
  char sharePath[kSharePathBytes] = "";
  if (KOVAShareNamePathGet(path.c_str(), name, kShareNameBytes, sharePath, kSharePathBytes) < 0) {
    Log::error(kModule, 35, "Error: getting share path of [%s] failed", path.c_str());
    return "";
  }
  return std::string(name, ::strnlen(name, sizeof name)); // may lack a NUL
}

bool isInKovaEaDir(const std::string &path) {
  std::size_t at = path.find(kEaDir);
  while (at != std::string::npos) {
    const std::size_t end = at + kEaDir.size();
    const bool begins = at == 0 || path[at - 1] == '/';
    const bool ends = end == path.size() || path[end] == '/';
    if (begins && ends) {
      return true;
    }
    at = path.find(kEaDir, end);
  }
  return false;
}

} // namespace KOVA::Backup::Path
