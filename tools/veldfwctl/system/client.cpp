// SPDX-License-Identifier: Apache-2.0
// The connection over which this machine is being administered.
#include "system/client.h"

#include <ifaddrs.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>

#include "frame/errors.h"
#include "model/addresses.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

constexpr const char *SHELL_PORT = "22";
constexpr const char *V4_MAPPED = "::ffff:";

std::optional<Address> addressOfSocket(const sockaddr *socket) {
    Address address;
    if (socket != nullptr && socket->sa_family == AF_INET) {
        std::memcpy(address.bytes.data(), &reinterpret_cast<const sockaddr_in *>(socket)->sin_addr, 4);
        return address;
    }
    if (socket != nullptr && socket->sa_family == AF_INET6) {
        address.isV6 = true;
        std::memcpy(address.bytes.data(), &reinterpret_cast<const sockaddr_in6 *>(socket)->sin6_addr, 16);
        return address;
    }
    return std::nullopt;
}

/// The interface that has the address; empty when none has.
std::string interfaceOf(const std::string &text) {
    std::string name;
    ifaddrs *list = nullptr;
    if (getifaddrs(&list) != 0) {
        return name;
    }
    for (const ifaddrs *entry = list; entry != nullptr; entry = entry->ifa_next) {
        const std::optional<Address> address = addressOfSocket(entry->ifa_addr);
        if (address && addressText(*address) == text) {
            name = entry->ifa_name;
        }
    }
    freeifaddrs(list);
    return name;
}

/// The address of this machine from which packets to another leave; empty when none do. Sends nothing.
std::string localAddressTowards(const Address &remote) {
    sockaddr_storage target = {};
    target.ss_family = remote.isV6 ? AF_INET6 : AF_INET;
    if (remote.isV6) {
        auto &v6 = reinterpret_cast<sockaddr_in6 &>(target);
        std::memcpy(&v6.sin6_addr, remote.bytes.data(), 16);
        v6.sin6_port = htons(9);
    } else {
        auto &v4 = reinterpret_cast<sockaddr_in &>(target);
        std::memcpy(&v4.sin_addr, remote.bytes.data(), 4);
        v4.sin_port = htons(9);
    }
    const int handle = socket(target.ss_family, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    if (handle < 0) {
        return "";
    }
    sockaddr_storage local = {};
    socklen_t size = sizeof local;
    const bool succeeded = connect(handle, reinterpret_cast<const sockaddr *>(&target), sizeof target) == 0 &&
                           getsockname(handle, reinterpret_cast<sockaddr *>(&local), &size) == 0;
    close(handle);
    const std::optional<Address> address =
        succeeded ? addressOfSocket(reinterpret_cast<const sockaddr *>(&local)) : std::nullopt;
    return address ? addressText(*address) : "";
}

/// As the rules see it: an IPv4 client of an IPv6 socket is one of IPv4, and an address has no interface in it.
std::string plainAddress(const std::string &text) {
    const std::string address = text.substr(0, text.find('%'));
    const bool isMapped = address.rfind(V4_MAPPED, 0) == 0 && address.find('.') != std::string::npos;
    return isMapped ? address.substr(std::strlen(V4_MAPPED)) : address;
}

}  // namespace

std::optional<PacketQuery> clientOfSession() {
    const char *connection = std::getenv("SSH_CONNECTION");
    const std::vector<std::string> words = split(connection != nullptr ? connection : "", ' ');
    const bool isUsable = words.size() == 4 && addressFromText(plainAddress(words[0])) &&
                          addressFromText(plainAddress(words[2])) && numberParse(words[1], 1, 0xFFFF) &&
                          numberParse(words[3], 1, 0xFFFF);
    if (!isUsable) {
        return std::nullopt;
    }
    PacketQuery query;
    query.from = plainAddress(words[0]);
    query.to = plainAddress(words[2]);
    query.toPort = words[3] + "/tcp";
    query.fromPort = words[1];
    const size_t zone = words[0].find('%');
    query.in = zone == std::string::npos ? interfaceOf(query.to) : words[0].substr(zone + 1);
    return query;
}

PacketQuery clientParse(const std::string &text) {
    PacketQuery query;
    const bool isBracketed = text.rfind('[', 0) == 0 && text.find(']') != std::string::npos;
    const size_t colon = isBracketed ? text.find(':', text.find(']')) : text.find(':');
    const bool hasPort = colon != std::string::npos && (isBracketed || text.find(':', colon + 1) == std::string::npos);
    const std::string address = hasPort ? text.substr(0, colon) : text;
    query.from = isBracketed ? address.substr(1, address.find(']') - 1) : address;
    query.toPort = (hasPort ? text.substr(colon + 1) : SHELL_PORT) + std::string("/tcp");
    const std::optional<Address> remote = addressFromText(query.from);
    if (!remote) {
        throw UsageError("\"" + text + "\" is no client; write 192.0.2.7, 192.0.2.7:22 or [2001:db8::7]:22");
    }
    query.to = localAddressTowards(*remote);
    query.in = interfaceOf(query.to);
    query.packets(InterfaceNumbers({}));  // refuses a wrong port
    return query;
}

}  // namespace veldfwctl
