// SPDX-License-Identifier: Apache-2.0
// What is known of a trial: written when it begins, read by whoever asks.
#ifndef VELDFWCTL_TRIALRECORD_H
#define VELDFWCTL_TRIALRECORD_H

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

namespace veldfwctl {

enum class TrialPhase {
    APPLYING,    ///< the rules are being put into the kernel
    ON_TRIAL,    ///< they are in force
    KEPT,        ///< ended: the profile is the active one now
    TAKEN_BACK,  ///< ended: what was before is back
    FAILED,      ///< ended: what was before could not be put back
};

struct TrialRecord {
    std::string profile;   ///< which is tried
    std::string previous;  ///< the active profile
    bool wasEnabled = false;
    bool atomic = false;  ///< applied as a whole
    TrialPhase phase = TrialPhase::APPLYING;
    int watch = 0;      ///< process that ends the trial
    int64_t until = 0;  ///< end of the trial, seconds since 1970; 0 while the rules are being applied
    std::string text;   ///< how it ended
};

/// Every record takes the same room, so that one can be written over another on a full disk.
inline constexpr size_t TRIAL_RECORD_SIZE = 4096;

/// A record of exactly TRIAL_RECORD_SIZE bytes; long texts are cut.
std::string trialRecordText(const TrialRecord &record);
/// @return nothing when the text is no record
std::optional<TrialRecord> trialRecordParse(const std::string &text);
/// "on trial", "kept", ...
const char *trialPhaseText(TrialPhase phase);
/// Whether a watch has something left to do.
bool isOpen(TrialPhase phase);

}  // namespace veldfwctl

#endif
