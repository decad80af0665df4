#ifndef KOVABACKUP_TESTS_HOSTILE_SMALL_ROOT_H
#define KOVABACKUP_TESTS_HOSTILE_SMALL_ROOT_H

/// @file A root folder in which little exists, as in a container or a rescue system.
///
///     const SmallRoot root({"/tmp", "/dev"});                      // no /proc, no /etc
///     const Outcome outcome = runCommand({"doctor"}, [&] { root.enter(); });

#include <set>
#include <string>

namespace KovaTest::Hostile {

/// The programs, their libraries, the stage, and the folders of the machine that are named. A test
/// of HostileTest unmounts it at its end.
class SmallRoot {
public:
  /// Throws Lacking when it cannot be made.
  explicit SmallRoot(const std::set<std::string> &folders);

  /// The path of something in it, as it is outside: root / "/etc".
  std::string operator/(const std::string &path) const { return path_ + path; }
  /// Makes it the root of the calling process.
  void enter() const;

private:
  void show(const std::string &folder) const;

  const std::string path_;
};

} // namespace KovaTest::Hostile

#endif
