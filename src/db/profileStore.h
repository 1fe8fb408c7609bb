// SPDX-License-Identifier: Apache-2.0
// The profile directory as edits of all profiles need it: read in one scan, written back file by file.
#ifndef VELDFIREWALL_SRC_PROFILESTORE_H
#define VELDFIREWALL_SRC_PROFILESTORE_H

#include <map>
#include <string>

#include "veldfirewall/fwRecords.h"

namespace FW {

struct StoredProfile {
    std::string path;  ///< file that holds the profile
    FWPROFILE profile;
};

/// All profiles by name, with the files they lie in. @return false, logged, when the directory cannot be scanned
bool storedProfilesLoad(std::map<std::string, StoredProfile> &profiles);
/// Writes the profile back to its file, as VELDFW_JSON_DB::profileSet() would. The rules are used up.
bool storedProfileSave(StoredProfile &&stored);

}  // namespace FW

#endif
