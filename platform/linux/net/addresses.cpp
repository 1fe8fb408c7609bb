// SPDX-License-Identifier: Apache-2.0
// Address checks.
#include "veld/net.h"

#include <arpa/inet.h>

int BlVLIBIsIpAddr(const char *text) {
    in_addr address{};
    return text != nullptr && inet_pton(AF_INET, text, &address) == 1 ? 1 : 0;
}

int BlVLIBIsv6IpAddrValid(const char *text) {
    in6_addr address{};
    return text != nullptr && inet_pton(AF_INET6, text, &address) == 1 ? 1 : 0;
}
