// SPDX-License-Identifier: Apache-2.0
// Turns services of other firewall managers into definitions of the service registry.
#include "model/serviceImport.h"

#include <json/writer.h>

#include <algorithm>
#include <cctype>
#include <set>

#include "model/numbers.h"
#include "model/ports.h"

namespace veldfwctl {

namespace {

// Leaves room for suffixes in the 255 bytes of a file name.
constexpr size_t LONGEST_NAME = 100;

using Ports = std::pair<int, NumberSet>;

/// The lists that records need for one side.
std::vector<Ports> portLists(const PortsByProtocol &ports) {
    std::vector<Ports> lists;
    if (!ports.tcp.isEmpty() && ports.tcp == ports.udp) {
        lists.emplace_back(FW::FW_PROTO_TCP_UDP, ports.tcp);
        return lists;
    }
    if (!ports.tcp.isEmpty()) {
        lists.emplace_back(FW::FW_PROTO_TCP, ports.tcp);
    }
    if (!ports.udp.isEmpty()) {
        lists.emplace_back(FW::FW_PROTO_UDP, ports.udp);
    }
    return lists;
}

/// ICMP and IGMP have no ports. A record counts by the entries of its lists, though, so that it needs one.
Ports plainProtocol(int protocol) {
    return {protocol, NumberSet::one(1)};
}

ServiceDefinition definitionMake(const std::string &name, const Ports &source, const Ports &destination) {
    ServiceDefinition definition{name, source.first, source.second, destination.first, destination.second};
    if (source.second.isEmpty()) {
        definition.sourceProtocol = destination.first;
    } else if (destination.second.isEmpty()) {
        definition.destinationProtocol = source.first;
    }
    return definition;
}

/// The records of a service, named after their protocols when there are several. None of them takes the name of the
/// whole then: a rule with that would silently cover a part only.
std::vector<ServiceDefinition> definitionsMake(const ForeignService &service, const std::string &name) {
    std::vector<Ports> sources = portLists(service.source);
    std::vector<Ports> destinations = portLists(service.destination);
    std::vector<Ports> plain;
    if (service.icmp || service.icmpv6) {
        plain.push_back(plainProtocol(FW::FW_PROTO_ICMP));
    }
    if (service.igmp) {
        plain.push_back(plainProtocol(FW::FW_PROTO_IGMP));
    }
    const size_t count = destinations.size() + plain.size();
    if (count <= 1 && sources.size() <= 1) {
        destinations.insert(destinations.end(), plain.begin(), plain.end());
        const Ports none = {FW::FW_PROTO_TCP, {}};
        return count + sources.size() == 0
                   ? std::vector<ServiceDefinition>()
                   : std::vector<ServiceDefinition>{definitionMake(name, sources.empty() ? none : sources.front(),
                                                                   destinations.empty() ? none : destinations.front())};
    }
    std::vector<ServiceDefinition> definitions;
    const auto add = [&](const std::string &suffix, int protocol, const NumberSet &source, const NumberSet &target) {
        if (!source.isEmpty() || !target.isEmpty()) {
            definitions.push_back(definitionMake(name + suffix, {protocol, source}, {protocol, target}));
        }
    };
    if (service.source.tcp == service.source.udp && service.destination.tcp == service.destination.udp) {
        add("-tcp-udp", FW::FW_PROTO_TCP_UDP, service.source.tcp, service.destination.tcp);
    } else {
        add("-tcp", FW::FW_PROTO_TCP, service.source.tcp, service.destination.tcp);
        add("-udp", FW::FW_PROTO_UDP, service.source.udp, service.destination.udp);
    }
    for (const auto &[protocol, ports] : plain) {
        add("-" + protocolText(protocol), protocol, {}, ports);
    }
    return definitions;
}

void sideUnite(PortsByProtocol &side, const PortsByProtocol &other) {
    side.tcp = side.tcp.unite(other.tcp);
    side.udp = side.udp.unite(other.udp);
}

/// Adds what a service includes, and what that includes, each once: includes may go round in circles.
void includesAdd(ForeignService &whole, const IncludeFind &find) {
    std::set<std::string> seen = {whole.name};
    const ForeignService start = whole;
    std::vector<const ForeignService *> open = {&start};
    while (!open.empty()) {
        const ForeignService &part = *open.back();
        open.pop_back();
        for (const std::string &name : part.includes) {
            if (!seen.insert(name).second) {
                continue;
            }
            const ForeignService *included = find(name, part);
            if (included == nullptr || !included->error.empty()) {
                whole.losses.push_back("included service " + name +
                                       (included == nullptr ? ", which is not there" : " (" + included->error + ")"));
                continue;
            }
            sideUnite(whole.source, included->source);
            sideUnite(whole.destination, included->destination);
            whole.icmp = whole.icmp || included->icmp;
            whole.icmpv6 = whole.icmpv6 || included->icmpv6;
            whole.igmp = whole.igmp || included->igmp;
            for (const std::string &loss : included->losses) {
                whole.losses.push_back(name + ": " + loss);
            }
            open.push_back(included);
        }
    }
}

ServiceImport translate(const ForeignService &service, const IncludeFind &find) {
    ServiceImport import;
    import.name = service.name;
    import.file = service.file;
    import.refusal = service.error;
    if (!import.refusal.empty()) {
        return import;
    }
    const std::string name = serviceNameMake(service.name);
    if (name.empty()) {
        import.refusal = service.file + ": \"" + service.name + "\" has no letter or digit to make a name of";
        return import;
    }
    ForeignService whole = service;
    includesAdd(whole, find);
    if (whole.icmp != whole.icmpv6) {
        whole.losses.emplace_back(whole.icmp ? "the restriction to ICMP of IPv4" : "the restriction to ICMP of IPv6");
    }
    for (const ServiceDefinition &definition : definitionsMake(whole, name)) {
        import.definitions.push_back({definition});
    }
    import.losses = whole.losses;
    if (import.definitions.empty()) {
        import.refusal = service.file + ": nothing is left of it without " +
                         (import.losses.empty() ? "ports" : join(import.losses, ", "));
    }
    return import;
}

/// Gives the parts of divided services names that no other service has, unless that is the same.
void partsRename(std::vector<ServiceImport> &imports) {
    std::map<std::string, ServiceDefinition> taken;
    for (const ServiceImport &import : imports) {
        if (import.definitions.size() == 1) {
            taken.emplace(import.definitions[0].definition.name, import.definitions[0].definition);
        }
    }
    for (ServiceImport &import : imports) {
        for (size_t i = 0; import.definitions.size() > 1 && i < import.definitions.size(); ++i) {
            ServiceDefinition &definition = import.definitions[i].definition;
            const std::string name = definition.name;
            for (int number = 2;; ++number) {
                const auto [found, isNew] = taken.emplace(definition.name, definition);
                if (isNew || found->second.matchesSame(definition)) {
                    break;
                }
                definition.name = name + std::to_string(number);
            }
        }
    }
}

}  // namespace

bool ServiceDefinition::matchesSame(const ServiceDefinition &other) const {
    const auto isSame = [](int protocol, const NumberSet &ports, int otherProtocol, const NumberSet &otherPorts) {
        const bool hasPorts = protocol < FW::FW_PROTO_ICMP;
        return ports.isEmpty()
                   ? otherPorts.isEmpty()
                   : !otherPorts.isEmpty() && protocol == otherProtocol && (!hasPorts || ports == otherPorts);
    };
    return isSame(sourceProtocol, sourcePorts, other.sourceProtocol, other.sourcePorts) &&
           isSame(destinationProtocol, destinationPorts, other.destinationProtocol, other.destinationPorts);
}

std::vector<ServiceImport> servicesTranslate(const std::vector<ForeignService> &services, const IncludeFind &find) {
    std::vector<ServiceImport> imports;
    std::map<std::string, const ForeignService *> first;
    for (const ForeignService &service : services) {
        imports.push_back(translate(service, find));
        ServiceImport &import = imports.back();
        if (!import.refusal.empty()) {
            continue;
        }
        const auto [found, isFirst] = first.emplace(serviceNameMake(service.name), &service);
        if (isFirst) {
            continue;
        }
        import.definitions.clear();
        if (found->second->name == service.name) {
            import.precedence = found->second->file;
        } else {
            import.refusal = service.file + ": the name it would have here is that of \"" + found->second->name +
                             "\" in " + found->second->file;
        }
    }
    partsRename(imports);
    return imports;
}

void importCompare(std::vector<ServiceImport> &imports, const DefinitionFind &existing, bool mayReplace) {
    std::map<std::string, ServiceDefinition> planned;
    for (ServiceImport &import : imports) {
        for (ImportedDefinition &imported : import.definitions) {
            const std::string &name = imported.definition.name;
            const auto before = planned.find(name);
            const std::optional<ServiceDefinition> old =
                before != planned.end() ? std::optional<ServiceDefinition>(before->second) : existing(name);
            if (!old) {
                imported.state = ImportState::NEW;
            } else if (old->matchesSame(imported.definition)) {
                imported.state = ImportState::SAME;
            } else {
                imported.state = ImportState::REPLACED;
                if (!mayReplace) {
                    import.refusal = "service " + name + " is there as " + definitionPortsText(*old) +
                                     "; --replace makes it " + definitionPortsText(imported.definition);
                }
            }
        }
        for (const ImportedDefinition &imported : import.definitions) {
            if (import.refusal.empty()) {
                planned.emplace(imported.definition.name, imported.definition);
            }
        }
    }
}

std::string serviceNameMake(const std::string &foreignName) {
    std::string name;
    for (const char c : foreignName) {
        const bool isPlain = (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z');
        const bool isSign = c == '_' || c == '+' || c == '.';
        // A name that begins with a dot is that of a hidden file, and one with "-" is taken for an option.
        if (isPlain || (isSign && !name.empty())) {
            name += c;
        } else if (!name.empty() && name.back() != '-') {
            name += '-';
        }
    }
    name.resize(std::min(name.size(), LONGEST_NAME));
    while (!name.empty() && name.back() == '-') {
        name.pop_back();
    }
    return name;
}

std::vector<std::string> portTexts(const NumberSet &ports) {
    std::vector<std::string> texts;
    for (const NumberRange &range : ports.ranges()) {
        const std::string first = std::to_string(range.first.second);
        texts.push_back(range.first == range.last ? first : first + "-" + std::to_string(range.last.second));
    }
    return texts;
}

NumberSet portSet(const std::vector<std::string> &texts) {
    std::vector<NumberRange> ranges;
    for (const std::string &text : texts) {
        const std::vector<std::string> ends = split(text, '-');
        const std::optional<int> first = numberParse(ends.front(), 1, 65535);
        const std::optional<int> last = numberParse(ends.back(), 1, 65535);
        if (first && last) {
            ranges.push_back({{0, static_cast<uint64_t>(*first)}, {0, static_cast<uint64_t>(*last)}});
        }
    }
    return NumberSet(std::move(ranges));
}

std::string definitionPortsText(const ServiceDefinition &definition) {
    return sidesText({definition.sourceProtocol, portTexts(definition.sourcePorts)},
                     {definition.destinationProtocol, portTexts(definition.destinationPorts)});
}

std::string definitionText(const ServiceDefinition &definition, const std::string &origin) {
    const auto side = [](int protocol, const NumberSet &ports) {
        Json::Value json;
        json["protocol"] = protocolText(protocol);
        json["ports"] = Json::arrayValue;
        for (const std::string &port : portTexts(ports)) {
            json["ports"].append(port);
        }
        return json;
    };
    Json::Value json;
    json["name"] = definition.name;
    json["enabled"] = true;
    json["source"] = side(definition.sourceProtocol, definition.sourcePorts);
    json["destination"] = side(definition.destinationProtocol, definition.destinationPorts);
    if (!origin.empty()) {
        json[IMPORTED_FROM] = origin;  // the registry overlooks it; a purge of the package knows its files by it
    }
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "  ";
    builder["enableYAMLCompatibility"] = true;  // "key": value, as in the definitions that are shipped
    return Json::writeString(builder, json) + "\n";
}

}  // namespace veldfwctl
