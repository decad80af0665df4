#ifndef KOVABACKUP_OPTION_MAP_H
#define KOVABACKUP_OPTION_MAP_H

/// @file Typed options of one object, kept as one section of a section file.
///
///     OptionMap task;                                     // a new task gets an id of its own
///     task.setLockToken("task.conf");
///     task.optSectionCreate("/etc/backup/task.conf", "task", true);    // [task1]
///     task.optSet("name", "nightly");
///     task.optSet("password", "open sesame", true);       // kept and written as cipher text
///     task.optSectionSave();
///
///     OptionMap again;                                    // any process, any time later
///     if (!again.optSectionLoad("/etc/backup/task.conf", "task", 1)) return false;
///     again.optString("name", "");                        // "nightly"
///     again.optSecret("password", "");                    // "open sesame"
///
/// The file, which people may edit by hand as well:
///
///     # text before the first section belongs to none
///     [task1]
///     name="nightly"
///     password="kf8Zr3w..."
///     retries=3
///     paths=["/volume1/photo","/volume1/music"]
///
/// A section begins with its header line and runs to the next line that begins with "[". An option
/// is a line key=value, split at its first "="; the value is one JSON text. Blanks (space, tab, CR,
/// LF, no others) around lines, keys and values do not count. Lines whose key begins with "#" and
/// lines without "=" are skipped. The last of equal keys counts. What a comment inside a section
/// becomes when the section is saved is the platform's choice; what stands outside is kept.
///
/// States: a map is unbound at first and after optClear. optSectionLoad and optSectionCreate bind
/// it to a section; optSectionLoad also marks it loaded when it found the section. Saving and
/// removing need a bound map, creating one that is not loaded. Values can be set and read always.
///
/// Lock:      writers of one file exclude each other when their maps have the same lock token
///            (setLockToken). A map without a token writes unlocked. Loading and listing never
///            lock; the platform replaces files whole, so that a reader sees the old or the new
///            content. A save writes all options of the map: what another process saved in the
///            same section between this map's load and its save is replaced. Hold lock() by a
///            second map with another token around both when that matters.
/// Secrets:   an option is secret by the caller's choice at each call; the map keeps no mark. The
///            buffers in which this class decrypts are wiped; the strings that it hands out are
///            the caller's to wipe.
/// Ownership: the map owns its values and its binding. It does not own a lock that it took: see
///            lock. Copies have the same values, binding, token and lock descriptor.
/// Failure:   by return value. Thrown are std::bad_alloc, and Json::LogicError by a getter whose
///            type the stored value cannot be converted to (at the getters).
/// errno:     not meaningful.
/// Log:       module path "option_map", LOG_ERR; at each declaration what it writes.
/// Threads:   one thread per map; maps are independent.
/// Process:   no process-wide state but the open descriptor of a held lock.

#include <iosfwd>
#include <list>
#include <memory>
#include <string>

namespace KOVA {
namespace Backup {
class OptionMapPrivate; // stands before the pragma: it is not exported
}
} // namespace KOVA

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

class OptionMap {
public:
  /// An unbound map without values, token and lock.
  OptionMap();

  /// A copy: values, binding, loaded flag, lock token and the number of the lock descriptor.
  /// Owns: of a map that holds its lock and its copies, one may unlock, and that for all of them;
  ///       the others must not lock or unlock any more, since they still record the descriptor.
  OptionMap(const OptionMap &other);
  OptionMap &operator=(const OptionMap &other);

  /// Deliberately leaves a held lock held and its descriptor open: unlock first.
  ~OptionMap();

  /// Makes target a copy of this map, as the copy constructor does. target may be this map.
  /// Returns: true.
  bool optCloneTo(OptionMap &target) const;

