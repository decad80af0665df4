#ifndef KOVABACKUP_BENCH_END_ON_SIGTERM_H
#define KOVABACKUP_BENCH_END_ON_SIGTERM_H

/// @file Ends a benchmark of SubProcess on SIGTERM. While a command runs, SubProcess passes the
/// signal on to it, and only a handler of the caller runs as well. Without one, the signal of a
/// time limit would end a command instead of the benchmark, which would then report a wrong result
/// and continue.

#include <csignal>
#include <unistd.h>

namespace KovaBench {

inline void endOnSigterm() {
  (void)std::signal(SIGTERM, [](int sig) { ::_exit(128 + sig); });
}

} // namespace KovaBench

#endif
