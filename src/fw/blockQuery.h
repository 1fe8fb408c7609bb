// SPDX-License-Identifier: Apache-2.0
// Whether a profile would block a port: the evaluation of rules, without files, kernel or log.
#ifndef VELDFIREWALL_SRC_BLOCKQUERY_H
#define VELDFIREWALL_SRC_BLOCKQUERY_H

#include <functional>
#include <map>
#include <string>
#include <vector>

#include "veldfirewall/fwRecords.h"

namespace FW {

using PolicyMap = std::map<std::string, FW_POLICY>;

/// Appends the ports of services; false when that is not possible, and the rule that names them is then passed over.
using ServiceExpander = std::function<bool(const std::vector<std::string> &services, ServPort &ports)>;

/// Verdicts while a rule list is walked, beside those of FW_POLICY; never in a result.
constexpr FW_POLICY VERDICT_ALLOWED_FOR_SOME = static_cast<FW_POLICY>(4);
constexpr FW_POLICY VERDICT_DENIED_FOR_SOME = static_cast<FW_POLICY>(5);

struct VerdictStep {
    FW_POLICY verdict;
    bool stop;  ///< no later rule of the list counts
};

/// The verdict after a matching rule.
/// @param anySource the rule holds for every address; otherwise only for some
VerdictStep verdictAfter(FW_POLICY verdict, bool anySource, FW_POLICY rulePolicy);

/// Whether ports of one direction and protocol match the query. Strict for rules that allow (all queried ports must be
/// covered), loose for rules that deny (one queried port is enough).
bool portsMatch(int32_t portDirect, int32_t protocol, const std::vector<std::string> &ports, FW_POLICY rulePolicy,
                const PortCompareST &query);

/// Whether the rule matches the query by its ports; a disabled rule never does.
bool ruleMatches(const FWRULE &rule, const PortCompareST &query, const ServiceExpander &expand);

/// The verdict after the whole list, begun with `verdict`.
FW_POLICY ruleListEvaluate(const std::vector<FWRULE> &rules, const PortCompareST &query, FW_POLICY verdict,
                           const ServiceExpander &expand);

/// Writes the verdict of `profile` for `adapter`, or for all its adapters when that is empty, into `result`.
void profileEvaluate(const FWPROFILE &profile, const PortCompareST &query, const std::string &adapter,
                     const ServiceExpander &expand, PolicyMap &result);

/// One query per port: the source ports first, then the destination ports.
std::vector<PortCompareST> serviceQueries(const ServPort &ports);

/// Merges verdicts into `result`; of two for one adapter the severer stays (deny, partial, allow, none).
void verdictsMerge(const PolicyMap &verdicts, PolicyMap &result);

}  // namespace FW

#endif
