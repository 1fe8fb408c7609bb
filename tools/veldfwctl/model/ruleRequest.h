// SPDX-License-Identifier: Apache-2.0
// A rule as the command line words it, and the record that it becomes.
#ifndef VELDFWCTL_RULEREQUEST_H
#define VELDFWCTL_RULEREQUEST_H

#include <veldfirewall/fwRecords.h>

#include <functional>
#include <string>
#include <vector>

namespace veldfwctl {

/// The options of "rule add", unchecked.
struct RuleRequest {
    bool allow = false;
    bool deny = false;
    std::string from;                    ///< source address, network, range or "any"
    std::string to;                      ///< destination
    std::vector<std::string> countries;  ///< codes of the source
    std::vector<std::string> countriesTo;
    bool anyAddress = false;
    std::vector<std::string> ports;  ///< destination ports
    std::vector<std::string> sourcePorts;
    std::vector<std::string> services;
    std::string protocol;  ///< icmp or igmp
    std::string direction = "in";
    bool log = false;
    bool disabled = false;
    std::string name;
    std::vector<std::string> labels;
};

/// Which families a country has data for.
struct CountryData {
    bool v4 = false;
    bool v6 = false;
};

/// What the system knows, asked only for what a request names.
struct SystemKnowledge {
    std::function<bool(const std::string &service)> serviceIsUsable;
    std::function<CountryData(const std::string &country)> countryData;
};

/// The record of a request.
/// @throws UsageError that names the value that is wrong, or the options that exclude each other
FW::FWRULE ruleFromRequest(const RuleRequest &request, const SystemKnowledge &system);

}  // namespace veldfwctl

#endif
