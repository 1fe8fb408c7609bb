// SPDX-License-Identifier: Apache-2.0
// Tells by a profile's rules alone, without iptables, what happens to one new connection.
#ifndef VELD_DEMO_PROFILE_DECISION_H
#define VELD_DEMO_PROFILE_DECISION_H

#include <veldfirewall/fwRecords.h>

#include <string>

namespace demo {

/// The first packet of a connection to this machine.
struct NewConnection {
    std::string source;  ///< numeric, IPv4 or IPv6
    FW::FW_PORT_PROTOCOL protocol = FW::FW_PROTO_TCP;
    uint16_t port = 0;
};

/// What the profile decides, and by which rule.
struct Decision {
    bool allowed = true;
    std::string rule = "no rule";
};

/// First matching rule of the list "global"; allowed when none matches. Throws std::runtime_error for kinds of rules
/// that the demonstration's profile does not have.
Decision decide(const FW::FWPROFILE &profile, const NewConnection &connection);

}  // namespace demo

#endif
