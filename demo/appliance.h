// SPDX-License-Identifier: Apache-2.0
// Sets up the appliance of the demonstration inside the sandbox: installation, start-up, network, administrator.
#ifndef VELD_DEMO_APPLIANCE_H
#define VELD_DEMO_APPLIANCE_H

#include "network.h"

#include <veldfirewall/fwRecords.h>

#include <string>
#include <vector>

namespace demo {

/// Addresses of the appliance's interface "eth0" and of its client, per family.
struct Addresses {
    const char *appliance;
    const char *local;    ///< client on the local network
    const char *denied;   ///< client on the local network that the administrator denies
    const char *outside;  ///< client somewhere else
};
inline constexpr Addresses addressesV4 = {"192.168.50.1", "192.168.50.20", "192.168.50.66", "203.0.113.7"};
inline constexpr Addresses addressesV6 = {"fd50::1", "fd50::20", "fd50::66", "2001:db8:99::7"};

/// Ports that the appliance serves.
inline constexpr uint16_t portDns = 53;
inline constexpr uint16_t portHttps = 443;
inline constexpr uint16_t portSmb = 445;
inline constexpr uint16_t portTelnet = 23;

/// Installs the build with its data as "cmake --install" does, and puts the shipped profiles where none are.
void installBuild(const std::string &buildDirectory);
/// Joins the appliance's eth0 with the client's.
void joinNetworks(const veldtest::NetworkNamespace &client);
/// Adds executables to the hooks of enabling and disabling, which note how they were called.
void installHooks();
/// What the hooks noted, a line per run.
std::vector<std::string> hookNotes();
/// Puts the administrator's rules in front of those of the shipped profile. @return the stored profile
FW::FWPROFILE editProfile();

}  // namespace demo

#endif
