#ifndef KOVABACKUP_PATH_UTIL_H
#define KOVABACKUP_PATH_UTIL_H

/// @file Paths: composing and taking apart, the area where processes meet, recursive removal.
///
///     const std::string dir = Path::createIpcTempPath("import", 0700);   // /tmp/kovabackup/import
///     if (dir.empty()) return false;                                     // logged already
///     const std::string list = Path::join(dir, "files/list");            // .../import/files/list
///     Path::basename(list);                                              // "list"
///     ...
///     return removeAll(dir);
///
/// The path algebra (dirname to relative) works on the bytes of its arguments: "/" is the only
/// separator, the file system is never asked, and neither "." nor ".." is resolved, apart from the
/// two rules of join on a lone ".". An argument may be the very string or vector that the result is
/// assigned to.
///
/// Failure:   by return value; nothing is thrown but std::bad_alloc.
/// errno:     left as the last system call left it, unless said otherwise.
/// Log:       createIpcTempPath, createIpcLockFile and removeAll, under the module path
///            "path/path_util"; all others are silent.
/// Threads:   any thread, at the same time too, except removeAll: one thread at a time.
/// Process:   removeAll keeps the path of its first failure in one variable of the process.
///
/// Programs that include <libgen.h>, before this header or after it, get the same Path::basename;
/// their own calls of basename(char *) mean what they meant without this header.

#include <string>
#include <vector>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Path {

/// The path without its last component, as dirname(3) gives it.
///     dirname("/a/b/") == "/a"   dirname("a") == "."   dirname("/") == "/"   dirname("") == "."
/// Errors: std::bad_alloc when the path cannot be copied. A NUL byte ends the path.
std::string dirname(const std::string &path);

// <libgen.h> makes the word basename a macro for __xpg_basename. The declaration is kept out of its
// reach, and a twin stands where a caller's Path::basename leads under the macro.
#pragma push_macro("basename")
#undef basename

/// The last component of a path, as POSIX basename(3) gives it: trailing slashes do not count.
///     basename("a/b/") == "b"   basename("/a") == "a"   basename("/") == "/"   basename("") == "."
/// Errors: std::bad_alloc when the path cannot be copied. A NUL byte ends the path.
std::string basename(const std::string &path);

/// basename, under the name by which programs that include <libgen.h> reach it. Write basename.
// NOLINTNEXTLINE(bugprone-reserved-identifier,readability-identifier-naming): libgen's word
inline std::string __xpg_basename(const std::string &path) {
  return basename(path);
}

#pragma pop_macro("basename")

/// Joins two paths by exactly one "/".
/// Trailing slashes of a and leading slashes of b are dropped; trailing slashes of b stay. A lone
/// "." on either side stands for nothing. A path of slashes only, as a, is the root.
///     join("a/", "/b/") == "a/b/"   join("/", "x") == "/x"    join("", "x") == "x"
///     join(".", "x") == "x"         join("a", "/.") == "a"    join("a", "./x") == "a/./x"
///     join("a/", "") == "a"         join("//", "") == "/"     join("", "/x") == "x"
/// The last one is deliberate: b is always taken as relative, also when a is empty.
std::string join(const std::string &a, const std::string &b);

/// Joins up to seven paths from left to right. a, b and c are always joined, d to g only when they
/// are not empty. Deliberate: because c is joined even when empty, a trailing slash that b left is
/// stripped, while an empty d to g strips nothing.
///     join("a/", "b/", "", "", "", "", "") == "a/b"
///     join("a", "b", "c/", "", "", "", "") == "a/b/c/"
std::string join(const std::string &a, const std::string &b, const std::string &c,
                 const std::string &d, const std::string &e, const std::string &f,
                 const std::string &g);

/// Joins a range of paths from left to right. An empty range gives ""; a single element is
/// returned as it stands.
///     {"/", "a", "b/"} gives "/a/b/"   {"a/"} gives "a/"   {"a/", ""} gives "a"
std::string join(std::vector<std::string>::const_iterator first,
                 std::vector<std::string>::const_iterator last);

/// Joins all elements, as the range form does.
std::string join(const std::vector<std::string> &parts);

/// Takes a path apart. Runs of slashes separate like one; a leading "/" is a component of its own,
/// a trailing one stays at the last name. join puts them together again, but for a lone ".".
///     "/a/b" gives {"/", "a", "b"}   "//a//b/" gives {"/", "a", "b/"}   "a//" gives {"a/"}
///     "//" gives {"/"}               "" gives {}
/// Returns: always true; out holds the components and nothing of what it held before.
bool split(const std::string &path, std::vector<std::string> &out);

/// One component, counted from 0 as split counts them, or "" when there are fewer.
///     token("/a/b", 0) == "/"   token("/a/b", 1) == "a"   token("/a/b", 3) == ""
///     token("a//b", 0) == "a"   token("a//", 0) == "a/"
std::string token(const std::string &path, unsigned int index);

