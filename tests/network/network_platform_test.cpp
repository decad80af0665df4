// Address lookup through the linked host services, without a name server: addresses, and the name
// of the loopback interface.

#include "kovabackup/network.h"

#include <gmock/gmock.h>

using KOVA::Backup::Net::getIpFromAddr;
using testing::AnyOf;

TEST(GetIpFromAddrHere, LeavesAddressesAsTheyAre) {
  for (const char *address : {"10.0.0.1", "::1", "fe80::1", "255.255.255.255"}) {
    EXPECT_EQ(address, getIpFromAddr(address));
  }
}

TEST(GetIpFromAddrHere, FindsTheLoopbackInterface) {
  EXPECT_THAT(getIpFromAddr("localhost"), AnyOf("127.0.0.1", "::1"));
}
