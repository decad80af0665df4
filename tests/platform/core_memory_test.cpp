// What the services do when memory runs out: the allocations are made to fail one by one. A failure
// is a result with a code, no exception leaves a service, and nothing has changed.

#include "tests/platform/core_support.h"

#include <cstdlib>
#include <functional>
#include <gmock/gmock.h>
#include <new>
#include <unistd.h>

using namespace KovaTest;
using testing::ElementsAre;

namespace {

int allocationsLeft = -1; // how many succeed before one fails; negative: all of them

void *allocate(std::size_t size) {
  if (allocationsLeft >= 0 && allocationsLeft-- == 0) {
    throw std::bad_alloc();
  }
  void *const memory = std::malloc(size == 0 ? 1 : size);
  if (memory == nullptr) {
    throw std::bad_alloc();
  }
  return memory;
}

// Fails the first allocation, then the second and so on, until the operation makes no more. The
// operation returns whether it succeeded; check receives that.
void failEachAllocation(const std::function<bool()> &operation,
                        const std::function<void(bool succeeded)> &check) {
  constexpr int kMost = 1000;
  bool failed = true;
  for (int nth = 0; failed; ++nth) {
    ASSERT_LT(nth, kMost);
    SCOPED_TRACE(nth);
    clearError();
    allocationsLeft = nth;
    const bool succeeded = operation();
    failed = allocationsLeft < 0;
    allocationsLeft = -1;
    EXPECT_EQ(failed, !succeeded);
    EXPECT_EQ(failed ? KLIBC_ERR_NO_MEMORY : 0, errorCode());
    EXPECT_TRUE(failed || nth > 0) << "nothing is allocated: the loop proves nothing";
    check(succeeded);
  }
}

} // namespace

void *operator new(std::size_t size) {
  return allocate(size);
}

void *operator new[](std::size_t size) {
  return allocate(size);
}

void operator delete(void *memory) noexcept {
  std::free(memory);
}

void operator delete[](void *memory) noexcept {
  std::free(memory);
}

void operator delete(void *memory, std::size_t) noexcept {
  std::free(memory);
}

void operator delete[](void *memory, std::size_t) noexcept {
  std::free(memory);
}

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
  const TestDir dir;
  const std::string value(1000, 'v');
  KLIBCSzHash *hash = KLIBCSzHashAlloc(1);
  ASSERT_LE(0, KLIBCSzHashSetValue(&hash, "a", "1"));
  failEachAllocation(
      [&] { return KLIBCSzHashSetValue(&hash, "b key that is allocated", value.c_str()) >= 0; },
      [&](bool succeeded) {
        writeText(dir / "conf", "[s]\n");
        EXPECT_EQ(1, KLIBCFileSetSection((dir / "conf").c_str(), "s", nullptr, hash, 0));
        EXPECT_EQ(succeeded ? "[s]\na=1\nb key that is allocated=" + value + "\n" : "[s]\na=1\n",
                  readText(dir / "conf"));
      });
  KLIBCSzHashFree(hash);
}

TEST(Memory, RunsOutForNamesAndTheListIsAsBefore) {
  const TestDir dir;
  writeText(dir / "conf", "[a name that is allocated]\n[another that is allocated]\n");
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
  const TestDir dir;
  const std::string path = dir / "conf";
  const std::string old = "[s]\n# a comment that is allocated\nk=0\n# and one more of these\nl=0\n";
  const Hash hash(Pairs{{"l", "1"}, {"k", "1"}});
  writeText(path, old);
  failEachAllocation([&] { return change(path.c_str(), hash.get()); },
                     [&](bool succeeded) {
                       EXPECT_EQ(succeeded ? result : old, readText(path));
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
