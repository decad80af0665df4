// A host, and what the resolver answers. Which texts are addresses is compared with the grammar,
// written down here. An address is returned unchanged and without a lookup. Any other host becomes
// the resolver's first IPv4 address, or else its first IPv6 address, in a text that reads as the
// same address; its scope is a name for link-local addresses only.
//
// Input: the host up to a line feed, one byte that is not 0 for a failing lookup, and the
// addresses: the byte 4 and four bytes, the byte 6 with 16 bytes, four of a scope and, up to a line
// feed, the name of its interface, or another byte for an address of another family.

#include "kovabackup/network.h"
#include "kovaplatform/kovanetsdk.h"

#include "fuzz/silent_log.h"
#include "fuzz/support.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <deque>
#include <net/if.h>
#include <netdb.h>
#include <netinet/in.h>
#include <optional>
#include <vector>

#include <arpa/inet.h>

namespace {

using KovaFuzz::require;

struct Found {
  sockaddr_storage address = {};
  socklen_t size = 0;
  std::string interface;
};

// What the resolver answers, and how often it was asked.
std::deque<Found> addresses;
std::deque<addrinfo> list;
int failure = 0;
int lookups = 0;

} // namespace

// In place of libc's, so that nothing is looked up.
extern "C" {

int getaddrinfo(const char *, const char *, const addrinfo *, addrinfo **out) {
  ++lookups;
  list.clear();
  for (Found &found : addresses) {
    addrinfo entry = {};
    entry.ai_family = found.address.ss_family;
    entry.ai_addr = reinterpret_cast<sockaddr *>(&found.address);
    entry.ai_addrlen = found.size;
    list.push_back(entry);
  }
  for (std::size_t i = 0; i + 1 < list.size(); ++i) {
    list[i].ai_next = &list[i + 1];
  }
  *out = list.empty() ? nullptr : &list.front();
  return failure;
}

void freeaddrinfo(addrinfo *) noexcept {}

// Each interface has the number of the scope that names it.
char *if_indextoname(unsigned index, char *name) noexcept {
  for (const Found &found : addresses) {
    sockaddr_in6 address = {};
    std::memcpy(&address, &found.address, sizeof address);
    if (address.sin6_family == AF_INET6 && address.sin6_scope_id == index &&
        !found.interface.empty()) {
      std::memcpy(name, found.interface.c_str(), found.interface.size() + 1);
      return name;
    }
  }
  errno = ENXIO;
  return nullptr;
}

} // extern "C"

