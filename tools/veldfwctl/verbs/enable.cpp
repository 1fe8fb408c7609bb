// SPDX-License-Identifier: Apache-2.0
// "enable": switches the firewall on.
#include <veldfirewall/veldFW.h>

#include <memory>

#include "frame/verb.h"
#include "system/apply.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

int enable(const Context &context, bool atomic) {
    const std::string profile = profileChosen("").name;  // a missing profile is told before anything is switched
    const auto heldUp =
        applicationApply(context, {"Switching the firewall on",
                                   "Cannot switch the firewall on with profile \"" + profile + "\"", profile,
                                   [atomic] {
                                       FW::FwApplyFailure failure;  // is in the log, too
                                       return atomic ? enableAtomic(failure) : FW::VELDFW().fwEnable();
                                   },
                                   atomic});
    context.print("The firewall is on, with profile \"" + profile + "\".");
    if (context.json) {
        Json::Value json;
        json["enabled"] = true;
        json["profile"] = profile;
        json["applied"] = true;
        json["heldUpMilliseconds"] = static_cast<Json::Int64>(heldUp.count());
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerEnable(CLI::App &app, Context &context) {
    const auto atomic = std::make_shared<bool>(false);
    verbAdd(app, context,
            {"enable", "Switch the firewall on and apply the active profile", "veldfwctl enable",
             [&context, atomic] { return enable(context, *atomic); }, false,
             "A profile that cannot be applied leaves the firewall off. The work goes on when the terminal is closed."})
        ->add_flag("--atomic", *atomic, ATOMIC_HELP);
}

}  // namespace veldfwctl
