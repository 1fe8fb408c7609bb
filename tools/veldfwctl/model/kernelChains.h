// SPDX-License-Identifier: Apache-2.0
// What "iptables -v -S" tells about the firewall's chains.
#ifndef VELDFWCTL_KERNELCHAINS_H
#define VELDFWCTL_KERNELCHAINS_H

#include <cstdint>
#include <map>
#include <string>

namespace veldfwctl {

struct ChainState {
    bool isReached = false;       ///< INPUT or FORWARD jumps to it
    uint64_t rules = 0;           ///< number of its rules
    uint64_t droppedPackets = 0;  ///< sum of the counters of its rules that drop
};

/// The firewall's chains by name; a chain that does not exist is left out.
/// @param listing rules with counters ("-A INPUT_FIREWALL -i eth0 -c 12 720 -j DROP"), chains ("-N", "-P")
std::map<std::string, ChainState> kernelChainsParse(const std::string &listing);

}  // namespace veldfwctl

#endif
