#ifndef KOVAPLATFORM_KOVANETSDK_H
#define KOVAPLATFORM_KOVANETSDK_H

/**
 * @file
 * The platform's host services: address tests and name lookup.
 *
 *     char text[KOVA_NET_IP_TEXT_BYTES] = "";
 *     if (!BlKLIBIsIpAddr(host) && KOVANetLookupIP(host, text, 1, 0) > 0)
 *       connectTo(text);
 *
 * Failure:   by return value; the lookup records one of the codes below (KLIBCErrGet).
 * Threads:   any; calls are independent.
 * Process:   no state is kept. The lookup reads the files that getaddrinfo(3) reads.
 */

/**
 * Error codes of the lookup. They are specific to the stand-in.
 *
 *     code    name                     what happened
 *     0x5001  KOVA_NET_ERR_ARGUMENT    a null or empty argument, or a family other than 1 or flags
 *                                      other than 0
 *     0x5002  KOVA_NET_ERR_NO_HOST     there is no such host, or it has no IPv4 or IPv6 address
 *     0x5003  KOVA_NET_ERR_TRY_AGAIN   the resolver got no answer; a later call may succeed
 *     0x5004  KOVA_NET_ERR_RESOLVER    the resolver failed
 *     0x5005  KOVA_NET_ERR_NO_MEMORY   memory ran out
 */
#define KOVA_NET_ERR_ARGUMENT 0x5001
#define KOVA_NET_ERR_NO_HOST 0x5002
#define KOVA_NET_ERR_TRY_AGAIN 0x5003
#define KOVA_NET_ERR_RESOLVER 0x5004
#define KOVA_NET_ERR_NO_MEMORY 0x5005

/** Size in bytes of the buffer that KOVANetLookupIP fills, including the NUL. */
#define KOVA_NET_IP_TEXT_BYTES 52

#ifdef __cplusplus
extern "C" {
#endif

/* The platform's libraries export these names and no others. */
#pragma GCC visibility push(default)

/**
 * Tests for an IPv4 address: four decimal numbers from 0 to 255, separated by dots, and nothing
 * else. "10.0.0.1" is one. "10.0.1", "010.0.0.1" (decimal or octal?) and " 10.0.0.1" are not.
 *
 * Returns: non-zero if text is an IPv4 address; 0 for any other text and for null.
 * Errors:  none is recorded.
 */
int BlKLIBIsIpAddr(const char *text);

/**
 * Tests for an IPv6 address in one of the forms of RFC 4291, section 2.2. "::1" and
 * "::ffff:10.0.0.1" are addresses; "fe80::1%eth0" (with a scope), "[::1]" and "::/0" are not.
 *
 * Returns: non-zero if text is an IPv6 address; 0 for any other text and for null.
 * Errors:  none is recorded.
 */
int BlKLIBIsv6IpAddrValid(const char *text);

/**
 * Resolves a host name and writes one of its addresses as text into buf: the first IPv4 address, or
 * the first IPv6 address if the host has no IPv4 address. A scope is written with the address, as
 * in "fe80::1%eth0". It is written as a number, as in "fe80::1%2", if the name would not fit into
 * buf, if the interface no longer exists or if the address is not link-local. The text is never
 * truncated.
 *
 * name:    a host name, or an address, which resolves to itself.
 * buf:     KOVA_NET_IP_TEXT_BYTES bytes; unchanged on failure, NUL-terminated on success.
 * family:  1, any family. flags: 0. Other values are errors.
 * Returns: 1 on success; -1 on failure. Callers test for a value above 0.
 * Errors:  KOVA_NET_ERR_*.
 * errno:   not meaningful.
 * Blocks:  as long as getaddrinfo(3) does.
 */
int KOVANetLookupIP(const char *name, char *buf, int family, int flags);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
