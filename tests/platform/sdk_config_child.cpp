// Prints which configuration file it would read.

#include "platform/config/config.h"

#include <cstdio>

int main() {
  std::puts(KovaPlatform::configPath().c_str());
}
