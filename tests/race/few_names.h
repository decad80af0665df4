#ifndef KOVABACKUP_TESTS_RACE_FEW_NAMES_H
#define KOVABACKUP_TESTS_RACE_FEW_NAMES_H

/// @file A source of names that is so poor that processes choose the same ones all the time.

#include <string>

namespace KovaTest {

/// For its lifetime, mkdtemp and mkstemp of this process and of the children that it forks choose
/// among that many names, at most 3,844. As ever they try again while a name is taken. Processes
/// that are forked choose differently. One at a time.
class FewNames {
public:
  FewNames(unsigned count, unsigned seed);
  ~FewNames();
  FewNames(const FewNames &) = delete;
  FewNames &operator=(const FewNames &) = delete;

  /// The six letters of a name, from 0 to count - 1.
  static std::string letters(unsigned number);
};

} // namespace KovaTest

#endif
