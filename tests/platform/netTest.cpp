// SPDX-License-Identifier: Apache-2.0
// Interfaces, addresses, PPPoE, and the network tool's choice of a tunnel.
#include "veld/net.h"
#include "files.h"
#include "net/routeDump.h"
#include "net/tunnelChoice.h"
#include "network.h"
#include "veld/core.h"

#include <arpa/inet.h>
#include <linux/rtnetlink.h>

using namespace veldtest;

namespace {

// What the kernel tells of a tunnel.
constexpr char tunnelMessage[] = "\x54\0\0\0\x10\0\0\0\0\0\0\0\0\0\0\0"             // length, RTM_NEWLINK
                                 "\0\0\0\0\x07\0\0\0\0\0\0\0\0\0\0\0"               // index 7
                                 "\x08\0\x04\0\xc8\x05\0\0\x0c\0\x03\0tun6in4\0"    // IFLA_MTU, IFLA_IFNAME
                                 "\x20\0\x12\x80\x07\0\x01\0sit\0\x14\0\x02\x80"    // IFLA_INFO_KIND, _DATA:
                                 "\x08\0\x01\0\0\0\0\0\x08\0\x02\0\xc0\0\x02\x01";  // IFLA_IPTUN_LINK, _LOCAL

TEST(RouteDump, OnlySitTunnelsAreReadAsSuch) {
    alignas(nlmsghdr) char message[sizeof tunnelMessage];
    memcpy(message, tunnelMessage, sizeof tunnelMessage);
    const auto &header = *reinterpret_cast<const nlmsghdr *>(message);
    auto link = veld::parseLink(header);
    ASSERT_TRUE(link && link->sitLocal);
    EXPECT_EQ(link->index, 7);
    EXPECT_EQ(link->name, "tun6in4");
    EXPECT_EQ(link->sitLocal->s_addr, inet_addr("192.0.2.1"));
    message[std::string(message, sizeof message).find("sit")] = 'g';
    link = veld::parseLink(header);
    EXPECT_TRUE(link && !link->sitLocal);
    message[4] = RTM_DELLINK;
    EXPECT_FALSE(veld::parseLink(header));
}

TEST(TunnelChoice, TunnelMustEndAtAnAddressOfTheInterface) {
    const auto ip4 = [](const char *text) { return in_addr{inet_addr(text)}; };
    const std::vector<veld::Link> links = {{1, 0, "lo", {}},
                                           {2, 0, "ppp0", {}},
                                           {3, 0, "eth0", {}},
                                           {4, 0, "sit0", ip4("0.0.0.0")},
                                           {5, 0, "six1", ip4("192.0.2.9")},
                                           {6, 0, "six2", ip4("192.0.2.2")},
                                           {7, 0, "six3", ip4("192.0.2.2")}};
    const std::vector<veld::LinkAddress> addresses = {
        {2, ip4("192.0.2.1")}, {2, ip4("192.0.2.2")}, {3, ip4("192.0.2.3")}, {1, ip4("0.0.0.0")}};
    EXPECT_EQ(veld::ipv6RouterInterface("ppp0", links, addresses), "six2");
    for (const char *none : {"eth0", "lo", "unknown", ""})
        EXPECT_EQ(veld::ipv6RouterInterface(none, links, addresses), none);
}

TEST(NetworkTool, PrintsTheRealTunnelOfAnInterfaceOrTheGivenName) {
    const auto ask = [](const char *name) { return runChecked({VELD_NETDTOOL, "--get-ipv6-router-interface", name}); };
    addDummyInterface("eth7");
    addAddress("eth7", "192.0.2.1/24");
    for (const char *name : {"eth7", "unknown"})
        EXPECT_EQ(ask(name), name);
    EXPECT_EQ(runProgram({VELD_NETDTOOL, "--help", "x"}).status, 2);
    if (!runProgram({"ip", "link", "add", "six0", "type", "sit", "local", "192.0.2.1"}).succeeded())
        GTEST_SKIP() << "this kernel makes no 6in4 tunnel";
    EXPECT_EQ(ask("eth7"), "six0");
}

TEST(Interfaces, AllButLoopbackInKernelOrderAndAtMostAsAsked) {
    VLIBNETINTERFACEINFO records[32];
    EXPECT_EQ(VLIBNetGetInterfaceInfo(records, 32, VLIBNET_KIND_ALL), 0) << "only loopback exists";
    const char *names[] = {"zeta", "alpha", "mid"};
    for (const char *name : names)
        addDummyInterface(name);
    setUp("zeta");
    ASSERT_EQ(VLIBNetGetInterfaceInfo(records, 32, VLIBNET_KIND_ALL), 3);
    for (int i = 0; i < 3; ++i) {
        EXPECT_STREQ(records[i].szName, names[i]);
        EXPECT_EQ(records[i].index, static_cast<int>(if_nametoindex(names[i])));
        EXPECT_EQ((records[i].flags & IFF_UP) != 0, i == 0) << names[i];
    }
    EXPECT_EQ(VLIBNetGetInterfaceInfo(records, 2, VLIBNET_KIND_ALL), 2);
    EXPECT_LT(VLIBNetGetInterfaceInfo(nullptr, 2, VLIBNET_KIND_ALL), 0);
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
}

TEST(Addresses, AreWholeAddressesOfTheirFamilyWithoutPrefixOrScope) {
    EXPECT_TRUE(BlVLIBIsIpAddr("192.0.2.255") && BlVLIBIsv6IpAddrValid("2001:db8::1"));
    for (const char *invalid : {"", "192.0.2", "192.0.2.1 ", "1.2.3.4/8", "::1"})
        EXPECT_EQ(BlVLIBIsIpAddr(invalid), 0) << invalid;
    for (const char *invalid : {"", "fe80::1%lo", "192.0.2.1", "::1/128"})
        EXPECT_EQ(BlVLIBIsv6IpAddrValid(invalid), 0) << invalid;
    EXPECT_FALSE(BlVLIBIsIpAddr(nullptr) || BlVLIBIsv6IpAddrValid(nullptr));
}

TEST(Pppoe, IsTheExistingInterfaceInPppdsFile) {
    char name[256] = "x";
    EXPECT_LT(VELDPPPoeIntfGet(name, sizeof name), 0);
    EXPECT_STREQ(name, "");
    writeFile("/run/ppp-pppoe.pid", "123\nppp7\n");
    EXPECT_LT(VELDPPPoeIntfGet(name, sizeof name), 0) << "the interface does not exist";
    EXPECT_EQ(VLIBCErrGet(), 0x0E00 | ENODEV);
    addDummyInterface("ppp7");
    EXPECT_EQ(VELDPPPoeIntfGet(name, 5), 4);
    EXPECT_STREQ(name, "ppp7");
    EXPECT_LT(VELDPPPoeIntfGet(name, 4), 0) << "no room for the NUL";
    for (const char *text : {"", "123", "123\n", "123\n\nppp7\n", "ppp7\n"}) {
        writeFile("/run/ppp-pppoe.pid", text);
        EXPECT_LT(VELDPPPoeIntfGet(name, sizeof name), 0) << text;
    }
}

}  // namespace
