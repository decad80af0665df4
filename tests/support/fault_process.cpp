// The libc functions on processes and signals that a test may make fail. Weak, so that a test which
// needs another behaviour defines its own.

#include "tests/support/interpose.h"

#include <csignal>
#include <cstdlib>
#include <dirent.h>
#include <sys/wait.h>
#include <unistd.h>

extern "C" {

KOVA_INTERPOSE_NOTHROW(pid_t, fork, -1, (), ())
KOVA_INTERPOSE(pid_t, waitpid, -1, (pid_t pid, int *status, int options), (pid, status, options))
KOVA_INTERPOSE_NOTHROW(int, kill, -1, (pid_t pid, int sig), (pid, sig))
KOVA_INTERPOSE_NOTHROW(pid_t, setsid, -1, (), ())
KOVA_INTERPOSE_NOTHROW(int, sigaction, -1,
                       (int sig, const struct sigaction *action, struct sigaction *old),
                       (sig, action, old))
KOVA_INTERPOSE_NOTHROW(int, sigprocmask, -1, (int how, const sigset_t *set, sigset_t *old),
                       (how, set, old))
KOVA_INTERPOSE_NOTHROW(int, sigemptyset, -1, (sigset_t * set), (set))
KOVA_INTERPOSE_NOTHROW(int, sigaddset, -1, (sigset_t * set, int sig), (set, sig))
KOVA_INTERPOSE_NOTHROW(sighandler_t, signal, SIG_ERR, (int sig, sighandler_t handler),
                       (sig, handler))
KOVA_INTERPOSE_NOTHROW(int, dup2, -1, (int from, int to), (from, to))
KOVA_INTERPOSE_NOTHROW(int, chdir, -1, (const char *path), (path))
KOVA_INTERPOSE_NOTHROW(int, clearenv, -1, (), ())
KOVA_INTERPOSE_NOTHROW(int, setenv, -1, (const char *name, const char *value, int overwrite),
                       (name, value, overwrite))
KOVA_INTERPOSE_NOTHROW(int, execv, -1, (const char *path, char *const argv[]), (path, argv))
KOVA_INTERPOSE(DIR *, opendir, nullptr, (const char *path), (path))
KOVA_INTERPOSE(ssize_t, read, -1, (int fd, void *buf, size_t size), (fd, buf, size))
}
