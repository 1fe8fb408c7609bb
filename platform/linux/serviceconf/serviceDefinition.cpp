// SPDX-License-Identifier: Apache-2.0
// The definition of one network service, as packages install it in a JSON file.
#include "serviceconf/serviceDefinition.h"

#include "veld/serviceconf.h"

#include <algorithm>
#include <json/json.h>
#include <memory>
#include <string_view>

namespace veld {
namespace {

struct ProtocolName {
    std::string_view name;
    int protocol;
};
constexpr ProtocolName kProtocols[] = {{"tcp", VELDFW_SERVICE_TCP},
                                       {"udp", VELDFW_SERVICE_UDP},
                                       {"tcp+udp", VELDFW_SERVICE_TCP_UDP},
                                       {"icmp", VELDFW_SERVICE_ICMP},
                                       {"igmp", VELDFW_SERVICE_IGMP}};

// Definitions are three levels deep.
constexpr int kDeepestNesting = 32;
constexpr std::size_t kLongestName = 255;

// 0 when the text is no port number.
int portNumber(std::string_view text) {
    if (text.empty() || text.size() > 5 || text.front() == '0')
        return 0;
    int number = 0;
    for (const char c : text) {
        if (c < '0' || c > '9')
            return 0;
        number = number * 10 + (c - '0');
    }
    return number <= 65535 ? number : 0;
}

bool isServiceName(const std::string &name) {
    return !name.empty() && name.size() <= kLongestName &&
           std::none_of(name.begin(), name.end(), [](char c) { return static_cast<unsigned char>(c) <= 0x20; });
}

bool parsePorts(const Json::Value &value, const std::string &member, ServicePorts &result, std::string &reason) {
    if (!value.isObject()) {
        reason = "\"" + member + "\" is no object";
        return false;
    }
    const Json::Value &protocol = value["protocol"];
    const Json::Value &ports = value["ports"];
    const auto *const known =
        std::find_if(std::begin(kProtocols), std::end(kProtocols), [&](const ProtocolName &entry) {
            return protocol.isString() && protocol.asString() == entry.name;
        });
    if (known == std::end(kProtocols)) {
        reason = "the \"protocol\" of \"" + member + "\" is none of tcp, udp, tcp+udp, icmp, igmp";
        return false;
    }
    result.protocol = known->protocol;
    if (!ports.isNull() && !ports.isArray()) {
        reason = "the \"ports\" of \"" + member + "\" are no array";
        return false;
    }
    for (const Json::Value &port : ports) {
        if (!port.isString() || !isPortEntry(port.asString())) {
            reason = "\"" + member + "\" has the port " +
                     (port.isString() ? "\"" + port.asString() + "\"" : "that is no string") +
                     "; ports are such as \"80\" and \"1000-2000\"";
            return false;
        }
        result.ports.push_back(port.asString());
    }
    return true;
}

bool readDefinition(const Json::Value &root, ServiceDefinition &definition, std::string &reason) {
    if (!root.isObject()) {
        reason = "it is no object";
        return false;
    }
    if (!root["name"].isString() || !isServiceName(root["name"].asString())) {
        reason = R"("name" is no string of 1 to 255 characters without blanks)";
        return false;
    }
    definition.name = root["name"].asString();
    if (root.isMember("enabled") && !root["enabled"].isBool()) {
        reason = R"("enabled" is neither true nor false)";
        return false;
    }
    definition.enabled = root.get("enabled", true).asBool();
    const bool hasSource = root.isMember("source");
    const bool hasDestination = root.isMember("destination");
    if (!hasSource && !hasDestination) {
        reason = R"(it has neither "source" nor "destination")";
        return false;
    }
    if ((hasSource && !parsePorts(root["source"], "source", definition.source, reason)) ||
        (hasDestination && !parsePorts(root["destination"], "destination", definition.destination, reason)))
        return false;
    if (!hasSource)
        definition.source.protocol = definition.destination.protocol;
    if (!hasDestination)
        definition.destination.protocol = definition.source.protocol;
    return true;
}

}  // namespace

bool isPortEntry(const std::string &text) {
    const std::string_view entry = text;
    const std::size_t dash = entry.find('-');
    if (dash == std::string_view::npos)
        return portNumber(entry) != 0;
    const int low = portNumber(entry.substr(0, dash));
    const int high = portNumber(entry.substr(dash + 1));
    return low != 0 && high != 0 && low <= high;
}

int protocolKind(const ServiceDefinition &definition) {
    return definition.destination.ports.empty() ? definition.source.protocol : definition.destination.protocol;
}

bool parseServiceDefinition(const std::string &text, ServiceDefinition &definition, std::string &reason) {
    definition = {};
    Json::CharReaderBuilder builder;
    builder["collectComments"] = false;
    builder["failIfExtra"] = true;
    builder["stackLimit"] = kDeepestNesting;
    // The reader throws beyond the depth limit, and conversions throw too.
    try {
        const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
        Json::Value root;
        if (!reader->parse(text.data(), text.data() + text.size(), &root, &reason)) {
            std::replace(reason.begin(), reason.end(), '\n', ' ');
            return false;
        }
        return readDefinition(root, definition, reason);
    } catch (const Json::Exception &error) {
        reason = error.what();
        return false;
    }
}

}  // namespace veld
