#ifndef KOVABACKUP_NETWORK_H
#define KOVABACKUP_NETWORK_H

/// @file Addresses of hosts, and whether a TCP service answers.
///
///     const std::string ip = Net::getIpFromAddr("backup.example.com");
///     if (ip.empty()) return false;                            // unknown host, logged
///     switch (Net::testIpAndPortConnect(ip.c_str(), 873, 5)) {
///     case 0:  return true;                                    // connected, and closed again
///     case -2: return retryLater();                            // nobody answered within 5 s
///     default: return false;                                   // refused, or not tried
///     }
///
/// Ownership: nothing is kept between calls; each call has its own socket and closes it.
/// Failure:   by return value; nothing is thrown but std::bad_alloc.
/// errno:     not meaningful after either function.
/// Threads:   reentrant; any number of threads at a time.
/// Process:   no process-wide state. No signal is raised: a peer that has gone costs no SIGPIPE.

#include <string>

#pragma GCC visibility push(default)

namespace KOVA {
namespace Backup {
namespace Net {

/// Turns a host into the text of an address: IPv4 and IPv6 addresses stay as they are, without any
/// lookup, a name is looked up by the platform.
/// Returns: the address; "" when the lookup fails.
/// Log:     one LOG_ERR line for a failed lookup, with the platform's error.
/// Blocks:  for a name, as long as the platform's lookup takes.
std::string getIpFromAddr(const std::string &addr);

/// Tries to open a TCP connection to a host, by name or address, and closes it again. Of several
/// addresses of a name only the first is tried: a host whose first address is unreachable fails
/// even if a later one would answer.
///
/// The peer sees one connection that ends at once. When the connection took time to be made, as it
/// nearly always does, one byte of value zero comes before its end; deliberate, a service may know
/// the probe by it.
///
/// A port of 0 is tried like any other. A port of more than nine digits is cut to its first nine.
/// Returns: 0 when the connection was made; -2 when the time ran out; -1 in every other case: bad
///          arguments, an unknown host, a failing system call (one interrupted by a signal
///          handler, too), a refusal.
/// Errors:  host is null; port or timeout is negative.
/// Log:     one LOG_ERR line for bad arguments, deliberately without process id and tag; else none.
/// Units:   timeout in whole seconds; 0 looks once without waiting.
/// Blocks:  for at most timeout seconds, and before that as long as a name's lookup takes: the time
///          limit leaves that out.
/// Process: the socket is close-on-exec. A fork in another thread just after the socket was made
///          may still hand it to a program.
int testIpAndPortConnect(const char *host, int port, int timeout);

} // namespace Net
} // namespace Backup
} // namespace KOVA

#pragma GCC visibility pop

#endif
