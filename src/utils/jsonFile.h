// SPDX-License-Identifier: Apache-2.0
// What the library itself needs of JSON files beyond the public functions in veldfirewall/utils.h.
#ifndef VELDFIREWALL_SRC_JSONFILE_H
#define VELDFIREWALL_SRC_JSONFILE_H

#include <json/value.h>

#include <string>

namespace FW {

enum class JsonFileCreated { YES, EXISTS, FAILED };

/// As jsonFileDump(), but never replaces a file: EXISTS, not logged, when there is one at `path`.
JsonFileCreated jsonFileCreate(const Json::Value &value, const std::string &path);

/// Unlinks the data file and then its lock file, while holding that lock, so that nobody is inside at that moment.
/// Errors are ignored; a lock that is not free in time, or cannot be opened, is left in place.
void jsonFileRemove(const std::string &path);

}  // namespace FW

#endif
