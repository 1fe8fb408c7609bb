// SPDX-License-Identifier: Apache-2.0
// Drawn profiles.
#ifndef VELD_TEST_PROFILE_GENERATOR_H
#define VELD_TEST_PROFILE_GENERATOR_H

#include <veldfirewall/fwRecords.h>

#include <random>
#include <string>
#include <vector>

namespace veldtest {

/// The same profiles for the same seed. Rules of the adapters name hosts 2 to 5 of 10.1.0.0/24 and fd00:1::/64 behind
/// eth0, and of 10.2.0.0/24 and fd00:2::/64 behind eth1; ports 21 to 28, source ports 701 to 703, shipped services.
class ProfileGenerator {
public:
    explicit ProfileGenerator(unsigned seed) : m_random(seed) {}

    /// Rules of every kind that the kernel takes, for "global", "eth0" and "eth1".
    FW::FWPROFILE profile(const std::string &name, int rulesPerAdapter);
    /// Also rules of the tables mangle and raw and of adapters that come and go, and now and then one that iptables
    /// refuses.
    FW::FWPROFILE wildProfile(const std::string &name, int rulesPerAdapter);
    /// Of the class for which a block query of one port of IPv4 is exact: a query looks at the stored rules only and
    /// keeps one mark per adapter. So each list begins with a rule for some sources that excepts them from what else
    /// holds, and goes on with rules for all sources.
    FW::FWPROFILE exactProfile(const std::string &name);

    int below(int bound) { return static_cast<int>(m_random() % static_cast<unsigned>(bound)); }
    bool chance(int percent) { return below(100) < percent; }
    template <typename Value> Value oneOf(const std::vector<Value> &values) {
        return values[static_cast<size_t>(below(static_cast<int>(values.size())))];
    }

private:
    FW::FWRULE rule(const std::string &adapter);
    void limitAddress(FW::FWRULE &rule, const std::string &adapter);
    void limitPorts(FW::FWRULE &rule);
    std::string range(int first, int last);

    std::mt19937 m_random;
};

/// "10.1.0.3", or "fd00:1::3".
std::string hostAddress(const std::string &adapter, int host, bool isV6);

}  // namespace veldtest

#endif
