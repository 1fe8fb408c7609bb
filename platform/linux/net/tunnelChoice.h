// SPDX-License-Identifier: Apache-2.0
// Which interface carries the IPv6 traffic of an IPv4 interface.
#pragma once

#include "net/routeDump.h"

namespace veld {

// The first 6in4 tunnel, in the order of `links`, whose local address is one of the interface's, or else the name
// given.
std::string ipv6RouterInterface(const std::string &interfaceName, const std::vector<Link> &links,
                                const std::vector<LinkAddress> &addresses);

}  // namespace veld
