#ifndef KOVABACKUP_TESTS_FAULT_H
#define KOVABACKUP_TESTS_FAULT_H

/// @file Failures of libc on demand. The test program defines the libc function; the definition
/// asks failsNow whether this call must fail, and otherwise passes it on.
///
///     Fault fault("mkdir", 1, EACCES);        // the first mkdir fails, once
///     EXPECT_EQ("", Path::createIpcTempPath("x", 0700));
///     EXPECT_TRUE(fault.fired());
///
/// The counting loop over all calls of a function is in tests/support/counting_loop.h.

#include <dlfcn.h>

namespace KovaTest {

/// For its lifetime, makes the nth call (from 1) of a function fail with the given errno; if
/// lasting, all calls after it, too. Up to eight at a time. A child forked meanwhile inherits a
/// copy that counts on its own.
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

/// Called by an interposed function: true when this call must fail; errno is then set. Neither
/// allocates nor locks, so it may run in a signal handler and in a forked child.
bool failsNow(const char *function);

/// A Fault for the calls of forked children, all counted together; the test's own process is not
/// affected. One at a time. It works for functions whose definitions ask failsInChild.
class ChildFault {
public:
  ChildFault(const char *function, int nth, int error, bool lasting = false);
  ~ChildFault();
  ChildFault(const ChildFault &) = delete;
  ChildFault &operator=(const ChildFault &) = delete;

  int calls() const;
  bool fired() const;
};

/// failsNow for ChildFault: true in a forked child when this call must fail.
bool failsInChild(const char *function);

/// Whether the calling process was forked from the test's own.
bool inForkedChild();

/// The definition of a function that dlsym(3) finds. On 32-bit machines it is the form with 64-bit
/// sizes and times, which the headers of libc put in place of the other: open64 for open, for
/// example.
void *definitionOf(const char *function, void *handle);

/// The next definition of the interposed function.
template <typename Function>
Function *realFunction(const char *name) {
  return reinterpret_cast<Function *>(definitionOf(name, RTLD_NEXT));
}

} // namespace KovaTest

#endif
