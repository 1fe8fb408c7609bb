// SPDX-License-Identifier: Apache-2.0
// "status": the switch, the active profile and what is in the kernel.
#include <veldfirewall/veldFW.h>

#include "frame/libraryCall.h"
#include "frame/verb.h"

namespace veldfwctl {

namespace {

int status(const Context &context) {
    bool enabled = false;
    std::string profile;
    require("Cannot read the settings", "run \"veldfwctl doctor\"",
            [&] { return FW::VELDFW().fwStatus(enabled) && FW::VELDFW().fwProfileConfigGet(profile); });
    context.print(std::string("Firewall: ") + (enabled ? "on" : "off"));
    context.print("Active profile: " + profile);
    return STATUS_DONE;
}

}  // namespace

void registerStatus(CLI::App &app, Context &context) {
    verbAdd(app, context,
            {"status", "Show whether the firewall is on, its profile and its rules", "veldfwctl status",
             [&context] { return status(context); }});
}

}  // namespace veldfwctl
