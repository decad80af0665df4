#ifndef KOVABACKUP_NETWORK_H
#define KOVABACKUP_NETWORK_H

/// @file Addresses of hosts, and a probe that checks whether a TCP service accepts connections.
///
///     const std::string ip = Net::getIpFromAddr("backup.example.com");
///     if (ip.empty()) return false;                            // unknown host, logged
///     switch (Net::testIpAndPortConnect(ip.c_str(), 873, 5)) {
///     case 0:  return true;                                    // connected, and closed again
///     case -2: return retryLater();                            // no answer within 5 s
///     default: return false;                                   // refused, or not tried
///     }
///
/// Ownership: nothing is kept between calls; each call opens its own socket and closes it.
/// Failure:   by return value; only std::bad_alloc is thrown.
/// errno:     not meaningful after either function.
/// Threads:   reentrant: any number of threads at the same time.
/// Signals:   neither function is async-signal-safe.
/// Process:   no process-wide state. No signal is raised: writing to a peer that has closed the
///            connection does not cause SIGPIPE.

#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Net {

/// Converts a host into the text of an address. An IPv4 or IPv6 address is returned unchanged and
/// without a lookup; the platform looks up everything else as a name. The platform defines which
/// texts are addresses (its stand-ins follow RFC 4291 for IPv6). addr ends at its first NUL byte.
/// Returns: the address; "" when the lookup fails.
/// Log:     one LOG_ERR line, 21, with the platform's error, when the lookup fails.
/// Blocks:  for a name, as long as the platform's lookup takes.
std::string getIpFromAddr(const std::string &addr);

/// Tries to open a TCP connection to a host, given by name or address, and closes it again. If a
/// name has several addresses, only the first is tried: the probe of a host whose first address is
/// unreachable fails even if another address would answer.
///
/// The peer sees one connection that ends at once. If the connection is not established
/// immediately, which is the usual case, the probe sends one byte of value zero before it closes
/// the connection. This is deliberate: a service can recognise the probe by that byte.
///
/// Port 0 is tried like any other. A port of more than nine digits is cut to its first nine.
/// Returns: 0 when the connection was established; -2 when the time limit expired; -1 in every
///          other case: invalid arguments, an unknown host, a refused connection, or a failed
///          system call (including one that a signal handler interrupted).
/// Errors:  host is null; port or timeout is negative.
/// Log:     one LOG_ERR line, 97, for invalid arguments, deliberately without process id and tag;
///          otherwise nothing.
/// Units:   timeout is a number of seconds; 0 checks once without waiting.
/// Blocks:  for at most timeout seconds, plus the time that the lookup of a name takes, which the
///          time limit does not cover.
/// Process: the socket is close-on-exec. A program that another thread forks and executes right
///          after the socket was created may still inherit it.
int testIpAndPortConnect(const char *host, int port, int timeout);

} // namespace Net
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
