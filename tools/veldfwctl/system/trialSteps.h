// SPDX-License-Identifier: Apache-2.0
// The steps of a trial in the kernel and the store. All of them can be repeated.
#ifndef VELDFWCTL_TRIALSTEPS_H
#define VELDFWCTL_TRIALSTEPS_H

#include <json/value.h>

#include "frame/libraryCall.h"
#include "model/trialRecord.h"

namespace veldfwctl {

/// What the way back needs, kept in memory.
struct TrialReturn {
    std::string previous;     ///< the active profile
    bool wasEnabled = false;  ///< before the trial
    Json::Value commands;     ///< what puts the active profile into the kernel; null when it was off
};

/// Stores the trial copy and prepares the way back. @throws UsageError, Failure; nothing is in force then
TrialReturn trialPrepare(const std::string &profile);

/// Removes the trial copy. @return what the library logged, and whether it went well
CallResult trialForget(const TrialRecord &record);

/// Puts the trial copy into the kernel, in a process of its own.
/// @param client address whose established connections the profile's own rules must let through; may be empty
CallResult trialApply(const TrialRecord &record, const std::string &client);

/// Puts back what was before and removes the trial copy. Needs no room on any disk. Tries several times.
/// @param applied whether the trial's rules were applied without failure
CallResult trialTakeBack(const TrialRecord &record, const TrialReturn &before, bool applied);

/// The first half of keeping: makes the tried profile the active one in the store.
CallResult trialAdopt(const TrialRecord &record);
/// The second half: puts it into the kernel for good, and switches the firewall on if it was off.
CallResult trialEnforce(const TrialRecord &record);

}  // namespace veldfwctl

#endif
