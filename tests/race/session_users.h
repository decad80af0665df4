#ifndef KOVABACKUP_TESTS_RACE_SESSION_USERS_H
#define KOVABACKUP_TESTS_RACE_SESSION_USERS_H

/// @file Processes that make, enter and leave sessions, and notice when one is taken from them.

#include "base/unique_fd.h"
#include "tests/session/session_fixture.h"
#include "tests/support/child_process.h"
#include "tests/support/shared_memory.h"

#include <array>
#include <atomic>
#include <fstream>
#include <functional>
#include <random>
#include <string>

namespace KovaTest {

/// IDs that processes share. The oldest ones are forgotten first.
class KnownIds {
public:
  void add(const std::string &id);
  /// One of them, each in its turn; "" if there is none.
  std::string any();

private:
  class Locked;

  std::atomic<bool> locked_{false};
  std::array<std::array<char, 12>, 24> ids_{};
  unsigned next_ = 0;
  unsigned asked_ = 0;
};

/// What the processes of one test share.
struct SessionPlay {
  SessionPlay();
  ~SessionPlay();
  SessionPlay(const SessionPlay &) = delete;
  SessionPlay &operator=(const SessionPlay &) = delete;

  void complain(const std::string &text) const {
    std::ofstream(complaints, std::ios::app) << text << "\n";
  }

  const unsigned seed;
  std::string folder;     ///< of sessions on the volume
  std::string complaints; ///< the file of what went wrong
  bool loads = false;     ///< whether sessions are also used without being entered
  KnownIds *const known;

  SharedCounter finished; ///< users that have ended
  SharedCounter entered;
  SharedCounter moved; ///< times that an entered session was away for a moment
  SharedCounter removed;
  SharedCounter refused; ///< removals, because of users
  SharedCounter adopted;
  SharedCounter commands;
};

/// One process that uses sessions.
class SessionUsers {
public:
  SessionUsers(const SessionPlay &play, unsigned seed) : play_(play), random_(seed) {}

  void run(int rounds);

private:
  // A session that this process has entered: its directory is open.
  struct Entered {
    std::string id;   // "": no link leads to it
    std::string path; // of its directory
    std::string mark; // the content of its file "owner"
    KOVA::Base::UniqueFd dir;
  };

  void makeAndStay();
  void loseAndStay();
  void visit();
  void load();
  bool make(Entered &made);
  void stay(const Entered &entered);
  bool checkFound(const Entered &entered) const;
  void pause(unsigned most); // nanoseconds
  void complainOf(const Entered &entered, const std::string &what) const;

  const SessionPlay &play_;
  std::mt19937 random_;
};

} // namespace KovaTest

#endif
