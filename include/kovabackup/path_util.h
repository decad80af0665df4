#ifndef KOVABACKUP_PATH_UTIL_H
#define KOVABACKUP_PATH_UTIL_H

/// @file Paths: path algebra, the directory tree in which processes meet, and recursive removal.
///
///     const std::string dir = Path::createIpcTempPath("import", 0700);   // /tmp/kovabackup/import
///     if (dir.empty()) return false;                                     // logged already
///     const std::string list = Path::join(dir, "files/list");            // .../import/files/list
///     Path::basename(list);                                              // "list"
///     ...
///     return removeAll(dir);
///
/// The path algebra (dirname to relative) works on the bytes of its arguments. "/" is the only
/// separator, and the file system is never accessed. Neither "." nor ".." is resolved, apart from
/// the two rules of join for a lone ".". An argument may be the same string or vector to which the
/// result is assigned.
///
/// Failure:   by return value; only std::bad_alloc is thrown.
/// errno:     as the last system call left it, unless said otherwise.
/// Log:       createIpcTempPath, createIpcLockFile and removeAll, under the module path
///            "path/path_util"; no other function logs.
/// Threads:   any number of threads at the same time, except removeAll: one thread at a time.
/// Signals:   no function here is async-signal-safe.
/// Process:   removeAll keeps the path of its first failure in a process-wide variable.
///
/// Programs that include <libgen.h>, before or after this header, get the same Path::basename. This
/// header does not change the meaning of their own calls of basename(char *).

#include "kovabackup/nodiscard.h"

#include <string>
#include <vector>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Path {

/// The path without its last component, as POSIX dirname() returns it (dirname(3)).
///     dirname("/a/b/") == "/a"   dirname("a") == "."   dirname("/") == "/"   dirname("") == "."
/// path ends at its first NUL byte.
/// Errors: std::bad_alloc when the path cannot be copied.
std::string dirname(const std::string &path);

// <libgen.h> defines basename as a macro for __xpg_basename. The macro is suspended here, so that
// the declaration keeps its name; the function below serves callers whose Path::basename the macro
// turns into Path::__xpg_basename.
#pragma push_macro("basename")
#undef basename

/// The last component of a path, as POSIX basename() returns it (basename(3)). Trailing slashes are
/// ignored.
///     basename("a/b/") == "b"   basename("/a") == "a"   basename("/") == "/"   basename("") == "."
/// path ends at its first NUL byte.
/// Errors: std::bad_alloc when the path cannot be copied.
std::string basename(const std::string &path);

/// Path::basename under the name to which the macro of <libgen.h> expands. Callers write basename.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming): libgen's name
inline std::string __xpg_basename(const std::string &path) {
  return basename(path);
}

#pragma pop_macro("basename")

/// Joins two paths with exactly one "/".
/// Trailing slashes of a and leading slashes of b are dropped; trailing slashes of b are kept. A
/// lone "." on either side counts as empty. If a consists of slashes only, it is the root.
///     join("a/", "/b/") == "a/b/"   join("/", "x") == "/x"    join("", "x") == "x"
///     join(".", "x") == "x"         join("a", "/.") == "a"    join("a", "./x") == "a/./x"
///     join("a/", "") == "a"         join("//", "") == "/"     join("", "/x") == "x"
/// The last result is deliberate: b is always taken as relative, even when a is empty.
std::string join(const std::string &a, const std::string &b);

/// Joins up to seven paths from left to right. a, b and c are always joined; d to g are joined only
/// when they are not empty. Deliberate: because c is joined even when it is empty, a trailing slash
/// of b is dropped, while an empty d to g drops nothing.
///     join("a/", "b/", "", "", "", "", "") == "a/b"
///     join("a", "b", "c/", "", "", "", "") == "a/b/c/"
std::string join(const std::string &a, const std::string &b, const std::string &c,
                 const std::string &d, const std::string &e, const std::string &f,
                 const std::string &g);

/// Joins a range of paths from left to right. An empty range gives ""; a single element is returned
/// unchanged.
///     {"/", "a", "b/"} gives "/a/b/"   {"a/"} gives "a/"   {"a/", ""} gives "a"
std::string join(std::vector<std::string>::const_iterator first,
                 std::vector<std::string>::const_iterator last);

/// Joins all elements from left to right, as the range form does.
std::string join(const std::vector<std::string> &parts);

/// Splits a path into its components. A run of slashes separates like a single slash. A leading "/"
/// is a component of its own; a trailing "/" stays attached to the last name. join restores the
/// path, except for runs of slashes and components that are a lone ".".
///     "/a/b" gives {"/", "a", "b"}   "//a//b/" gives {"/", "a", "b/"}   "a//" gives {"a/"}
///     "//" gives {"/"}               "" gives {}
/// Returns: always true. The components replace the previous contents of out.
bool split(const std::string &path, std::vector<std::string> &out);

/// The component number index of a path, counted from 0 as split orders them; "" when there are too
/// few.
///     token("/a/b", 0) == "/"   token("/a/b", 1) == "a"   token("/a/b", 3) == ""
///     token("a//b", 0) == "a"   token("a//", 0) == "a/"
std::string token(const std::string &path, unsigned int index);

