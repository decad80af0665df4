// The list of names when a file can only be read in part.

#include "tests/platform/core_support.h"
#include "tests/support/fault.h"

#include <algorithm>
#include <cerrno>
#include <gmock/gmock.h>
#include <unistd.h>

using namespace KovaTest;

namespace {

// Few bytes a read, so that a short file takes several.
constexpr std::size_t kMostRead = 16;

} // namespace

extern "C" ssize_t read(int fd, void *buf, size_t size) {
  static auto *const real = realFunction<ssize_t(int, void *, size_t)>("read");
  return failsNow("read") ? -1 : real(fd, buf, std::min(size, kMostRead));
}

// A list with some of the names would pass for the complete one.
TEST(SectionNames, AreAsBeforeWhenAReadFailsAfterSome) {
  const TestFolder folder;
  const std::string path = writeFile(folder / "conf", "[first]\nk=1\n[second]\nk=2\n[third]\n");
  KLIBCSzList *list = KLIBCSzListAlloc(1);
  int failures = 0;
  forEachFailure("read", EIO, [&](Fault &fault) {
    const int before = list->count;
    clearError();
    const int result = KLIBCFileEnumSection(path.c_str(), &list);
    EXPECT_EQ(fault.fired() ? KLIBC_ERR_READ : 0, errorCode());
    EXPECT_EQ(fault.fired(), result < 0);
    EXPECT_EQ(fault.fired() ? before : before + 3, list->count);
    failures += fault.fired() ? 1 : 0;
  });
  EXPECT_LT(2, failures);
  EXPECT_STREQ("first", KLIBCSzListGet(list, 0));
  KLIBCSzListFree(list);
}
