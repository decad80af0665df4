#ifndef KOVABACKUP_OPTION_MAP_H
#define KOVABACKUP_OPTION_MAP_H

/// @file Typed options of one object, stored as one section of a section file.
///
///     OptionMap task;                                     // a new task gets its own id
///     if (!task.setLockToken("task.conf")) return false;
///     if (!task.optSectionCreate("/etc/backup/task.conf", "task", true)) return false; // [task1]
///     task.optSet("name", "nightly");
///     task.optSet("password", "open sesame", true);       // stored and written as cipher text
///     if (!task.optSectionSave()) return false;
///
///     OptionMap again;                                    // any process, at any later time
///     if (!again.optSectionLoad("/etc/backup/task.conf", "task", 1)) return false;
///     again.optString("name", "");                        // "nightly"
///     again.optSecret("password", "");                    // "open sesame"
///
/// This is the file, which may also be edited by hand:
///
///     # text before the first section belongs to none
///     [task1]
///     name="nightly"
///     password="kf8Zr3w..."
///     retries=3
///     paths=["/volume1/photo","/volume1/music"]
///
/// A section begins with its header line and ends before the next line that begins with "[". An
/// option is a line key=value, which is split at its first "="; the value is one JSON text. White
/// space around lines, keys and values is ignored; only space, tab, CR and LF count as white space.
/// Lines whose key begins with "#" and lines without "=" are skipped. If a key occurs twice, the
/// last occurrence applies. When a section is saved, the platform decides whether comments inside
/// it are kept; everything outside the section is kept.
///
/// States:    a new map is unbound, and so is a map after optClear. optSectionLoad and
///            optSectionCreate bind it to a section; optSectionLoad also marks it as loaded if it
///            found the section. Saving and removing a section require a bound map; creating one
///            requires a map that is not loaded. Values can be set and read in every state.
/// Lock:      writers of one file exclude each other if their maps have the same lock token
///            (setLockToken). A map without a token writes without a lock. Loading and listing
///            never lock: the platform replaces a file atomically, so a reader sees either the old
///            or the new content. A save writes all options of the map. It therefore overwrites
///            what another process saved in the same section after this map's load. To prevent
///            that, hold the lock() of a second map with another token around both load and save.
/// Secrets:   the caller decides at each call whether an option is secret; the map does not record
///            it. The class wipes the buffers in which it decrypts. The caller must wipe the
///            strings that it receives.
/// Ownership: the map owns its values and its binding. It does not own a lock that it took (see
///            lock). A copy has the same values, binding, token and lock descriptor.
/// Failure:   by return value. Only std::bad_alloc is thrown, and Json::LogicError by a getter that
///            cannot convert the stored value (see the getters).
/// errno:     not meaningful.
/// Log:       LOG_ERR lines under the module path "option_map". Each declaration lists its own.
/// Threads:   one thread per map; maps are independent.
/// Signals:   no function here is async-signal-safe.
/// Process:   no process-wide state except the open descriptor of a held lock.

#include "kovabackup/nodiscard.h"

#include <cstddef>
#include <iosfwd>
#include <list>
#include <memory>
#include <string>
#include <type_traits>

namespace KOVA {
namespace Backup {
class OptionMapPrivate; // declared before the pragma, so that it is not exported

/// Whether a type is none of those that optSet takes. Without this, a call with one would be
/// ambiguous, match no overload, or store a pointer as true.
template <typename Value, typename Plain = typename std::decay<Value>::type>
struct IsUnsupportedOption
    : std::integral_constant<
          bool,
          std::is_floating_point<Plain>::value || std::is_same<Plain, long>::value ||
              std::is_same<Plain, unsigned>::value || std::is_same<Plain, unsigned long>::value ||
              std::is_same<Plain, unsigned long long>::value ||
              std::is_same<Plain, std::nullptr_t>::value ||
              (std::is_pointer<Plain>::value && !std::is_convertible<Plain, const char *>::value) ||
              (std::is_class<Plain>::value && !std::is_convertible<Plain, std::string>::value &&
               !std::is_convertible<Plain, std::list<std::string>>::value &&
               !std::is_convertible<Plain, long long>::value)> {};
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

/// Holds typed options by name, together with the binding to a section and the lock token.
class OptionMap {
public:
  /// Creates an unbound map without values, token or lock.
  OptionMap();

