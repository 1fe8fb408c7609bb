// SPDX-License-Identifier: Apache-2.0
// A plan as rules over packets.
#include "system/ruleset.h"

#include <veldfirewall/fwGeoip.h>

#include <algorithm>
#include <iterator>
#include <map>

#include "frame/libraryCall.h"

namespace veldfwctl {

namespace {

NumberSet countryRead(const std::string &country, bool isV6) {
    Json::Value data = Json::arrayValue;
    // A country without data matches nothing, in the kernel too.
    libraryCall([&] { return FW::FW_GEOIP().countryIPGet(country, isV6, data); });
    std::vector<NumberRange> ranges;
    for (const Json::Value &range : data) {
        const std::optional<Address> first = addressFromText(range["ip_begin"].asString());
        const std::optional<Address> last = addressFromText(range["ip_end"].asString());
        if (first && last) {
            ranges.push_back({addressNumber(*first), addressNumber(*last)});
        }
    }
    return NumberSet(std::move(ranges));
}

}  // namespace

Ruleset rulesetBuild(Plan plan, const std::vector<std::string> &interfaces) {
    Ruleset ruleset;
    std::vector<std::string> commands;
    commands.reserve(plan.size());
    for (const PlannedCommand &planned : plan) {
        commands.push_back(planned.command);
    }
    ruleset.interfaceNames = interfacesNamed(commands);
    std::copy_if(interfaces.begin(), interfaces.end(), std::back_inserter(ruleset.interfaceNames),
                 [](const std::string &name) { return !name.empty(); });
    std::sort(ruleset.interfaceNames.begin(), ruleset.interfaceNames.end());
    ruleset.interfaceNames.erase(std::unique(ruleset.interfaceNames.begin(), ruleset.interfaceNames.end()),
                                 ruleset.interfaceNames.end());
    ruleset.interfaces = InterfaceNumbers(ruleset.interfaceNames);
    std::map<std::pair<std::string, bool>, NumberSet> countries;
    const auto countryAddresses = [&countries](const std::string &country, bool isV6) {
        const auto [known, isNew] = countries.try_emplace({country, isV6});
        if (isNew) {
            known->second = countryRead(country, isV6);
        }
        return known->second;
    };
    for (const PlannedCommand &planned : plan) {
        ruleset.rules.push_back(packetRuleParse(planned.command, planned.isV6, ruleset.interfaces, countryAddresses));
    }
    ruleset.plan = std::move(plan);
    return ruleset;
}

}  // namespace veldfwctl
