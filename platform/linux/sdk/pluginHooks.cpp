// SPDX-License-Identifier: Apache-2.0
// Plug-in hooks: other components' programs that run before and after a switch.
#include "veld/sdk.h"

#include "common/log.h"
#include "sdk/hookDirectory.h"

struct VLIBPlugin {
    std::string directory;
    std::map<std::string, std::string> arguments;
};

namespace {

constexpr char kHooksDirectory[] = "/usr/veld/etc/hooks.d/";
constexpr std::chrono::seconds kLongestRun{30};

int badParameter(const char *what) {
    VELD_LOG(LOG_ERR, "bad parameter: %s", what);
    VELD_SET_ERROR(veld::kBadParameter);
    return -1;
}

}  // namespace

int VLIBPluginSDKInit(const char * /*category*/, const char *hook, VLIBPLUGIN_HANDLE *handle) {
    return veld::guarded(__func__, -1, [&] {
        if (handle == nullptr)
            return badParameter("no place for the handle");
        *handle = nullptr;
        if (hook == nullptr || !veld::isHookName(hook))
            return badParameter("the name of a hook is one such as \"net/firewall_enable\"");
        *handle = new VLIBPlugin{std::string(kHooksDirectory) + hook, {}};
        return 0;
    });
}

int VLIBPluginSetArg(VLIBPLUGIN_HANDLE handle, const char *key, const char *value) {
    return veld::guarded(__func__, -1, [&] {
        if (handle == nullptr || key == nullptr || *key == '\0' || strchr(key, '=') != nullptr || value == nullptr)
            return badParameter("an argument of a hook has a name without \"=\" and a value");
        handle->arguments.insert_or_assign(key, value);
        return 0;
    });
}

int VLIBPluginAction(int code, VLIBPLUGIN_HANDLE handle) {
    return veld::guarded(__func__, -1, [&] {
        if (handle == nullptr || (code != VLIB_PLUGIN_PRE && code != VLIB_PLUGIN_POST))
            return badParameter("a hook's action needs a handle and the code 4 or 5");
        const char *const when = code == VLIB_PLUGIN_PRE ? "pre" : "post";
        if (veld::runHookDirectory(handle->directory, when, handle->arguments, kLongestRun))
            return 0;
        VELD_SET_ERROR(veld::kInternalError);
        return -1;
    });
}

void VLIBPluginExit(VLIBPLUGIN_HANDLE handle) {
    delete handle;
}
