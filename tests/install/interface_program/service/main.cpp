// Calls every public function and member of the second library once, as the program of the first
// library does.

#include "check.h"

void callCommands();
void callFiles();
void callSessions();
void callTrees();

int main() {
  return callAll({callCommands, callFiles, callSessions, callTrees});
}
