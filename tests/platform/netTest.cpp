// SPDX-License-Identifier: Apache-2.0
// Interfaces, addresses, PPPoE, and the network tool's choice of a tunnel.
#include "veld/net.h"
#include "files.h"
#include "net/routeDump.h"
#include "net/tunnelChoice.h"
#include "network.h"
#include "processes.h"
#include "veld/core.h"

#include <arpa/inet.h>
#include <gtest/gtest.h>
#include <libmnl/libmnl.h>
#include <linux/if_link.h>
#include <linux/if_tunnel.h>
#include <linux/rtnetlink.h>

#include <array>

using namespace veldtest;

namespace {

in_addr ip4(const char *text) {
    in_addr address{};
    EXPECT_EQ(inet_pton(AF_INET, text, &address), 1);
    return address;
}

class Message {
public:
    explicit Message(int type) : header_(mnl_nlmsg_put_header(buffer_.data())) {
        header_->nlmsg_type = static_cast<__u16>(type);
    }
    nlmsghdr *operator->() { return header_; }
    nlmsghdr *get() { return header_; }
    template <typename Header> Header &put() {
        return *static_cast<Header *>(mnl_nlmsg_put_extra_header(header_, sizeof(Header)));
    }

private:
    alignas(nlmsghdr) std::array<char, 1024> buffer_{};
    nlmsghdr *header_;
};

/// A link message with these parts; an empty kind or local address is left out.
void fillLink(Message &message, int index, const char *name, const std::string &kind, const std::string &local) {
    message.put<ifinfomsg>().ifi_index = index;
    mnl_attr_put_u32(message.get(), IFLA_MTU, 1480);
    mnl_attr_put_strz(message.get(), IFLA_IFNAME, name);
    if (kind.empty())
        return;
    nlattr *info = mnl_attr_nest_start(message.get(), IFLA_LINKINFO);
    mnl_attr_put_str(message.get(), IFLA_INFO_KIND, kind.c_str());
    nlattr *data = mnl_attr_nest_start(message.get(), IFLA_INFO_DATA);
    mnl_attr_put_u32(message.get(), IFLA_IPTUN_LINK, 0);
    if (!local.empty())
        mnl_attr_put_u32(message.get(), IFLA_IPTUN_LOCAL, ip4(local.c_str()).s_addr);
    mnl_attr_nest_end(message.get(), data);
    mnl_attr_nest_end(message.get(), info);
}

TEST(RouteDump, OnlyWholeSitTunnelsAreRead) {
    Message tunnel(RTM_NEWLINK);
    fillLink(tunnel, 7, "tun6in4", "sit", "192.0.2.1");
    auto link = veld::parseLink(*tunnel.get());
    ASSERT_TRUE(link && link->sitLocal);
    EXPECT_EQ(link->index, 7);
    EXPECT_EQ(link->name, "tun6in4");
    EXPECT_EQ(link->sitLocal->s_addr, ip4("192.0.2.1").s_addr);
    for (const auto &[kind, local] : {std::pair("", ""), std::pair("ipip", "192.0.2.1"), std::pair("sit", "")}) {
        Message other(RTM_NEWLINK);
        fillLink(other, 8, "x", kind, local);
        link = veld::parseLink(*other.get());
        EXPECT_TRUE(link && !link->sitLocal) << kind;
    }
    // Cut at every (aligned) length: never a read beyond the end, never a tunnel made of half a message.
    const auto *bytes = reinterpret_cast<const char *>(tunnel.get());
    for (size_t length = sizeof(nlmsghdr); length < tunnel->nlmsg_len; length += NLMSG_ALIGNTO) {
        const std::unique_ptr<char[]> exact(new char[length]);
        std::copy_n(bytes, length, exact.get());
        auto *header = reinterpret_cast<nlmsghdr *>(exact.get());
        header->nlmsg_len = static_cast<__u32>(length);
        link = veld::parseLink(*header);
        EXPECT_FALSE(link && link->sitLocal) << length;
    }
    tunnel->nlmsg_type = RTM_DELLINK;
    EXPECT_FALSE(veld::parseLink(*tunnel.get()));
}

TEST(TunnelChoice, TunnelMustEndAtAnAddressOfTheInterface) {
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
    const auto ask = [](const std::string &name) {
        return runChecked({VELD_NETDTOOL, "--get-ipv6-router-interface", name});
    };
    addDummyInterface("eth7");
    addDummyInterface("eth8");
    addAddress("eth7", "192.0.2.1/24");
    addAddress("eth8", "198.51.100.1/24");
    for (const char *name : {"eth7", "unknown"})
        EXPECT_EQ(ask(name), name);
    EXPECT_EQ(runProgram({VELD_NETDTOOL, "--help", "x"}).status, 2);
    const auto added =
        runProgram({"ip", "link", "add", "six0", "type", "sit", "local", "192.0.2.1", "remote", "192.0.2.2"});
    if (!added.succeeded())
        GTEST_SKIP() << "this kernel makes no 6in4 tunnel: " << added.errors;
    EXPECT_EQ(ask("eth7"), "six0");
    EXPECT_EQ(ask("eth8"), "eth8");
}

TEST(Interfaces, AllButLoopbackInKernelOrderAndAtMostAsAsked) {
    VLIBNETINTERFACEINFO records[32];
    const int before = VLIBNetGetInterfaceInfo(records, 32, VLIBNET_KIND_ALL);
    EXPECT_EQ(before, 0) << "only loopback exists";
    addVethPair("zeta", "alpha");
    addDummyInterface("mid");
    setUp("zeta");
    ASSERT_EQ(VLIBNetGetInterfaceInfo(records, 32, VLIBNET_KIND_ALL), 3);
    for (int i = 0; i < 3; ++i) {
        EXPECT_EQ(records[i].index, static_cast<int>(if_nametoindex(records[i].szName)));
        EXPECT_TRUE(i == 0 || records[i - 1].index < records[i].index);
        EXPECT_EQ((records[i].flags & IFF_UP) != 0, std::string(records[i].szName) == "zeta") << records[i].szName;
    }
    EXPECT_STREQ(records[2].szName, "mid");
    EXPECT_EQ(VLIBNetGetInterfaceInfo(records, 2, VLIBNET_KIND_ALL), 2);
    EXPECT_LT(VLIBNetGetInterfaceInfo(nullptr, 2, VLIBNET_KIND_ALL), 0);
    EXPECT_EQ(VLIBCErrGet(), 0x0D00);
}

TEST(Addresses, AreThoseThatTheCLibraryReads) {
    for (const char *valid : {"0.0.0.0", "192.0.2.255"})
        EXPECT_NE(BlVLIBIsIpAddr(valid), 0) << valid;
    for (const char *invalid : {"", "192.0.2", "192.0.2.256", "192.0.2.1 ", "1.2.3.4/8", "::1"})
        EXPECT_EQ(BlVLIBIsIpAddr(invalid), 0) << invalid;
    for (const char *valid : {"::", "2001:db8::1", "::ffff:192.0.2.1"})
        EXPECT_NE(BlVLIBIsv6IpAddrValid(valid), 0) << valid;
    for (const char *invalid : {"", ":", "2001:db8::1::2", "fe80::1%lo", "192.0.2.1", "::1/128"})
        EXPECT_EQ(BlVLIBIsv6IpAddrValid(invalid), 0) << invalid;
    EXPECT_EQ(BlVLIBIsIpAddr(nullptr), 0);
    EXPECT_EQ(BlVLIBIsv6IpAddrValid(nullptr), 0);
}

TEST(Pppoe, IsTheExistingInterfaceInPppdsFile) {
    char name[256] = "x";
    EXPECT_LT(VELDPPPoeIntfGet(name, sizeof name), 0);
    EXPECT_STREQ(name, "");
    writeFile("/run/ppp-pppoe.pid", "123\nppp7\n");
    EXPECT_LT(VELDPPPoeIntfGet(name, sizeof name), 0) << "the interface does not exist";
    EXPECT_EQ(VLIBCErrGet(), 0x0E00 | ENODEV);
    addDummyInterface("ppp7");
    EXPECT_EQ(VELDPPPoeIntfGet(name, sizeof name), 4);
    EXPECT_STREQ(name, "ppp7");
    EXPECT_LT(VELDPPPoeIntfGet(name, 4), 0) << "no room for the NUL";
    writeFile("/run/ppp-pppoe.pid", "123\nppp7");
    EXPECT_EQ(VELDPPPoeIntfGet(name, 5), 4);
    for (const char *text : {"", "123", "123\n", "123\n\nppp7\n", "ppp7\n"}) {
        writeFile("/run/ppp-pppoe.pid", text);
        EXPECT_LT(VELDPPPoeIntfGet(name, sizeof name), 0) << text;
    }
}

}  // namespace
