// Looking up the address of a host, with the host services of the platform replaced.

#include "kovabackup/network.h"

#include "kovaplatform/kovacore.h"
#include "kovaplatform/kovanetsdk.h"
#include "tests/support/log_capture.h"

#include <algorithm>
#include <cstring>
#include <gmock/gmock.h>
#include <string>
#include <vector>

using namespace KovaTest;
using KOVA::Backup::Net::getIpFromAddr;
using testing::ElementsAre;

namespace {

// The replaced platform.
struct {
  bool ipv4 = false;
  bool ipv6 = false;
  int lookupResult = 1;
  std::string answer; // written including a NUL that it contains
  std::vector<std::string> calls;
} platform;

class GetIpFromAddr : public testing::Test {
protected:
  GetIpFromAddr() { platform = {}; }
  ~GetIpFromAddr() override { KLIBCErrSetEx(0, nullptr, 0); }
};

} // namespace

extern "C" {

int BlKLIBIsIpAddr(const char *text) {
  platform.calls.push_back(std::string("ipv4 ") + text);
  return platform.ipv4 ? -1 : 0; // any value but zero
}

int BlKLIBIsv6IpAddrValid(const char *text) {
  platform.calls.push_back(std::string("ipv6 ") + text);
  return platform.ipv6 ? -1 : 0; // any value but zero
}

int KOVANetLookupIP(const char *name, char *buf, int family, int flags) {
  EXPECT_TRUE(std::all_of(buf, buf + 52, [](char byte) { return byte == '\0'; }));
  platform.calls.push_back(std::string("lookup ") + name + " " + std::to_string(family) + " " +
                           std::to_string(flags));
  std::memcpy(buf, platform.answer.data(), platform.answer.size());
  if (platform.lookupResult <= 0) {
    KLIBCErrSetEx(0xA12, "net/lookup.c", 345);
  }
  return platform.lookupResult;
}
}

namespace {

TEST_F(GetIpFromAddr, LeavesAnIpv4AddressAsItIs) {
  platform.ipv4 = true;
  EXPECT_EQ("10.0.0.1", getIpFromAddr("10.0.0.1"));
  EXPECT_THAT(platform.calls, ElementsAre("ipv4 10.0.0.1"));
}

TEST_F(GetIpFromAddr, LeavesAnIpv6AddressAsItIs) {
  platform.ipv6 = true;
  EXPECT_EQ("::1", getIpFromAddr("::1"));
  EXPECT_THAT(platform.calls, ElementsAre("ipv4 ::1", "ipv6 ::1"));
}

TEST_F(GetIpFromAddr, LooksUpAName) {
  platform.answer = "192.0.2.7";
  EXPECT_EQ("192.0.2.7", getIpFromAddr("nas.example"));
  EXPECT_THAT(platform.calls,
              ElementsAre("ipv4 nas.example", "ipv6 nas.example", "lookup nas.example 1 0"));
}

TEST_F(GetIpFromAddr, TakesAnyResultAboveZeroForSuccess) {
  platform.answer = "2001:db8::5";
  platform.lookupResult = 28;
  EXPECT_EQ("2001:db8::5", getIpFromAddr("nas.example"));
}

TEST_F(GetIpFromAddr, TakesAnEmptyAnswerAsItIs) {
  EXPECT_EQ("", getIpFromAddr("nas.example"));
}

TEST_F(GetIpFromAddr, ReadsNoFurtherThanItsBuffer) {
  platform.answer = std::string(52, 'f');
  EXPECT_EQ(platform.answer, getIpFromAddr("nas.example"));
}

TEST_F(GetIpFromAddr, LogsAFailedLookupWithThePlatformsError) {
  for (const int result : {0, -1, -2147483647}) {
    platform.lookupResult = result;
    platform.answer = "192.0.2.7"; // must not be used
    LogCapture log;
    EXPECT_EQ("", getIpFromAddr("no.such.host"));
    EXPECT_THAT(log.take(),
                ElementsAre(errLine("network/network", 21,
                                    "lookup[no.such.host]: [0x0A12 net/lookup.c:345]")));
  }
}

TEST_F(GetIpFromAddr, LooksUpAnEmptyNameToo) {
  platform.lookupResult = -1;
  LogCapture log;
  EXPECT_EQ("", getIpFromAddr(""));
  EXPECT_THAT(log.take(),
              ElementsAre(errLine("network/network", 21, "lookup[]: [0x0A12 net/lookup.c:345]")));
}

} // namespace