  /// @name Getters
  /// An absent key gives def, or false and leaves out or buf alone. A key is present whatever its
  /// type. Another type than the stored one is converted as the JSON library does it:
  ///
  ///     stored             to text              to int, long long       to bool
  ///     text               itself               throws                  throws
  ///     int, long long     its decimal form     itself; throws when     whether it is not 0
  ///                                             out of range
  ///     bool               "true" or "false"    1 or 0                  itself
  ///     null               ""                   0                       false
  ///     real               17 digits or fewer   cut; throws when        whether it is not 0
  ///                                             out of range
  ///     list, object       throws               throws                  throws
  ///
  /// What is thrown is Json::LogicError; out and buf are then as before. A real keeps its value and
  /// not its spelling, here and in the JSON form: 2.9 gives "2.8999999999999999".
  /// @{

  /// The option as text.
  std::string optString(const std::string &key, const std::string &def) const;

  /// The option's clear text. def is returned as it is.
  /// Errors: a text that the platform cannot decrypt gives "", and so does the stored text "",
  ///         for which the platform is not asked.
  /// Log:    128 "calloc: ..." or 132 "KLIBCCryptSzDecrypt: ..." when it fails.
  std::string optSecret(const std::string &key, const std::string &def) const;

  int optInt(const std::string &key, int def) const;
  bool optBool(const std::string &key, bool def) const;

  /// The option as text, or its clear text when secret.
  /// Returns: whether the key is present; true, with "", also when decryption fails (optSecret).
  bool optGet(const std::string &key, std::string &out, bool secret = false) const;

  /// The same into a buffer of size bytes, cut silently to size - 1 bytes and always ended by a
  /// NUL; a size of 0 writes nothing. Not secret, the value must be text: any other type throws.
  /// Text with a NUL byte in it ends there.
  bool optGet(const std::string &key, char *buf, unsigned int size, bool secret = false) const;

  bool optGet(const std::string &key, int &out) const;
  bool optGet(const std::string &key, long long &out) const;
  bool optGet(const std::string &key, bool &out) const;

  /// The elements of a list, each as text; out is replaced. A value that is neither list nor
  /// object has no elements; of an object they are the members' values.
  bool optGet(const std::string &key, std::list<std::string> &out) const;

  /// @}

  /// @name Setters
  /// Each replaces what the key held, of whatever type, and returns true. Any byte string can be
  /// key or text in memory and in the JSON form; which keys a file takes: optSectionExport. A
  /// number of another type (long, unsigned, double) fits none of them better than the others and
  /// does not compile: cast it.
  /// @{

  /// Stores text, NUL bytes included, or its cipher text when secret.
  /// Errors: a text that cannot be encrypted is stored as "", and true is returned all the same.
  ///         A secret ends at its first NUL byte.
  /// Log:    148 "calloc: ..." or 152 "KLIBCCryptSzDecrypt: ..." (deliberately that name) when
  ///         encryption fails.
  bool optSet(const std::string &key, const std::string &value, bool secret = false);

  /// The same for text that ends at its NUL. value must not be null.
  bool optSet(const std::string &key, const char *value, bool secret = false);

  bool optSet(const std::string &key, int value);
  /// Every value is kept in memory and in the JSON form; a section takes none below -2147483648
  /// or above 4294967295 (optSectionExport).
  bool optSet(const std::string &key, long long value);
  bool optSet(const std::string &key, bool value);
  bool optSet(const std::string &key, const std::list<std::string> &value);

  /// @}

  /// Removes an option.
  /// Returns: true when it was there and not null.
  bool optRemove(const std::string &key);

  /// Removes all options and unbinds the map; lock token and lock stay. Returns: true.
  bool optClear();

  bool optIsLoaded() const;

  /// The id of the section to which the map is bound; -1 when it has none or the map is unbound.
  int optSectionGetId() const;

  /// The full name of the section to which the map is bound, id included; "" when unbound.
  std::string optSectionGetName() const;

  /// @name JSON form
  /// The options as one JSON object, compact and on one line; secrets stand in it as cipher text.
  /// Binding, loaded flag and lock are neither shown nor changed. Nothing is logged.
  /// @{

  /// Returns: the text; "null" for a map that never held an option, "{}" for one that is empty
  ///          again.
  std::string optToJsonString() const;

  /// Replaces all options by those of a JSON text. A text that is no object (a list, a number) is
  /// taken too: it is what optToJsonString gives, but no getter finds anything in it, and the next
  /// setter begins a fresh object.
  /// Returns: true when the text was JSON, whole; on false the options are unchanged.
  bool optLoadJsonString(const std::string &text);

