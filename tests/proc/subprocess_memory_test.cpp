// A child that runs out of memory ends like any other that could not be set up, and never returns
// into the caller's code.

#include "tests/proc/launch_fixture.h"
#include "tests/proc/process_hooks.h"
#include "tests/support/alloc_failure.h"

#include <cstdlib>

using namespace KovaTest;
using KOVA::Backup::SubProcess;
using testing::ElementsAre;
using testing::IsEmpty;

// Under a sanitizer the child's own allocations come first, and not in the same number each time.
#if !defined(__SANITIZE_ADDRESS__) && !defined(__SANITIZE_THREAD__)
#define KOVA_OWN_ALLOCATOR 1
#else
#define KOVA_OWN_ALLOCATOR 0
#endif

class CommandWithoutMemory : public Launch {
protected:
  void SetUp() override {
    if (KOVA_OWN_ALLOCATOR == 0) {
      GTEST_SKIP() << "skipped: the sanitizer's allocator cannot be made to fail";
    }
  }
};

TEST_F(CommandWithoutMemory, FailsWhenTheArgumentVectorCannotBeMade) {
  const SubProcess command(helperArgs({"exit", "0"}));
  forEachChildFailure("calloc", ENOMEM, [&](int nth, const ChildFault &) {
    const std::size_t before = failures().size();
    const int status = command.call();
    EXPECT_TRUE(WIFEXITED(status));
    EXPECT_EQ(nth == 1 ? 127 : 0, WEXITSTATUS(status));
    if (nth == 1) {
      ASSERT_EQ(before + 1, failures().size());
      EXPECT_EQ(failure(238, "calloc", ENOMEM), failures().back());
    }
  });
}

TEST_F(CommandWithoutMemory, IsNotLaunchedFirst) {
  const ChildFault fault("calloc", 1, ENOMEM);
  (void)SubProcess(helperArgs({"exit", "0"})).call();
  EXPECT_THAT(logged(), ElementsAre(failure(238, "calloc", ENOMEM)));
}

// A child that returned would end here with another code, and the process of the test would run
// twice.
TEST_F(CommandWithoutMemory, NeverReturnsIntoTheCallersCode) {
  const std::string path = ::getenv("PATH");
  ::setenv("PATH", std::string(1000, 'p').c_str(), 1);
  const SubProcess command(helperArgs({"exit", "0"}));
  int status = 0;
  {
    const ChildFault fault("operator new", 1, ENOMEM, true);
    status = command.call();
    EXPECT_TRUE(fault.fired());
  }
  ::setenv("PATH", path.c_str(), 1);
  EXPECT_TRUE(WIFEXITED(status));
  EXPECT_EQ(127, WEXITSTATUS(status));
  EXPECT_THAT(logged(), IsEmpty());
}
