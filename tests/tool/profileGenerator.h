// SPDX-License-Identifier: Apache-2.0
// Profiles with rules of every kind that the kernel takes.
#ifndef VELD_TEST_PROFILEGENERATOR_H
#define VELD_TEST_PROFILEGENERATOR_H

#include <veldfirewall/fwRecords.h>

#include <random>
#include <string>
#include <vector>

namespace veldtest {

/// The same profiles for the same seed. Rules of the adapters name hosts 2 to 5 of 10.1.0.0/24 and fd00:1::/64 behind
/// eth0, and of 10.2.0.0/24 and fd00:2::/64 behind eth1; ports 21 to 28, source ports 701 to 703.
class ProfileGenerator {
public:
    explicit ProfileGenerator(unsigned seed) : m_random(seed) {}

    FW::FWPROFILE profile(const std::string &name, int rulesPerAdapter);
    int below(int bound) { return static_cast<int>(m_random() % static_cast<unsigned>(bound)); }
    bool chance(int percent) { return below(100) < percent; }

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
