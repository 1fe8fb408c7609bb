// SPDX-License-Identifier: Apache-2.0
// What tests of the controller start from: an installed, switched-off firewall.
#ifndef VELD_TEST_FIREWALL_TEST_H
#define VELD_TEST_FIREWALL_TEST_H

#include <gmock/gmock.h>

#include <string>
#include <vector>

#include "systemLog.h"
#include "veldfirewall/veldFW.h"

namespace veldtest {

constexpr const char *MODULE_LIST = "/usr/veld/etc.defaults/iptables_modules_list";
constexpr const char *MODULE_STATE = "/tmp/iptables_serv_mod_list";
constexpr const char *SETTINGS = "/usr/veld/etc/firewall.d/firewall_settings.json";
constexpr const char *PROFILE = "/usr/veld/etc/firewall.d/1.json";  ///< holds the profile "default"
constexpr const char *EXEC_LOCK = "/tmp/firewall_iptables_exec.lock";

/// A module list, the profile "default" without rules, a network tool that knows no tunnel; no settings, no hooks, no
/// services but "discard".
class FirewallTest : public testing::Test {
protected:
    FirewallTest();

    /// The settings' "status", read from the file.
    static bool isSwitchedOn();
    /// Installs an executable hook of "enable" or "disable".
    static void installHook(const std::string &action, const std::string &name, const std::string &script);
    /// Installs hooks that note each run, for enabling and disabling.
    static void installNotingHooks();
    /// The runs noted since the last call: "enable pre 0", "disable post -1".
    static std::vector<std::string> takeHookRuns();
    /// Whether another process could take the lock now.
    static bool execLockIsFree();
    /// Error messages of what runs above the store.
    std::vector<std::string> errors() { return log.errors("veldFW|fwHook|fwIptables|veldIptablesModule|fwGeoip"); }

    SystemLog log;
    FW::VELDFW firewall;
};

/// A rule for any address of IPv4 and one tcp port.
FW::FWRULE portRule(const std::string &port, FW::FW_POLICY policy);

}  // namespace veldtest

#endif