  /// Copies values, binding, loaded flag, lock token and the number of the lock descriptor.
  /// Owns: if the source holds its lock, the copies share it. Any one of them may unlock, which
  ///       releases the lock for all. Afterwards the others must neither lock nor unlock, because
  ///       they still record the closed descriptor.
  OptionMap(const OptionMap &other);

  /// Replaces this map with a copy of other, as the copy constructor makes it. A lock that this map
  /// held stays held, and its descriptor stays open: unlock first. other may be this map.
  OptionMap &operator=(const OptionMap &other);

  /// Releases the values. Deliberately, a held lock stays held and its descriptor stays open:
  /// unlock first.
  ~OptionMap();

  /// Replaces target with a copy of this map, as operator= does. target may be this map.
  /// Returns: always true.
  bool optCloneTo(OptionMap &target) const;

  /// @name Getters
  /// When the key is absent, a getter returns def, or returns false and leaves out or buf
  /// unchanged. A key is present whatever the type of its value. If the stored type differs from
  /// the requested type, the JSON library converts the value:
  ///
  ///     stored             to text              to int, long long       to bool
  ///     text               itself               throws                  throws
  ///     int, long long     its decimal form     itself; throws when     true unless 0
  ///                                             out of range
  ///     bool               "true" or "false"    1 or 0                  itself
  ///     null               ""                   0                       false
  ///     real               at most 17 digits    truncated; throws when  true unless 0
  ///                                             out of range
  ///     list, object       throws               throws                  throws
  ///
  /// The exception is Json::LogicError; it leaves out and buf unchanged. A real keeps its value but
  /// not its spelling, here and in the JSON form: 2.9 becomes "2.8999999999999999".
  /// @{

  /// Returns: the option as text.
  std::string optString(const std::string &key, const std::string &def) const;

  /// Decrypts the option. def is returned unchanged, without decryption.
  /// Returns: the clear text; "" when the platform cannot decrypt the stored text. A stored ""
  ///          gives "" without a call of the platform.
  /// Log:     128 "calloc: ..." or 132 "KLIBCCryptSzDecrypt: ..." when decryption fails.
  std::string optSecret(const std::string &key, const std::string &def) const;

  /// Returns: the option as an int.
  int optInt(const std::string &key, int def) const;

  /// Returns: the option as a bool.
  bool optBool(const std::string &key, bool def) const;

  /// Reads the option as text; if secret is true, decrypts it as optSecret does.
  /// Returns: true when the key is present, even if decryption fails; out is then "".
  /// Log:     as optSecret, if secret is true.
  bool optGet(const std::string &key, std::string &out, bool secret = false) const;

  /// Reads the option as text into a buffer of size bytes, as optGet does into a string. A longer
  /// text is silently cut to size - 1 bytes, and the buffer always ends with a NUL; if size is 0,
  /// nothing is written. Unless secret is true, the value must be text: any other type throws. The
  /// buffer receives the text up to its first NUL byte.
  /// Returns: true when the key is present.
  /// Log:     as optSecret, if secret is true.
  bool optGet(const std::string &key, char *buf, unsigned int size, bool secret = false) const;

  /// Reads the option as an int.
  /// Returns: true when the key is present.
  bool optGet(const std::string &key, int &out) const;

  /// Reads the option as a long long.
  /// Returns: true when the key is present.
  bool optGet(const std::string &key, long long &out) const;

  /// Reads the option as a bool.
  /// Returns: true when the key is present.
  bool optGet(const std::string &key, bool &out) const;

  /// Reads the elements of a list, each as text. They replace the previous contents of out. The
  /// elements of an object are the values of its members; a value of any other type has none, so a
  /// text in the place of a list looks like an empty list.
  /// Returns: true when the key is present, whatever the type of its value.
  bool optGet(const std::string &key, std::list<std::string> &out) const;

  /// @}

  /// @name Setters
  /// Each setter replaces the value of the key, whatever its type, and returns true. In memory and
  /// in the JSON form, any byte string can be a key or a text; optSectionExport lists the keys that
  /// a file accepts. Values of other types do not compile. Cast a long, an unsigned integer or a
  /// double to int or long long, and copy a vector into a list.
  /// @{

