// SPDX-License-Identifier: Apache-2.0
// Puts the active profile into the kernel, with progress on a terminal and a full account of a failure.
#ifndef VELDFWCTL_APPLY_H
#define VELDFWCTL_APPLY_H

#include <veldfirewall/fwRecords.h>

#include <chrono>
#include <functional>
#include <string>

#include "frame/context.h"

namespace veldfwctl {

inline constexpr const char *ATOMIC_HELP = "Replace the rules as a whole, without a moment that drops new traffic";

/// One operation of the library that runs commands.
struct Application {
    std::string doing;              ///< "Applying profile \"office\""
    std::string failure;            ///< "Cannot apply profile \"office\""
    std::string profile;            ///< whose rules are put into the kernel; empty for none
    std::function<bool()> operate;  ///< runs in a process of its own
    bool atomic = false;            ///< replaces the rules as a whole, so that no traffic waits
};

/// Runs the operation in a process that nothing on the terminal can stop half-way, and prints how long new traffic was
/// held up.
/// @return for how long, at most: 0 when the rules were replaced as a whole
/// @throws Failure that names profile, adapter, rule, the whole command, what iptables said and whether the firewall is
///         on now; with --json an object with these is printed before
std::chrono::milliseconds applicationApply(const Context &context, const Application &application);

/// Switches the firewall on as VELDFW::fwEnable() does, but applies the active profile as a whole. After a failure the
/// switch is as it was. To be run as Application::operate.
bool enableAtomic(FW::FwApplyFailure &failure);

/// Applies the active profile again, if the firewall is on. @return whether it is on
/// @param heldUp is set to what applicationApply() gives; may be null
bool reloadRun(const Context &context, bool atomic = false, std::chrono::milliseconds *heldUp = nullptr);

/// "New traffic was held up for at most 0.4 s."
std::string heldUpText(std::chrono::milliseconds time);

/// After a change of `profile`: applies it when that was asked for, or says that it is not in force yet.
/// @return whether it was applied
bool changeApply(const Context &context, const std::string &profile, bool apply);

}  // namespace veldfwctl

#endif
