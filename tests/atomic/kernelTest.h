// SPDX-License-Identifier: Apache-2.0
// What tests of the atomic apply start from: a switched-on firewall and the real chains of one backend.
#ifndef VELD_TEST_KERNEL_TEST_H
#define VELD_TEST_KERNEL_TEST_H

#include <string>
#include <vector>

#include "firewallTest.h"

namespace veldtest {

/// The parameter is the backend, "nft" or "legacy". The chains are also in the tables mangle and raw. The interface is
/// "eth0".
class KernelTest : public FirewallTest, public testing::WithParamInterface<const char *> {
protected:
    void SetUp() override;

    void store(const FW::FWPROFILE &profile);
    static void setSwitch(bool on);
    /// "iptables -S" and "ip6tables -S" of the table.
    static std::string rulesOf(const std::string &table = "filter");
    /// All tables and rules of both families, without counters.
    static std::string allRules();
};

/// A profile "default" that denies on eth0 what the rules leave.
FW::FWPROFILE profileOf(const std::vector<FW::FWRULE> &rules, const std::string &adapter = "eth0");
/// A rule that denies an address of one family (FW_IP_TYPE).
FW::FWRULE addressRule(const std::string &name, const std::string &address, int ipType = FW::FW_IP_TYPE_V4);

}  // namespace veldtest

#endif
