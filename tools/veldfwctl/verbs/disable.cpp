// SPDX-License-Identifier: Apache-2.0
// "disable": switches the firewall off.
#include <veldfirewall/veldFW.h>

#include "frame/verb.h"
#include "system/apply.h"

namespace veldfwctl {

namespace {

int disable(const Context &context) {
    applicationApply(context, {"Switching the firewall off", "Cannot switch the firewall off", "",
                               [] { return FW::VELDFW().fwDisable(); }});
    context.print("The firewall is off; everything is let through.");
    if (context.json) {
        Json::Value json;
        json["enabled"] = false;
        context.printJson(json);
    }
    return STATUS_DONE;
}

}  // namespace

void registerDisable(CLI::App &app, Context &context) {
    verbAdd(app, context,
            {"disable", "Switch the firewall off and remove its rules from the kernel", "veldfwctl disable",
             [&context] { return disable(context); }});
}

}  // namespace veldfwctl
