#ifndef KOVAPLATFORM_KOVANETSDK_H
#define KOVAPLATFORM_KOVANETSDK_H

/**
 * @file
 * The platform's host services: address tests and name lookup.
 */

#ifdef __cplusplus
extern "C" {
#endif

/* These names are what the platform's libraries export, and all that they export. */
#pragma GCC visibility push(default)

/** Bytes of the buffer that KOVANetLookupIP fills, NUL included. */
#define KOVA_NET_IP_TEXT_BYTES 52

/** Non-zero when text is an IPv4 address: four decimal numbers from 0 to 255 with dots between. */
int BlKLIBIsIpAddr(const char *text);

/** Non-zero when text is an IPv6 address in a form of RFC 4291, without scope id. */
int BlKLIBIsv6IpAddrValid(const char *text);

/** Resolves a host name and writes its address as text, NUL-terminated, into buf, which holds
 *  KOVA_NET_IP_TEXT_BYTES bytes. family is 1 and flags 0. Returns a value above 0 on success;
 *  0 or below on failure, with an error code. */
int KOVANetLookupIP(const char *name, char *buf, int family, int flags);

#pragma GCC visibility pop

#ifdef __cplusplus
}
#endif

#endif
