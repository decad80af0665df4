// The lock token: writers of a section file that share it exclude each other by one flock(2).
//
//   state       lockToken   lockFd   setLockToken      lock                unlock
//   no token    ""          < 0      -> token set      true, nothing       true, nothing
//   token set   a name      < 0      replaces          -> held             false
//   held        a name      >= 0     false             false               -> token set
//
// A step that fails leaves the state unchanged.

#include "base/unique_fd.h"
#include "common/log.h"
#include "kovabackup/option_map.h"
#include "kovabackup/path_util.h"
#include "option/option_map_private.h"

#include <sys/file.h>
#include <unistd.h>

namespace KOVA::Backup {

bool OptionMap::setLockToken(const std::string &token) {
  if (token.empty()) {
    Log::error(kOptionModule, 923, "setLockToken: invalid parameter.");
    return false;
  }
  if (d->lockFd >= 0) {
    Log::error(kOptionModule, 927, "setLockToken: file locked already. fd: [%d].", d->lockFd);
    return false;
  }
  d->lockToken = token;
  return true;
}

bool OptionMap::lock() {
  if (d->lockToken.empty()) {
    return true; // deliberately: a map without a token works unlocked
  }
  if (d->lockFd >= 0) {
    Log::error(kOptionModule, 944, "lock: file locked already. fd: [%d].", d->lockFd);
    return false;
  }
  Base::UniqueFd file(Path::createIpcLockFile(d->lockToken));
  if (!file) {
    Log::error(kOptionModule, 951, "lock: open lock token failed.");
    return false;
  }
  if (::flock(file.get(), LOCK_EX) != 0) {
    Log::error(kOptionModule, 956, "lock: flock(LOCK_EX) failed. %m");
    return false;
  }
  d->lockFd = file.release();
  return true;
}

bool OptionMap::unlock() {
  if (d->lockToken.empty()) {
    return true;
  }
  if (d->lockFd < 0) {
    Log::error(kOptionModule, 975, "lock: file released already. fd: [%d].", d->lockFd);
    return false;
  }
  if (::flock(d->lockFd, LOCK_UN) != 0) {
    Log::error(kOptionModule, 980, "unlock: flock(LOCK_UN) failed. %m");
    return false;
  }
  (void)::close(d->lockFd); // the lock is released whatever close returns
  d->lockFd = -1;
  return true;
}

} // namespace KOVA::Backup