  /// Stores a text, including any NUL bytes. If secret is true, stores its cipher text instead; a
  /// secret ends at its first NUL byte.
  /// Errors: if encryption fails, "" is stored, and true is returned nevertheless.
  /// Log:    148 "calloc: ..." or 152 "KLIBCCryptSzDecrypt: ..." (deliberately that name) when
  ///         encryption fails.
  bool optSet(const std::string &key, const std::string &value, bool secret = false);

  /// Stores a NUL-terminated text in the same way. value must not be null.
  /// Errors: as optSet of a std::string.
  /// Log:    as optSet of a std::string.
  bool optSet(const std::string &key, const char *value, bool secret = false);

  /// Stores an int.
  bool optSet(const std::string &key, int value);

  /// Stores a long long. Memory and the JSON form hold every value; a section accepts none below
  /// -2147483648 or above 4294967295 (see optSectionExport).
  bool optSet(const std::string &key, long long value);

  /// Stores a bool.
  bool optSet(const std::string &key, bool value);

  /// Stores a list of texts, in order. An empty list is stored as an empty list.
  bool optSet(const std::string &key, const std::list<std::string> &value);

  template <typename Value>
  typename std::enable_if<IsUnsupportedOption<Value>::value, bool>::type optSet(const std::string &,
                                                                                const Value &) {
    static_assert(!IsUnsupportedOption<Value>::value,
                  "optSet takes texts, int, long long, bool and std::list<std::string>: cast "
                  "numbers, and copy other containers into a list");
    return false;
  }

  /// @}

  /// Removes an option.
  /// Returns: true when the key was present and its value was not null.
  bool optRemove(const std::string &key);

  /// Removes all options and unbinds the map. The lock token and the lock remain.
  /// Returns: always true.
  bool optClear();

  /// Returns: true after a successful optSectionLoad, until optClear or the next optSectionLoad.
  bool optIsLoaded() const;

  /// Returns: the id of the section to which the map is bound; -1 when that section has no id or
  ///          the map is unbound.
  int optSectionGetId() const;

  /// Returns: the full name of the section to which the map is bound, including the id; "" when the
  ///          map is unbound.
  std::string optSectionGetName() const;

  /// @name JSON form
  /// The JSON form is one JSON object (RFC 8259), compact and on one line. It contains secrets as
  /// cipher text. It does not contain the binding, the loaded flag or the lock, and reading it does
  /// not change them. Nothing is logged.
  /// @{

  /// Returns: the JSON text; "null" for a map that never held an option, "{}" for a map that became
  ///          empty again.
  std::string optToJsonString() const;

  /// Replaces all options with those of a JSON text. A JSON text that is not an object, such as a
  /// list or a number, is accepted: optToJsonString then returns it, but no getter finds anything
  /// in it, and the next setter starts a new object.
  /// Returns: true when the complete text is valid JSON; on false the options are unchanged.
  KOVA_NODISCARD bool optLoadJsonString(const std::string &text);

  /// Stores each member of a JSON object as an option. A member replaces an option of the same name
  /// completely; there is no deep merge. A text that is not JSON, or not an object, changes
  /// nothing.
  /// Returns: always true.
  bool optAppendJsonString(const std::string &text);

  /// @}

  /// @name Sections
  /// The section with prefix "task" and id 12 is named "task12"; with an id of -1 it is named
  /// "task". Paths are used as given. Names are compared exactly, with case.
  /// @{

  /// Clears the map, binds it to a section and reads that section. A value that is not JSON, or
  /// that is nested too deeply to be a member of an object, loses only its own option.
  /// Returns: true when the section was found and read. On false the map has no values and is not
  ///          loaded, but it is bound: it can be filled and saved.
  /// Errors:  a file that cannot be opened, is a device or does not contain the section (none of
  ///          these is logged); an empty name or path, after which the map is unbound; a file that
  ///          cannot be read.
  /// Log:     625 "invalid sec [...]"; 476 or 515 "getline [...]: ..."; 508 "json load failed ..."
  ///          for each value that is lost.
  /// Blocks:  while another process releases a lease on the file. A FIFO does not block: it reads
  ///          as empty when it has no writer, and fails when its writer has not written anything
  ///          yet.
  /// The last character of the header is deliberately not examined: "[task12x" matches task12, too.
  KOVA_NODISCARD bool optSectionLoad(const std::string &path, const std::string &prefix, int id);

