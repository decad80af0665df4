#ifndef KOVABACKUP_TESTS_SESSION_SUPPORT_H
#define KOVABACKUP_TESTS_SESSION_SUPPORT_H

/// @file Sessions of any age and in any state, for the tests of the commands on them.

#include "base/unique_fd.h"
#include "tests/tools/run_tool.h"

#include <string>

namespace KovaTest {

constexpr int kDay = 86400;
extern const std::string kRoot; ///< the directory of the sessions

void setAge(const std::string &path, int seconds);

/// A local session with one file of five bytes; returns its id.
std::string makeLocal(int ageSeconds = 0);

/// A volume session as the library creates it, in a folder of the test; returns its directory.
std::string makeVolume(const TestFolder &volume, const std::string &id, int ageSeconds = 0);

/// The link of a session whose directory is gone; returns its id.
std::string makeDangling(const std::string &id, int ageSeconds = 0);

/// The file of a local session, opened.
KOVA::Base::UniqueFd openFileOf(const std::string &id);

} // namespace KovaTest

#endif
