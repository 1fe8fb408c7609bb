// SPDX-License-Identifier: Apache-2.0
// Checks and compares backups of the whole configuration.
#ifndef VELDFWCTL_BACKUPDOCUMENT_H
#define VELDFWCTL_BACKUPDOCUMENT_H

#include <json/value.h>

#include <string>
#include <vector>

namespace veldfwctl {

/// What makes a document unfit to be imported, a line each that names the member; empty when it is fit. Checked are its
/// version, that members of "config_profiles" are plain file names that a profile can have, that every profile decodes
/// and is found again under its name, and that the settings name one of them.
std::vector<std::string> backupProblems(const Json::Value &document);

/// What an import of `next` over `current` does.
struct BackupChanges {
    std::vector<std::string> added;  ///< names of profiles
    std::vector<std::string> removed;
    std::vector<std::string> changed;
    std::vector<std::string> unchanged;
    std::vector<std::string> settings;  ///< "profile: default -> office"
    bool isEmpty() const { return added.empty() && removed.empty() && changed.empty() && settings.empty(); }
};

/// @param current,next documents without problems
BackupChanges backupCompare(const Json::Value &current, const Json::Value &next);

}  // namespace veldfwctl

#endif
