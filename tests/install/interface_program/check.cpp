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

int callAll(std::initializer_list<void (*)()> functions) {
  for (void (*function)() : functions) {
    function();
  }
  if (failures != 0) {
    return 1;
  }
  std::cout << "the complete interface works\n";
  return 0;
}
