// SPDX-License-Identifier: Apache-2.0
// Which interface carries the IPv6 traffic of an IPv4 interface.
#include "net/tunnelChoice.h"

#include <algorithm>

namespace veld {

std::string ipv6RouterInterface(const std::string &interfaceName, const std::vector<Link> &links,
                                const std::vector<LinkAddress> &addresses) {
    const auto given =
        std::find_if(links.begin(), links.end(), [&](const Link &link) { return link.name == interfaceName; });
    if (given == links.end())
        return interfaceName;
    for (const Link &link : links) {
        // The kernel's fallback tunnel has the local address 0.0.0.0, which belongs to no interface.
        if (!link.sitLocal || link.sitLocal->s_addr == htonl(INADDR_ANY))
            continue;
        for (const LinkAddress &address : addresses) {
            if (address.index == given->index && address.local.s_addr == link.sitLocal->s_addr)
                return link.name;
        }
    }
    return interfaceName;
}

}  // namespace veld
