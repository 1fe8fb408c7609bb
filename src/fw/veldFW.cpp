// SPDX-License-Identifier: Apache-2.0
// The firewall controller, and the profile manager with the edits that span all profiles.
#include "veldfirewall/veldFW.h"

#include <veld/core.h>

#include <algorithm>
#include <array>
#include <functional>

#include "adapters/adapterNames.h"
#include "db/profileStore.h"
#include "fw/blockQuery.h"
#include "fw/builtinChains.h"
#include "fw/commandLine.h"
#include "fw/commandList.h"
#include "fw/execLock.h"
#include "fw/firewallModules.h"
#include "fw/ruleListEdit.h"
#include "fw/serviceRegistry.h"
#include "settings/fwSettings.h"
#include "utils/log.h"
#include "utils/platformError.h"
#include "utils/runOrLog.h"
#include "veldfirewall/fwHook.h"
#include "veldfirewall/fwIptables.h"
#include "veldfirewall/veldIptablesModule.h"

namespace FW {

namespace {

constexpr const char *MODULE_OWNER = "firewall";
const std::vector<std::string> FIREWALL_MODULES = {"compat_xtables.ko", "xt_geoip.ko", "xt_mac.ko"};

constexpr int WAIT = 1;

constexpr const char *TEST_PREFIX = ".test_";

/// A failure is only logged; the texts speak of loading, and those who watch the log know them so.
void firewallModUnload() {
    if (!VELD_IPTABLES_MODULES::isModuleLoad(MODULE_OWNER)) {
        return;
    }
    const std::vector<std::string> modules(FIREWALL_MODULES.rbegin(), FIREWALL_MODULES.rend());
    if (!VELD_IPTABLES_MODULES::moduleRemove(MODULE_OWNER, modules)) {
        FW_LOG_ERR("Failed to moduleInsert()");
        return;
    }
    if (!VELD_IPTABLES_MODULES::iptablesCoreModUnload(MODULE_OWNER)) {
        FW_LOG_ERR("Failed to iptablesCoreModLoad");
    }
}

bool profileTranslate(const std::string &name, Json::Value &commands, bool keepEstablished,
                      const std::string &clientAddress) {
    FWPROFILE profile;
    if (!VELDFW_PROFILE().profileGet(name, profile)) {
        FW_LOG_ERR("Failed to profileGet(%s)", name.c_str());
        return false;
    }
    VELDFW_IPTABLES_RULES translator;
    if (!translator.fwRulesToIptablesRules(keepEstablished, profile.rules, profile.adapterPolicyMap, commands,
                                           clientAddress)) {
        FW_LOG_ERR("Failed to fwRulesToIptablesRules()");
        return false;
    }
    return true;
}

/// Replaces the kernel's rules while the built-in chains drop what the firewall chains do not accept.
/// @param commandsBuild clears the chains and builds the new command list, logging its failures
bool rulesReplace(VELDFW &firewall, const std::function<bool(Json::Value &commands)> &commandsBuild) {
    if (!firewall.fwDefaultDrop()) {
        return false;
    }
    bool outcome = false;
    try {
        Json::Value commands;
        if (commandsBuild(commands)) {
            outcome = firewall.fwExec(commands);
            if (!outcome) {
                firewall.fwDisable();
                FW_LOG_ERR("Failed to fwExec() so disable firewall");
            }
        }
    } catch (...) {
        // A profile that JsonCpp cannot convert must not leave the machine locked out.
        if (!firewall.fwDefaultAccept()) {
            firewall.fwDisable();
        }
        throw;
    }
    if (!firewall.fwDefaultAccept()) {
        firewall.fwDisable();
        outcome = false;
    }
    return outcome;
}

/// Applies the active profile if the firewall is on; the caller holds the lock of the kernel's rules.
bool lockedReload(VELDFW &firewall, bool keepEstablished) {
    bool enabled = false;
    if (!firewall.fwStatus(enabled)) {
        FW_LOG_ERR("Failed to check status");
        return false;
    }
    if (!enabled) {
        return true;
    }
    if (!firewallModLoad()) {
        FW_LOG_ERR("Failed to firewallModLoad()");
        return false;
    }
    return rulesReplace(firewall, [&](Json::Value &commands) {
        firewall.fwClear();
        std::string profileName;
        if (!firewall.fwProfileConfigGet(profileName)) {
            FW_LOG_ERR("Failed to fwProfileConfigGet()");
            return false;
        }
        if (!firewall.fwIptablesRulesEnum(profileName, commands, keepEstablished)) {
            FW_LOG_ERR("Failed to fwIptablesRulesEnum()");
            return false;
        }
        return true;
    });
}

/// Runs a switch and then its post hook with the outcome: false when an exception leaves the switch.
bool switchWithPostHook(const std::function<bool()> &switchOver, const std::function<void(bool)> &postHook) {
    bool outcome = false;
    try {
        outcome = switchOver();
    } catch (...) {
        postHook(false);
        throw;
    }
    postHook(outcome);
    return outcome;
}

/// What block queries ask: the switch and the profile in force, read once for all ports of a service.
struct ProfileInForce {
    bool enabled = false;
    FWPROFILE profile;

