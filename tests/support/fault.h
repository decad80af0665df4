#ifndef KOVABACKUP_TESTS_FAULT_H
#define KOVABACKUP_TESTS_FAULT_H

/// @file Failures of libc on demand. The test program defines the libc function; the definition
/// asks failsNow whether this call is the one to fail, else passes it on.
///
///     Fault fault("mkdir", 1, EACCES);        // the first mkdir fails, once
///     EXPECT_EQ("", Path::createIpcTempPath("x", 0700));
///     EXPECT_TRUE(fault.fired());
///
/// The counting loop, for every function that makes system calls:
///
///     forEachFailure("open", EIO, [&](Fault &fault) {
///       ... run the operation; when fault.fired(), check result, log and leftovers ...
///     });
///
/// It fails the first call, then the second and so on, once each and once lasting, until the
/// operation runs without the failure.

#include <dlfcn.h>
#include <gtest/gtest.h>

namespace KovaTest {

/// Makes the nth call (from 1) of a function fail with the given errno while it stands; with
/// lasting, that call and all after it. Up to eight may stand at a time.
class Fault {
public:
  Fault(const char *function, int nth, int error, bool lasting = false);
  ~Fault();
  Fault(const Fault &) = delete;
  Fault &operator=(const Fault &) = delete;

  /// Calls seen since the fault was made, failed ones included.
  int calls() const { return calls_; }
  bool fired() const { return fired_; }

private:
  friend bool failsNow(const char *function);

  const char *function_;
  int nth_;
  int error_;
  bool lasting_;
  int calls_ = 0;
  bool fired_ = false;
};

/// Called by an interposed function: true when it must fail now; errno is then set. Neither
/// allocates nor locks, so it may run in a signal handler and in a forked child.
bool failsNow(const char *function);

/// The next definition of the interposed function.
template <typename Function>
Function *realFunction(const char *name) {
  return reinterpret_cast<Function *>(::dlsym(RTLD_NEXT, name));
}

template <typename Operation>
void forEachFailure(const char *function, int error, Operation operation) {
  constexpr int kMostCalls = 1000;
  for (const bool lasting : {false, true}) {
    bool fired = true;
    for (int nth = 1; fired; ++nth) {
      ASSERT_LE(nth, kMostCalls) << function << " is called without end";
      SCOPED_TRACE(testing::Message()
                   << function << " fails at call " << nth << (lasting ? " and after" : ""));
      Fault fault(function, nth, error, lasting);
      operation(fault);
      fired = fault.fired();
      if (nth == 1) {
        EXPECT_TRUE(fired) << function << " is not called at all: the loop proves nothing";
      }
      if (testing::Test::HasFatalFailure()) {
        return;
      }
    }
  }
}

} // namespace KovaTest

#endif
