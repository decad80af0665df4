// What the probe says of paths that do not exist, and on kernels that report less.

#include "platform/sdk/system_probe.h"

#include "tests/support/fault.h"
#include "tests/support/files.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

using namespace KovaPlatform;
using namespace KovaTest;

namespace {

bool withoutMountIds = false;

}

extern "C" int statx(int dir, const char *path, int flags, unsigned mask,
                     struct statx *out) noexcept {
  static auto *const real =
      realFunction<int(int, const char *, int, unsigned, struct statx *)>("statx");
  const int result = real(dir, path, flags, mask, out);
  out->stx_mask &= withoutMountIds ? ~STATX_MNT_ID : ~0U;
  return result;
}

TEST(SystemProbe, KnowsNothingOfWhatDoesNotExist) {
  const TestFolder folder;
  const SystemProbe probe;
  EXPECT_FALSE(probe.facts(folder / "absent").has_value());
  EXPECT_FALSE(probe.space(folder / "absent").has_value());
  EXPECT_FALSE(probe.resolve(folder / "absent").has_value());
  EXPECT_FALSE(factsOf(-1).has_value());
}

TEST(SystemProbe, KnowsAFolderByItsMount) {
  const TestFolder folder;
  const auto facts = SystemProbe().facts(folder.path());
  ASSERT_TRUE(facts.has_value());
  EXPECT_TRUE(facts->isDirectory);
  EXPECT_TRUE(facts->mountId.has_value());
}

TEST(SystemProbe, KnowsNoMountOnAKernelThatReportsNone) {
  const TestFolder folder;
  withoutMountIds = true; // as before Linux 5.8
  const auto facts = SystemProbe().facts(folder.path());
  withoutMountIds = false;
  ASSERT_TRUE(facts.has_value());
  EXPECT_TRUE(facts->isDirectory);
  EXPECT_FALSE(facts->mountId.has_value());
}
