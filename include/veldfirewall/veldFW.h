// SPDX-License-Identifier: Apache-2.0
// The firewall controller, and the manager through which profiles are edited.
#ifndef VELDFIREWALL_VELDFW_H
#define VELDFIREWALL_VELDFW_H

#include <json/value.h>

#include <map>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "veldfirewall/export.h"
#include "veldfirewall/fwDB.h"
#include "veldfirewall/fwRecords.h"

namespace FW {

/// The controller: settings, switching on and off, applying profiles to the kernel, block queries. Holds no state;
/// create one wherever needed. Operations that return bool give true on success and log every failure at error
/// priority. Nothing is thrown of its own accord; see VELDFW_JSON_DB for what passes through from the libraries.
class VELDFIREWALL_API VELDFW {
public:
    // Settings: "/usr/veld/etc/firewall.d/firewall_settings.json", members "status" (bool) and "profile" (string)

    /// Sets the two members of `config` to their defaults: "status" false, "profile" "default".
    void initJconfig(Json::Value &config);
    /// Reads the settings; a missing file is created with the defaults (and true returned even if it cannot be
    /// written).
    bool configGet(Json::Value &config);
    /// Merges the members of `changes` into the stored settings. Two processes that do so at once can lose a change.
    bool configSet(const Json::Value &changes);
    /// Whether the firewall is switched on. `enabled` is untouched on failure.
    bool fwStatus(bool &enabled);
    /// The name of the active profile. `name` is untouched on failure.
    bool fwProfileConfigGet(std::string &name);
    /// Makes a stored profile the active one, and applies it when `reload` is set and the firewall is on. A failed
    /// reload gives false, but the profile stays the active one.
    bool fwProfileConfigSet(const std::string &name, bool reload);

    // Running commands (these take no lock)

    /// Runs one program without a shell and waits for it. The line is split at single spaces; there is no quoting.
    /// @param commandLine program path and arguments: at most 255 in all, 1024 bytes with one NUL each
    /// @return false when the line is empty or beyond the limits, or the program cannot be run or exits non-zero
    bool cmdExec(const std::string &commandLine);
    /// Runs a command list (see VELDFW_IPTABLES_RULES): all of "v4", then all of "v6"; in each the group "global"
    /// first, then the others in byte order. Stops at the first command that fails; those before it stay in effect.
    bool fwExec(Json::Value commandList);

    /// Applies a command list as a whole: replaces the rules of both firewall chains, in one transaction per family,
    /// through iptables-restore and ip6tables-restore; families that the list does not have, other chains and the
    /// built-in policies are left alone. Rules of tables other than "filter" are appended there. Both families are
    /// tried first; when the second cannot be committed, the first is put back. Takes no lock.
    /// @param commandList appends only; a command that the two kinds of program would read differently is refused
    /// @param failure what stopped it; untouched on success
    /// @return true: everything is new; false, logged: everything is as it was, or the failure's message ends with
    /// whose old rules could not be put back
    bool fwExecAtomic(const Json::Value &commandList, FwApplyFailure &failure);
    /// The same for callers to whom the log is enough.
    bool fwExecAtomic(const Json::Value &commandList);

    // Lifecycle

    /// Loads the kernel modules, announces the switch (hooks), stores it and applies the active profile.
    /// @return false when the modules cannot be loaded (nothing is changed then), or after a failed reload: of a
    /// refused
    ///         command the firewall is off again; of a profile that cannot be read or translated the switch stays on,
    ///         with empty chains
    bool fwEnable();
    /// Announces the switch, flushes the firewall chains, unloads the kernel modules and stores the switch. Goes on
    /// past every failure; the policies of the built-in chains stay as they are.
    /// @return whether the switch could be stored
    bool fwDisable();
    /// Same as fwDisable().
    bool fwReset();
    /// Applies the active profile again if the firewall is on; does nothing, successfully, if it is off. Holds the lock
    /// "/tmp/firewall_iptables_exec.lock" (waiting up to 30 s) and drops all new traffic meanwhile. A profile of which
    /// a command is refused switches the firewall off.
    /// @param keepEstablished accept packets of established connections
    bool fwReload(bool keepEstablished);
    /// As fwReload(), but as a whole (fwExecAtomic()): no moment without rules, the built-in policies are never
    /// touched, and after a failure the old rules stay in force and the firewall stays on.
    /// @param failure what stopped it; untouched on success
    bool fwReloadAtomic(bool keepEstablished, FwApplyFailure &failure);
    /// The same for callers to whom the log is enough.
    bool fwReloadAtomic(bool keepEstablished);
    /// Flushes both firewall chains of both families; goes on past a failure.
    bool fwClear();
    /// Sets the policy of the built-in INPUT and FORWARD chains of both families to DROP.
    bool fwDefaultDrop();
    /// Sets it to ACCEPT.
    bool fwDefaultAccept();
    /// Removes services that the system no longer knows from every stored profile, and sets the protocol of service
    /// rules to that of their services. Writes every profile, changed or not. Does not reload.
    bool fwUpdate();

    // Building commands

