// Whether the check itself notices what it is for: scripts/counts fails unless the growth of the
// quadratic case exceeds its bound.

#include "tests/counts/counted.h"

#include <algorithm>
#include <vector>

namespace KovaCounts {
namespace {

std::vector<std::size_t> numbers(std::size_t size) {
  std::vector<std::size_t> all;
  for (std::size_t i = 0; i < size; ++i) {
    all.push_back(i);
  }
  return all;
}

void linear(std::size_t size) {
  const std::vector<std::size_t> all = numbers(size);
  count([&] { return std::find(all.begin(), all.end(), size) == all.end(); });
}

// Searches each number from the beginning.
void quadratic(std::size_t size) {
  const std::vector<std::size_t> all = numbers(size);
  count([&] {
    return std::all_of(all.begin(), all.end(), [&](std::size_t number) {
      return std::find(all.begin(), all.end(), number) != all.end();
    });
  });
}

constexpr Case kCases[] = {
    {"self.linear", linear, {}, 1000},
    {"self.quadratic", quadratic, {}, 500},
};

} // namespace

Cases selfCases() {
  return casesOf(kCases);
}

} // namespace KovaCounts
