#include "service/session_names.h"

#include "base/retry_on_eintr.h"
#include "kovabackup/path_util.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <sys/random.h>

namespace KOVA::Backup::Service {
namespace {

constexpr std::size_t kPrefixBytes = 5;
constexpr std::size_t kRandomBytes = 6;
constexpr const char kLetters[] = "0123456789abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ";
constexpr std::size_t kLetterCount = sizeof kLetters - 1;

// Not isalnum(3), whose answer depends on the locale: mkdtemp(3) and mkstemp(3), from which the
// names come, use ASCII letters and digits only.
bool isAsciiAlphanumeric(char c) {
  return (c >= '0' && c <= '9') || (c >= 'A' && c <= 'Z') || (c >= 'a' && c <= 'z');
}

} // namespace

bool isSessionName(const std::string &name, const char *prefix) {
  return name.size() == kPrefixBytes + kRandomBytes && name.compare(0, kPrefixBytes, prefix) == 0 &&
         std::all_of(name.begin() + kPrefixBytes, name.end(), isAsciiAlphanumeric);
}

std::string sessionRoot() {
  return Path::join(Path::getIpcTempPath(), "session");
}

// That some letters are slightly more frequent than others does not matter: a name that is taken is
// refused by the call that uses it.
bool chooseName(const char *prefix, std::string &name, Error &error) {
  std::array<unsigned char, kRandomBytes> random{};
  const ssize_t size =
      Base::retryOnEintr([&] { return ::getrandom(random.data(), random.size(), 0); });
  if (size != static_cast<ssize_t>(random.size())) {
    error = {size < 0 ? errno : EIO, "getrandom", ""};
    return false;
  }
  name = prefix;
  for (const unsigned char byte : random) {
    name += kLetters[byte % kLetterCount];
  }
  return true;
}

} // namespace KOVA::Backup::Service