  /// Writes all options to the section to which the map is bound, under the lock. The section must
  /// exist; the map need not be loaded.
  /// Returns: true when the section was written and the lock was released. If only the release
  ///          failed, the file is written nevertheless.
  /// Errors:  the map is unbound; as lock, unlock and optSectionExport without create.
  /// Log:     644 "not bind before save"; the lines of lock, unlock and optSectionExport.
  /// Blocks:  as lock.
  KOVA_NODISCARD bool optSectionSave();

  /// Reserves the section with the given id under the lock, by appending its header to the file,
  /// and binds the map to it. The file is created if it does not exist. The map keeps its values;
  /// the first save writes them.
  /// Returns: true when the map is bound to the new section; on false the binding is unchanged.
  /// Errors:  id is below 1, the map is loaded, path or prefix is empty, or the id is taken (none
  ///          of these is logged); as lock, unlock and optSectionCreateUniqueId. If only unlock
  ///          failed, the header remains in the file.
  /// Log:     the lines of lock, unlock and optSectionCreateUniqueId.
  /// Blocks:  as lock.
  KOVA_NODISCARD bool optSectionCreate(const std::string &path, const std::string &prefix, int id);

  /// Does the same with a new id (optSectionGetUniqueId) if withId is true. Otherwise the section
  /// has no id: its name is prefix, and it must not exist yet.
  /// Returns: as above.
  /// Errors:  the map is loaded, path or prefix is empty, or the name is taken (none of these is
  ///          logged); as lock, unlock, optSectionGetUniqueId and optSectionCreateUniqueName.
  /// Log:     the lines of these functions.
  /// Blocks:  as lock.
  KOVA_NODISCARD bool optSectionCreate(const std::string &path, const std::string &prefix,
                                       bool withId);

  /// Removes the section to which the map is bound, under the lock. The map keeps its values and
  /// its binding.
  /// Returns: true when the section was removed and the lock was released. If only the release
  ///          failed, the section is removed nevertheless.
  /// Errors:  the map is unbound; the platform cannot remove the section; as lock and unlock.
  /// Log:     709 "not bind before remove"; 719 "rm [...][...]: ..." with the platform's error; the
  ///          lines of lock and unlock.
  /// Blocks:  as lock.
  KOVA_NODISCARD bool optSectionRemove();

  /// Writes all options as the section with the given full name, without a lock, replacing the
  /// section's previous options. With create, a missing file is created (mode 0644 less the umask)
  /// and a missing section is added.
  /// Returns: true when the section was written.
  /// Errors:  an option has no form in a section: null, an object, a real that is not an integer,
  ///          an integer below -2147483648 or above 4294967295. The platform rejects a key: an
  ///          empty key, a key with white space at either end, one that contains "=" or a line end,
  ///          or one that begins with "#" or "[". It also rejects a name that is empty, has white
  ///          space at either end or contains a line end. NUL bytes are rejected in both. All of
  ///          these are detected before the file is changed. Finally, the platform may fail to
  ///          write. An option with an empty key can come from a line such as "=5" in a hand-edited
  ///          file: remove it before the save.
  /// Log:     667, 687 "unknown type key", 692 "KLIBCSzHashSetValue: ...", 379, 384, 392, 398 or
  ///          408.
  /// When a missing file or section is created, the platform's last error code remains what it was
  /// before the call.
  KOVA_NODISCARD bool optSectionExport(const std::string &path, const std::string &name,
                                       bool create) const;

  /// Lists the ids of the sections whose names begin with prefix, in file order. The id of a name
  /// is the number at the start of the part after the prefix, as strtol(3) reads it in base 10,
  /// converted to int; it is 0 if there is none.
  /// Returns: true with the ids in place of the previous contents of ids; also true, with no ids,
  ///          when the file does not exist.
  /// Errors:  the platform cannot list the sections; ids is then empty, or unchanged after 848.
  /// Log:     848 "KLIBCSzListAlloc: ..." or 860 "KLIBCFileEnumSection[...]: ...".
  static bool optSectionListId(const std::string &path, const std::string &prefix,
                               std::list<int> &ids);

  /// Lists the names of all sections in file order.
  /// Returns: true with the names in place of the previous contents of names; also true, with no
  ///          names, when the file does not exist.
  /// Errors:  the platform cannot list the sections; names is then empty, or unchanged after 887.
  /// Log:     887 "KLIBCSzListAlloc: ..." or 899 "KLIBCFileEnumSection[...] failed: ..."; 906 for a
  ///          section that the platform counts but does not name, which is left out.
  static bool optSectionListName(const std::string &path, std::list<std::string> &names);

