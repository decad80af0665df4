#ifndef KOVABACKUP_SERVICE_SECTION_UPDATE_H
#define KOVABACKUP_SERVICE_SECTION_UPDATE_H

/// @file Changes options in a section file without losing what other processes save meanwhile.
///
///     Error error;
///     const Update done = updateSection("/etc/backup/task.conf", "task", 12, "task.conf",
///                                       [](OptionMap &options) {
///                                         const int runs = options.optInt("runs", 0);
///                                         return options.optSet("runs", runs + 1);
///                                       },
///                                       std::chrono::seconds(5), &error);
///     if (done != Update::Saved) report(error);
///
/// One call takes the lock of the token, loads the section, calls a function that changes it, saves
/// it and releases the lock. An option map that is loaded, changed and saved on its own holds the
/// lock during the save only, and then overwrites what another process saved in the section after
/// the load. Here nothing is lost, as long as every writer of the file uses this function or holds
/// the lock of the same token from before its load until after its save.
///
/// The lock excludes exactly the option maps that have the same token (OptionMap::setLockToken),
/// and RunLocks of that name. It also excludes other threads of this process.
///
/// Saving replaces all options of the section. A line whose value is not JSON is not loaded, which
/// is logged; the save then loses it. Comments and other sections are treated as
/// OptionMap::optSectionSave treats them: the platform decides about comments inside the section,
/// and everything outside is kept. A section that does not exist is not created; that is what
/// OptionMap::optSectionCreate is for.
///
/// Failure: by the result and an Error; std::bad_alloc and what the function throws are passed on.
/// errno:   not meaningful.
/// Log:     the lines of OptionMap::optSectionLoad, of OptionMap::optSectionExport and, when the
///          lock directory cannot be prepared, of Path::createIpcTempPath. Nothing else.
/// Threads: any number at once.
/// Signals: none ends a wait for the lock.
/// Process: the descriptor of the lock is close-on-exec. A child that is forked during the call
///          shares the lock until the call releases it for both.

#include "kovabackup/nodiscard.h"
#include "kovabackup/option_map.h"
#include "kovabackup/service/error.h"
#include "kovabackup/service/millis.h"

#include <functional>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA::Backup::Service {

/// What became of an update. The file is unchanged unless the result is Saved or SaveFailed.
enum class Update {
  Saved,      ///< the section holds the options that the function left in the map
  Declined,   ///< the function returned false
  NoSection,  ///< the file does not exist, or has no such section
  Locked,     ///< the limit passed while another writer held the lock
  LockFailed, ///< the lock cannot be taken, now or later
  LoadFailed, ///< the file or the section cannot be read
  SaveFailed  ///< the section could not be written, or its name or an option has no form in a file
};

/// Changes the options of one section under the lock of a token.
///
/// change gets the loaded map and returns whether to save it. The map has no lock token, so lock()
/// does nothing in it. What change does to the map's binding has no effect: its options are saved
/// in the section that was loaded. While change runs, it must not wait for the same token, neither
/// by another updateSection nor by a map's lock(): that wait would never end.
///
/// Returns: see Update. On Saved and Declined error is untouched; otherwise it is set, unless it is
///          null.
/// Errors:  NoSection: ENOENT, or ENOTDIR.
///          Locked: EWOULDBLOCK.
///          LockFailed: EINVAL for a token that is empty, ends with "/", contains a NUL byte, or
///          has "." or ".." as a component; ELOOP when the lock file is a symbolic link; ESTALE
///          when the lock file is replaced again and again; else the errno of the step.
///          LoadFailed: the errno with which the file cannot be opened or read; EINVAL for an empty
///          path or name, and for a device; EIO when the section is there but could not be loaded.
///          SaveFailed: the step is optSectionExport. The code is errno as the platform left it,
///          and EIO if it left none; the platform's error is in the log. If only the folder
///          could not be synced, the file is changed nevertheless.
/// Throws:  std::bad_alloc, and what change throws. The lock was then released, and the file is
///          unchanged unless memory ran out after the platform had written it.
/// Units:   lockLimit limits the wait for the lock only; negative waits without limit, 0 does not
///          wait.
/// Blocks:  while another writer holds the lock. With a limit, the lock is tried every 10 ms,
///          because flock(2) has no time limit; such a caller is not listed among those who wait
///          (RunLock::users), and one that waits without limit gets the lock before it.
KOVA_NODISCARD Update updateSection(const std::string &path, const std::string &prefix, int id,
                                    const std::string &token,
                                    const std::function<bool(OptionMap &)> &change,
                                    Millis lockLimit = Millis(-1), Error *error = nullptr);

} // namespace KOVA::Backup::Service

#pragma GCC visibility pop

#endif
