// SPDX-License-Identifier: Apache-2.0
// A rule as the command line words it, and the record that it becomes.
#include "model/ruleRequest.h"

#include <algorithm>
#include <cctype>

#include "frame/errors.h"
#include "model/addresses.h"
#include "model/numbers.h"
#include "model/ports.h"

namespace veldfwctl {

namespace {

/// Option names with whether they were given; at most one of them may be.
void atMostOne(const std::vector<std::pair<std::string, bool>> &options, const std::string &why) {
    std::vector<std::string> given;
    for (const auto &[name, isGiven] : options) {
        if (isGiven) {
            given.push_back(name);
        }
    }
    if (given.size() > 1) {
        throw UsageError(join(given, " and ") + " exclude each other: " + why);
    }
}

/// The codes as the data files are named: upper or lower case, whichever has data.
std::string countryWithData(const std::string &code, const SystemKnowledge &system, CountryData &all) {
    std::string upper = code;
    std::string lower = code;
    std::transform(code.begin(), code.end(), upper.begin(), [](unsigned char c) { return std::toupper(c); });
    std::transform(code.begin(), code.end(), lower.begin(), [](unsigned char c) { return std::tolower(c); });
    if (code.size() == 2 && std::isalpha(static_cast<unsigned char>(code[0])) != 0 &&
        std::isalpha(static_cast<unsigned char>(code[1])) != 0) {
        for (const std::string &spelling : {code, upper, lower}) {
            const CountryData data = system.countryData(spelling);
            if (data.v4 || data.v6) {
                all.v4 = all.v4 || data.v4;
                all.v6 = all.v6 || data.v6;
                return spelling;
            }
        }
        throw UsageError("Country \"" + code + "\" has no address data; see \"veldfwctl country list\"");
    }
    throw UsageError("\"" + code + "\" is no country code of two letters; see \"veldfwctl country list\"");
}

AddressMatch countriesParse(const std::vector<std::string> &codes, const SystemKnowledge &system) {
    AddressMatch match;
    match.ipGroup = FW::FW_IP_GROUP_COUNTRY;
    CountryData all;
    for (const std::string &entry : codes) {
        for (const std::string &code : split(entry, ',')) {
            match.ipList.push_back(countryWithData(code, system, all));
        }
    }
    match.ipType = !all.v6 ? FW::FW_IP_TYPE_V4 : all.v4 ? FW::FW_IP_TYPE_BOTH : FW::FW_IP_TYPE_V6;
    return match;
}

void addressApply(const RuleRequest &request, const SystemKnowledge &system, FW::FWRULE &rule) {
    atMostOne({{"--from", !request.from.empty()},
               {"--to", !request.to.empty()},
               {"--country", !request.countries.empty()},
               {"--to-country", !request.countriesTo.empty()},
               {"--any", request.anyAddress}},
              "a rule matches one address, network, range, list of countries or any address");
    AddressMatch match;
    if (!request.from.empty()) {
        match = addressMatchParse(request.from);
    } else if (!request.to.empty()) {
        match = addressMatchParse(request.to);
        rule.ipDirect = 0;
    } else if (!request.countries.empty()) {
        match = countriesParse(request.countries, system);
    } else if (!request.countriesTo.empty()) {
        match = countriesParse(request.countriesTo, system);
        rule.ipDirect = 0;
    }
    rule.ipGroup = match.ipGroup;
    rule.ipType = match.ipType;
    rule.ipList = match.ipList;
}

std::vector<std::string> servicesParse(const std::vector<std::string> &entries, const SystemKnowledge &system) {
    std::vector<std::string> services;
    for (const std::string &entry : entries) {
        for (const std::string &name : split(entry, ',')) {
            if (!system.serviceIsUsable(name)) {
                throw UsageError("Service \"" + name + "\" is not known; see \"veldfwctl service list\"");
            }
            services.push_back(name);
        }
    }
    return services;
}

void portsApply(const RuleRequest &request, const SystemKnowledge &system, FW::FWRULE &rule) {
    atMostOne({{"--port", !request.ports.empty()},
               {"--source-port", !request.sourcePorts.empty()},
               {"--service", !request.services.empty()},
               {"--protocol", !request.protocol.empty()}},
              "a rule has ports, services or a protocol");
    rule.portGroup = FW::FW_PORT_GROUP_ANY;
    if (!request.services.empty()) {
        rule.portGroup = FW::FW_PORT_GROUP_SERVICE;
        rule.protocol = FW::FW_PROTO_TCP_UDP;
        rule.portList = servicesParse(request.services, system);
    } else if (!request.protocol.empty()) {
        rule.portGroup = FW::FW_PORT_GROUP_PORT;
        rule.protocol = plainProtocolParse(request.protocol);
    } else if (!request.ports.empty() || !request.sourcePorts.empty()) {
        const PortMatch match = portMatchParse(request.ports.empty() ? request.sourcePorts : request.ports);
        rule.portGroup = FW::FW_PORT_GROUP_PORT;
        rule.portDirect = request.ports.empty() ? 1 : 0;
        rule.protocol = match.protocol;
        rule.portList = match.ports;
    }
}

}  // namespace

FW::FWRULE ruleFromRequest(const RuleRequest &request, const SystemKnowledge &system) {
    if (request.allow == request.deny) {
        throw UsageError(request.allow ? "--allow and --deny exclude each other"
                                       : "The rule does not say what to do; add --allow or --deny");
    }
    FW::FWRULE rule;
    rule.policy = request.deny ? FW::FW_POLICY_DENY : FW::FW_POLICY_ALLOW;
    if (request.direction != "in" && request.direction != "out") {
        throw UsageError("\"" + request.direction + "\" is no direction; use in or out");
    }
    rule.adapterDirect = request.direction == "in" ? 1 : 0;
    addressApply(request, system, rule);
    portsApply(request, system, rule);
    rule.blLog = request.log;
    rule.enable = !request.disabled;
    rule.name = request.name;
    rule.labelList = request.labels;
    return rule;
}

}  // namespace veldfwctl
