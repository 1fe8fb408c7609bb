// SPDX-License-Identifier: Apache-2.0
// What tests of the atomic apply start from.
#include "kernelTest.h"

#include <regex>

#include "files.h"
#include "network.h"
#include "processes.h"
#include "realIptables.h"

namespace veldtest {

void KernelTest::SetUp() {
    std::string reason;
    if (!useIptablesBackend(GetParam()))
        GTEST_SKIP() << "no iptables-" << GetParam() << " on this machine";
    if (!realIptables(&reason))
        GTEST_SKIP() << "iptables-" << GetParam() << " does not work here: " << reason;
    createFirewallChains();
    // Rules of other tables go into chains of the same names there.
    for (const char *program : {"/sbin/iptables", "/sbin/ip6tables"}) {
        for (const char *table : {"mangle", "raw"}) {
            runChecked({program, "-t", table, "-N", "INPUT_FIREWALL"});
            runChecked({program, "-t", table, "-A", "PREROUTING", "-j", "INPUT_FIREWALL"});
            runChecked({program, "-t", table, "-N", "FORWARD_FIREWALL"});
        }
    }
    addDummyInterface("eth0");
    setSwitch(true);
}

void KernelTest::store(const FW::FWPROFILE &profile) {
    if (!FW::VELDFW_PROFILE().profileSet("default", profile))
        throw std::runtime_error("no profile could be stored: " + log.text());
}

void KernelTest::setSwitch(bool on) {
    writeFile(SETTINGS, std::string(R"({"profile": "default", "status": )") + (on ? "true}" : "false}"));
}

std::string KernelTest::rulesOf(const std::string &table) {
    return runChecked({"/sbin/iptables", "-t", table, "-S"}) + runChecked({"/sbin/ip6tables", "-t", table, "-S"});
}

std::string KernelTest::allRules() {
    static const std::regex changing("#[^\n]*\n|\\[[0-9]+:[0-9]+\\]");
    return std::regex_replace(runChecked({"/sbin/iptables-save"}) + runChecked({"/sbin/ip6tables-save"}), changing, "");
}

FW::FWPROFILE profileOf(const std::vector<FW::FWRULE> &rules, const std::string &adapter) {
    FW::FWPROFILE profile;
    profile.name = "default";
    profile.rules[adapter] = rules;
    profile.adapterPolicyMap["eth0"] = FW::FW_POLICY_DENY;
    return profile;
}

FW::FWRULE addressRule(const std::string &name, const std::string &address, int ipType) {
    FW::FWRULE rule;
    rule.name = name;
    rule.policy = FW::FW_POLICY_DENY;
    rule.ipType = ipType;
    rule.ipList = {address};
    rule.portGroup = FW::FW_PORT_GROUP_ANY;
    return rule;
}

}  // namespace veldtest
