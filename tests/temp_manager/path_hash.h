#ifndef KOVABACKUP_TESTS_PATH_HASH_H
#define KOVABACKUP_TESTS_PATH_HASH_H

/// @file The definition of the hash that owners of temporaries store of their path: the additive
/// djb2, modulo 2^32.

#include <cstdint>
#include <string>

namespace KovaTest {

inline std::uint32_t plainHashOf(const std::string &path) {
  unsigned long long exact = 5381;
  for (const char byte : path) {
    exact = (exact * 33 + static_cast<unsigned char>(byte)) % 4294967296ULL;
  }
  return static_cast<std::uint32_t>(exact);
}

} // namespace KovaTest

#endif
