// SPDX-License-Identifier: Apache-2.0
// Loads and unloads the kernel modules of iptables on behalf of named owners.
#ifndef VELDFIREWALL_VELDIPTABLESMODULE_H
#define VELDFIREWALL_VELDIPTABLESMODULE_H

#include <string>
#include <vector>

#include "veldfirewall/export.h"

namespace FW {

/// Kernel modules by owner ("firewall", or the name of another service). Which modules belong to a load is read from
/// "/usr/veld/etc.defaults/iptables_modules_list"; whether an owner has them loaded is one key, "yes" or "no", in
/// "/tmp/iptables_serv_mod_list". Core and NAT loads of one owner share that key. All operations are static, return
/// true on success and log every failure. The state file is written under a lock of up to 30 s; when the lock cannot
/// be had it is written all the same.
class VELDFIREWALL_API VELD_IPTABLES_MODULES {
public:
    /// Inserts the modules (file names such as "xt_mac.ko") in order and marks the owner "yes".
    static bool moduleInsert(const std::string &servName, const std::vector<std::string> &modules);
    /// Removes the modules in order and marks the owner "no".
    static bool moduleRemove(const std::string &servName, const std::vector<std::string> &modules);
    /// Whether the owner is marked exactly "yes". Takes no lock.
    static bool isModuleLoad(const std::string &servName);
    /// Reads the core, common and IPv6 modules into `out`. Loads nothing; `out` is untouched on failure.
    static bool coreCommonModuleLoad(std::vector<std::string> &out);
    /// Reads the NAT modules into `out`. Loads nothing; `out` is untouched on failure.
    static bool natModuleLoad(std::vector<std::string> &out);
    /// Reads the modules of any key of the list file into `out`; `out` is untouched on failure.
    static bool iptablesModListGet(const std::string &key, std::vector<std::string> &out);
    /// Inserts the core, common and IPv6 modules for the owner.
    static bool iptablesCoreModLoad(const std::string &servName);
    /// Removes them, last first.
    static bool iptablesCoreModUnload(const std::string &servName);
    /// Inserts the core modules, then the NAT modules.
    static bool iptablesNATModLoad(const std::string &servName);
    /// Removes the NAT modules, last first, then the core modules, last first.
    static bool iptablesNATModUnload(const std::string &servName);
};

}  // namespace FW

#endif
