// SPDX-License-Identifier: Apache-2.0
// Rules and policies in an administrator's words.
#ifndef VELDFWCTL_RULETEXT_H
#define VELDFWCTL_RULETEXT_H

#include <json/value.h>
#include <veldfirewall/fwRecords.h>

#include <string>

#include "model/table.h"

namespace veldfwctl {

/// "allow", "deny", "none", "partly" (a verdict), or "policy 9" for a number that is none of them.
std::string policyText(FW::FW_POLICY policy);
/// @throws UsageError unless the text is "allow", "deny" or "none"
FW::FW_POLICY policyParse(const std::string &text);
Shade policyShade(FW::FW_POLICY policy);

/// "from 203.0.113.0/24", "to country de,fr", "any", "nothing" for a rule that matches no address.
std::string ruleAddressText(const FW::FWRULE &rule);
/// "port 8000-8010/tcp", "source port 53/udp", "service ssh,https", "reserved smb", "icmp", "any".
std::string rulePortText(const FW::FWRULE &rule);
/// "deny from 203.0.113.0/24 port 8000-8010/tcp, log, "old scanner"".
std::string ruleText(const FW::FWRULE &rule);

/// The rule in words and as it is stored: {"adapter", "number", "text", "rule": {...}}.
/// @param number position in the adapter's list, from 1
Json::Value ruleJson(const std::string &adapter, size_t number, const FW::FWRULE &rule);

/// All rules of a profile, a row each, default policies last in their adapter.
/// @param adapter only this one, or empty for all
Table ruleTable(const FW::FWPROFILE &profile, const std::string &adapter);

}  // namespace veldfwctl

#endif
