#ifndef KOVABACKUP_TESTS_CONFORMANCE_CHECK_H
#define KOVABACKUP_TESTS_CONFORMANCE_CHECK_H

/// @file Checks of a platform's libraries through their C interface, and the program's verdicts.
///
/// Each check runs in its own process and its own empty working directory, so one that crashes,
/// hangs or leaves something behind does not affect the others. A check passes by returning.

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
/// They end the check's process. A note reports something that the library can do without.
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

/// The text that a platform wrote into a buffer: everything before the first NUL.
std::string textIn(const std::string &buffer);

/// Runs in the other process of core.secret.other-process. Returns whether that process can decrypt
/// what the first one encrypted.
bool decryptsTheSecret(const std::string &cipher);

/// Runs a check and prints its verdict. Returns: the verdict's first letter.
char runCheck(const Check &check, const std::string &scratch);

} // namespace KovaConformance

#endif
