// SPDX-License-Identifier: Apache-2.0
// Puts the active profile into the kernel, with progress on a terminal and a full account of a failure.
#ifndef VELDFWCTL_APPLY_H
#define VELDFWCTL_APPLY_H

#include <veldfirewall/fwRecords.h>

#include <functional>
#include <string>

#include "frame/context.h"

namespace veldfwctl {

/// One operation of the library that runs commands.
struct Application {
    std::string doing;              ///< "Applying profile \"office\""
    std::string failure;            ///< "Cannot apply profile \"office\""
    std::string profile;            ///< whose rules are put into the kernel; empty for none
    std::function<bool()> operate;  ///< runs in a process of its own
};

/// Runs the operation in a process that nothing on the terminal can stop half-way.
/// @throws Failure that names profile, adapter, rule, the whole command, what iptables said and whether the firewall is
///         on now; with --json an object with these is printed before
void applicationApply(const Context &context, const Application &application);

/// Switches the firewall on as VELDFW::fwEnable() does, but applies the active profile as a whole. After a failure the
/// switch is as it was. To be run as Application::operate.
bool enableAtomic(FW::FwApplyFailure &failure);

/// Applies the active profile again, if the firewall is on. @return whether it is on
bool reloadRun(const Context &context);

/// After a change of `profile`: applies it when that was asked for, or says that it is not in force yet.
/// @return whether it was applied
bool changeApply(const Context &context, const std::string &profile, bool apply);

}  // namespace veldfwctl

#endif
