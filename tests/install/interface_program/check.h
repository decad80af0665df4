#ifndef KOVABACKUP_TESTS_INSTALL_CHECK_H
#define KOVABACKUP_TESTS_INSTALL_CHECK_H

/// @file What the source files of this program share.

/// Reports what unless held is true; the program then exits with a failure.
void check(bool held, const char *what);

void callTextAndPaths();
void callProcesses();
void callStorage();
void callOptions();

#endif
