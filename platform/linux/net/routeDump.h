// SPDX-License-Identifier: Apache-2.0
// Network interfaces, tunnels and IPv4 addresses as the kernel's routing netlink tells them.
#pragma once

#include <netinet/in.h>
#include <optional>
#include <string>
#include <vector>

struct nlmsghdr;

namespace veld {

struct Link {
    int index = 0;
    unsigned int flags = 0;  // IFF_*
    std::string name;
    std::optional<in_addr> sitLocal;  // local address of a 6in4 (sit) tunnel
};

struct LinkAddress {
    int index = 0;  // of the interface
    in_addr local{};
};

// Reads one message: the interface, the IPv4 address in it, or none when it is of another kind or malformed.
std::optional<Link> parseLink(const nlmsghdr &message);
std::optional<LinkAddress> parseAddress(const nlmsghdr &message);

// All interfaces in the order of their kernel index, all IPv4 addresses: 0 or an errno value.
int readLinks(std::vector<Link> &links);
int readAddresses(std::vector<LinkAddress> &addresses);

}  // namespace veld