/// The longest run of leading components that both paths share, joined. Trailing slashes of either
/// path are ignored.
///     common("/a/b/c", "/a/b/d") == "/a/b"   common("/a/b/", "/a/b") == "/a/b"
///     common("a", "b") == ""                 common("/a", "b") == ""
/// Deliberate: a path that is only the root shares nothing, so common("/", "/a") and common("/",
/// "/") return "".
std::string common(const std::string &a, const std::string &b);

/// The part of path that follows base, or "" when path is not below base.
///     relative("/a/b/c", "/a") == "b/c"   relative("/a/b/", "/a/") == "b/"
///     relative("/a/b", "/") == "a/b"      relative("/ab", "/a") == ""
/// The result is also "" when path equals base and when base is empty.
std::string relative(const std::string &path, const std::string &base);

/// Makes a path absolute. A path that begins with "/" is returned unchanged; any other is joined to
/// the current directory. Nothing is resolved: absPath("x/../y") ends in "/x/../y". absPath("")
/// returns the current directory.
/// Returns: the absolute path. When the current directory cannot be read, because it was removed or
///          its path is longer than 4094 bytes, a relative path is returned as join("", path)
///          leaves it.
/// Process: reads the current directory, which all threads share.
std::string absPath(const std::string &path);

/// The root under which the processes of the backup services meet.
/// Returns: always "/tmp/kovabackup". The directory need not exist; createIpcTempPath creates it.
std::string getIpcTempPath();

/// Ensures that the root (mode 0755) and the directory root/name exist, and sets their modes
/// exactly, regardless of the umask and of the process that created them.
/// name is one path component. Deliberate: only an empty name and a name that contains "/" are
/// rejected, so "." sets the mode of the root itself and ".." that of /tmp. Never pass a name that
/// comes from outside the program.
/// Returns: root/name, or "" on failure. Directories created before the failing step remain.
/// Errors:  name is empty or contains "/"; mkdir(2) fails with an error other than EEXIST; chmod(2)
///          fails, for example because another user owns the directory. A file in place of the
///          directory is not detected, because EEXIST is accepted.
/// errno:   as the failing call left it; not meaningful for a rejected name.
/// Log:     one LOG_ERR line: 387 for a rejected name, 395 and 402 for mkdir and chmod of the root,
///          409 and 414 for mkdir and chmod of the directory.
/// Threads: any; several threads and processes may race for the same name.
/// Units:   mode is a set of permission bits and may include the set-id and sticky bits.
std::string createIpcTempPath(const std::string &name, unsigned int mode);

/// Opens the lock file "/tmp/kovabackup/lock/<name>" for reading and writing, and creates it if it
/// does not exist. Its directory has mode 0770. The function takes no lock; call flock(2) on the
/// descriptor. Leading slashes of name are dropped. A name with inner slashes refers to a
/// subdirectory, which must exist.
/// Returns: the descriptor, or -1 on failure. An existing file keeps its content; a new file has
///          mode 0666 less the umask.
/// Owns:    the caller closes the descriptor.
/// Process: the descriptor is deliberately not close-on-exec, so that a caller can pass a lock on
///          to a program. Children that SubProcess starts do not inherit it; other children do,
///          unless the caller sets FD_CLOEXEC.
/// errno:   as the failing call left it.
/// Log:     as createIpcTempPath when the directory fails; nothing when open(2) fails.
KOVA_NODISCARD int createIpcLockFile(const std::string &name);

} // namespace Path

namespace ConfigPath {

/// The first component of a path of the form "/share/rest"; "" for a path of any other form.
///     shareName("/music/a/b") == "music"   shareName("/music") == "music"
///     shareName("//x") == ""               shareName("music/a") == ""
std::string shareName(const std::string &path);

/// The part that follows "/share/" in a path of that form, unchanged; "" when nothing follows or
/// the path has another form.
///     shareRelativePath("/music/a/b") == "a/b"   shareRelativePath("/music/a/") == "a/"
///     shareRelativePath("/music/") == ""         shareRelativePath("//x") == "x"
std::string shareRelativePath(const std::string &path);

} // namespace ConfigPath

/// Removes a path and, if it is a directory, everything below it. Symbolic links are removed and
/// never followed, even when path itself is one. The walk stays on the file system of path. Use
/// removeAll only on trees that no other process is changing: it does not guard against an entry
/// that is replaced by a link after the walk has examined it and before the walk enters it.
/// Returns: true when no removal failed. A missing path, an empty path and an entry that vanishes
///          during the walk do not count as failures. Deliberate: the result of the walk itself is
///          ignored, so removeAll also returns true for a path that cannot be examined, and for a
///          walk that ends early because descriptors or memory run out. Callers who need certainty
///          check whether the path still exists.
/// Errors:  an entry cannot be removed, for example because its path is longer than PATH_MAX. The
///          walk continues past it and removes everything else.
/// errno:   not meaningful.
/// Log:     one LOG_ERR line for the first entry that could not be removed, 32 for rmdir(2) or 39
///          for unlink(2); nothing for later entries.
/// Threads: one at a time, because the path of the first failure is a process-wide variable.
/// Blocks:  until the walk is complete, however large the tree is.
/// Process: up to 20 directories are open at a time. The walk recurses and uses about 400 bytes of
///          stack per level: with the usual stack of 8 MiB, a tree of more than 20,000 levels
///          crashes the process.
KOVA_NODISCARD bool removeAll(const std::string &path);

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
