// SPDX-License-Identifier: Apache-2.0
// The process that ends a trial.
#ifndef VELDFWCTL_TRIALWATCH_H
#define VELDFWCTL_TRIALWATCH_H

#include <chrono>
#include <string>

namespace veldfwctl {

struct TrialRequest {
    std::string profile;
    std::string client;  ///< see trialApply()
    int seconds = 0;     ///< from the moment when the rules are in force
    bool atomic = false;
};

/// Starts a trial: prepares the way back, starts the watch, which applies the trial copy once it listens, and waits for
/// its word. The watch belongs to no terminal and no session, and needs nothing from the process that started it.
/// @return for how long new traffic was held up, at most
/// @throws UsageError, Failure; what was before is in force then
std::chrono::milliseconds trialStart(const TrialRequest &request);

/// Asks the watch to keep the profile or to take it back, and waits until that is done. A trial whose watch was killed
/// can only be taken back, which is done right here.
/// @return what was done. @throws Failure also when there is no trial
std::string trialEnd(bool keep);

}  // namespace veldfwctl

#endif
