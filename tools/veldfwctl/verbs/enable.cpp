// SPDX-License-Identifier: Apache-2.0
// "enable": switches the firewall on.
#include <veldfirewall/veldFW.h>

#include "frame/verb.h"
#include "system/apply.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

int enable(const Context &context) {
    const std::string profile = profileChosen("").name;  // a missing profile is told before anything is switched
    applicationApply(context,
                     {"Switching the firewall on", "Cannot switch the firewall on with profile \"" + profile + "\"",
                      profile, [] { return FW::VELDFW().fwEnable(); }});
    context.print("The firewall is on, with profile \"" + profile + "\".");
    if (context.json) {
        Json::Value json;
        json["enabled"] = true;
        json["profile"] = profile;
        json["applied"] = true;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerEnable(CLI::App &app, Context &context) {
    verbAdd(
        app, context,
        {"enable", "Switch the firewall on and apply the active profile", "veldfwctl enable",
         [&context] { return enable(context); }, false,
         "A profile that cannot be applied leaves the firewall off. The work goes on when the terminal is closed."});
}

}  // namespace veldfwctl
