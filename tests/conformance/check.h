#ifndef KOVABACKUP_TESTS_CONFORMANCE_CHECK_H
#define KOVABACKUP_TESTS_CONFORMANCE_CHECK_H

/// @file Checks of a platform's libraries through their C interface, and the program's verdicts.
///
/// Each check runs in a process and an empty working directory of its own, so one that crashes,
/// hangs or leaves something behind does not touch the others. It passes by returning.

#include <string>
#include <vector>

namespace KovaConformance {

struct Check {
  const char *name;
  const char *claim; ///< what holds when it passes
  void (*run)();
};

std::vector<Check> coreChecks();
std::vector<Check> sectionChecks();
std::vector<Check> sdkChecks();
std::vector<Check> netsdkChecks();

/// @name Ends of a check
/// They end the check's process. A note tells of something that the library works without.
/// @{
[[noreturn]] void fail(const std::string &why);
[[noreturn]] void skip(const std::string &why);
[[noreturn]] void note(const std::string &why);
/// @}

/// Fails with why unless holds.
inline void expect(bool holds, const std::string &why) {
  if (!holds) {
    fail(why);
  }
}

/// Fails unless the platform's error record names an error: a code, and a file that is not null.
void expectErrorRecorded(const std::string &after);

/// Fails unless the code of the platform's last error is this one.
void expectErrorCode(int code, const std::string &after);

std::string inQuotes(const std::string &text);

/// The text that a platform wrote into a buffer: what stands before the first NUL.
std::string textIn(const std::string &buffer);

/// The other process of core.secret.other-process: whether it can decrypt what the first encrypted.
bool decryptsTheSecret(const std::string &cipher);

/// Runs a check and prints its verdict. Returns: the verdict's first letter.
char runCheck(const Check &check, const std::string &scratch);

} // namespace KovaConformance

#endif
