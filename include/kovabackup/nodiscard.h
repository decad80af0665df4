#ifndef KOVABACKUP_NODISCARD_H
#define KOVABACKUP_NODISCARD_H

/// @file The mark of functions whose result must not be ignored.
///
///     if (!session.destroy()) return false;   // checked
///     (void)session.destroy();                // deliberately ignored: no warning either
///
/// A function has the mark if a caller who ignores its result can lose data, work without the lock
/// that was asked for, miss that a command failed, or believe that something was removed that
/// remains. Functions that always succeed are not marked, and neither are queries,
/// SubProcess::exec, which returns only when it has failed, and OptionMap::unlock. The exception is
/// SessionStore::users: its failure looks like a session that no process uses.
///
/// The warning is -Wunused-result, which g++ and clang++ give by default. A program that is
/// compiled with warnings as errors and must not change yet adds -Wno-error=unused-result.

/// Precedes a declaration, and makes the compiler warn of calls that ignore the result.
///
/// The attribute warn_unused_result of g++ is deliberately not used: with it g++ warns even of a
/// result that is cast to void. The standard attribute is part of C++17. In older standards, g++
/// accepts it silently from version 7 on; clang++ -Wpedantic reports it as an extension, but has an
/// attribute of its own that respects the cast. For all other compilers the macro is empty.
#if __cplusplus >= 201703L
#define KOVA_NODISCARD [[nodiscard]]
#elif defined(__clang__)
#define KOVA_NODISCARD [[clang::warn_unused_result]]
#elif defined(__GNUC__) && __GNUC__ >= 7
#define KOVA_NODISCARD [[nodiscard]]
#else
#define KOVA_NODISCARD
#endif

#endif
