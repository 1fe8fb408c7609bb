// SPDX-License-Identifier: Apache-2.0
// Tells other components, through plug-in hooks, that the firewall is switched on or off.
#ifndef VELDFIREWALL_FWHOOK_H
#define VELDFIREWALL_FWHOOK_H

#include <string>

#include "veldfirewall/export.h"

namespace FW {

/// Runs the hooks "net/firewall_enable" and "net/firewall_disable". Holds no state. All operations wait for the hook,
/// return true on success and log a failure; none throws.
class VELDFIREWALL_API VeldFwHook {
public:
    /// When a hook runs, relative to the switch.
    enum HookAction { HOOK_PRE = 0, HOOK_POST = 1 };

    /// Announces that the firewall is about to be enabled (RESULT is "0").
    bool RunFwEnablePreHook();
    /// Announces that enabling has ended; RESULT is "0" when it `succeeded`, else "-1".
    bool RunFwEnablePostHook(bool succeeded);
    /// Announces that the firewall is about to be disabled (RESULT is "0").
    bool RunFwDisablePreHook();
    /// Announces that disabling has ended; RESULT is "0" when it `succeeded`, else "-1".
    bool RunFwDisablePostHook(bool succeeded);

    /// Runs one hook of the category "net" with the argument RESULT ("0" or "-1"). An argument that cannot be set is
    /// logged, and the hook runs all the same. @param hookName for example "net/firewall_enable"
    bool RunFwHook(const std::string &hookName, HookAction action, bool succeeded);
};

}  // namespace FW

#endif
