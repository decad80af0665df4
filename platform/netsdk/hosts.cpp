#include "kovaplatform/kovanetsdk.h"
#include "platform/support/failure.h"

#include <algorithm>
#include <arpa/inet.h>
#include <array>
#include <cstdio>
#include <cstring>
#include <memory>
#include <net/if.h>
#include <netdb.h>
#include <netinet/in.h>
#include <sys/socket.h>

using KovaPlatform::fail;

namespace {

constexpr const char *kFile = "netsdk/hosts.cpp";
constexpr int kFamilyAny = 1; // the only family that callers may ask for

// The longest address text that inet_ntop writes (its mixed IPv4 forms are shorter) and the longest
// scope number. The caller's buffer holds both, but not always an address with an interface name of
// up to 15 characters.
constexpr std::size_t kAddressChars = sizeof "ffff:ffff:ffff:ffff:ffff:ffff:ffff:ffff" - 1;
constexpr std::size_t kScopeChars = sizeof "4294967295" - 1;
static_assert(INET6_ADDRSTRLEN <= KOVA_NET_IP_TEXT_BYTES, "an address always fits");
static_assert(kAddressChars + 1 + kScopeChars < KOVA_NET_IP_TEXT_BYTES,
              "an address with a scope number always fits");

// Callers distinguish only "no such host" and "no answer yet". To them, a name that exists but has
// no usable address is also "no such host".
int recordLookupFailure(int result) {
  switch (result) {
  case EAI_NONAME:
  case EAI_NODATA:
  case EAI_ADDRFAMILY:
    return fail({KOVA_NET_ERR_NO_HOST, kFile});
  case EAI_AGAIN:
    return fail({KOVA_NET_ERR_TRY_AGAIN, kFile});
  case EAI_MEMORY:
    return fail({KOVA_NET_ERR_NO_MEMORY, kFile});
  default:
    return fail({KOVA_NET_ERR_RESOLVER, kFile});
  }
}

const addrinfo *firstOf(const addrinfo *list, int family) {
  while (list != nullptr && list->ai_family != family) {
    list = list->ai_next;
  }
  return list;
}

// Copied, because reading the resolver's sockaddr as another type is undefined behaviour.
template <typename SocketAddress>
SocketAddress socketAddressOf(const addrinfo &entry) {
  SocketAddress address{};
  std::memcpy(&address, entry.ai_addr,
              std::min<std::size_t>(sizeof address, static_cast<std::size_t>(entry.ai_addrlen)));
  return address;
}

// Writes the interface name of a link-local address. Returns: false if the scope must be written as
// a number, because the address is not link-local (getaddrinfo(3) accepts names for link-local
// addresses only) or the interface no longer exists.
bool scopeName(const sockaddr_in6 &address, char *name) {
  const in6_addr &ip = address.sin6_addr;
  return (IN6_IS_ADDR_LINKLOCAL(&ip) || IN6_IS_ADDR_MC_LINKLOCAL(&ip)) &&
         ::if_indextoname(address.sin6_scope_id, name) != nullptr;
}

void writeIpv6(const sockaddr_in6 &address, char *buf) {
  std::array<char, INET6_ADDRSTRLEN> text{};
  (void)::inet_ntop(AF_INET6, &address.sin6_addr, text.data(), text.size()); // always fits
  if (address.sin6_scope_id == 0) {
    std::memcpy(buf, text.data(), text.size());
    return;
  }
  std::array<char, IF_NAMESIZE> scope{};
  std::array<char, INET6_ADDRSTRLEN + IF_NAMESIZE + 1> scoped{};
  if (scopeName(address, scope.data())) {
    std::snprintf(scoped.data(), scoped.size(), "%s%%%s", text.data(), scope.data());
  }
  // Without a usable name, or too long with it, the number is written, which always fits.
  if (scoped[0] == '\0' || std::strlen(scoped.data()) >= KOVA_NET_IP_TEXT_BYTES) {
    std::snprintf(scoped.data(), scoped.size(), "%s%%%u", text.data(), address.sin6_scope_id);
  }
  std::memcpy(buf, scoped.data(), std::strlen(scoped.data()) + 1);
}

// The caller gets one address and cannot fall back to another if that one is unreachable. IPv4 is
// preferred, because a host with both families is more often reachable over IPv4. Within a family
// the resolver's order is kept.
int writeFirst(const addrinfo *list, char *buf) {
  if (const addrinfo *entry = firstOf(list, AF_INET)) {
    const auto address = socketAddressOf<sockaddr_in>(*entry);
    (void)::inet_ntop(AF_INET, &address.sin_addr, buf, KOVA_NET_IP_TEXT_BYTES); // always fits
    return 1;
  }
  if (const addrinfo *entry = firstOf(list, AF_INET6)) {
    writeIpv6(socketAddressOf<sockaddr_in6>(*entry), buf);
    return 1;
  }
  return fail({KOVA_NET_ERR_NO_HOST, kFile});
}

} // namespace

// Uses inet_pton, because inet_aton also accepts short, octal and hexadecimal forms.
int BlKLIBIsIpAddr(const char *text) {
  in_addr ignored{};
  return text != nullptr && ::inet_pton(AF_INET, text, &ignored) == 1 ? 1 : 0;
}

int BlKLIBIsv6IpAddrValid(const char *text) {
  in6_addr ignored{};
  return text != nullptr && ::inet_pton(AF_INET6, text, &ignored) == 1 ? 1 : 0;
}

int KOVANetLookupIP(const char *name, char *buf, int family, int flags) {
  if (name == nullptr || *name == '\0' || buf == nullptr || family != kFamilyAny || flags != 0) {
    return fail({KOVA_NET_ERR_ARGUMENT, kFile});
  }
  addrinfo hints{};
  hints.ai_socktype = SOCK_STREAM; // otherwise each address is listed once for each socket type
  addrinfo *list = nullptr;
  const int result = ::getaddrinfo(name, nullptr, &hints, &list);
  if (result != 0) {
    return recordLookupFailure(result);
  }
  const std::unique_ptr<addrinfo, decltype(&::freeaddrinfo)> owner(list, &::freeaddrinfo);
  return writeFirst(list, buf);
}
