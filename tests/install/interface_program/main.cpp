// Calls every public function and member once, so that a name that is missing in an installed
// header or in the library, or has another signature, fails the build or the start.

#include "check.h"

#include <iostream>

namespace {
int failures = 0;
}

void check(bool held, const char *what) {
  if (!held) {
    std::cerr << "not as it should be: " << what << '\n';
    ++failures;
  }
}

int main() {
  callTextAndPaths();
  callProcesses();
  callStorage();
  callOptions();
  if (failures != 0) {
    return 1;
  }
  std::cout << "the whole interface works\n";
  return 0;
}
