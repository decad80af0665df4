#ifndef KOVABACKUP_TESTS_SESSION_RING_H
#define KOVABACKUP_TESTS_SESSION_RING_H

/// @file Processes that create, find, load and destroy sessions at the same time. They form a ring:
/// each creates sessions and passes their IDs on to the next one, which checks and removes them.

#include "kovabackup/session.h"

#include <functional>
#include <string>

namespace KovaTest {

struct SessionRing {
  int processes = 0;
  int rounds = 0; ///< in each round every process creates one session and removes one

  /// Creates a session, in one of the processes; process and round count from 0.
  std::function<bool(KOVA::Backup::Session &, int process, int round)> create;

  /// The file to which the processes append what is wrong.
  std::string complaints;
};

/// Runs the ring to its end. Fails the test when a process ends early; what is wrong with a session
/// is in the complaints.
void runRing(const SessionRing &ring);

} // namespace KovaTest

#endif