  /// Reserves the section whose id is the highest id of this prefix plus 1, without a lock: the
  /// caller holds the lock. The id of a removed section is assigned again only if it was the
  /// highest.
  /// Returns: the id, 1 or more; -1 on failure, with the content of the file unchanged. A file that
  ///          did not exist may exist afterwards, empty, if the header could not be written.
  /// Errors:  the platform cannot list the sections; the file cannot be opened or written. A name
  ///          that contains a line end or a NUL byte, and an id above the largest int, count as a
  ///          failed write.
  /// Log:     761 or 771 for the list of sections; 735 "fopen: ..." or 740 "fprintf: ..." for the
  ///          header.
  /// If the last line of the file has no line end, one is added, so that the header is a line of
  /// its own.
  KOVA_NODISCARD static int optSectionGetUniqueId(const std::string &path,
                                                  const std::string &prefix);

  /// Reserves the section with a given id in the same way.
  /// Returns: true when the id was free and is now reserved; false when it was taken, which is not
  ///          logged, and on failure.
  /// Errors:  as optSectionGetUniqueId.
  /// Log:     the lines of optSectionListId; 735 or 740 for the header.
  KOVA_NODISCARD static bool optSectionCreateUniqueId(const std::string &path,
                                                      const std::string &prefix, int id);

  /// Reserves the section with a given name in the same way.
  /// Returns: true when the name was free and is now reserved; false when it was taken, which is
  ///          not logged, and on failure.
  /// Errors:  as optSectionGetUniqueId.
  /// Log:     the lines of optSectionListName; 735 or 740 for the header.
  /// A name that is empty or has white space at either end can be reserved, but no map can save or
  /// remove its section (see optSectionExport).
  KOVA_NODISCARD static bool optSectionCreateUniqueName(const std::string &path,
                                                        const std::string &name);

  /// @}

  /// Sets the lock token: the name, under /tmp/kovabackup/lock, of the lock file that the writers
  /// of one section file share. A name with inner slashes refers to a subdirectory, which must
  /// exist.
  /// Returns: true when the token was stored; on false the previous token remains.
  /// Log:     923 "setLockToken: invalid parameter." for an empty token; 927 "setLockToken: file
  ///          locked already. ..." while the map holds the lock.
  KOVA_NODISCARD bool setLockToken(const std::string &token);

  /// Takes the lock of the token with flock(2); a map without a token takes no lock. The lock is
  /// not re-entrant. optSectionCreate, optSectionSave and optSectionRemove take it themselves: do
  /// not hold it around them.
  /// Returns: true when the map holds the lock or has no token.
  /// Errors:  the map holds the lock already; the lock file cannot be opened; flock(2) fails, for
  ///          example because a signal interrupts the wait (EINTR).
  /// Log:     944 "lock: file locked already. ...", 951 "lock: open lock token failed." or 956
  ///          "lock: flock(LOCK_EX) failed. ...".
  /// Owns:    the map records an open descriptor until unlock; its destructor does not close it.
  /// Blocks:  without limit, while another descriptor of the lock file holds the lock. Another map
  ///          of this process has its own descriptor.
  /// Process: the lock belongs to the open file, and the descriptor is not close-on-exec. A child
  ///          that is forked meanwhile therefore holds the lock as well: it is released when one of
  ///          the two unlocks, or both have closed the descriptor. Children that SubProcess starts
  ///          do not inherit the descriptor.
  KOVA_NODISCARD bool lock();

  /// Releases the lock and closes its descriptor; a map without a token does nothing.
  /// Returns: true when the lock was released or the map has no token. If flock(2) fails, the
  ///          result is false and the map still holds the lock.
  /// Errors:  the map does not hold the lock; flock(2) fails.
  /// Log:     975 "lock: file released already. ..." (deliberately "lock:") or 980 "unlock:
  ///          flock(LOCK_UN) failed. ...".
  bool unlock();

private:
  std::unique_ptr<OptionMapPrivate> d; // NOLINT(readability-identifier-naming): a fixed name
};

/// Writes the JSON form of the map to os, with nothing before or after it.
/// Returns: os.
std::ostream &operator<<(std::ostream &os, const OptionMap &map);

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
