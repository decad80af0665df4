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
/// Two questions are kept apart. Is this very path left out? filterOut. May a pattern apply to
/// anything below this folder? getIncludePattern and getExcludePattern; a walker that meets an
/// excluded folder asks them before it skips the whole tree.
///
/// A pattern is a byte string that must cover the whole path, from the first byte to the last:
///
///     *    any bytes but "/", none as well     /a/*.c      /a/.c  /a/b.c    not  /a/b/c.c
///     **   any bytes, "/" too, none as well    /a/**       /a/  /a/b/c      not  /a
///     ?    one byte but "/"                    /a?b        /axb             not  /a/b  /ab
///     \x   the byte x itself                   /a/\*       /a/*             not  /a/b
///     else the byte itself, case-sensitive     /a/[bc]     /a/[bc]          not  /a/b
///
/// "**" needs no "/" around it ("**.log" is every path that ends in .log), and three stars or more
/// are as two. A pattern that ends in an odd "\" matches nothing; patterns are never refused.
/// Patterns, paths and bases end at their first NUL byte, if they hold one.
/// docs/path-filter-patterns.md shows the rules as a table of pattern, path and answer.
///
/// Ownership: the filter owns its patterns.
/// Failure:   nothing fails but memory (std::bad_alloc), after which the filter is as it was;
///            and a base without "/" (see getIncludePattern). Nothing is logged.
/// errno:     not meaningful.
/// Threads:   not locked. Any number of threads may ask one filter at a time while none adds.
/// Process:   no process-wide state.
/// Cost:      made for thousands of patterns: they are sorted by their literal parts when they are
///            added, and a path is compared with those alone whose literal beginning, literal
///            ending and longest run in between it holds. Patterns without any, such as "**" or
///            "*?", are compared with every path. Adding takes time and memory in proportion to the
///            pattern, some 300 bytes for a usual one.
///            One comparison mostly ends after a few bytes. However many stars a pattern has, it
///            takes at most the cube of the path's length in steps; its recursion is as deep as the
///            pattern has stars, but never deeper than the path has bytes.

#include <list>
#include <memory>
#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {

class PathFilterPrivate;

class PathFilter {
public:
  /// Makes a filter without patterns: it leaves nothing out.
  PathFilter();
  ~PathFilter();

  PathFilter(const PathFilter &) = delete;
  PathFilter &operator=(const PathFilter &) = delete;

  /// Appends a pattern to the include list. Duplicates are kept.
  /// Returns: always true.
  bool addIncludePattern(const std::string &pattern);

  /// Moves all patterns into the include list by a merge of two lists that are each in byte order,
  /// as std::list::merge does it; deliberately not appended. For filterOut their order is all one,
  /// getIncludePattern shows it.
  /// Returns: always true; patterns is empty then. After std::bad_alloc both lists are as before.
  bool addIncludePattern(std::list<std::string> &patterns);

  /// Appends a pattern to the exclude list. Duplicates are kept.
  /// Returns: always true.
  bool addExcludePattern(const std::string &pattern);

  /// Moves all patterns into the exclude list, as the include list's twin does.
  /// Returns: always true; patterns is empty then. After std::bad_alloc both lists are as before.
  bool addExcludePattern(std::list<std::string> &patterns);

  /// Tells whether a path is left out: no include pattern matches it and an exclude pattern does.
  /// Matching a folder says nothing about what lies below it, and the other way round: "/a/**"
  /// leaves out "/a/b" and "/a/b/c" but not "/a", and "/a" leaves out nothing but "/a".
  /// Returns: true when path is left out.
  bool filterOut(const std::string &path);

  /// Lists the include patterns that can apply to base or below it, each begun anew at the last
  /// component of base. With the base "/v/s/dir":
  ///
  ///     /v/s/dir/sub/*.txt   gives  /dir/sub/*.txt
  ///     /v/s/dir             gives  /dir
  ///     /v/**/*.log          gives  /dir/**/*.log
  ///     /v/other/x           gives  nothing
  ///
  /// Nothing found means that no include pattern applies in the tree; what is found may still match
  /// nothing that exists. base must not end in "/", or patterns would have to have the slash twice.
  /// Deliberate oddities: a "**" takes what is left of base and stays, so "/v/**.log" gives
  /// "/dir/**.log"; a "*" that ends the pattern within the last component gives
  /// that component and "*" ("/v/s/d*" gives "/dir*"); where a "*" in the middle takes the end of
  /// base, what follows it is put after the component as it is ("/v/s/d*x" gives "/dirx").
  /// Returns: always true. With an empty base out becomes a copy of the whole list, else what is
  ///          found is appended to it, in list order.
  /// Errors:  a base that is not empty and has no "/" throws std::out_of_range with the text
  ///          "basic_string::substr", whether or not a pattern applies. out is untouched then, and
  ///          likewise after std::bad_alloc.
  bool getIncludePattern(std::list<std::string> &out, const std::string &base);

  /// As getIncludePattern, on the exclude list.
  bool getExcludePattern(std::list<std::string> &out, const std::string &base);

private:
  std::unique_ptr<PathFilterPrivate> private_;
};

} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
