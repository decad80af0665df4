#ifndef KOVAPLATFORM_SUPPORT_FAILURE_H
#define KOVAPLATFORM_SUPPORT_FAILURE_H

/// @file How a function of the stand-ins fails: it records one code with the place where the
/// failure was found, and returns what its caller is to see.
///
///     return fail({KLIBC_ERR_NO_FILE, kFile});                // -1
///     return fail({KLIBC_ERR_NO_SECTION, kFile}, 0);          // 0
///     return fail({KLIBC_ERR_READ, kFile}, false);            // false
///
/// A function that passes a failure on records nothing more: the record names its origin.
///
/// Results, codes and lines are all integers. Code, file and line therefore make one argument of a
/// type of its own, so that a call that mixes them up does not compile.
///
/// errno:  left as the failing system call set it.

#include "kovaplatform/kovacore.h"

#include <type_traits>

namespace KovaPlatform {

/// A line of a source file.
enum class SourceLine : int {};

/// What the error record is to say: a code, and the source file and line that found the failure.
/// The line is by default the one on which the Failure is written. The file is the name that is
/// recorded, such as "core/crypt.cpp": a literal of each source, because __FILE__ depends on the
/// folder in which the compiler runs.
struct Failure {
  constexpr Failure(int failureCode, const char *sourceFile,
                    SourceLine sourceLine = SourceLine{__builtin_LINE()}) noexcept
      : code(failureCode), file(sourceFile), line(sourceLine) {}

  int code;
  const char *file;
  SourceLine line;
};

/// Records the failure. Returns result.
template <typename Result = int>
Result fail(const Failure &failure, Result result = -1) noexcept {
  KLIBCErrSetEx(failure.code, failure.file, static_cast<int>(failure.line));
  return result;
}

/// Runs the body of a C function. An exception ends here, because a C caller cannot catch one. The
/// bodies throw nothing of their own, so an exception means that memory ran out.
/// Returns: what body returns, or result after recording noMemory.
template <typename Body>
std::invoke_result_t<Body> guarded(const Failure &noMemory, std::invoke_result_t<Body> result,
                                   Body body) noexcept {
  try {
    return body();
  } catch (...) {
    return fail(noMemory, result);
  }
}

} // namespace KovaPlatform

#endif
