#ifndef KOVABACKUP_TESTS_COUNTS_COUNTED_H
#define KOVABACKUP_TESTS_COUNTS_COUNTED_H

/// @file Operations whose instructions are counted, each on a fixed input.
///
///     void joinTwo(std::size_t bytes) {
///       const std::string name(bytes, 'n');           // what is set up is not counted
///       count([&] { return Path::join("/a", name).size() == bytes + 3; });
///     }
///     constexpr Case kCases[] = {{"Path.join", joinTwo, {10, 100}, 4000, kLinear}};
///
/// The program runs each case at each of its sizes in a process of its own, so no case changes the
/// heap or the caches of another one. It measures nothing itself: scripts/counts runs it under
/// callgrind, which counts the instructions and the system calls inside kovaCounted. Without
/// callgrind the program only checks that every case has the right result.
///
/// The first call in a process loads and caches what later calls find, so count makes one call
/// before the one that is counted.

#include <array>
#include <cstddef>
#include <functional>
#include <string>

namespace KovaCounts {

/// One operation. Returns whether its result is right.
using Operation = std::function<bool()>;

/// Bounds of the growth: the cost at size 4n divided by the cost at size n. It is 4 for an
/// operation that does the same work for each byte or entry, and 16 for a quadratic one. The rest
/// is for allocators and buffers, which grow in leaps.
constexpr double kLinear = 4.6;
/// For ordered containers: n log n has a ratio of 4.8 at n = 1000.
constexpr double kLinearLog = 5.6;
/// For the only operation that is allowed to be quadratic, because the C library is.
constexpr double kQuadratic = 17;
/// For what must not depend on the size.
constexpr double kConstant = 1.2;
/// For what may depend on the logarithm of the size.
constexpr double kNearlyConstant = 1.5;

struct Case {
  const char *name;
  void (*run)(std::size_t size);
  /// The sizes whose counts are compared with the baseline. Zeros at the end are ignored; with
  /// zeros alone the case has no size and runs once, with size 0.
  std::array<std::size_t, 4> sizes = {};
  /// The growth from this size to four times this size is compared with bound. 0: it is not.
  std::size_t from = 0;
  double bound = kLinear;
};

struct Cases {
  const Case *first;
  std::size_t count;

  const Case *begin() const { return first; }
  const Case *end() const { return first + count; }
};

/// The cases of an array.
template <std::size_t N>
constexpr Cases casesOf(const Case (&cases)[N]) {
  return {cases, N};
}

/// Runs the operation once, and then once more inside kovaCounted. Each case calls this or
/// countOnce exactly once. A wrong result ends the process with a message.
void count(const Operation &operation);

/// The same without the first run, for operations that cannot run twice in a process.
void countOnce(const Operation &operation);

/// Ends the process with a message when a case cannot be set up.
void require(bool holds, const char *what);

/// An empty folder in a private file system in memory, for the files of a case. Skips the case
/// where such a file system cannot be mounted.
std::string scratchFolder();

/// Creates or replaces a file.
void writeFile(const std::string &path, const std::string &text);

/// The text, repeated.
std::string repeated(const std::string &text, std::size_t times);

Cases filterCases();
Cases jsonCases();
Cases optionCases();
Cases pathCases();
Cases platformCases();
Cases processCases();
Cases sectionCases();
Cases selfCases();
Cases stringCases();
Cases treeCases();

} // namespace KovaCounts

#endif
