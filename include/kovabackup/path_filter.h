#ifndef KOVABACKUP_PATH_FILTER_H
#define KOVABACKUP_PATH_FILTER_H

/// @file Which paths a backup leaves out, by shell-like include and exclude patterns.
///
///     PathFilter filter;
///     filter.addExcludePattern("/volume1/photo/**");
///     filter.addIncludePattern("/volume1/photo/**.raw");
///     filter.filterOut("/volume1/photo/2021/a.jpg");   // true: left out
///     filter.filterOut("/volume1/photo/2021/a.raw");   // false: an include pattern always wins
///     filter.filterOut("/volume1/music/b.mp3");        // false: nothing excludes it
///
/// The filter answers two separate questions. Is this very path left out? filterOut answers that.
/// Can a pattern apply to anything below this folder? getIncludePattern and getExcludePattern
/// answer that; a program that walks a tree asks them before it skips an excluded folder with its
/// contents.
///
/// A pattern is a byte string that must match the entire path, from the first byte to the last:
///
///     *    any bytes except "/", or none        /a/*.c      /a/.c  /a/b.c    not  /a/b/c.c
///     **   any bytes, "/" included, or none     /a/**       /a/  /a/b/c      not  /a
///     ?    exactly one byte except "/"          /a?b        /axb             not  /a/b  /ab
///     \x   the byte x itself                    /a/\*       /a/*             not  /a/b
///     else the byte itself, case-sensitive      /a/[bc]     /a/[bc]          not  /a/b
///
/// "**" needs no "/" on either side: "**.log" matches every path that ends in ".log". Three or more
/// stars in a row act like two. A pattern that ends in an unescaped "\" matches nothing. No pattern
/// is rejected. Patterns, paths and bases end at their first NUL byte.
/// docs/path-filter-patterns.md lists the rules as a table of patterns, paths and results.
///
/// Ownership: the filter owns its patterns.
/// Failure:   std::bad_alloc, which leaves the filter unchanged, and std::out_of_range for a base
///            without "/" (see getIncludePattern). Nothing else fails, and nothing is logged.
/// errno:     not meaningful.
/// Threads:   nothing is locked. Any number of threads may query a filter at the same time, as long
///            as none adds a pattern.
/// Signals:   no function here is async-signal-safe.
/// Process:   no process-wide state that a caller could observe. Each thread remembers the folders
///            of its last queries, in less than 16 KB that it has until it ends.
/// Cost:      the filter is designed for thousands of patterns. It indexes each pattern by its
///            literal parts and compares a path only with the patterns whose literal prefix,
///            literal suffix and longest literal infix the path contains. A pattern without literal
///            parts, such as "**" or "*?", is compared with every path. Adding a pattern takes time
///            and memory in proportion to its length, about 300 bytes for a typical pattern.
///            filterOut takes time in proportion to the length of the path for each pattern that it
///            compares, whatever their wildcards, so no path and no pattern can slow it down out of
///            proportion. It allocates memory only for a path of 16 KiB or more that it compares
///            with a pattern of more than 64 bytes. Paths in the order of a walk are filtered
///            fastest: what the filter finds out about a folder is kept for the next path in it.
///            getIncludePattern and getExcludePattern take time in proportion to the length of base
///            for each byte of a pattern. Their recursion is as deep as the pattern has stars, but
///            never deeper than base has bytes.

#include <cstddef>
#include <list>
#include <memory>
#include <string>
#include <type_traits>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

class PathFilterPrivate;

/// Holds include and exclude patterns, and answers which paths they leave out.
class PathFilter {
public:
  /// Creates a filter without patterns, which leaves nothing out.
  PathFilter();

  /// Releases the patterns.
  ~PathFilter();

  PathFilter(const PathFilter &) = delete;
  PathFilter &operator=(const PathFilter &) = delete;

  /// Appends a pattern to the include list. Duplicates are kept.
  /// Returns: always true. std::bad_alloc leaves the list unchanged.
  bool addIncludePattern(const std::string &pattern);

  /// Moves all patterns into the include list by merging the two lists, as std::list::merge does;
  /// both are expected to be in byte order. Deliberate: the patterns are merged and not appended.
  /// Their order has no effect on filterOut; it is visible in the results of getIncludePattern.
  /// Returns: always true, with patterns empty. std::bad_alloc leaves both lists unchanged.
  bool addIncludePattern(std::list<std::string> &patterns);

  /// Several texts in braces do not compile: two of them would be taken for the beginning and the
  /// end of one text. Pass a list.
  template <std::size_t kCount>
  typename std::enable_if<(kCount > 1), bool>::type
  addIncludePattern(const char *const (&patterns)[kCount]) = delete;

  /// Appends a pattern to the exclude list. Duplicates are kept.
  /// Returns: always true. std::bad_alloc leaves the list unchanged.
  bool addExcludePattern(const std::string &pattern);

  /// Moves all patterns into the exclude list by the same merge.
  /// Returns: always true, with patterns empty. std::bad_alloc leaves both lists unchanged.
  bool addExcludePattern(std::list<std::string> &patterns);

  /// Several texts in braces do not compile: two of them would be taken for the beginning and the
  /// end of one text. Pass a list.
  template <std::size_t kCount>
  typename std::enable_if<(kCount > 1), bool>::type
  addExcludePattern(const char *const (&patterns)[kCount]) = delete;

  /// Checks whether a path is left out: an exclude pattern matches it and no include pattern does.
  /// Whether a folder matches is independent of whether anything below it matches: "/a/**" leaves
  /// out "/a/b" and "/a/b/c" but not "/a", and "/a" leaves out only "/a".
  /// Returns: true when path is left out.
  bool filterOut(const std::string &path);

  /// Lists the include patterns that can match base or anything below it. Each is rewritten to
  /// start at the last component of base. With the base "/v/s/dir":
  ///
  ///     /v/s/dir/sub/*.txt   gives  /dir/sub/*.txt
  ///     /v/s/dir             gives  /dir
  ///     /v/**/*.log          gives  /dir/**/*.log
  ///     /v/other/x           gives  nothing
  ///
  /// An empty result means that no include pattern applies to base or below it. A pattern in the
  /// result need not match any file that exists. base must not end in "/": a pattern would then
  /// have to contain that slash twice.
  /// Deliberate oddities:
  /// A "**" consumes the rest of base and is kept, so "/v/**.log" gives "/dir/**.log".
  /// A "*" that ends the pattern within the last component gives that component followed by "*", so
  /// "/v/s/d*" gives "/dir*".
  /// When a "*" inside the pattern consumes the end of base, the part after the "*" follows the
  /// component unchanged, so "/v/s/d*x" gives "/dirx".
  /// Returns: always true. With an empty base, out becomes a copy of the complete list. Otherwise
  ///          the patterns found are appended to out, in list order.
  /// Errors:  std::out_of_range, with the text "basic_string::substr", for a base that is not empty
  ///          and contains no "/", even when the list is empty. That exception and std::bad_alloc
  ///          leave out unchanged.
  bool getIncludePattern(std::list<std::string> &out, const std::string &base);

  /// Lists the exclude patterns, in the same way as getIncludePattern lists the include patterns.
  bool getExcludePattern(std::list<std::string> &out, const std::string &base);

private:
  std::unique_ptr<PathFilterPrivate> private_;
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
