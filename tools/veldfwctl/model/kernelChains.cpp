// SPDX-License-Identifier: Apache-2.0
// What "iptables -v -S" tells about the firewall's chains.
#include "model/kernelChains.h"

#include <veldfirewall/fwRecords.h>

#include <sstream>

namespace veldfwctl {

std::map<std::string, ChainState> kernelChainsParse(const std::string &listing) {
    std::map<std::string, ChainState> chains;
    std::map<std::string, bool> reached;
    std::istringstream lines(listing);
    for (std::string line; std::getline(lines, line);) {
        std::istringstream words(line);
        std::string kind;
        std::string chain;
        words >> kind >> chain;
        const bool isOurs = chain == FW::FW_CHAIN_INPUT || chain == FW::FW_CHAIN_FORWARD;
        if (kind == "-N" && isOurs) {
            chains[chain];
        }
        if (kind != "-A") {
            continue;
        }
        uint64_t packets = 0;
        std::string target;
        for (std::string word; words >> word;) {
            if (word == "-c") {
                words >> packets;
            } else if (word == "-j") {
                words >> target;
            }
        }
        if (isOurs) {
            ++chains[chain].rules;
            chains[chain].droppedPackets += target == "DROP" ? packets : 0;
        } else if ((chain == "INPUT" && target == FW::FW_CHAIN_INPUT) ||
                   (chain == "FORWARD" && target == FW::FW_CHAIN_FORWARD)) {
            reached[target] = true;
        }
    }
    for (auto &[name, state] : chains) {
        state.isReached = reached[name];
    }
    return chains;
}

}  // namespace veldfwctl
