// SPDX-License-Identifier: Apache-2.0
// Service definitions in XML files.
#include <tinyxml2.h>

#include <algorithm>
#include <cctype>
#include <cstring>
#include <map>
#include <stdexcept>

#include "model/foreignService.h"

namespace veldfwctl {

namespace {

constexpr const char *ALL_PORTS = "1-65535";
constexpr const char *SUFFIX = ".xml";

/// What makes a file unusable.
struct Fault : std::runtime_error {
    Fault(int where, const std::string &what) : std::runtime_error(what), line(where) {}
    int line;
};

const std::map<std::string, std::vector<std::string>> &knownAttributes() {
    static const std::map<std::string, std::vector<std::string>> known = {
        {"service", {"name", "version"}},
        {"short", {}},
        {"description", {}},
        {"port", {"port", "protocol"}},
        {"source-port", {"port", "protocol"}},
        {"protocol", {"value"}},
        {"include", {"service"}},
        {"destination", {"ipv4", "ipv6"}},
        {"helper", {"name"}},
        {"module", {"name"}},
    };
    return known;
}

std::string lower(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
    return text;
}

/// "mismatched element" for XML_ERROR_MISMATCHED_ELEMENT. The library's own texts are not made for people.
std::string errorText(tinyxml2::XMLError error) {
    std::string name = tinyxml2::XMLDocument::ErrorIDToName(error);
    for (const char *head : {"XML_", "ERROR_"}) {
        name.erase(0, name.rfind(head, 0) == 0 ? std::strlen(head) : 0);
    }
    std::replace(name.begin(), name.end(), '_', ' ');
    return lower(name);
}

class Reader {
public:
    explicit Reader(ForeignService &service) : m_service(service) {}

    void read(const tinyxml2::XMLElement &root) {
        if (std::string(root.Name()) != "service") {
            throw Fault(root.GetLineNum(), "<" + std::string(root.Name()) + "> is no service");
        }
        if (const tinyxml2::XMLElement *second = root.NextSiblingElement()) {
            throw Fault(second->GetLineNum(), "there is something after the end of <service>");
        }
        attributesCheck(root);
        for (const auto *element = root.FirstChildElement(); element != nullptr;
             element = element->NextSiblingElement()) {
            elementRead(*element);
        }
    }

private:
    void elementRead(const tinyxml2::XMLElement &element) {
        const std::string name = element.Name();
        if (knownAttributes().count(name) == 0 || name == "service") {
            m_service.losses.push_back("<" + name + ">, which is not known");
            return;
        }
        attributesCheck(element);
        if (name == "port") {
            portsRead(element, m_service.destination);
        } else if (name == "source-port") {
            portsRead(element, m_service.source);
        } else if (name == "protocol") {
            protocolAdd(lower(required(element, "value")), element.GetLineNum());
        } else if (name == "include") {
            m_service.includes.push_back(required(element, "service"));
        } else if (name == "helper" || name == "module") {
            m_service.losses.push_back("connection tracking " + name + " " + required(element, "name"));
        } else if (name == "destination") {
            destinationRead(element);
        }
    }

    /// What restricts an element further, and is overlooked, would open more than was meant.
    void attributesCheck(const tinyxml2::XMLElement &element) {
        const std::vector<std::string> &known = knownAttributes().at(element.Name());
        for (const auto *attribute = element.FirstAttribute(); attribute != nullptr; attribute = attribute->Next()) {
            if (std::find(known.begin(), known.end(), attribute->Name()) == known.end()) {
                m_service.losses.push_back("\"" + std::string(attribute->Name()) + "\" of <" + element.Name() +
                                           ">, which is not known");
            }
        }
    }

    static std::string required(const tinyxml2::XMLElement &element, const char *attribute) {
        const char *value = element.Attribute(attribute);
        if (value == nullptr) {
            throw Fault(element.GetLineNum(), "<" + std::string(element.Name()) + "> has no \"" + attribute + "\"");
        }
        return value;
    }

    void portsRead(const tinyxml2::XMLElement &element, PortsByProtocol &side) {
        const std::string ports = required(element, "port");
        const std::string protocol = lower(required(element, "protocol"));
        // An old way to name a protocol as a whole.
        if (ports.empty() && &side == &m_service.destination) {
            protocolAdd(protocol, element.GetLineNum());
            return;
        }
        const std::string problem = protocol == "any" ? "\"any\" is no protocol with ports"
                                                      : foreignPortsAdd(m_service, side, ports, '-', protocol);
        if (!problem.empty()) {
            throw Fault(element.GetLineNum(), problem);
        }
    }

    void protocolAdd(const std::string &protocol, int line) {
        if (protocol.empty()) {
            throw Fault(line, "the protocol has no name");
        }
        if (protocol == "tcp" || protocol == "6" || protocol == "udp" || protocol == "17") {
            foreignPortsAdd(m_service, m_service.destination, ALL_PORTS, '-',
                            protocol == "tcp" || protocol == "6" ? "tcp" : "udp");
        } else if (protocol == "icmp" || protocol == "1") {
            m_service.icmp = true;
        } else if (protocol == "ipv6-icmp" || protocol == "icmpv6" || protocol == "58") {
            m_service.icmpv6 = true;
        } else if (protocol == "igmp" || protocol == "2") {
            m_service.igmp = true;
        } else {
            const bool isIpsec = protocol == "esp" || protocol == "50" || protocol == "ah" || protocol == "51";
            const bool isGre = protocol == "gre" || protocol == "47";
            m_service.losses.push_back("protocol " + protocol +
                                       (isIpsec ? " (service vpn_server_ipsec stands for it)"
                                        : isGre ? " (service vpn_server_pptp stands for it)"
                                                : ""));
        }
    }

    void destinationRead(const tinyxml2::XMLElement &element) {
        std::string addresses;
        for (const char *family : {"ipv4", "ipv6"}) {
            if (const char *address = element.Attribute(family)) {
                addresses += (addresses.empty() ? "" : " and ") + std::string(address);
            }
        }
        if (!addresses.empty()) {
            m_service.losses.push_back("the restriction to destination " + addresses);
        }
    }

    ForeignService &m_service;
};

}  // namespace

ForeignService serviceXmlParse(const std::string &file, const std::string &text) {
    ForeignService service;
    service.file = file;
    service.name = file.substr(file.rfind('/') + 1);
    if (const size_t end = service.name.rfind(SUFFIX); end != std::string::npos && end > 0) {
        service.name.erase(end);
    }
    tinyxml2::XMLDocument document;
    document.Parse(text.data(), text.size());
    try {
        if (document.Error()) {
            throw Fault(document.ErrorLineNum(), "no valid XML (" + errorText(document.ErrorID()) + ")");
        }
        if (document.RootElement() == nullptr) {
            throw Fault(1, "there is no element in it");
        }
        Reader(service).read(*document.RootElement());
    } catch (const Fault &fault) {
        service.error = file + ":" + std::to_string(std::max(fault.line, 1)) + ": " + fault.what();
    }
    return service;
}

}  // namespace veldfwctl
