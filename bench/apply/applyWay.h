// SPDX-License-Identifier: Apache-2.0
// The ways of applying a profile, each run in a process of its own.
#ifndef VELD_BENCH_APPLY_WAY_H
#define VELD_BENCH_APPLY_WAY_H

#include "network.h"

#include <string>

namespace veldbench {

/// Ways that processOfWay() knows.
inline constexpr const char *LOAD = "profile load";
inline constexpr const char *SPECIFIED_RELOAD = "fwReload";
inline constexpr const char *ATOMIC_RELOAD = "fwReloadAtomic";
inline constexpr const char *PROCESS_LOOP = "a process per command";
inline constexpr const char *BARE_RESTORE = "bare restore";
inline constexpr const char *UFW_RELOAD = "ufw reload";
inline constexpr const char *FIREWALLD_RELOAD = "firewall-cmd --reload";

struct ApplyCost {
    double milliseconds = 0;
    double processorMilliseconds = 0;  ///< of the process and its children; a daemon's is not in it
    long peakKilobytes = 0;            ///< resident, of the largest process
};

/// Makes the sandbox an installation of the library. Before anything else.
void installationPrepare();

/// Stores a profile of that many rules, all of both families and both chains, makes it the active one, and writes down
/// its commands and its input of iptables-restore, as they are for the interface "eth0" of `space`. The ports of
/// windowProbe.h are let in and kept out as told there.
/// @return the number of rules that it makes in the kernel
size_t profilePrepare(const veldtest::NetworkNamespace &space, size_t rules);

/// Runs one of the ways in a process of its own in `space`. Throws std::runtime_error when it fails.
ApplyCost applyIn(const veldtest::NetworkNamespace &space, const std::string &way);

/// What that process does: argument vector from main(). @return its exit status
int processOfWay(const std::string &way);

}  // namespace veldbench

#endif
