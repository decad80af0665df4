// Encryption of secret option values by the platform's stand-in. Every run checks its result.

#include "kovaplatform/kovacore.h"

#include "bench/race.h"

#include <string>

namespace {

using KovaBench::Race;
using KovaBench::rounds;

std::string textOf(std::int64_t size) {
  return std::string(static_cast<std::size_t>(size), 'x');
}

// Room for the cipher text of a text.
std::string bufferFor(const std::string &text) {
  return std::string((text.size() + 2) * 2, '\0');
}

void encrypt(benchmark::State &state) {
  const std::string text = textOf(state.range(0));
  std::string buffer = bufferFor(text);
  Race(state, [&] {
    return KLIBCCryptSzEncrypt(text.c_str(), buffer.data(), static_cast<int>(buffer.size())) != 0;
  }).run();
}
BENCHMARK(encrypt)->Arg(16)->Arg(4096)->Apply(rounds);

void decrypt(benchmark::State &state) {
  const std::string text = textOf(state.range(0));
  std::string cipher = bufferFor(text);
  (void)KLIBCCryptSzEncrypt(text.c_str(), cipher.data(), static_cast<int>(cipher.size()));
  std::string buffer(cipher.size(), '\0');
  Race(state, [&] {
    return KLIBCCryptSzDecrypt(cipher.c_str(), buffer.data(), static_cast<int>(buffer.size())) !=
               0 &&
           text == buffer.c_str();
  }).run();
}
BENCHMARK(decrypt)->Arg(16)->Arg(4096)->Apply(rounds);

} // namespace
