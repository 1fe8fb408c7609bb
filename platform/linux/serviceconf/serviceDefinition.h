// SPDX-License-Identifier: Apache-2.0
// The definition of one network service, as packages install it in a JSON file.
#pragma once

#include <string>
#include <vector>

namespace veld {

struct ServicePorts {
    int protocol = 0;                // VELDFW_SERVICE_*
    std::vector<std::string> ports;  // "80", "1000-2000"
};

struct ServiceDefinition {
    std::string name;
    bool enabled = true;
    ServicePorts source;
    ServicePorts destination;
};

// "80" or "1000-2000": decimal numbers from 1 to 65535 without leading zeros, the first at most the second.
bool isPortEntry(const std::string &text);

// The protocol of the destination list, of the source list when the destination list is empty.
int protocolKind(const ServiceDefinition &definition);

// Reads the text of a definition file: true, or false with the reason. "source" and "destination" may be missing (then
// empty, with the protocol of the other), but not both; "enabled" is true unless said otherwise; other members are
// ignored. Never throws for what is in the text.
bool parseServiceDefinition(const std::string &text, ServiceDefinition &definition, std::string &reason);

}  // namespace veld
