// SPDX-License-Identifier: Apache-2.0
// Edits of an adapter's rule list, with rules named by their numbers from 1.
#include "model/ruleEdit.h"

#include <algorithm>

#include "frame/errors.h"

namespace veldfwctl {

namespace {

std::ptrdiff_t indexCheck(int number, size_t count, const std::string &adapter, const std::string &profile) {
    if (number < 1 || static_cast<size_t>(number) > count) {
        const std::string bounds = count == 0 ? "has no rules" : "has rules 1 to " + std::to_string(count);
        throw UsageError("There is no rule " + std::to_string(number) + ": adapter " + adapter + " of profile \"" +
                         profile + "\" " + bounds + "; see \"veldfwctl rule list\"");
    }
    return number - 1;
}

}  // namespace

FW::FWRULE &ruleAt(FW::FWPROFILE &profile, const std::string &adapter, int number) {
    const auto list = profile.rules.find(adapter);
    const size_t count = list == profile.rules.end() ? 0 : list->second.size();
    const std::ptrdiff_t index = indexCheck(number, count, adapter, profile.name);
    return list->second[static_cast<size_t>(index)];
}

size_t ruleInsert(FW::FWPROFILE &profile, const std::string &adapter, int position, const FW::FWRULE &rule) {
    std::vector<FW::FWRULE> &list = profile.rules[adapter];
    const auto count = static_cast<int>(list.size());
    if (position < 0 || position > count + 1) {
        throw UsageError("--position " + std::to_string(position) + " is outside of the list: adapter " + adapter +
                         " of profile \"" + profile.name + "\" has " + std::to_string(count) + " rules, so use 1 to " +
                         std::to_string(count + 1));
    }
    list.insert(position == 0 ? list.end() : list.begin() + position - 1, rule);
    return position == 0 ? list.size() : static_cast<size_t>(position);
}

void ruleRemove(FW::FWPROFILE &profile, const std::string &adapter, int number) {
    ruleAt(profile, adapter, number);
    std::vector<FW::FWRULE> &list = profile.rules[adapter];
    list.erase(list.begin() + number - 1);
}

void ruleMove(FW::FWPROFILE &profile, const std::string &adapter, int from, int to) {
    ruleAt(profile, adapter, from);
    ruleAt(profile, adapter, to);
    const auto first = profile.rules[adapter].begin();
    if (from < to) {
        std::rotate(first + from - 1, first + from, first + to);
    } else {
        std::rotate(first + to - 1, first + from - 1, first + from);
    }
}

}  // namespace veldfwctl
