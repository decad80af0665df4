// Calls every public function and member of the first library once. A name that is missing from an
// installed header or from the library, or that has another signature, breaks the build or the
// start of this program.

#include "check.h"

void callTextAndPaths();
void callProcesses();
void callStorage();
void callOptions();

int main() {
  return callAll({callTextAndPaths, callProcesses, callStorage, callOptions});
}
