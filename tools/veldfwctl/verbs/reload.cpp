// SPDX-License-Identifier: Apache-2.0
// "reload": applies the active profile again.
#include <veldfirewall/veldFW.h>

#include "frame/verb.h"
#include "system/apply.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

int reload(const Context &context) {
    const std::string profile = settingsRead().profile;
    const bool applied = reloadRun(context);
    context.print(applied ? "Profile \"" + profile + "\" is applied."
                          : "The firewall is off; nothing was applied. \"veldfwctl enable\" switches it on.");
    if (context.json) {
        Json::Value json;
        json["applied"] = applied;
        json["profile"] = profile;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerReload(CLI::App &app, Context &context) {
    verbAdd(app, context,
            {"reload", "Apply the active profile again, if the firewall is on", "veldfwctl reload",
             [&context] { return reload(context); }, false,
             "Established connections are kept. A profile that cannot be applied switches the firewall off. The work "
             "goes on when the terminal is closed."});
}

}  // namespace veldfwctl
