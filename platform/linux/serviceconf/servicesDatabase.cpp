// SPDX-License-Identifier: Apache-2.0
// Services from the system's services database (getservent).
#include "serviceconf/servicesDatabase.h"

#include "veld/serviceconf.h"

#include <arpa/inet.h>
#include <cerrno>
#include <map>
#include <mutex>
#include <netdb.h>

namespace veld {
namespace {

struct PortsByProtocol {
    int tcp = 0;
    int udp = 0;
    bool isName = false;  // and not just another entry's alias
};
using PortsByName = std::map<std::string, PortsByProtocol>;

void addPort(PortsByName &ports, const std::string &name, const DatabaseEntry &entry, bool isName) {
    PortsByProtocol &known = ports[name];
    if (known.isName && !isName)
        return;
    known.isName = isName;
    int &port = entry.protocol == "tcp" ? known.tcp : known.udp;
    if (port == 0)
        port = entry.port;
}

}  // namespace

std::vector<DatabaseEntry> readServicesDatabase() {
    static std::mutex mutex;
    const std::lock_guard guard(mutex);
    std::vector<DatabaseEntry> entries;
    std::vector<char> buffer(4096);
    setservent(1);
    for (;;) {
        servent storage{};
        servent *entry = nullptr;
        const int error = getservent_r(&storage, buffer.data(), buffer.size(), &entry);
        if (error == ERANGE && buffer.size() < std::size_t{1024} * 1024) {
            buffer.resize(buffer.size() * 2);  // the same entry comes again
            continue;
        }
        if (error != 0 || entry == nullptr)
            break;
        DatabaseEntry copy{entry->s_name, {}, ntohs(static_cast<in_port_t>(entry->s_port)), entry->s_proto};
        for (char **alias = entry->s_aliases; alias != nullptr && *alias != nullptr; ++alias)
            copy.aliases.emplace_back(*alias);
        entries.push_back(std::move(copy));
    }
    endservent();
    return entries;
}

std::vector<ServiceDefinition> definitionsFrom(const std::vector<DatabaseEntry> &entries) {
    PortsByName ports;
    for (const bool names : {true, false}) {
        for (const DatabaseEntry &entry : entries) {
            if ((entry.protocol != "tcp" && entry.protocol != "udp") || entry.port < 1 || entry.port > 65535)
                continue;
            if (names)
                addPort(ports, entry.name, entry, true);
            else
                for (const std::string &alias : entry.aliases)
                    addPort(ports, alias, entry, false);
        }
    }
    std::vector<ServiceDefinition> definitions;
    for (const auto &[name, port] : ports) {
        ServiceDefinition definition;
        definition.name = name;
        const int protocol = port.tcp == 0          ? VELDFW_SERVICE_UDP
                             : port.tcp == port.udp ? VELDFW_SERVICE_TCP_UDP
                                                    : VELDFW_SERVICE_TCP;
        definition.source.protocol = protocol;
        definition.destination = {protocol, {std::to_string(port.tcp != 0 ? port.tcp : port.udp)}};
        definitions.push_back(std::move(definition));
    }
    return definitions;
}

}  // namespace veld
