// libkovanetsdk: address tests and lookup. Nothing leaves this machine.

#include "tests/conformance/check.h"

#include "kovaplatform/kovanetsdk.h"

namespace KovaConformance {
namespace {

void knowsIpv4() {
  for (const char *text : {"10.0.0.1", "0.0.0.0", "255.255.255.255", "127.0.0.1"}) {
    expect(BlKLIBIsIpAddr(text) != 0, inQuotes(text) + " is not taken for an IPv4 address");
  }
  for (const char *text :
       {"", "host", "1.2.3", "1.2.3.4.5", "256.1.1.1", "1.2.3.4x", "::1", "1.2.3.example"}) {
    expect(BlKLIBIsIpAddr(text) == 0, inQuotes(text) + " is taken for an IPv4 address");
  }
}

void knowsIpv6() {
  for (const char *text : {"::1", "::", "fe80::1", "2001:db8:0:0:0:0:0:1", "::ffff:10.0.0.1"}) {
    expect(BlKLIBIsv6IpAddrValid(text) != 0, inQuotes(text) + " is not taken for an IPv6 address");
  }
  for (const char *text : {"", "host", "10.0.0.1", ":::", "1::2::3", "12345::", "2001:db8"}) {
    expect(BlKLIBIsv6IpAddrValid(text) == 0, inQuotes(text) + " is taken for an IPv6 address");
  }
}

// Returns: what the platform returned.
int lookUp(const std::string &name, std::string &address) {
  constexpr std::size_t kGuardBytes = 64;
  const std::string guard(kGuardBytes, '\x5A');
  std::string buffer(KOVA_NET_IP_TEXT_BYTES, '\0');
  buffer += guard;
  const int result = KOVANetLookupIP(name.c_str(), buffer.data(), 1, 0);
  expect(buffer.substr(KOVA_NET_IP_TEXT_BYTES) == guard, "KOVANetLookupIP wrote past 52 bytes");
  address = textIn(buffer);
  return result;
}

void looksUpThisMachine() {
  std::string address;
  expect(lookUp("localhost", address) > 0, "\"localhost\" is not found");
  const std::string plain = address.substr(0, address.find('%'));
  expect(BlKLIBIsIpAddr(plain.c_str()) != 0 || BlKLIBIsv6IpAddrValid(plain.c_str()) != 0,
         "\"localhost\" is found at " + inQuotes(address) + ", which is no address");
}

void looksUpNoHost() {
  std::string address;
  const std::string impossible(64, 'a'); // a label has at most 63 bytes
  expect(lookUp(impossible, address) <= 0,
         "a name that no host can have is found at " + inQuotes(address));
  expectErrorRecorded("KOVANetLookupIP of a name that no host can have");
}

} // namespace

std::vector<Check> netsdkChecks() {
  return {
      {"netsdk.ipv4", "IPv4 addresses are told from other texts", knowsIpv4},
      {"netsdk.ipv6", "IPv6 addresses are told from other texts", knowsIpv6},
      {"netsdk.lookup", "a name is resolved to the text of an address", looksUpThisMachine},
      {"netsdk.lookup-none", "a name without a host is told by 0 or less", looksUpNoHost},
  };
}

} // namespace KovaConformance
