// One update is a short sequence under one lock:
//
//     take the lock     Locked, LockFailed
//     load              NoSection, LoadFailed
//     change            Declined, or an exception
//     save              SaveFailed, Saved
//     release the lock

#include "kovabackup/service/section_update.h"

#include "base/open_file.h"
#include "base/section_reader.h"
#include "service/absence.h"
#include "service/failed.h"
#include "service/token_lock.h"

#include <sys/file.h>

namespace KOVA::Backup::Service {
namespace {

using Read = Base::SectionReader::Read;

// Unlocks explicitly: a child that another thread forks meanwhile has the descriptor too, and must
// not keep the lock.
class HeldToken {
public:
  explicit HeldToken(Base::UniqueFd lock) : lock_(std::move(lock)) {}
  ~HeldToken() { (void)::flock(lock_.get(), LOCK_UN); } // if it fails, closing releases
  HeldToken(const HeldToken &) = delete;
  HeldToken &operator=(const HeldToken &) = delete;

private:
  Base::UniqueFd lock_;
};

// A failing load does not report why, so the file is examined here.
Update whyNotLoaded(const std::string &path, const std::string &name, Error &error) {
  constexpr const char *kStep = "optSectionLoad";
  if (path.empty() || name.empty()) {
    (void)failed(error, kStep, path, EINVAL);
    return Update::LoadFailed;
  }
  const Base::UniqueFd fd = Base::openFile(path.c_str(), O_RDONLY);
  if (!fd) {
    (void)failed(error, "open", path);
    return isAbsence(error.code) ? Update::NoSection : Update::LoadFailed;
  }
  if (Base::isDevice(fd.get())) {
    (void)failed(error, kStep, path, EINVAL);
    return Update::LoadFailed;
  }
  Base::SectionReader file(fd.get());
  const Read read = file ? file.findSection(name) : Read::Error;
  if (read == Read::Error) {
    (void)failed(error, "read", path);
    return Update::LoadFailed;
  }
  const bool there = read == Read::Line;
  (void)failed(error, kStep, path, there ? EIO : ENOENT);
  return there ? Update::LoadFailed : Update::NoSection;
}

Update updateLocked(const std::string &path, const std::string &prefix, int id,
                    const std::function<bool(OptionMap &)> &change, Error &error) {
  OptionMap options;
  const bool loaded = options.optSectionLoad(path, prefix, id);
  const std::string name = options.optSectionGetName(); // change may rebind the map
  if (!loaded) {
    return whyNotLoaded(path, name, error);
  }
  if (!change(options)) {
    return Update::Declined;
  }
  errno = 0;
  if (!options.optSectionExport(path, name, false)) {
    (void)failed(error, "optSectionExport", path, errno != 0 ? errno : EIO);
    return Update::SaveFailed;
  }
  return Update::Saved;
}

} // namespace

Update updateSection(const std::string &path, const std::string &prefix, int id,
                     const std::string &token, const std::function<bool(OptionMap &)> &change,
                     Millis lockLimit, Error *error) {
  Error ignored;
  Error &why = error != nullptr ? *error : ignored;
  Base::UniqueFd lock;
  if (!takeToken(token, lockLimit, lock, why)) {
    return why.code == EWOULDBLOCK ? Update::Locked : Update::LockFailed;
  }
  const HeldToken held(std::move(lock));
  return updateLocked(path, prefix, id, change, why);
}

} // namespace KOVA::Backup::Service
