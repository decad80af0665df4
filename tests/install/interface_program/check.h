#ifndef KOVABACKUP_TESTS_INSTALL_CHECK_H
#define KOVABACKUP_TESTS_INSTALL_CHECK_H

/// @file What the source files of these programs share.

#include <initializer_list>

/// Reports what unless held is true; the program then exits with a failure.
void check(bool held, const char *what);

/// Calls all functions.
/// Returns: the exit status of the program.
int callAll(std::initializer_list<void (*)()> functions);

#endif
