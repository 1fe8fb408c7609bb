// SPDX-License-Identifier: Apache-2.0
// Faults of rules that can be seen in their records.
#include "model/ruleLint.h"

#include <algorithm>

#include "frame/errors.h"
#include "model/addresses.h"
#include "model/numbers.h"
#include "model/ports.h"

namespace veldfwctl {

namespace {

constexpr size_t MOST_COUNTRIES = 15;          // the geoip match takes no more
constexpr const char *NEVER_APPLIED = "ppp0";  // the library passes over it
constexpr const char *CORRECT = "correct or remove it";

/// Looks at one rule.
class RuleLint {
public:
    RuleLint(const FW::FWRULE &rule, const RuleCommands &place, const LintKnowledge &system,
             std::vector<Finding> &findings)
        : m_rule(rule), m_place(place), m_system(system), m_findings(findings) {}

    /// @param isPresent the adapter has something to act on, so that the rule must yield commands
    void look(bool isPresent) {
        const size_t before = m_findings.size();
        addresses();
        m_rule.ipGroup == FW::FW_IP_GROUP_COUNTRY ? countries() : void();
        switch (m_rule.portGroup) {
        case FW::FW_PORT_GROUP_SERVICE:
        case FW::FW_PORT_GROUP_RESERVED:
            services();
            break;
        case FW::FW_PORT_GROUP_PORT:
            ports();
            break;
        default:
            break;
        }
        if (!m_place.isTranslated) {
            add("untranslatable", "the library cannot convert it, so that the whole profile cannot be applied",
                m_rule.policy < FW::FW_POLICY_ALLOW || m_rule.policy > FW::FW_POLICY_NONE
                    ? "its policy is " + std::to_string(m_rule.policy) + "; give it one"
                    : "see the system log");
        } else if (m_findings.size() == before && isPresent && m_place.commands.empty()) {
            add("no-command", "yields no command: " + reasonForNothing(), CORRECT);
        }
    }

private:
    void add(const std::string &kind, const std::string &why, const std::string &mend) {
        m_findings.push_back(findingAt(kind, m_place, why, mend));
    }

    void addresses() {
        size_t count = 0;  // of the list's entries that are addresses
        if (m_rule.ipGroup == FW::FW_IP_GROUP_ADDRESS || m_rule.ipGroup == FW::FW_IP_GROUP_NETWORK) {
            count = 1;
        } else if (m_rule.ipGroup == FW::FW_IP_GROUP_RANGE) {
            count = 2;
        }
        for (size_t i = 0; i < std::min(count, m_rule.ipList.size()); ++i) {
            const std::string &text = m_rule.ipList[i];
            const std::optional<Address> address = addressFromText(text);
            if (!address) {
                add("address", "\"" + text + "\" is no address", "write it in numbers, like 192.0.2.7 or 2001:db8::7");
                return;
            }
            if (m_rule.ipType != (address->isV6 ? FW::FW_IP_TYPE_V6 : FW::FW_IP_TYPE_V4)) {
                add("family",
                    std::string(address->isV6 ? "the IPv6 address " : "the IPv4 address ") + text + " goes to " +
                        (address->isV6 ? "iptables" : "ip6tables") + " too, which refuses it",
                    std::string("make it a rule for ") + (address->isV6 ? "IPv6" : "IPv4") +
                        " only: add it anew with " + "\"veldfwctl rule add\", and remove this one");
                return;
            }
        }
    }

    void countries() {
        for (const std::string &country : m_rule.ipList) {
            const CountryData data = m_system.country(country);
            const bool lacksV4 = !data.v4 && m_rule.ipType != FW::FW_IP_TYPE_V6;
            const bool lacksV6 = !data.v6 && m_rule.ipType != FW::FW_IP_TYPE_V4;
            if (lacksV4 || lacksV6) {
                const std::string family = lacksV4 && lacksV6 ? "" : lacksV4 ? "IPv4 " : "IPv6 ";
                add("country",
                    "there is no " + family + "address data for country \"" + country +
                        "\", which the rule therefore leaves out",
                    "install data in /usr/share/xt_geoip, or take the country out");
            }
        }
        if (m_rule.ipList.size() > MOST_COUNTRIES) {
            add("limit",
                "names " + std::to_string(m_rule.ipList.size()) + " countries, and iptables takes " +
                    std::to_string(MOST_COUNTRIES) + " in a rule",
                "spread them over several rules");
        }
    }

