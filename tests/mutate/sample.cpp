// A program with one test of its own, for mutate_test.py: it notices a wrong limit, and does not
// look whether the secret was wiped. With an argument it says what a child without an environment
// says.
#include <cstdio>
#include <cstring>
#include <unistd.h>

namespace {

bool isSmall(int number) {
  return number < 10;
}

void wipe(char *secret) {
  secret[0] = '\0';
}

bool check() {
  char secret[] = "open sesame";
  const bool right = isSmall(9) && !isSmall(10);
  wipe(secret);
  return right;
}

} // namespace

int main(int argc, char **argv) {
  if (argc > 1) {
    char *const arguments[] = {argv[0], nullptr};
    char *const environment[] = {nullptr};
    ::execve(argv[0], arguments, environment);
  }
  return check() ? 0 : 1;
}
