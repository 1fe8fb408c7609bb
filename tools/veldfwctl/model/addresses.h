// SPDX-License-Identifier: Apache-2.0
// Addresses, networks and ranges as an administrator writes them.
#ifndef VELDFWCTL_ADDRESSES_H
#define VELDFWCTL_ADDRESSES_H

#include <veldfirewall/fwRecords.h>

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace veldfwctl {

/// The address part of a rule, with the values of the FWRULE fields of the same names.
struct AddressMatch {
    int32_t ipGroup = FW::FW_IP_GROUP_ANY;
    int32_t ipType = FW::FW_IP_TYPE_BOTH;
    std::vector<std::string> ipList;
};

/// A numeric address; IPv4 addresses use the first four bytes.
struct Address {
    bool isV6 = false;
    std::array<uint8_t, 16> bytes = {};
};

/// @return nothing when the text is no numeric address
std::optional<Address> addressFromText(const std::string &text);
std::string addressText(const Address &address);

/// Understands "any", "10.0.0.5", "10.0.0.0/24", "10.0.0.0/255.255.255.0", "10.0.0.5-10.0.0.9", and the same in IPv6.
/// @throws UsageError that names the text and what is wrong with it
AddressMatch addressMatchParse(const std::string &text);

/// The networks that together are exactly the range, fewest first: {"10.0.0.0/24", "10.0.1.0/32"}.
/// @param first not after `last`, of the same family
std::vector<std::string> rangeNetworks(const Address &first, const Address &last);

}  // namespace veldfwctl

#endif