    void services() {
        for (const std::string &service : m_rule.portList) {
            const ServiceState state = m_system.service(service);
            if (state == ServiceState::UNKNOWN) {
                add("service", "service \"" + service + "\" is not known", "see \"veldfwctl service list\"");
            } else if (state == ServiceState::SWITCHED_OFF) {
                add("service", "service \"" + service + "\" is switched off in its definition",
                    "switch it on there, or take it out of the rule");
            }
        }
    }

    void ports() {
        if (m_rule.portList.empty() || (m_rule.protocol & ~FW::FW_PROTO_TCP_UDP) != 0) {
            return;
        }
        try {
            portMatchParse({join(m_rule.portList, ",")});
        } catch (const UsageError &error) {
            add("port", error.what(), CORRECT);
        }
    }

    std::string reasonForNothing() const {
        const bool takesPorts =
            m_rule.portGroup != FW::FW_PORT_GROUP_ANY &&
            (m_rule.portGroup != FW::FW_PORT_GROUP_PORT || (m_rule.protocol & ~FW::FW_PROTO_TCP_UDP) == 0);
        if (m_rule.policy == FW::FW_POLICY_NONE) {
            return "its policy is none";
        }
        if (m_rule.ipGroup == FW::FW_IP_GROUP_NONE) {
            return "it matches no address";
        }
        if (m_rule.ipList.empty() && m_rule.ipGroup != FW::FW_IP_GROUP_ANY) {
            return "it names no address";
        }
        if (m_rule.portList.empty() && takesPorts) {
            return "it names no port or service";
        }
        return "address kind " + std::to_string(m_rule.ipGroup) + ", family " + std::to_string(m_rule.ipType) +
               ", port kind " + std::to_string(m_rule.portGroup) + " and " + protocolText(m_rule.protocol) +
               " make none together";
    }

    const FW::FWRULE &m_rule;
    const RuleCommands &m_place;
    const LintKnowledge &m_system;
    std::vector<Finding> &m_findings;
};

void adaptersLint(const FW::FWPROFILE &profile, const LintKnowledge &system, std::vector<Finding> &findings) {
    std::map<std::string, size_t> adapters;
    for (const auto &[adapter, rules] : profile.rules) {
        adapters[adapter] += rules.size();
    }
    for (const auto &[adapter, policy] : profile.adapterPolicyMap) {
        if (policy != FW::FW_POLICY_NONE) {
            adapters[adapter];
        }
    }
    for (const auto &[adapter, rules] : adapters) {
        const std::string what = std::to_string(rules) + (rules == 1 ? " rule" : " rules") + " and its default policy";
        if (adapter == NEVER_APPLIED) {
            findings.push_back({"adapter", adapter, 0, "", "adapter " + adapter,
                                "its " + what + " are never applied under that name",
                                "move them to adapter pppoe or vpn with \"veldfwctl adapter rename\""});
        } else if (system.adapters.count(adapter) == 0) {
            findings.push_back({"adapter", adapter, 0, "", "adapter " + adapter,
                                "is none of this machine, so that its " + what + " do nothing",
                                "see \"veldfwctl adapter list\" and \"veldfwctl adapter rename\""});
        }
    }
}

}  // namespace

Finding findingAt(const std::string &kind, const RuleCommands &rule, const std::string &why, const std::string &mend) {
    return {kind, rule.adapter, rule.number, rule.name, originText(rule), why, mend};
}

std::vector<Finding> recordsLint(const FW::FWPROFILE &profile, const std::vector<RuleCommands> &rules,
                                 const LintKnowledge &system) {
    std::vector<Finding> findings;
    adaptersLint(profile, system, findings);
    for (const RuleCommands &place : rules) {
        if (place.number == 0) {
            if (!place.isTranslated) {
                findings.push_back(findingAt("untranslatable", place,
                                             "the library cannot convert it, so that the whole profile cannot be "
                                             "applied",
                                             "set it with \"veldfwctl policy set\""));
            }
            continue;
        }
        const FW::FWRULE &rule = profile.rules.at(place.adapter)[place.number - 1];
        if (!rule.enable) {
            continue;
        }
        // What "pppoe" and "vpn" stand for comes and goes.
        const bool isPresent = place.adapter != NEVER_APPLIED && place.adapter != FW::FW_ADAPTER_PPPOE &&
                               place.adapter != FW::FW_ADAPTER_VPN && system.adapters.count(place.adapter) != 0;
        RuleLint(rule, place, system, findings).look(isPresent);
    }
    return findings;
}

}  // namespace veldfwctl
