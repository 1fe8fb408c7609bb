// SPDX-License-Identifier: Apache-2.0
// Tells other components, through plug-in hooks, that the firewall is switched on or off.
#include "veldfirewall/fwHook.h"

#include <veld/sdk.h>

#include "utils/log.h"

namespace FW {

namespace {

constexpr const char *HOOK_CATEGORY = "net";
constexpr const char *ENABLE_HOOK = "net/firewall_enable";
constexpr const char *DISABLE_HOOK = "net/firewall_disable";
constexpr const char *RESULT_ARGUMENT = "RESULT";
constexpr const char *RESULT_SUCCESS = "0";
constexpr const char *RESULT_FAILURE = "-1";

/// Closed in every case, also when opening it failed.
struct PluginHandle {
    VLIBPLUGIN_HANDLE handle = nullptr;

    PluginHandle() = default;
    ~PluginHandle() { VLIBPluginExit(handle); }
    PluginHandle(const PluginHandle &) = delete;
    PluginHandle &operator=(const PluginHandle &) = delete;
};

}  // namespace

bool VeldFwHook::RunFwEnablePreHook() {
    return RunFwHook(ENABLE_HOOK, HOOK_PRE, true);
}

bool VeldFwHook::RunFwEnablePostHook(bool succeeded) {
    return RunFwHook(ENABLE_HOOK, HOOK_POST, succeeded);
}

bool VeldFwHook::RunFwDisablePreHook() {
    return RunFwHook(DISABLE_HOOK, HOOK_PRE, true);
}

bool VeldFwHook::RunFwDisablePostHook(bool succeeded) {
    return RunFwHook(DISABLE_HOOK, HOOK_POST, succeeded);
}

bool VeldFwHook::RunFwHook(const std::string &hookName, HookAction action, bool succeeded) {
    PluginHandle plugin;
    if (VLIBPluginSDKInit(HOOK_CATEGORY, hookName.c_str(), &plugin.handle) < 0) {
        FW_LOG_ERR("Failed to init hook plugin");
        return false;
    }
    const char *result = succeeded ? RESULT_SUCCESS : RESULT_FAILURE;
    if (VLIBPluginSetArg(plugin.handle, RESULT_ARGUMENT, result) < 0) {
        FW_LOG_ERR("Failed to set %s = %s", RESULT_ARGUMENT, result);
    }
    if (VLIBPluginAction(action == HOOK_PRE ? VLIB_PLUGIN_PRE : VLIB_PLUGIN_POST, plugin.handle) < 0) {
        FW_LOG_ERR("Failed to run hook: %s", hookName.c_str());
        return false;
    }
    return true;
}

}  // namespace FW
