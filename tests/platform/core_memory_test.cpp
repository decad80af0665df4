// What the services do when memory runs out: the allocations are made to fail one by one. A failure
// is a result with a code, no exception leaves a service, and nothing has changed.

#include "tests/platform/core_support.h"
#include "tests/support/alloc_failure.h"

#include <cstdint>
#include <functional>
#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;

namespace {

// The counting loop for operations that return whether they succeeded; check receives that.
void failEachAllocation(const std::function<bool()> &operation,
                        const std::function<void(bool succeeded)> &check) {
  countFailures("operator new", Failing::Once, [&](int nth, bool) {
    clearError();
    bool succeeded = false;
    bool failed = false;
    {
      const AllocFailure failure(nth);
      succeeded = operation();
      failed = failure.fired();
    }
    EXPECT_EQ(failed, !succeeded);
    EXPECT_EQ(failed ? KLIBC_ERR_NO_MEMORY : 0, errorCode());
    check(succeeded);
    return failed;
  });
}

} // namespace

TEST(Memory, RunsOutForAList) {
  KLIBCSzList *list = nullptr;
  failEachAllocation(
      [&] {
        list = KLIBCSzListAlloc(100);
        return list != nullptr;
      },
      [&](bool) { KLIBCSzListFree(list); });
}

TEST(Memory, RunsOutForAHashAndItsPairs) {
  const std::string value(1000, 'v');
  KLIBCSzHash *hash = nullptr;
  failEachAllocation(
      [&] {
        hash = KLIBCSzHashAlloc(100);
        return hash != nullptr && KLIBCSzHashSetValue(&hash, "first", value.c_str()) >= 0 &&
               KLIBCSzHashSetValue(&hash, "a key that is allocated", value.c_str()) >= 0;
      },
      [&](bool) { KLIBCSzHashFree(hash); });
}

TEST(Memory, RunsOutAndAHashIsAsBefore) {
  const TestFolder dir;
  const std::string value(1000, 'v');
  KLIBCSzHash *hash = KLIBCSzHashAlloc(1);
  ASSERT_LE(0, KLIBCSzHashSetValue(&hash, "a", "1"));
  failEachAllocation(
      [&] { return KLIBCSzHashSetValue(&hash, "b key that is allocated", value.c_str()) >= 0; },
      [&](bool succeeded) {
        writeFile(dir / "conf", "[s]\n");
        EXPECT_EQ(1, KLIBCFileSetSection((dir / "conf").c_str(), "s", nullptr, hash, 0));
        EXPECT_EQ(succeeded ? "[s]\na=1\nb key that is allocated=" + value + "\n" : "[s]\na=1\n",
                  readFile(dir / "conf"));
      });
  KLIBCSzHashFree(hash);
}

TEST(Memory, RunsOutForNamesAndTheListIsAsBefore) {
  const TestFolder dir;
  writeFile(dir / "conf", "[a name that is allocated]\n[another that is allocated]\n");
  const std::string path = dir / "conf";
  KLIBCSzList *list = KLIBCSzListAlloc(0);
  int before = 0;
  failEachAllocation([&] { return KLIBCFileEnumSection(path.c_str(), &list) >= 0; },
                     [&](bool succeeded) {
                       EXPECT_EQ(before + (succeeded ? 2 : 0), list->count);
                       before = list->count;
                     });
  EXPECT_STREQ("another that is allocated", KLIBCSzListGet(list, 1));
  KLIBCSzListFree(list);
}

namespace {

void failEachAllocationOf(const std::string &result,
                          const std::function<bool(const char *path, KLIBCSzHash *hash)> &change) {
  const TestFolder dir;
  const std::string path = dir / "conf";
  const std::string old = "[s]\n# a comment that is allocated\nk=0\n# and one more of these\nl=0\n";
  const Hash hash(Pairs{{"l", "1"}, {"k", "1"}});
  writeFile(path, old);
  failEachAllocation([&] { return change(path.c_str(), hash.get()); },
                     [&](bool succeeded) {
                       EXPECT_EQ(succeeded ? result : old, readFile(path));
                       EXPECT_THAT(dir.names(), ElementsAre("conf"));
                     });
}

} // namespace

TEST(Memory, RunsOutAndTheFileIsAsBefore) {
  failEachAllocationOf("[s]\n# a comment that is allocated\n# and one more of these\nl=1\nk=1\n",
                       [](const char *path, KLIBCSzHash *hash) {
                         return KLIBCFileSetSection(path, "s", nullptr, hash, 0) == 1;
                       });
  failEachAllocationOf("[s]\n# a comment that is allocated\nk=0\n# and one more of these\nl=0\n"
                       "[a name that is allocated]\nl=1\nk=1\n",
                       [](const char *path, KLIBCSzHash *hash) {
                         return KLIBCFileAddSection(path, "a name that is allocated", hash, 0) >= 0;
                       });
  failEachAllocationOf(
      "", [](const char *path, KLIBCSzHash *) { return KLIBCFileRemoveSection(path, "s") == 1; });
}

// The most that 32 bits count, or far more than any machine has.
TEST(Memory, IsNotThereForAFileOfThisSize) {
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
  GTEST_SKIP() << "skipped: a sanitizer ends the program when it is asked for so much";
#endif
  const TestFolder dir;
  writeFile(dir / "conf", "[s]\n");
  const off_t size = sizeof(std::size_t) == 4 ? off_t{UINT32_MAX} : off_t{1} << (sizeof(off_t) * 7);
  ASSERT_EQ(0, ::truncate((dir / "conf").c_str(), size));
  clearError();
  EXPECT_EQ(-1, setSection(dir / "conf", "s", {{"a", "1"}}));
  EXPECT_EQ(KLIBC_ERR_NO_MEMORY, errorCode());
  struct stat file = {};
  EXPECT_EQ(0, ::stat((dir / "conf").c_str(), &file));
  EXPECT_EQ(size, file.st_size);
}
