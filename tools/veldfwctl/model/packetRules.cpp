// SPDX-License-Identifier: Apache-2.0
// Which packets an iptables command is about, and what happens to them.
#include "model/packetRules.h"

#include <algorithm>
#include <map>
#include <set>

#include "model/numbers.h"
#include "model/restoreText.h"

namespace veldfwctl {

namespace {

/// The text has no meaning here.
struct NotUnderstood {
    std::string text;
};

template <typename Value> const Value &require(const std::optional<Value> &value, const std::string &text) {
    if (!value) {
        throw NotUnderstood{text};
    }
    return *value;
}

Number numberOf(const std::string &text, bool isV6) {
    const std::optional<Address> address = addressFromText(text);
    if (!address || address->isV6 != isV6) {
        throw NotUnderstood{text};
    }
    return addressNumber(*address);
}

Number prefixMask(int prefix, bool isV6) {
    const auto ones = [](int count) { return count <= 0 ? 0 : ~uint64_t{0} << (64 - std::min(count, 64)); };
    return isV6 ? Number(ones(prefix), ones(prefix - 64)) : Number(0, ones(prefix) >> 32);
}

Number both(const Number &a, const Number &b) {
    return {a.first & b.first, a.second & b.second};
}

/// Reads the options of one command into a rule.
class Reader {
public:
    Reader(PacketRule &rule, const InterfaceNumbers &interfaces, const CountryAddresses &countries)
        : m_rule(rule), m_interfaces(interfaces), m_countries(countries) {}

    void read(const std::vector<std::string> &words) {
        for (auto word = words.begin(); word != words.end(); ++word) {
            if (*word == "!") {
                m_isInverted = true;
                continue;
            }
            if (word + 1 == words.end()) {
                throw NotUnderstood{*word};
            }
            option(*word, *(word + 1));
            m_isInverted = false;
            ++word;
        }
    }

private:
    void limit(PacketField field, const NumberSet &numbers) {
        m_rule.packets[field] = m_rule.packets[field].intersect(m_isInverted ? numbers.complement() : numbers);
    }

    void option(const std::string &name, const std::string &value) {
        static const std::set<std::string> knownMatches = {"multiport", "state", "iprange", "geoip", "tcp", "udp"};
        static const std::map<std::string, PacketField> portOptions = {{"--sport", FIELD_SOURCE_PORT},
                                                                       {"--sports", FIELD_SOURCE_PORT},
                                                                       {"--dport", FIELD_DESTINATION_PORT},
                                                                       {"--dports", FIELD_DESTINATION_PORT}};
        static const std::map<std::string, PacketField> addressOptions = {{"-s", FIELD_SOURCE},
                                                                          {"-d", FIELD_DESTINATION},
                                                                          {"--src-range", FIELD_SOURCE},
                                                                          {"--dst-range", FIELD_DESTINATION},
                                                                          {"--source-country", FIELD_SOURCE},
                                                                          {"--destination-country", FIELD_DESTINATION}};
        if (name == "-i" || name == "-o") {
            limit(name == "-i" ? FIELD_IN_INTERFACE : FIELD_OUT_INTERFACE, m_interfaces.match(value));
        } else if (name == "-p") {
            limit(FIELD_PROTOCOL,
                  value == "all" ? NumberSet::all() : NumberSet::one(require(protocolNumber(value), value)));
        } else if (name == "-j") {
            m_rule.target = value;
        } else if (name == "--state") {
            state(value);
        } else if (name == "--icmpv6-type") {
            icmpType(value);
        } else if (const auto port = portOptions.find(name); port != portOptions.end()) {
            ports(port->second, value);
        } else if (const auto address = addressOptions.find(name); address != addressOptions.end()) {
            if (name.size() == 2) {
                network(address->second, value);
            } else if (name.find("range") != std::string::npos) {
                range(address->second, value);
            } else {
                country(address->second, value);
            }
        } else if (name != "-m" || knownMatches.count(value) == 0) {
            throw NotUnderstood{name + " " + value};
        }
    }

    void state(const std::string &value) {
        static const std::map<std::string, PacketState> states = {{"NEW", STATE_NEW},
                                                                  {"ESTABLISHED", STATE_ESTABLISHED},
                                                                  {"RELATED", STATE_RELATED},
                                                                  {"INVALID", STATE_INVALID}};
        NumberSet numbers;
        for (const std::string &name : split(value, ',')) {
            const auto known = states.find(name);
            if (known == states.end()) {
                throw NotUnderstood{value};
            }
            numbers = numbers.unite(NumberSet::one(known->second));
        }
        limit(FIELD_STATE, numbers);
    }

