// Calls every public function and member once. A name that is missing from an installed header or
// from the library, or that has another signature, breaks the build or the start of this program.

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
  std::cout << "the complete interface works\n";
  return 0;
}
