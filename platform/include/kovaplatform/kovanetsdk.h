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
 * Process:   no state of their own. The lookup reads what getaddrinfo(3) reads.
 */

/**
 * Error codes of the lookup. They are the stand-in's own.
 *
 *     code    name                     what happened
 *     0x5001  KOVA_NET_ERR_ARGUMENT    a null or empty argument, or a family other than 1 or flags
 *                                      other than 0
 *     0x5002  KOVA_NET_ERR_NO_HOST     there is no such host, or it has no IPv4 or IPv6 address
 *     0x5003  KOVA_NET_ERR_TRY_AGAIN   the resolver gave no answer; a later call may
 *     0x5004  KOVA_NET_ERR_RESOLVER    the resolver failed
 *     0x5005  KOVA_NET_ERR_NO_MEMORY   there was no memory for the answer
 */
#define KOVA_NET_ERR_ARGUMENT 0x5001
#define KOVA_NET_ERR_NO_HOST 0x5002
#define KOVA_NET_ERR_TRY_AGAIN 0x5003
#define KOVA_NET_ERR_RESOLVER 0x5004
#define KOVA_NET_ERR_NO_MEMORY 0x5005

/** Bytes of the buffer that KOVANetLookupIP fills, NUL included. */
#define KOVA_NET_IP_TEXT_BYTES 52

#ifdef __cplusplus
extern "C" {
#endif

/* These names are what the platform's libraries export, and all that they export. */
#pragma GCC visibility push(default)

/**
 * Tests for an IPv4 address: four decimal numbers from 0 to 255 with dots between and nothing else.
 * "10.0.0.1" is one; "10.0.1", "010.0.0.1" (a leading zero has two readings), " 10.0.0.1" are not.
 *
 * Returns: non-zero when text is one; 0 when not, null included.
 * Errors:  none is recorded.
 */
int BlKLIBIsIpAddr(const char *text);

/**
 * Tests for an IPv6 address in a form of RFC 4291, section 2.2. "::1" and "::ffff:10.0.0.1" are
 * such; "fe80::1%eth0" (a scope), "[::1]" and "::/0" are not.
 *
 * Returns: non-zero when text is one; 0 when not, null included.
 * Errors:  none is recorded.
 */
int BlKLIBIsv6IpAddrValid(const char *text);

/**
 * Resolves a host name and writes one of its addresses as text into buf: the first IPv4 address,
 * or the first IPv6 address of a host that has no IPv4 one. An address with a scope is written with
 * it, "fe80::1%eth0"; by number, "fe80::1%2", where the name would not fit into buf, where the
 * interface is gone and where the address is not link-local. The text is never cut.
 *
 * name:    a host name, or an address, which resolves to itself.
 * buf:     KOVA_NET_IP_TEXT_BYTES bytes; untouched on failure, NUL-terminated on success.
 * family:  1, any family. flags: 0. Nothing else is served.
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
