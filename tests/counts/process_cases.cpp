// The description of a command. The size is the number of arguments or variables unless a comment
// says otherwise.

#include "kovabackup/subprocess.h"

#include "tests/counts/counted.h"

namespace KovaCounts {
namespace {

using KOVA::Backup::SubProcess;

void arguments(std::size_t number) {
  count([&] {
    SubProcess command("/bin/true");
    for (std::size_t i = 0; i < number; ++i) {
      command.addArg("argument");
    }
    return command.toString().size() == 9 + number * 9;
  });
}

void formatted(std::size_t number) {
  count([&] {
    SubProcess command("/bin/true");
    for (std::size_t i = 0; i < number; ++i) {
      command.addFormatArg("--level=%d", 7);
    }
    return command.toString().size() == 9 + number * 10;
  });
}

void setVariables(SubProcess &command, std::size_t number) {
  for (std::size_t i = 0; i < number; ++i) {
    command.setEnv("NAME" + std::to_string(100000 + i), "value");
  }
}

void variables(std::size_t number) {
  count([&] {
    SubProcess command("/bin/true");
    setVariables(command, number);
    return command.toString() == "/bin/true";
  });
}

// exec prepares the process, and then fails because there is no such program. It logs each
// argument.
void execArguments(std::size_t number) {
  (void)scratchFolder(); // without a private /tmp it would write to the system's log
  SubProcess command("/nonexistent");
  for (std::size_t i = 0; i < number; ++i) {
    command.addArg("argument");
  }
  countOnce([&] { return !command.exec(); });
}

// setenv(3) compares the name with those of all variables before it.
void execVariables(std::size_t number) {
  (void)scratchFolder();
  SubProcess command("/nonexistent");
  setVariables(command, number);
  countOnce([&] { return !command.exec(); });
}

constexpr Case kCases[] = {
    {"SubProcess.arguments", arguments, {10, 1000}, 1000},
    {"SubProcess.formatted", formatted, {10, 1000}, 1000},
    {"SubProcess.variables", variables, {10, 1000}, 1000, kLinearLog},
    {"SubProcess.exec.arguments", execArguments, {10, 100}, 500},
    {"SubProcess.exec.variables", execVariables, {10, 100}, 200, kQuadratic},
};

} // namespace

Cases processCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
