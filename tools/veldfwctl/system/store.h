// SPDX-License-Identifier: Apache-2.0
// Settings and profiles, read and written with messages that name them.
#ifndef VELDFWCTL_STORE_H
#define VELDFWCTL_STORE_H

#include <veldfirewall/veldFW.h>

#include <string>
#include <vector>

namespace veldfwctl {

struct Settings {
    bool enabled = false;
    std::string profile;  ///< the active one
};

/// @throws Failure
Settings settingsRead();

/// Names of all profiles but trial copies. @throws Failure
std::vector<std::string> profileNames();

/// Whether a name is that of a trial copy.
bool isTrialCopy(const std::string &profile);

/// @throws UsageError when there is none of that name, Failure when it cannot be read
FW::FWPROFILE profileRead(const std::string &name);

/// The profile that an option names, or the active one when it names none.
/// @throws UsageError as profileRead() does, Failure also when the active one is missing
FW::FWPROFILE profileChosen(const std::string &named);

/// Replaces the stored profile of the same name. @throws Failure
void profileWrite(const FW::FWPROFILE &profile);

/// @throws UsageError unless the text can name a profile: not empty, no control characters, no trial copy's name
void profileNameCheck(const std::string &name);

/// Names of the adapters that rules can be bound to. @throws Failure
std::set<std::string> adapterNames();

}  // namespace veldfwctl

#endif
