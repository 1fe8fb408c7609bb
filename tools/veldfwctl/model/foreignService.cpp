// SPDX-License-Identifier: Apache-2.0
// What the formats of other firewall managers have in common.
#include "model/foreignService.h"

#include <algorithm>

#include "model/numbers.h"

namespace veldfwctl {

bool isXml(const std::string &text) {
    const size_t start = text.rfind("\xEF\xBB\xBF", 0) == 0 ? 3 : 0;
    const size_t first = text.find_first_not_of(" \t\r\n", start);
    return first != std::string::npos && text[first] == '<';
}

std::string foreignPortsAdd(ForeignService &service, PortsByProtocol &side, const std::string &ports, char rangeSign,
                            const std::string &protocol) {
    const std::vector<std::string> ends = split(ports, rangeSign);
    const std::optional<int> first = numberParse(ends.front(), 1, 65535);
    const std::optional<int> last = numberParse(ends.back(), 1, 65535);
    if (ends.size() > 2 || !first || !last) {
        return "\"" + ports + "\" is no port or range of ports from 1 to 65535";
    }
    if (protocol == "sctp" || protocol == "dccp") {
        service.losses.push_back((&side == &service.source ? "source port " : "port ") + ports + "/" + protocol);
        return "";
    }
    // Either end may come first, as for the other managers.
    const auto [low, high] = std::minmax({*first, *last});
    const NumberSet set = NumberSet::range(static_cast<uint64_t>(low), static_cast<uint64_t>(high));
    const bool isAny = protocol == "any";
    if (!isAny && protocol != "tcp" && protocol != "udp") {
        return "\"" + protocol + "\" is no protocol with ports";
    }
    if (isAny || protocol == "tcp") {
        side.tcp = side.tcp.unite(set);
    }
    if (isAny || protocol == "udp") {
        side.udp = side.udp.unite(set);
    }
    return "";
}

}  // namespace veldfwctl
