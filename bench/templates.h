#ifndef KOVABACKUP_BENCH_TEMPLATES_H
#define KOVABACKUP_BENCH_TEMPLATES_H

/// @file Templates and the values for them, which the benchmarks of replaceMustache share.

#include <cstddef>
#include <map>
#include <string>

namespace KovaBench {

using Vars = std::map<std::string, std::string>;

inline std::string nameOf(std::size_t number) {
  return "name" + std::to_string(number);
}

inline Vars makeVars(std::size_t names) {
  Vars vars;
  for (std::size_t i = 0; i < names; ++i) {
    vars[nameOf(i)] = "the value of " + nameOf(i);
  }
  return vars;
}

/// Words with a placeholder in every 50 bytes. The names come by turns.
inline std::string makeTemplate(std::size_t bytes, std::size_t names) {
  constexpr std::size_t kEvery = 50;
  std::string text;
  for (std::size_t i = 0; (i + 1) * kEvery <= bytes; ++i) {
    text += "{{" + nameOf(i % names) + "}} ";
    while (text.size() < (i + 1) * kEvery) {
      text += text.size() % 6 == 0 ? ' ' : 'x';
    }
  }
  return text;
}

} // namespace KovaBench

#endif
