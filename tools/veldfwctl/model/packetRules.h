// SPDX-License-Identifier: Apache-2.0
// Which packets an iptables command is about, and what happens to them.
#ifndef VELDFWCTL_PACKETRULES_H
#define VELDFWCTL_PACKETRULES_H

#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "model/packetSet.h"

namespace veldfwctl {

/// A mask with holes: addresses that no range describes.
struct AddressMask {
    PacketField field = FIELD_SOURCE;
    Number mask;
    Number value;
};

/// One command that appends a rule.
struct PacketRule {
    std::string table;
    std::string chain;
    bool isV6 = false;
    PacketSet packets = PacketSet::all();
    std::vector<AddressMask> masks;  ///< hold beside `packets`
    std::string target;              ///< "ACCEPT", "RETURN", "DROP", "LOG", or empty
    std::string notUnderstood;       ///< what in it has no known meaning; `packets` then says too much

    /// Ends the way of a packet through the chain.
    bool isFinal() const { return target == "ACCEPT" || target == "RETURN" || target == "DROP"; }
};

/// The addresses of a country.
using CountryAddresses = std::function<NumberSet(const std::string &country, bool isV6)>;

/// @param command program and arguments, as the library builds them
PacketRule packetRuleParse(const std::string &command, bool isV6, const InterfaceNumbers &interfaces,
                           const CountryAddresses &countries);

/// The interfaces that commands name, and loopback.
std::vector<std::string> interfacesNamed(const std::vector<std::string> &commands);

/// The protocol number of a name that iptables and the library use; nothing for another text.
std::optional<uint64_t> protocolNumber(const std::string &name);

}  // namespace veldfwctl

#endif
