// The answers of the resolver are invented: this program defines the functions that the platform
// calls for them, so that no test depends on the names or interfaces of the machine.

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovanetsdk.h"

#include "tests/support/fault.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <deque>
#include <gmock/gmock.h>
#include <net/if.h>
#include <netdb.h>
#include <netinet/in.h>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include <arpa/inet.h>

namespace {

struct Answer {
  int result = 0;
  std::vector<addrinfo> entries;
  std::deque<sockaddr_storage> addresses;

  void add(int family, const std::string &text, unsigned scope = 0) {
    sockaddr_storage &storage = addresses.emplace_back();
    std::memset(&storage, 0, sizeof storage);
    storage.ss_family = static_cast<sa_family_t>(family);
    addrinfo entry{};
    entry.ai_family = family;
    entry.ai_addr = reinterpret_cast<sockaddr *>(&storage);
    if (family == AF_INET) {
      auto &address = reinterpret_cast<sockaddr_in &>(storage);
      ASSERT_EQ(1, ::inet_pton(AF_INET, text.c_str(), &address.sin_addr));
      entry.ai_addrlen = sizeof address;
    } else if (family == AF_INET6) {
      auto &address = reinterpret_cast<sockaddr_in6 &>(storage);
      ASSERT_EQ(1, ::inet_pton(AF_INET6, text.c_str(), &address.sin6_addr));
      address.sin6_scope_id = scope;
      entry.ai_addrlen = sizeof address;
    }
    entries.push_back(entry);
  }
};

Answer *standing = nullptr; // null: the real resolver answers
int given = 0;              // lists handed out and not yet freed
std::string interfaceName;  // "" when no interface has the number
unsigned interfaceAskedFor = 0;

class Hosts : public testing::Test {
protected:
  void SetUp() override {
    standing = &answer;
    interfaceName.clear();
    interfaceAskedFor = 0;
    KLIBCErrSetEx(0, nullptr, 0);
    buf.fill('#');
  }
  void TearDown() override {
    EXPECT_EQ(0, given) << "the answer was not freed exactly once";
    standing = nullptr;
  }

  std::optional<std::string> lookup(const char *name = "host") {
    if (KOVANetLookupIP(name, buf.data(), 1, 0) <= 0) {
      EXPECT_THAT(buf, testing::Each('#')) << "a failure wrote into the buffer";
      return std::nullopt;
    }
    EXPECT_EQ('#', buf.back()) << "written past the end";
    return std::string(buf.data());
  }

  Answer answer;
  std::array<char, KOVA_NET_IP_TEXT_BYTES + 1> buf{};
};

} // namespace

extern "C" {

int getaddrinfo(const char *name, const char *service, const addrinfo *hints, addrinfo **list) {
  if (standing == nullptr) {
    static auto *const real = KovaTest::realFunction<decltype(getaddrinfo)>("getaddrinfo");
    return real(name, service, hints, list);
  }
  EXPECT_EQ(AF_UNSPEC, hints->ai_family);
  EXPECT_EQ(SOCK_STREAM, hints->ai_socktype);
  EXPECT_EQ(0, hints->ai_flags);
  if (standing->result != 0) {
    return standing->result;
  }
  for (std::size_t i = 0; i + 1 < standing->entries.size(); ++i) {
    standing->entries[i].ai_next = &standing->entries[i + 1];
  }
  *list = standing->entries.data();
  ++given;
  return 0;
}

void freeaddrinfo(addrinfo *list) noexcept {
  if (standing == nullptr) {
    static auto *const real = KovaTest::realFunction<void(addrinfo *)>("freeaddrinfo");
    real(list);
    return;
  }
  EXPECT_EQ(standing->entries.data(), list);
  --given;
}

char *if_indextoname(unsigned index, char *name) noexcept {
  interfaceAskedFor = index;
  if (interfaceName.empty()) {
    errno = ENXIO;
    return nullptr;
  }
  return std::strcpy(name, interfaceName.c_str());
}
}