  /// Stores the members of a JSON object one by one; members of the same name are replaced whole.
  /// A text that is not JSON, or no object, changes nothing. Returns: true.
  bool optAppendJsonString(const std::string &text);

  /// @}

  /// @name Sections
  /// The section of prefix "task" and id 12 is named "task12"; with an id of -1 it is "task".
  /// Paths are taken as they stand; names are compared exactly.
  /// @{

  /// Clears the map, binds it to a section and reads that. A value that is not JSON, or nested too
  /// deep to stand in an object, loses only its own option.
  /// Returns: true when the section was found and read. On false the map has no values and is not
  ///          loaded, but bound: it can be filled and saved.
  /// Errors:  a file that cannot be opened or does not hold the section (both silent); a name or
  ///          path that is empty (the map is then unbound); a file that cannot be read.
  /// Log:     625 "invalid sec [...]"; 476 or 515 "getline [...]: ..."; 508 "json load failed
  ///          ..." for each value that is lost.
  /// Blocks:  not on a FIFO, which reads as empty when nobody writes and fails when a writer has
  ///          nothing to say; while another process gives up a lease on the file.
  /// The header's last character is deliberately not examined: "[task12x" is task12 as well.
  bool optSectionLoad(const std::string &path, const std::string &prefix, int id);

  /// Writes all options into the section to which the map is bound, under the lock. The section
  /// must exist; the map need not be loaded.
  /// Returns: true when written and unlocked. When only unlocking failed, the file is written.
  /// Errors:  an unbound map; as lock, unlock and optSectionExport without create.
  /// Log:     644 "not bind before save"; those of lock, unlock and optSectionExport.
  /// Blocks:  as lock.
  bool optSectionSave();

  /// Reserves the section of that id under the lock, by adding its header at the file's end, and
  /// binds the map to it. The file is made when absent. Values stay; the first save writes them.
  /// Returns: true when the map is bound to the new section; on false the binding is unchanged.
  /// Errors:  an id below 1, a loaded map, an empty path or prefix, an id that is taken (all
  ///          silent); as lock, unlock and optSectionCreateUniqueId. When only unlocking failed,
  ///          the header stays in the file.
  /// Log:     those of lock, unlock and optSectionCreateUniqueId.
  /// Blocks:  as lock.
  bool optSectionCreate(const std::string &path, const std::string &prefix, int id);

  /// The same with a new id (optSectionGetUniqueId) when withId, else with no id: the section is
  /// named prefix and must not exist.
  bool optSectionCreate(const std::string &path, const std::string &prefix, bool withId);

  /// Removes the section to which the map is bound, under the lock. Values and binding stay.
  /// Returns: true when removed and unlocked. When only unlocking failed, the section is gone.
  /// Log:     709 "not bind before remove"; 719 "rm [...][...]: ..." with the platform's error;
  ///          those of lock and unlock.
  /// Blocks:  as lock.
  bool optSectionRemove();

  /// Writes all options as the section of that full name, without a lock, replacing what it held.
  /// With create a missing file is made (mode 0644 less the umask) and a missing section added.
  /// Errors:  an option that has no form in a section (null, a real that is no whole number, an
  ///          object, an integer below -2147483648 or above 4294967295), a key that is empty, has
  ///          a blank at an end, "=" or a line end in it or "#" or "[" at its begin, a name that is
  ///          empty or has a blank at an end or a line end in it (the platform refuses them; NUL
  ///          bytes are refused here): all before the file is touched. What the platform fails to
  ///          write. A line "=5" that somebody wrote by hand loads under the empty key: remove that
  ///          option before the save.
  /// Log:     667, 687 "unknown type key", 692 "KLIBCSzHashSetValue: ...", 379, 384, 392, 398 or
  ///          408.
  /// A missing file or section that is made good leaves the platform's last error code as it was.
  bool optSectionExport(const std::string &path, const std::string &name, bool create) const;

