// SPDX-License-Identifier: Apache-2.0
// Addresses, networks and ranges as an administrator writes them.
#include "model/addresses.h"

#include <arpa/inet.h>

#include <algorithm>

#include "frame/errors.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

int familyBits(const Address &address) {
    return address.isV6 ? 128 : 32;
}

bool bitGet(const Address &address, int bit) {
    return (address.bytes[static_cast<size_t>(bit / 8)] >> (7 - bit % 8) & 1) != 0;
}

void bitSet(Address &address, int bit, bool value) {
    const auto mask = static_cast<uint8_t>(1 << (7 - bit % 8));
    uint8_t &byte = address.bytes[static_cast<size_t>(bit / 8)];
    byte = static_cast<uint8_t>(value ? byte | mask : byte & ~mask);
}

/// The first or the last address of the network that `address` lies in.
Address networkEdge(Address address, int prefix, bool last) {
    for (int bit = prefix; bit < familyBits(address); ++bit) {
        bitSet(address, bit, last);
    }
    return address;
}

/// The next address, or nothing after the last one.
std::optional<Address> successor(Address address) {
    for (int bit = familyBits(address) - 1; bit >= 0; --bit) {
        const bool wasSet = bitGet(address, bit);
        bitSet(address, bit, !wasSet);
        if (!wasSet) {
            return address;
        }
    }
    return std::nullopt;
}

Address addressRequire(const std::string &text, const std::string &whole) {
    const std::optional<Address> address = addressFromText(text);
    if (!address) {
        const std::string inside = text == whole ? "" : " in \"" + whole + "\"";
        throw UsageError("\"" + text + "\"" + inside +
                         " is no IPv4 or IPv6 address; write it in numbers, like 192.0.2.7 or 2001:db8::7");
    }
    return *address;
}

int prefixParse(const std::string &text, const Address &address, const std::string &whole) {
    const int bits = familyBits(address);
    if (const std::optional<int> prefix = numberParse(text, 0, bits)) {
        return *prefix;
    }
    const std::optional<Address> mask = address.isV6 ? std::nullopt : addressFromText(text);
    if (mask && !mask->isV6) {
        int prefix = 0;
        while (prefix < bits && bitGet(*mask, prefix)) {
            ++prefix;
        }
        if (networkEdge(*mask, prefix, false).bytes == mask->bytes) {
            return prefix;
        }
    }
    throw UsageError("\"" + text + "\" in \"" + whole + "\" is no prefix length of " +
                     (address.isV6 ? "IPv6" : "IPv4") + "; it goes from 0 to " + std::to_string(bits));
}

int32_t ipTypeOf(const Address &address) {
    return address.isV6 ? FW::FW_IP_TYPE_V6 : FW::FW_IP_TYPE_V4;
}

AddressMatch networkParse(const std::string &text, size_t slash) {
    const Address address = addressRequire(text.substr(0, slash), text);
    const int prefix = prefixParse(text.substr(slash + 1), address, text);
    const std::string network = addressText(networkEdge(address, prefix, false));
    if (network != addressText(address)) {
        throw UsageError("\"" + text + "\" names an address inside a network; write " + network + "/" +
                         std::to_string(prefix) + " for the network or " + addressText(address) + " for the address");
    }
    return {FW::FW_IP_GROUP_NETWORK, ipTypeOf(address), {network, std::to_string(prefix)}};
}

AddressMatch rangeParse(const std::string &text, size_t dash) {
    const Address first = addressRequire(text.substr(0, dash), text);
    const Address last = addressRequire(text.substr(dash + 1), text);
    if (first.isV6 != last.isV6) {
        throw UsageError("\"" + text + "\" mixes IPv4 and IPv6; both ends of a range must be of one family");
    }
    if (first.bytes > last.bytes) {
        throw UsageError("\"" + text + "\" ends before it begins; write " + addressText(last) + "-" +
                         addressText(first));
    }
    return {FW::FW_IP_GROUP_RANGE, ipTypeOf(first), {addressText(first), addressText(last)}};
}

}  // namespace

std::optional<Address> addressFromText(const std::string &text) {
    Address address;
    if (inet_pton(AF_INET, text.c_str(), address.bytes.data()) == 1) {
        return address;
    }
    address.isV6 = true;
    if (inet_pton(AF_INET6, text.c_str(), address.bytes.data()) == 1) {
        return address;
    }
    return std::nullopt;
}

std::string addressText(const Address &address) {
    char text[INET6_ADDRSTRLEN] = {};
    inet_ntop(address.isV6 ? AF_INET6 : AF_INET, address.bytes.data(), text, sizeof text);
    return text;
}

AddressMatch addressMatchParse(const std::string &text) {
    if (text == "any") {
        return {};
    }
    if (const size_t slash = text.find('/'); slash != std::string::npos) {
        return networkParse(text, slash);
    }
    if (const size_t dash = text.find('-'); dash != std::string::npos) {
        return rangeParse(text, dash);
    }
    const Address address = addressRequire(text, text);
    return {FW::FW_IP_GROUP_ADDRESS, ipTypeOf(address), {addressText(address)}};
}

std::vector<std::string> rangeNetworks(const Address &first, const Address &last) {
    std::vector<std::string> networks;
    std::optional<Address> next = first;
    while (next && next->bytes <= last.bytes) {
        int prefix = familyBits(*next);
        while (prefix > 0 && !bitGet(*next, prefix - 1) && networkEdge(*next, prefix - 1, true).bytes <= last.bytes) {
            --prefix;
        }
        networks.push_back(addressText(*next) + "/" + std::to_string(prefix));
        next = successor(networkEdge(*next, prefix, true));
    }
    return networks;
}

}  // namespace veldfwctl
