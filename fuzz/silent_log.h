#ifndef KOVABACKUP_FUZZ_SILENT_LOG_H
#define KOVABACKUP_FUZZ_SILENT_LOG_H

/// @file Keeps what is logged from the system log, which a fuzz target would flood. Include it in
/// one source of a target. Weak: where tests replay the corpus, their own definitions are used.

extern "C" {
__attribute__((weak)) void syslog(int, const char *, ...) {}
__attribute__((weak)) void __syslog_chk(int, int, const char *, ...) {}
}

#endif
