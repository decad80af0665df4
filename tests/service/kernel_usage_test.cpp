#include "service/kernel_usage.h"

#include <cstring>
#include <gtest/gtest.h>
#include <numeric>
#include <vector>

using KOVA::Backup::Service::KernelUsage;
using KOVA::Backup::Service::usageOf;

// On 64-bit machines both structures have the same layout, so each field must come out in its
// place.
TEST(KernelUsage, BecomesTheUsageOfLibc) {
  if (sizeof(KernelUsage) != sizeof(struct rusage)) {
    GTEST_SKIP() << "skipped: the layouts differ on 32-bit machines";
  }
  std::vector<__kernel_long_t> words(sizeof(KernelUsage) / sizeof(__kernel_long_t));
  std::iota(words.begin(), words.end(), 1);
  KernelUsage kernel = {};
  std::memcpy(&kernel, words.data(), sizeof kernel);
  const struct rusage usage = usageOf(kernel);
  EXPECT_EQ(0, std::memcmp(words.data(), &usage, sizeof usage));
}
