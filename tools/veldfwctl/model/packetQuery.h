// SPDX-License-Identifier: Apache-2.0
// A packet as an administrator describes it.
#ifndef VELDFWCTL_PACKETQUERY_H
#define VELDFWCTL_PACKETQUERY_H

#include <string>
#include <vector>

#include "model/packetSet.h"

namespace veldfwctl {

/// What the command line says; what is empty may be anything.
struct PacketQuery {
    std::string from;
    std::string to;
    std::string toPort;    ///< "445/tcp", "53"
    std::string fromPort;  ///< a number
    std::string protocol;  ///< for packets without ports: "icmp", "igmp", a number
    std::string in;
    std::string out;  ///< not empty: the packet is forwarded
    bool isEstablished = false;

    bool isV6() const;
    bool isForwarded() const { return !out.empty(); }
    /// @throws UsageError that names the value that is wrong
    PacketSet packets(const InterfaceNumbers &interfaces) const;
};

/// What parts `some` from `whole`, in words: "destination 10.0.0.1, source port 701-703"; empty when nothing does.
std::string packetDifferenceText(const PacketSet &some, const PacketSet &whole, bool isV6,
                                 const std::vector<std::string> &interfaces);

}  // namespace veldfwctl

#endif