namespace {

std::vector<std::string> splitAt(const std::string &text, char separator) {
  std::vector<std::string> parts = {""};
  for (const char byte : text) {
    if (byte == separator) {
      parts.emplace_back();
    } else {
      parts.back() += byte;
    }
  }
  return parts;
}

bool consistsOf(const std::string &text, std::size_t most, const char *digits) {
  return !text.empty() && text.size() <= most &&
         text.find_first_not_of(digits) == std::string::npos;
}

// Four numbers from 0 to 255 without leading zeros, with dots between them.
bool isPlainIpv4(const std::string &text) {
  const std::vector<std::string> parts = splitAt(text, '.');
  return parts.size() == 4 && std::all_of(parts.begin(), parts.end(), [](const std::string &part) {
           return consistsOf(part, 3, "0123456789") && (part == "0" || part[0] != '0') &&
                  std::stoi(part) <= 255;
         });
}

// How many groups of 16 bits a list of them has, of which the last may be an IPv4 address; none
// when it is not a list.
std::optional<std::size_t> groupsIn(const std::string &text, bool mayEndInIpv4) {
  if (text.empty()) {
    return 0;
  }
  std::vector<std::string> parts = splitAt(text, ':');
  std::size_t count = parts.size();
  if (mayEndInIpv4 && isPlainIpv4(parts.back())) {
    ++count;
    parts.back() = "0";
  }
  const bool valid = std::all_of(parts.begin(), parts.end(), [](const std::string &part) {
    return consistsOf(part, 4, "0123456789abcdefABCDEF");
  });
  return valid ? std::optional<std::size_t>(count) : std::nullopt;
}

// Eight groups, or fewer with one "::" in place of at least one.
bool isPlainIpv6(const std::string &text) {
  const std::size_t gap = text.find("::");
  if (gap == std::string::npos) {
    return groupsIn(text, true) == 8;
  }
  const auto before = groupsIn(text.substr(0, gap), false);
  const auto after = groupsIn(text.substr(gap + 2), true);
  return before && after && *before + *after <= 7;
}

Found takeIpv4(KovaFuzz::Input &input) {
  sockaddr_in address = {};
  address.sin_family = AF_INET;
  const std::string bytes = input.bytes(sizeof address.sin_addr);
  std::memcpy(&address.sin_addr, bytes.data(), bytes.size());
  Found found;
  std::memcpy(&found.address, &address, sizeof address);
  found.size = sizeof address;
  return found;
}

Found takeIpv6(KovaFuzz::Input &input) {
  sockaddr_in6 address = {};
  address.sin6_family = AF_INET6;
  const std::string bytes = input.bytes(sizeof address.sin6_addr);
  std::memcpy(&address.sin6_addr, bytes.data(), bytes.size());
  for (int i = 0; i < 4; ++i) {
    address.sin6_scope_id = address.sin6_scope_id << 8U | input.byte();
  }
  Found found;
  found.interface = input.until('\n').substr(0, IF_NAMESIZE - 1).c_str();
  std::memcpy(&found.address, &address, sizeof address);
  found.size = sizeof address;
  return found;
}

Found takeOther() {
  Found found;
  found.address.ss_family = AF_UNIX;
  found.size = sizeof found.address.ss_family;
  return found;
}

void takeAddresses(KovaFuzz::Input &input) {
  constexpr std::size_t kMost = 8;
  addresses.clear();
  while (!input.empty() && addresses.size() < kMost) {
    const unsigned family = input.byte();
    addresses.push_back(family == 4   ? takeIpv4(input)
                        : family == 6 ? takeIpv6(input)
                                      : takeOther());
  }
}

const Found *firstOf(int family) {
  const auto found = std::find_if(addresses.begin(), addresses.end(), [family](const Found &entry) {
    return entry.address.ss_family == family;
  });
  return found == addresses.end() ? nullptr : &*found;
}

void checkIpv4(const Found &found, const std::string &text) {
  sockaddr_in expected = {};
  std::memcpy(&expected, &found.address, sizeof expected);
  in_addr got = {};
  require(isPlainIpv4(text) && ::inet_pton(AF_INET, text.c_str(), &got) == 1);
  require(got.s_addr == expected.sin_addr.s_addr);
}

void checkIpv6(const Found &found, const std::string &text) {
  sockaddr_in6 expected = {};
  std::memcpy(&expected, &found.address, sizeof expected);
  const std::size_t percent = text.find('%');
  const std::string ip = text.substr(0, percent);
  in6_addr got = {};
  require(isPlainIpv6(ip) && ::inet_pton(AF_INET6, ip.c_str(), &got) == 1);
  require(std::memcmp(&got, &expected.sin6_addr, sizeof got) == 0);
  require((percent != std::string::npos) == (expected.sin6_scope_id != 0));
  if (percent == std::string::npos) {
    return;
  }
  const std::string scope = text.substr(percent + 1);
  if (scope == std::to_string(expected.sin6_scope_id)) {
    return;
  }
  char name[IF_NAMESIZE] = "";
  require(IN6_IS_ADDR_LINKLOCAL(&got) || IN6_IS_ADDR_MC_LINKLOCAL(&got));
  require(::if_indextoname(expected.sin6_scope_id, name) != nullptr && scope == name);
}

void checkLookup(const std::string &host, const std::string &text) {
  require(lookups == (host.empty() ? 0 : 1));
  const Found *const ipv4 = firstOf(AF_INET);
  const Found *const ipv6 = firstOf(AF_INET6);
  require(text.size() < KOVA_NET_IP_TEXT_BYTES);
  if (host.empty() || failure != 0 || (ipv4 == nullptr && ipv6 == nullptr)) {
    require(text.empty());
  } else if (ipv4 != nullptr) {
    checkIpv4(*ipv4, text);
  } else {
    checkIpv6(*ipv6, text);
  }
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t *data, std::size_t size) {
  KovaFuzz::Input input(data, size);
  const std::string given = input.until('\n');
  const std::string host = given.c_str();
  failure = input.byte() == 0 ? 0 : EAI_NONAME;
  takeAddresses(input);
  lookups = 0;
  const bool isIpv4 = isPlainIpv4(host);
  const bool isIpv6 = isPlainIpv6(host);
  require((::BlKLIBIsIpAddr(host.c_str()) != 0) == isIpv4);
  require((::BlKLIBIsv6IpAddrValid(host.c_str()) != 0) == isIpv6);
  const std::string text = KOVA::Backup::Net::getIpFromAddr(given);
  if (isIpv4 || isIpv6) {
    require(lookups == 0 && text == given);
  } else {
    checkLookup(host, text);
  }
  return 0;
}
