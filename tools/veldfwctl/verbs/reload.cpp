// SPDX-License-Identifier: Apache-2.0
// "reload": applies the active profile again.
#include <veldfirewall/veldFW.h>

#include <chrono>
#include <memory>

#include "frame/verb.h"
#include "system/apply.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

int reload(const Context &context, bool atomic) {
    const std::string profile = settingsRead().profile;
    std::chrono::milliseconds heldUp{0};
    const bool applied = reloadRun(context, atomic, &heldUp);
    context.print(applied ? "Profile \"" + profile + "\" is applied."
                          : "The firewall is off; nothing was applied. \"veldfwctl enable\" switches it on.");
    if (context.json) {
        Json::Value json;
        json["applied"] = applied;
        json["profile"] = profile;
        json["heldUpMilliseconds"] = static_cast<Json::Int64>(heldUp.count());
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerReload(CLI::App &app, Context &context) {
    const auto atomic = std::make_shared<bool>(false);
    verbAdd(app, context,
            {"reload", "Apply the active profile again, if the firewall is on", "veldfwctl reload",
             [&context, atomic] { return reload(context, *atomic); }, false,
             "Established connections are kept. A profile that cannot be applied switches the firewall off, but with "
             "--atomic the old rules stay in force. The work goes on when the terminal is closed."})
        ->add_flag("--atomic", *atomic, ATOMIC_HELP);
}

}  // namespace veldfwctl
