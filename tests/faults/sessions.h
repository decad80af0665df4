#ifndef KOVABACKUP_TESTS_FAULTS_SESSIONS_H
#define KOVABACKUP_TESTS_FAULTS_SESSIONS_H

/// @file The sessions that scenarios find: an old one and a young one.

#include <string>

namespace KovaTest::Faults {

inline const std::string kOld = "/tmp/kovabackup/session/sess.Aa1Bb2";
inline const std::string kYoung = "/tmp/kovabackup/session/sess.Ee5Ff6";

/// Makes the folder of a session, with a file "file" that contains "12345" and a folder with a
/// file, last modified ageSec seconds ago.
void makeSession(const std::string &folder, int ageSec);

/// Makes kOld, two hours old, and kYoung.
void makeLocalSessions();

} // namespace KovaTest::Faults

#endif