/// The longest run of leading components that both paths share, joined; slashes at the end of
/// either path do not count.
///     common("/a/b/c", "/a/b/d") == "/a/b"   common("/a/b/", "/a/b") == "/a/b"
///     common("a", "b") == ""                 common("/a", "b") == ""
/// Deliberate: the root alone shares nothing, so common("/", "/a") and common("/", "/") are "".
std::string common(const std::string &a, const std::string &b);

/// What is left of a path when base is taken off its front, or "" when the path is not below base.
///     relative("/a/b/c", "/a") == "b/c"   relative("/a/b/", "/a/") == "b/"
///     relative("/a/b", "/") == "a/b"      relative("/ab", "/a") == ""
/// A path equal to base gives "", too, and so does an empty base.
std::string relative(const std::string &path, const std::string &base);

/// The path itself when it begins with "/", else the path joined to the current directory. Nothing
/// is resolved: absPath("x/../y") ends in "/x/../y". absPath("") is the current directory.
/// When the current directory cannot be read (removed, or its path is longer than 4094 bytes), a
/// relative path is returned as join("", path) leaves it.
/// Process: reads the current directory, which all threads share.
std::string absPath(const std::string &path);

/// The root under which the processes of the backup services meet: "/tmp/kovabackup". It need not
/// exist; createIpcTempPath makes it.
std::string getIpcTempPath();

/// Makes sure that the root (mode 0755) and the directory root/name exist, with exactly the given
/// mode whatever the umask was and whoever made them.
/// name is one path component. Deliberate: only an empty name and a "/" are refused, so "." sets
/// the mode of the root itself and ".." that of /tmp; never pass what an outsider chose.
/// Returns: root/name, or "" on failure. Directories made before the failing step stay.
/// Errors:  a bad name; mkdir(2) other than EEXIST; chmod(2), also where another user owns the
///          directory. A file in the directory's place is not noticed: EEXIST is accepted.
/// errno:   as the failing call left it; not meaningful for a bad name.
/// Log:     one LOG_ERR line: 387 bad name, 395 and 402 mkdir and chmod of the root, 409 and 414
///          the same of the directory.
/// Threads: any; several processes may race for one name.
/// Units:   mode holds permission bits, set-id and sticky bits included.
std::string createIpcTempPath(const std::string &name, unsigned int mode);

/// Opens the lock file "/tmp/kovabackup/lock/<name>" for reading and writing and makes it when it
/// is missing, in a directory of mode 0770. No lock is taken; call flock(2) on the descriptor.
/// Leading slashes of name are dropped; a name with inner slashes needs its directory to exist.
/// Returns: the descriptor, or -1. An existing file keeps its content; a new one has mode 0666
///          less the umask.
/// Owns:    the caller closes the descriptor.
/// Process: deliberately not close-on-exec, since a lock may be handed on; children that SubProcess
///          starts do not get it, others do unless the caller sets FD_CLOEXEC.
/// errno:   as the failing call left it.
/// Log:     as createIpcTempPath when the directory fails; none for a failing open(2).
int createIpcLockFile(const std::string &name);

} // namespace Path

namespace ConfigPath {

/// The first component of a path of the form "/share/rest", or "" for a path of another form.
///     shareName("/music/a/b") == "music"   shareName("/music") == "music"
///     shareName("//x") == ""               shareName("music/a") == ""
std::string shareName(const std::string &path);

/// What follows "/share/" in such a path, unchanged, or "" when nothing does.
///     shareRelativePath("/music/a/b") == "a/b"   shareRelativePath("/music/a/") == "a/"
///     shareRelativePath("/music/") == ""         shareRelativePath("//x") == "x"
std::string shareRelativePath(const std::string &path);

} // namespace ConfigPath

/// Removes a path and, when it is a directory, everything below it. Symbolic links are removed,
/// never followed, also when path itself is one. The walk stays on the file system of path. It is
/// meant for trees that no one else is changing in the meantime: an entry swapped for a link
/// between the walk's look and its step into a directory is not guarded against.
/// Returns: true when nothing failed. A missing path, an empty one and an entry that vanishes
///          meanwhile are no failures. Deliberate: the outcome of the walk itself does not count,
///          so a path that cannot even be looked at gives true, and so does a walk that ends early
///          for want of descriptors or memory. Who must know looks whether path is still there.
/// Errors:  past an entry that cannot be removed, also one whose path is longer than PATH_MAX, the
///          walk goes on; all else is removed.
/// errno:   not meaningful.
/// Log:     one LOG_ERR line for the first entry that failed, 32 rmdir or 39 unlink; none for
///          later ones.
/// Threads: one at a time: the path of the first failure is one variable of the process.
/// Process: up to 20 directories are open at a time. The walk descends on the stack, some 400 bytes
///          a level: with the usual 8 MiB, a tree of more than 20,000 levels ends the process.
bool removeAll(const std::string &path);

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
