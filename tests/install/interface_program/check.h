#ifndef KOVABACKUP_TESTS_INSTALL_CHECK_H
#define KOVABACKUP_TESTS_INSTALL_CHECK_H

/// @file What the parts of this program share.

/// Notes a result that is not as it should be; the program then fails.
void check(bool held, const char *what);

void callTextAndPaths();
void callProcesses();
void callStorage();
void callOptions();

#endif
