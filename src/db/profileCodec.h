// SPDX-License-Identifier: Apache-2.0
// Conversion between profiles and their JSON documents: no files, no log.
#ifndef VELDFIREWALL_SRC_PROFILECODEC_H
#define VELDFIREWALL_SRC_PROFILECODEC_H

#include <json/value.h>

#include <map>
#include <string>
#include <vector>

#include "veldfirewall/fwRecords.h"

namespace FW {

/// Appends the rules of a "rules" member. @throws Json::LogicError when a value cannot be converted
void rulesDecode(const Json::Value &json, std::map<std::string, std::vector<FWRULE>> &rules);
/// Appends a profile document to `profile`. @throws Json::LogicError when a value cannot be converted
void profileDecode(const Json::Value &json, FWPROFILE &profile);
/// Appends the rules to the arrays of their adapters in `json`.
void rulesEncode(const std::map<std::string, std::vector<FWRULE>> &rules, Json::Value &json);
/// Sets the members of a profile document.
void profileEncode(const FWPROFILE &profile, Json::Value &json);
/// What a stored profile always has: a policy for every adapter with rules, and none (FW_POLICY_NONE) for "global".
void adapterPoliciesComplete(FWPROFILE &profile);

}  // namespace FW

#endif