TEST(IsIpAddr, AcceptsFourNumbersWithDotsOnly) {
  for (const char *text : {"0.0.0.0", "10.0.0.1", "127.0.0.1", "255.255.255.255", "1.20.130.4"}) {
    EXPECT_NE(0, BlKLIBIsIpAddr(text)) << text;
  }
  for (const char *text :
       {"",           " ",         "1",          "1.2",       "1.2.3",          "1.2.3.",
        ".1.2.3",     "1..2.3",    "1.2.3.4.",   "1.2.3.4.5", "256.1.1.1",      "1.1.1.256",
        "1.2.3.1000", "01.2.3.4",  "1.2.3.00",   " 1.2.3.4",  "1.2.3.4 ",       "x1.2.3.4",
        "1.2.3.4x",   "1.2.3.4/8", "1.2.3.4:80", "+1.2.3.4",  "-1.2.3.4",       "0x1.2.3.4",
        "1.2.3.a",    "1,2,3,4",   "1.2.3.4\n",  "::1",       "::ffff:1.2.3.4", "localhost",
        "4294967296"}) {
    EXPECT_EQ(0, BlKLIBIsIpAddr(text)) << '"' << text << '"';
  }
}

TEST(IsIpAddr, NullIsNone) {
  EXPECT_EQ(0, BlKLIBIsIpAddr(nullptr));
}

TEST(IsIpv6Addr, AcceptsTheFormsOfTheStandard) {
  for (const char *text :
       {"::", "::1", "1::", "2001:db8::8:800:200c:417a", "2001:DB8:0:0:8:800:200C:417A",
        "ABCD:EF01:2345:6789:abcd:ef01:2345:6789", "0:0:0:0:0:0:0:1", "ff02::1", "fe80::1",
        "::ffff:129.144.52.38", "::13.1.68.3", "0:0:0:0:0:FFFF:129.144.52.38",
        "1:2:3:4:5:6:7::", "::2:3:4:5:6:7:8", "0001::"}) {
    EXPECT_NE(0, BlKLIBIsv6IpAddrValid(text)) << text;
  }
}

TEST(IsIpv6Addr, RefusesScopesBracketsPrefixesAndJunk) {
  for (const char *text : {"",
                           ":",
                           ":::",
                           "1",
                           "1:2:3:4:5:6:7",
                           "1:2:3:4:5:6:7:8:9",
                           "1::2::3",
                           "12345::",
                           "g::",
                           ":1",
                           "1:",
                           "1:2:3:4:5:6:7:",
                           "fe80::1%eth0",
                           "fe80::1%1",
                           "[::1]",
                           "::1/128",
                           " ::1",
                           "::1 ",
                           "::1\n",
                           "::ffff:1.2.3",
                           "::ffff:1.2.3.256",
                           "::ffff:01.2.3.4",
                           "1.2.3.4",
                           "1:2:3:4:5:6:7:1.2.3.4",
                           "::1.2.3.4:5",
                           "localhost"}) {
    EXPECT_EQ(0, BlKLIBIsv6IpAddrValid(text)) << '"' << text << '"';
  }
}

TEST(IsIpv6Addr, NullIsNone) {
  EXPECT_EQ(0, BlKLIBIsv6IpAddrValid(nullptr));
}

TEST(IpTests, RecordNoError) {
  KLIBCErrSetEx(0x1234, "kept", 5);
  (void)BlKLIBIsIpAddr("x");
  (void)BlKLIBIsv6IpAddrValid(nullptr);
  EXPECT_EQ(0x1234, KLIBCErrGet());
  KLIBCErrSetEx(0, nullptr, 0);
}

TEST_F(Hosts, TheOnlyAddressIsTheAnswer) {
  answer.add(AF_INET, "192.0.2.7");
  EXPECT_EQ("192.0.2.7", lookup());
  EXPECT_EQ(0, KLIBCErrGet());
}

TEST_F(Hosts, Ipv4ComesBeforeIpv6WhateverTheOrder) {
  answer.add(AF_INET6, "2001:db8::1");
  answer.add(AF_INET, "192.0.2.1");
  answer.add(AF_INET, "192.0.2.2");
  EXPECT_EQ("192.0.2.1", lookup());
}

TEST_F(Hosts, FirstIpv6AddressAnswersWhereThereIsNoIpv4) {
  answer.add(AF_INET6, "2001:db8::1");
  answer.add(AF_INET6, "2001:db8::2");
  EXPECT_EQ("2001:db8::1", lookup());
  EXPECT_EQ(0U, interfaceAskedFor);
}

TEST_F(Hosts, OtherFamiliesArePassedOver) {
  answer.add(AF_UNIX, "");
  answer.add(AF_INET, "192.0.2.1");
  EXPECT_EQ("192.0.2.1", lookup());
}