    bool read() {
        Json::Value settings;
        const auto statusRead = [&] { return settingsGetOrLog(settings) && settingsStatus(settings, enabled); };
        if (!FW_RUN_OR_LOG(statusRead)) {
            FW_LOG_ERR("Failed to check firewall status");
            return false;
        }
        if (!enabled) {
            return true;
        }
        std::string name;
        if (!settingsActiveProfileOrLog(settings, name)) {
            FW_LOG_ERR("Failed to fwProfileConfigGet()");
            return false;
        }
        if (!FW_RUN_OR_LOG([&] { return VELDFW_PROFILE().profileGet(name, profile); })) {
            FW_LOG_ERR("Failed to profileGet(%s)", name.c_str());
            return false;
        }
        return true;
    }

    void evaluate(const PortCompareST &query, const std::string &adapter, VELDFW_IPTABLES_RULES &services,
                  PolicyMap &result) const {
        if (!enabled) {
            if (!adapter.empty()) {
                result[adapter] = FW_POLICY_ALLOW;
            }
            return;
        }
        const auto expand = [&](const std::vector<std::string> &names, ServPort &ports) {
            if (!services.servToPorts(names, ports)) {
                FW_LOG_ERR("Failed to servToPorts()");
                return false;
            }
            return true;
        };
        profileEvaluate(profile, query, adapter, expand, result);
    }
};

}  // namespace

bool firewallModLoad() {
    if (VELD_IPTABLES_MODULES::isModuleLoad(MODULE_OWNER)) {
        return true;
    }
    if (!VELD_IPTABLES_MODULES::iptablesCoreModLoad(MODULE_OWNER)) {
        FW_LOG_ERR("Failed to iptablesCoreModLoad");
        return false;
    }
    if (!VELD_IPTABLES_MODULES::moduleInsert(MODULE_OWNER, FIREWALL_MODULES)) {
        FW_LOG_ERR("Failed to moduleInsert()");
        return false;
    }
    return true;
}

// Settings

void VELDFW::initJconfig(Json::Value &config) {
    settingsInit(config);
}

bool VELDFW::configGet(Json::Value &config) {
    return settingsGet(config);
}

bool VELDFW::configSet(const Json::Value &changes) {
    return settingsSet(changes);
}

bool VELDFW::fwStatus(bool &enabled) {
    Json::Value settings;
    return settingsGetOrLog(settings) && settingsStatus(settings, enabled);
}

bool VELDFW::fwProfileConfigGet(std::string &name) {
    Json::Value settings;
    return settingsGetOrLog(settings) && settingsActiveProfileOrLog(settings, name);
}

bool VELDFW::fwProfileConfigSet(const std::string &name, bool reload) {
    std::vector<std::string> names;
    if (!VELDFW_PROFILE().profileEnum(names)) {
        FW_LOG_ERR("Failed to profileEnum()");
        return false;
    }
    if (std::find(names.begin(), names.end(), name) == names.end()) {
        FW_LOG_ERR("Profile %s is not in database", name.c_str());
        return false;
    }
    Json::Value settings;
    if (!settingsGetOrLog(settings)) {
        return false;
    }
    settings["profile"] = name;
    if (!configSet(settings)) {
        FW_LOG_ERR("Falied to configSet()");
        return false;
    }
    if (reload && !VELDFW().fwReload(true)) {
        FW_LOG_ERR("Failed to reload firewall");
        return false;
    }
    return true;
}

// Running commands

bool VELDFW::cmdExec(const std::string &commandLine) {
    CommandArguments arguments;
    switch (commandLineSplit(commandLine, arguments)) {
    case CommandSplit::TOO_MANY:
        FW_LOG_ERR("#Arguments exceeds limit");
        return false;
    case CommandSplit::EMPTY_OR_TOO_LONG:
        FW_LOG_ERR("cmd is empty or arguments exceeding limit");
        return false;
    case CommandSplit::OK:
        break;
    }
    const char *program = arguments.vector[0];
    if (VLIBCExecv(program, arguments.vector.data(), WAIT) == -1) {
        FW_LOG_ERR("Failed to execute %s", program);
        return false;
    }
    return true;
}

bool VELDFW::fwExec(Json::Value commandList) {
    for (const ListedCommand &command : commandsInOrder(commandList)) {
        if (!cmdExec(command.commandLine)) {
            FW_LOG_ERR("Failed to execute \"%s\"", command.commandLine.c_str());
            return false;
        }
    }
    return true;
}

// Lifecycle

bool VELDFW::fwEnable() {
    if (!firewallModLoad()) {
        FW_LOG_ERR("Failed to firewallModLoad()");
        return false;
    }
    VeldFwHook hook;
    if (!hook.RunFwEnablePreHook()) {
        FW_LOG_ERR("Failed to run firewall enable pre-hook.");
    }
    const auto switchOver = [this] {
        Json::Value changes;
        changes["status"] = true;
        if (!configSet(changes)) {
            FW_LOG_ERR("Falied to configSet()");
            return false;
        }
        if (!fwReload(true)) {
            FW_LOG_ERR("Failed to apply firewall rules");
            return false;
        }
        return true;
    };
    return switchWithPostHook(switchOver, [&](bool succeeded) {
        if (!hook.RunFwEnablePostHook(succeeded)) {
            FW_LOG_ERR("Failed to run firewall enable post-hook.");
        }
    });
}

bool VELDFW::fwDisable() {
    VeldFwHook hook;
    if (!hook.RunFwDisablePreHook()) {
        FW_LOG_ERR("Failed to run firewall disable pre-hook.");
    }
    const auto switchOver = [this] {
        fwClear();
        firewallModUnload();
        Json::Value changes;
        changes["status"] = false;
        if (!configSet(changes)) {
            FW_LOG_ERR("Falied to configSet()");
            return false;
        }
        return true;
    };
    return switchWithPostHook(switchOver, [&](bool succeeded) {
        if (!hook.RunFwDisablePostHook(succeeded)) {
            FW_LOG_ERR("Failed to run firewall disable post-hook.");
        }
    });
}

bool VELDFW::fwReset() {
    return fwDisable();
}

bool VELDFW::fwReload(bool keepEstablished) {
    ExecLock lock;
    if (!lock.isTaken()) {
        FW_LOG_ERR("TIMEOUT: getting lock");
        return false;
    }
    const bool outcome = lockedReload(*this, keepEstablished);
    if (!lock.release()) {
        FW_LOG_ERR("Failed to unlock");
    }
    return outcome;
}

bool VELDFW::fwClear() {
    bool cleared = true;
    for (const char *chain : FW_CHAINS) {
        for (const char *program : {IPTABLES_PROGRAM, IP6TABLES_PROGRAM}) {
            const std::string commandLine = std::string(program) + " -F " + chain;
            if (!cmdExec(commandLine)) {
                FW_LOG_ERR("Failed to execute \"%s\"", commandLine.c_str());
                cleared = false;
            }
        }
    }
    return cleared;
}

bool VELDFW::fwDefaultDrop() {
    if (!fwExec(builtinPolicyCommands("DROP"))) {
        FW_LOG_ERR("Failed to fwExec() to set default drop.");
        return false;
    }
    return true;
}

bool VELDFW::fwDefaultAccept() {
    if (!fwExec(builtinPolicyCommands("ACCEPT"))) {
        FW_LOG_ERR("Failed to fwExec() to set default accept.");
        return false;
    }
    return true;
}

bool VELDFW::fwUpdate() {
    std::map<std::string, StoredProfile> profiles;
    if (!storedProfilesLoad(profiles)) {
        FW_LOG_ERR("Failed to enum profiles to profile list");
        return false;
    }
    const ServiceRegistry registry;
    if (!registry.isOpen()) {
        FW_LOG_ERR("Failed to enum FW services");
        return false;
    }
    for (auto &[name, stored] : profiles) {
        servicesRefresh(stored.profile, [&](const std::string &service) { return registry.kindOf(service); });
    }
    for (auto &[name, stored] : profiles) {
        if (!storedProfileSave(std::move(stored))) {
            FW_LOG_ERR("Failed to set profile");
            return false;
        }
    }
    return true;
}

// Building commands

bool VELDFW::fwIptablesRulesEnum(std::string profileName, Json::Value &commands, bool keepEstablished) {
    return profileTranslate(profileName, commands, keepEstablished, "");
}

bool VELDFW::fwIptablesRulesEnum(std::string profileName, Json::Value &commands, const std::string &clientAddress) {
    return profileTranslate(profileName, commands, true, clientAddress);
}

bool VELDFW::fwAdapterEnum(std::set<std::string> &adapters) {
    std::vector<std::string> names;
    const int count = adapterNamesRead(names);
    if (count < 0) {
        FW_LOG_ERR("Failed to VLIBNetGetInterfaceInfo(%d) " PLATFORM_ERROR_FORMAT, count, PLATFORM_ERROR_ARGUMENTS);
        return false;
    }
    adapters.insert(names.begin(), names.end());
    adapters.insert({FW_ADAPTER_GLOBAL, FW_ADAPTER_PPPOE, FW_ADAPTER_VPN});
    return true;
}

// Trying a profile

bool VELDFW::TestApplyingProfile(std::string name, const std::string &clientAddress) {
    const std::string testName = TEST_PREFIX + name;
    if (!firewallModLoad()) {
        FW_LOG_ERR("Failed to firewallModLoad()");
        return false;
    }
    return rulesReplace(*this, [&](Json::Value &commands) {
        if (!fwClear()) {
            FW_LOG_ERR("Failed to fwClear()");
            return false;
        }
        const bool built = clientAddress.empty() ? fwIptablesRulesEnum(testName, commands, false)
                                                 : fwIptablesRulesEnum(testName, commands, clientAddress);
        if (!built) {
            FW_LOG_ERR("Failed to fwIptablesRulesEnum()");
        }
        return built;
    });
}

bool VELDFW::TestApplyingProfile(std::string name) {
    return TestApplyingProfile(std::move(name), "");
}

// Block queries

bool VELDFW::fwPortIsBlocked(const PortCompareST &query, const std::string &adapter, PolicyMap &result) {
    ProfileInForce inForce;
    if (!inForce.read()) {
        return false;
    }
    VELDFW_IPTABLES_RULES services;
    inForce.evaluate(query, adapter, services, result);
    return true;
}

bool VELDFW::fwServIsBlocked(const std::string &servName, const std::string &adapter, PolicyMap &result) {
    VELDFW_IPTABLES_RULES services;
    ServPort ports;
    if (!services.servToPorts({servName}, ports)) {
        FW_LOG_ERR("Failed to servToPorts()");
        return false;
    }
    const std::vector<PortCompareST> queries = serviceQueries(ports);
    if (queries.empty()) {
        return true;
    }
    ProfileInForce inForce;
    if (!inForce.read()) {
        FW_LOG_ERR("Failed to fwPortIsBlocked()");
        return false;
    }
    for (const PortCompareST &query : queries) {
        PolicyMap verdicts;
        inForce.evaluate(query, adapter, services, verdicts);
        verdictsMerge(verdicts, result);
    }
    return true;
}

// The profile manager

bool VELDFW_PROFILE::profileEnum(std::map<std::string, FWPROFILE> &profiles) {
    return VELDFW_JSON_DB::profileEnum(profiles);
}

bool VELDFW_PROFILE::profileEnum(std::vector<std::string> &names) {
    return VELDFW_JSON_DB::profileEnum(names);
}

bool VELDFW_PROFILE::profileGet(const std::string &name, FWPROFILE &profile) {
    return VELDFW_JSON_DB::profileGet(name, profile);
}

bool VELDFW_PROFILE::profileSet(const std::string &name, const FWPROFILE &profile) {
    return VELDFW_JSON_DB::profileSet(name, profile);
}

bool VELDFW_PROFILE::profileExist(const std::string &name) {
    return VELDFW_JSON_DB::profileExist(name);
}

bool VELDFW_PROFILE::profileCreate(const std::string &name) {
    return VELDFW_JSON_DB::profileCreate(name);
}

bool VELDFW_PROFILE::profileRename(const std::string &oldName, const std::string &newName) {
    return VELDFW_JSON_DB::profileRename(oldName, newName);
}

bool VELDFW_PROFILE::profileDelete(const std::string &name) {
    Json::Value settings;
    std::string activeProfile;
    if (!VELDFW().configGet(settings) || !settingsActiveProfile(settings, activeProfile)) {
        FW_LOG_ERR("Falied to config.configGet()");
        return false;
    }
    if (activeProfile == name) {
        FW_LOG_ERR("The profile %s is used now so cannot remove", name.c_str());
        return false;
    }
    return VELDFW_JSON_DB::profileDelete(name);
}

bool VELDFW_PROFILE::CreateTestProfile(std::string name, const FWPROFILE &profile) {
    FWPROFILE copy = profile;
    const std::string testName = TEST_PREFIX + name;
    if (profileExist(testName) && !profileDelete(testName)) {
        FW_LOG_ERR("failed to profileDelete()");
        return false;
    }
    if (!profileCreate(testName)) {
        FW_LOG_ERR("failed to profileCreate()");
        return false;
    }
    copy.name = testName;
    if (!profileSet(testName, copy)) {
        FW_LOG_ERR("failed to profileSet()");
        return false;
    }
    return true;
}

bool VELDFW_PROFILE::AdoptTestProfile(std::string name) {
    const std::string testName = TEST_PREFIX + name;
    if (!profileExist(testName)) {
        FW_LOG_ERR("profile does not exist");
        return false;
    }
    FWPROFILE copy;
    if (!profileGet(testName, copy)) {
        FW_LOG_ERR("failed to profileGet()");
        return false;
    }
    copy.name = name;
    if (!profileSet(name, copy)) {
        FW_LOG_ERR("failed to profileSet()");
        return false;
    }
    return true;
}

bool VELDFW_PROFILE::RemoveTestProfile(std::string name) {
    const bool removed = profileDelete(TEST_PREFIX + name);
    if (!removed) {
        FW_LOG_ERR("failed to profileDelete()");
    }
    return removed;
}

bool VELDFW_PROFILE::profileAddServToReserve(const std::string &adapter, const std::string &servName, FW_POLICY policy,
                                             bool reload) {
    std::map<std::string, StoredProfile> profiles;
    if (!FW_RUN_OR_LOG([&] { return storedProfilesLoad(profiles); })) {
        FW_LOG_ERR("Failed to profileEnum()");
        return false;
    }
    for (auto &entry : profiles) {
        StoredProfile &stored = entry.second;
        serviceReserve(stored.profile, adapter, servName, policy);
        if (!FW_RUN_OR_LOG([&] { return storedProfileSave(std::move(stored)); })) {
            FW_LOG_ERR("Failed to set profile");
            return false;
        }
    }
    if (reload && !FW_RUN_OR_LOG([] { return VELDFW().fwReload(true); })) {
        FW_LOG_ERR("Failed to firewall reload");
        return false;
    }
    return true;
}

bool VELDFW_PROFILE::profileRemoveServ(const std::string &servName) {
    std::map<std::string, StoredProfile> profiles;
    if (!FW_RUN_OR_LOG([&] { return storedProfilesLoad(profiles); })) {
        FW_LOG_ERR("Failed to profileEnum()");
        return false;
    }
    for (auto &entry : profiles) {
        StoredProfile &stored = entry.second;
        serviceRemove(stored.profile, servName);
        if (!FW_RUN_OR_LOG([&] { return storedProfileSave(std::move(stored)); })) {
            FW_LOG_ERR("Failed to profile set [%s]", entry.first.c_str());
            return false;
        }
    }
    return true;
}

bool VELDFW_PROFILE::profileChangeAdapter(const std::string &oldAdapter, const std::string &newAdapter, bool reload) {
    std::map<std::string, StoredProfile> profiles;
    if (!FW_RUN_OR_LOG([&] { return storedProfilesLoad(profiles); })) {
        FW_LOG_ERR("Failed to profileEnum()");
        return false;
    }
    std::string activeProfile;
    if (!FW_RUN_OR_LOG([&] { return VELDFW().fwProfileConfigGet(activeProfile); })) {
        FW_LOG_ERR("Failed to fwProfileConfigGet()");
        return false;
    }
    bool reloadDue = false;
    for (auto &entry : profiles) {
        StoredProfile &stored = entry.second;
        if (adapterRename(stored.profile, oldAdapter, newAdapter) && entry.first == activeProfile) {
            reloadDue = true;
        }
        if (!FW_RUN_OR_LOG([&] { return storedProfileSave(std::move(stored)); })) {
            FW_LOG_ERR("Failed to profile set [%s]", entry.first.c_str());
            return false;
        }
    }
    if (reloadDue && reload && !FW_RUN_OR_LOG([] { return VELDFW().fwReload(true); })) {
        FW_LOG_ERR("Failed to reload firewall");
        return false;
    }
    return true;
}

}  // namespace FW
