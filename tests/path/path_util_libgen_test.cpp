// <libgen.h> turns the word basename into a macro. Path::basename and the caller's own basename
// must both keep their meaning, wherever the include is. It uses no test framework, since the same
// sources are also built and run with each compiler alone, in every language standard.

#include "tests/path/path_util_libgen.h"

#include <cstdio>

namespace {

int failures = 0;

void expect(const std::string &expected, const std::string &actual, const char *who,
            const char *what) {
  if (expected != actual) {
    std::printf("%s include, %s: expected \"%s\", got \"%s\"\n", who, what, expected.c_str(),
                actual.c_str());
    ++failures;
  }
}

// The two functions of libc differ on a trailing slash: POSIX returns "b", <string.h> returns "".
void check(const char *who, const PathUtilLibgen::Caller &caller, const std::string &ownResult) {
  const std::string path = "/a/b/";
  expect("b", caller.qualified(path), who, "Path::basename");
  expect("b", caller.used(path), who, "basename under using namespace");
  expect("b", caller.declared(path), who, "basename under a using declaration");
  char copy[] = "/a/b/";
  expect(ownResult, caller.own(copy), who, "the caller's own basename");
  char second[] = "/a/b/";
  expect(ownResult, caller.ownBesideUsed(second), who, "its own basename under using namespace");
}

} // namespace

int main() {
  check("early", PathUtilLibgen::callerBefore(), "b");
  check("late", PathUtilLibgen::callerAfter(), "b");
  check("no", PathUtilLibgen::callerNever(), "");
  return failures == 0 ? 0 : 1;
}