TEST_F(Hosts, LinkLocalAddressKeepsItsScopeByName) {
  answer.add(AF_INET6, "fe80::1", 7);
  interfaceName = "eth0";
  EXPECT_EQ("fe80::1%eth0", lookup());
  EXPECT_EQ(7U, interfaceAskedFor);
}

TEST_F(Hosts, LinkLocalGroupKeepsItsScopeByName) {
  answer.add(AF_INET6, "ff02::1", 7);
  interfaceName = "eth0";
  EXPECT_EQ("ff02::1%eth0", lookup());
}

TEST_F(Hosts, ScopeOfAnInterfaceThatIsGoneIsANumber) {
  answer.add(AF_INET6, "fe80::1", 4294967295U);
  EXPECT_EQ("fe80::1%4294967295", lookup());
}

TEST_F(Hosts, ScopeOfAnAddressThatIsNotLinkLocalIsANumber) {
  answer.add(AF_INET6, "fec0::1", 3);
  interfaceName = "eth0";
  EXPECT_EQ("fec0::1%3", lookup());
}

TEST_F(Hosts, ScopeNameThatJustFitsIsWrittenWhole) {
  answer.add(AF_INET6, "fe80:ffff:ffff:ffff:ffff:ffff:ffff:ffff", 7);
  interfaceName = "abcdefghijk"; // 39 + 1 + 11 characters and the NUL: 52 bytes
  EXPECT_EQ("fe80:ffff:ffff:ffff:ffff:ffff:ffff:ffff%abcdefghijk", lookup());
}

TEST_F(Hosts, ScopeNameThatWouldNotFitIsReplacedByItsNumber) {
  answer.add(AF_INET6, "fe80:ffff:ffff:ffff:ffff:ffff:ffff:ffff", 4294967295U);
  interfaceName = "abcdefghijkl";
  EXPECT_EQ("fe80:ffff:ffff:ffff:ffff:ffff:ffff:ffff%4294967295", lookup());
}

TEST_F(Hosts, HostWithoutAnInternetAddressIsAFailure) {
  answer.add(AF_UNIX, "");
  EXPECT_EQ(std::nullopt, lookup());
  EXPECT_EQ(KOVA_NET_ERR_NO_HOST, KLIBCErrGet());
}

TEST_F(Hosts, EveryResolverFailureHasItsCodeFileAndLine) {
  const std::vector<std::pair<int, int>> rows = {
      {EAI_NONAME, 0x5002}, {EAI_NODATA, 0x5002}, {EAI_ADDRFAMILY, 0x5002}, {EAI_AGAIN, 0x5003},
      {EAI_FAIL, 0x5004},   {EAI_SYSTEM, 0x5004}, {EAI_SERVICE, 0x5004},    {EAI_MEMORY, 0x5005}};
  for (const auto &[result, code] : rows) {
    answer.result = result;
    EXPECT_EQ(-1, KOVANetLookupIP("host", buf.data(), 1, 0));
    EXPECT_EQ(code, KLIBCErrGet()) << ::gai_strerror(result);
    EXPECT_STREQ("netsdk/hosts.cpp", KLIBCErrorGetFile());
    EXPECT_GT(KLIBCErrorGetLine(), 0);
  }
}

TEST_F(Hosts, BadArgumentsAreFailures) {
  answer.add(AF_INET, "192.0.2.1");
  const auto refused = [](int result) { return result <= 0 && KLIBCErrGet() == 0x5001; };
  EXPECT_TRUE(refused(KOVANetLookupIP(nullptr, buf.data(), 1, 0)));
  EXPECT_TRUE(refused(KOVANetLookupIP("", buf.data(), 1, 0)));
  EXPECT_TRUE(refused(KOVANetLookupIP("host", nullptr, 1, 0)));
  EXPECT_TRUE(refused(KOVANetLookupIP("host", buf.data(), 0, 0)));
  EXPECT_TRUE(refused(KOVANetLookupIP("host", buf.data(), 1, 1)));
  EXPECT_THAT(buf, testing::Each('#'));
}

TEST_F(Hosts, TheRecordOfAnotherThreadIsLeftAlone) {
  answer.result = EAI_NONAME;
  std::thread([this] { EXPECT_EQ(std::nullopt, lookup()); }).join();
  EXPECT_EQ(0, KLIBCErrGet());
}

TEST_F(Hosts, TheRealResolverResolvesAnAddressToItself) {
  standing = nullptr;
  EXPECT_EQ("127.0.0.1", lookup("127.0.0.1"));
  EXPECT_EQ("::1", lookup("::1"));
}