  /// The ids of the sections whose names begin with prefix, in file order. A name's id is the
  /// number with which its rest begins, as strtol(3) reads it, cut to an int; 0 for none.
  /// Returns: true, with no ids, also when the file does not exist.
  /// Log:     848 "KLIBCSzListAlloc: ..." (ids is unchanged), 860 "KLIBCFileEnumSection[...]: ...".
  static bool optSectionListId(const std::string &path, const std::string &prefix,
                               std::list<int> &ids);

  /// The names of all sections in file order.
  /// Returns: true, with no names, also when the file does not exist.
  /// Log:     887 "KLIBCSzListAlloc: ..." (names is unchanged), 899 "KLIBCFileEnumSection[...]
  ///          failed: ...", 906 for a name that the platform listed but does not give.
  static bool optSectionListName(const std::string &path, std::list<std::string> &names);

  /// Reserves the section of the highest id of this prefix plus 1, without a lock: the caller
  /// holds it. Ids of removed sections come back only when they were the highest.
  /// Returns: the id, 1 or more; -1 on failure, with the file unchanged (an absent one may be
  ///          there, empty, when its header could not be written).
  /// Log:     761 or 771 for the list of sections; 735 "fopen: ..." or 740 "fprintf: ..." for the
  ///          header. A name with a line end or a NUL byte in it, and an id past the largest int,
  ///          count as a failed write.
  /// The file's last line gets a line end when it has none, so that the header stands alone.
  static int optSectionGetUniqueId(const std::string &path, const std::string &prefix);

  /// Reserves the section of a given id in the same way.
  /// Returns: true when the id was free and is reserved; false, silently, when it was taken.
  /// Log:     those of optSectionListId; 735 or 740 for the header.
  static bool optSectionCreateUniqueId(const std::string &path, const std::string &prefix, int id);

  /// Reserves the section of a given name in the same way.
  /// Returns: true when the name was free and is reserved; false, silently, when it was taken.
  /// Log:     those of optSectionListName; 735 or 740 for the header.
  /// A name that is empty or has a blank at an end is reserved too, but no map can save or remove
  /// its section (optSectionExport).
  static bool optSectionCreateUniqueName(const std::string &path, const std::string &name);

  /// @}

  /// Names the lock file that writers of one section file share, under /tmp/kovabackup/lock; a name
  /// with inner slashes needs its directory to exist.
  /// Returns: true when stored; on false the old token stays.
  /// Log:     923 "setLockToken: invalid parameter." for an empty token; 927 "setLockToken: file
  ///          locked already. ..." while the lock is held.
  bool setLockToken(const std::string &token);

  /// Takes the lock of the token; without a token does nothing. Not re-entrant. optSectionCreate,
  /// Save and Remove take it themselves: do not hold it around them.
  /// Returns: true when the lock is held or there is no token.
  /// Errors:  held already; the lock file cannot be opened; flock(2) fails, a signal that
  ///          interrupts the wait (EINTR) included.
  /// Log:     944 "lock: file locked already. ...", 951 "lock: open lock token failed.", 956
  ///          "lock: flock(LOCK_EX) failed. ...".
  /// Owns:    the map holds an open descriptor until unlock, also past its own destruction.
  /// Blocks:  without limit, while another descriptor of the lock file holds the lock; another map
  ///          of this process is another descriptor.
  /// Process: the lock belongs to the open file, and the descriptor is not close-on-exec: a child
  ///          forked meanwhile holds the lock too, until both have closed it or either has
  ///          unlocked. Children that SubProcess starts do not get it.
  bool lock();

  /// Releases the lock and closes its descriptor; without a token does nothing.
  /// Returns: true when released or there is no token. On false after a failing flock(2) the lock
  ///          is still held.
  /// Log:     975 "lock: file released already. ..." (deliberately "lock:"), 980 "unlock:
  ///          flock(LOCK_UN) failed. ...".
  bool unlock();

private:
  std::unique_ptr<OptionMapPrivate> d; // NOLINT(readability-identifier-naming): its name since ever
};

/// Writes the JSON form of the map, with nothing before or after it.
std::ostream &operator<<(std::ostream &os, const OptionMap &map);

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