    void icmpType(const std::string &value) {
        static const std::map<std::string, int> types = {{"router-solicitation", 133},
                                                         {"router-advertisement", 134},
                                                         {"neighbour-solicitation", 135},
                                                         {"neighbour-advertisement", 136}};
        const auto known = types.find(value);
        const int number = known != types.end() ? known->second : require(numberParse(value, 0, 0xFF), value);
        limit(FIELD_ICMP_TYPE, NumberSet::one(static_cast<uint64_t>(number)));
    }

    void ports(PacketField field, const std::string &value) {
        NumberSet numbers;
        for (const std::string &entry : split(value, ',')) {
            const size_t colon = entry.find(':');
            const int first = require(numberParse(entry.substr(0, colon), 0, 0xFFFF), entry);
            const int last = colon == std::string::npos
                                 ? first
                                 : require(numberParse(entry.substr(colon + 1), first, 0xFFFF), entry);
            numbers = numbers.unite(NumberSet::range(static_cast<uint64_t>(first), static_cast<uint64_t>(last)));
        }
        limit(field, numbers);
    }

    void network(PacketField field, const std::string &value) {
        const bool isV6 = m_rule.isV6;
        const size_t slash = value.find('/');
        Number mask = prefixMask(128, isV6);
        if (slash != std::string::npos) {
            const std::string text = value.substr(slash + 1);
            const std::optional<int> prefix = numberParse(text, 0, isV6 ? 128 : 32);
            mask = prefix ? prefixMask(*prefix, isV6) : numberOf(text, isV6);
        }
        const Number first = both(numberOf(value.substr(0, slash), isV6), mask);
        const Number all = prefixMask(128, isV6);
        const Number last = {first.first | (all.first & ~mask.first), first.second | (all.second & ~mask.second)};
        bool isPrefix = false;
        for (int prefix = 0; prefix <= (isV6 ? 128 : 32); ++prefix) {
            isPrefix = isPrefix || prefixMask(prefix, isV6) == mask;
        }
        if (!isPrefix && m_isInverted) {
            throw NotUnderstood{"! " + value};
        }
        limit(field, NumberSet({{first, last}}));
        if (isPrefix) {
            return;
        }
        m_rule.masks.push_back({field, mask, first});
    }

    void range(PacketField field, const std::string &value) {
        const size_t dash = value.find('-');
        const Number first = numberOf(value.substr(0, dash), m_rule.isV6);
        const Number last = dash == std::string::npos ? first : numberOf(value.substr(dash + 1), m_rule.isV6);
        limit(field, NumberSet({{first, last}}));
    }

    void country(PacketField field, const std::string &value) {
        NumberSet numbers;
        for (const std::string &code : split(value, ',')) {
            numbers = numbers.unite(m_countries(code, m_rule.isV6));
        }
        limit(field, numbers);
    }

    PacketRule &m_rule;
    const InterfaceNumbers &m_interfaces;
    const CountryAddresses &m_countries;
    bool m_isInverted = false;
};

}  // namespace

std::optional<uint64_t> protocolNumber(const std::string &name) {
    static const std::map<std::string, uint64_t> names = {
        {"icmp", 1}, {"igmp", 2}, {"tcp", 6}, {"udp", 17}, {"icmpv6", 58}};
    if (const auto known = names.find(name); known != names.end()) {
        return known->second;
    }
    const std::optional<int> number = numberParse(name, 1, 0xFF);
    return number ? std::optional<uint64_t>(static_cast<uint64_t>(*number)) : std::nullopt;
}

PacketRule packetRuleParse(const std::string &command, bool isV6, const InterfaceNumbers &interfaces,
                           const CountryAddresses &countries) {
    const CommandWords words = commandWordsSplit(command);
    PacketRule rule;
    rule.table = words.table;
    rule.chain = words.chain;
    rule.isV6 = isV6;
    try {
        Reader(rule, interfaces, countries).read(words.rest);
    } catch (const NotUnderstood &error) {
        rule.notUnderstood = error.text;
        const auto jump = std::find(words.rest.begin(), words.rest.end(), "-j");
        rule.target = jump == words.rest.end() || jump + 1 == words.rest.end() ? "" : *(jump + 1);
    }
    return rule;
}

std::vector<std::string> interfacesNamed(const std::vector<std::string> &commands) {
    std::set<std::string> names = {"lo"};
    for (const std::string &command : commands) {
        const std::vector<std::string> words = commandWordsSplit(command).rest;
        for (size_t i = 0; i + 1 < words.size(); ++i) {
            if ((words[i] == "-i" || words[i] == "-o") && words[i + 1].back() != '+') {
                names.insert(words[i + 1]);
            }
        }
    }
    return {names.begin(), names.end()};
}

}  // namespace veldfwctl