    /// Builds the command list of a stored profile (see VELDFW_IPTABLES_RULES::fwRulesToIptablesRules()).
    /// @param commands is appended to; untouched when the profile cannot be read
    bool fwIptablesRulesEnum(std::string profileName, Json::Value &commands, bool keepEstablished);
    /// The same with established connections kept, except those from `clientAddress` (which may be empty).
    bool fwIptablesRulesEnum(std::string profileName, Json::Value &commands, const std::string &clientAddress);
    /// A string literal is a client address, not a bool.
    bool fwIptablesRulesEnum(std::string profileName, Json::Value &commands, const char *clientAddress) {
        return fwIptablesRulesEnum(std::move(profileName), commands, std::string(clientAddress));
    }
    /// Adds the names of all adapters that rules can be bound to: at most 32 interfaces, "wlan0" where the system
    /// supports wireless, "global", "pppoe" and "vpn".
    bool fwAdapterEnum(std::set<std::string> &adapters);

    // Trying a profile

    /// Applies the test copy of a profile (VELDFW_PROFILE::CreateTestProfile()) whether the firewall is on or off;
    /// "status" and the active profile stay as they are, so the next fwReload() or fwEnable() ends the trial. Takes no
    /// lock. A refused command switches the firewall off.
    /// @param clientAddress address of the tester, whose established connections must then be let through by the
    ///        profile's own rules while others' are kept; empty: nobody's established connections are kept
    bool TestApplyingProfile(std::string name, const std::string &clientAddress);
    /// The same with an empty client address.
    bool TestApplyingProfile(std::string name);

    // Block queries: what the active profile says, without a look at the kernel. A stored document that cannot be
    // converted makes them fail, without an exception. They answer exactly where rules of all addresses decide; of
    // several rules for some addresses they tell only a coarse verdict: a profile that allows one network and then
    // denies everything, on an adapter whose default is to allow, is reported as denied.

    /// Tells per adapter whether a port is blocked: FW_POLICY_ALLOW, _DENY, _PARTIAL (for some source addresses), or
    /// _NONE (only for "global": no decision).
    /// @param adapter one adapter, or empty for all of the profile
    /// @param result verdicts are written by adapter name; other entries are left alone. With the firewall off,
    ///        `adapter` is reported as allowed, and nothing when it is empty.
    bool fwPortIsBlocked(const PortCompareST &query, const std::string &adapter,
                         std::map<std::string, FW_POLICY> &result);
    /// The same for all ports of a service: the severest verdict counts (deny, partial, allow, none). A service that is
    /// unknown has no ports and adds nothing.
    bool fwServIsBlocked(const std::string &servName, const std::string &adapter,
                         std::map<std::string, FW_POLICY> &result);
};

/// The profile database with the safeguards and edits of the firewall. Holds no state. Operations return true on
/// success and log every failure; see VELDFW_JSON_DB for what each stores and for what can be thrown.
class VELDFIREWALL_API VELDFW_PROFILE : public VELDFW_JSON_DB {
public:
    /// Forwarders to the operations of VELDFW_JSON_DB of the same names.
    bool profileEnum(std::map<std::string, FWPROFILE> &profiles);
    bool profileEnum(std::vector<std::string> &names);
    bool profileGet(const std::string &name, FWPROFILE &profile);
    bool profileSet(const std::string &name, const FWPROFILE &profile);
    bool profileExist(const std::string &name);
    bool profileCreate(const std::string &name);
    bool profileRename(const std::string &oldName, const std::string &newName);
    /// Deletes a profile. @return false for the active profile, which is kept whether the firewall is on or off
    bool profileDelete(const std::string &name);

    // Trial copies, stored as ".test_" + name

    /// Stores `profile` as the test copy of `name`, replacing an older one.
    bool CreateTestProfile(std::string name, const FWPROFILE &profile);
    /// Copies the test copy of `name` over the profile `name`, which is created when missing. Keeps the test copy.
    bool AdoptTestProfile(std::string name);
    /// Deletes the test copy of `name`.
    bool RemoveTestProfile(std::string name);

    // Edits of all stored profiles. Each profile is written by itself: a failure half-way leaves those before it
    // changed. A stored document that cannot be converted makes them fail, without an exception.

    /// Makes the front rule of `adapter`'s list in every profile a reserved rule of `policy` that names the service,
    /// and takes the service out of the list's other reserved rules. Rules left without a service are dropped.
    /// @param reload apply the active profile afterwards
    bool profileAddServToReserve(const std::string &adapter, const std::string &servName, FW_POLICY policy,
                                 bool reload);
    /// Takes the service out of every service rule of every profile; rules left without one are dropped. Does not
    /// reload.
    bool profileRemoveServ(const std::string &servName);
    /// Moves rules and default policy of `oldAdapter` to `newAdapter` in every profile, replacing what is there.
    /// @param reload apply the active profile afterwards, if its default policies named the old adapter
    bool profileChangeAdapter(const std::string &oldAdapter, const std::string &newAdapter, bool reload);
};

}  // namespace FW

#endif
