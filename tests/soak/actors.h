// SPDX-License-Identifier: Apache-2.0
// Those who work on the rules and profiles at the same time, each in a process of its own until told to stop.
#ifndef VELD_SOAK_ACTORS_H
#define VELD_SOAK_ACTORS_H

#include <atomic>
#include <string>
#include <vector>

namespace veldsoak {

/// What one actor did; lies in memory shared by all processes.
struct Tally {
    std::atomic<unsigned long> done;
    std::atomic<unsigned long> failed;
};

/// What a process holds.
struct Footprint {
    std::atomic<long> descriptors;
    std::atomic<long> kilobytes;  ///< resident
};

struct Shared {
    std::atomic<bool> stop;
    std::atomic<unsigned long> profilesBroughtBack;
    Tally specifiedReloads, atomicReloads, edits, queries, neighbourSteps, heldLocks;
    Footprint reloaderEarly, reloaderLate, querierEarly, querierLate;
};

inline constexpr int PROFILES = 4;  ///< that are made the active one in turn
std::string profileName(int n);

/// Interfaces, services, modules and the profiles. Switches the firewall on.
void worldPrepare(unsigned seed);

/// Stores another content of a profile, makes it the active one and applies it: in turn as the specified reload and as
/// a whole.
int reload(Shared &shared, unsigned seed);
/// Edits all profiles, and creates, renames and deletes profiles of its own.
int edit(Shared &shared, unsigned seed);
/// Asks for blocked ports and services and reads all profiles.
int query(Shared &shared, unsigned seed);
/// Adds and removes chains and rules in several tables of both families through iptables, as a container engine does.
/// Leaves some, and notes all that it left in NEIGHBOUR_RULES, in the form of neighbourRules().
int neighbour(Shared &shared, unsigned seed);
/// Holds the lock of the xtables programs now and then.
int holdLock(Shared &shared, unsigned seed);

inline constexpr const char *NEIGHBOUR_RULES = "/run/neighbour-rules";
/// All chains and rules of the neighbour that the kernel holds, one per line, sorted.
std::string neighbourRules();

}  // namespace veldsoak

#endif
