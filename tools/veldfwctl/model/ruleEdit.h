// SPDX-License-Identifier: Apache-2.0
// Edits of an adapter's rule list, with rules named by their numbers from 1.
#ifndef VELDFWCTL_RULEEDIT_H
#define VELDFWCTL_RULEEDIT_H

#include <veldfirewall/fwRecords.h>

#include <string>

namespace veldfwctl {

// All throw UsageError, which names the number and how many rules there are, for a number outside of the list.

/// @return the rule of that number
FW::FWRULE &ruleAt(FW::FWPROFILE &profile, const std::string &adapter, int number);
/// @param position the number that the rule gets, 0 for the end of the list
/// @return the number that it got
size_t ruleInsert(FW::FWPROFILE &profile, const std::string &adapter, int position, const FW::FWRULE &rule);
/// An adapter whose last rule is removed keeps its default policy.
void ruleRemove(FW::FWPROFILE &profile, const std::string &adapter, int number);
/// The rule has the number `to` afterwards.
void ruleMove(FW::FWPROFILE &profile, const std::string &adapter, int from, int to);

}  // namespace veldfwctl

#endif
