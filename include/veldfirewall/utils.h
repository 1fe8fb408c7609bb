// SPDX-License-Identifier: Apache-2.0
// JSON files that several processes and threads read and replace safely.
#ifndef VELDFIREWALL_UTILS_H
#define VELDFIREWALL_UTILS_H

#include <json/value.h>

#include <string>

#include "veldfirewall/export.h"

namespace FW {

/// The lock file that guards the data file `path`: "/var/lock/firewall/" + base name + ".lock", or the same name in
/// "/tmp/" when that directory cannot be made. Data files of one base name share a lock file.
/// Side effects: creates the lock directory (mode 0770) and the empty lock file when missing.
/// In "/tmp/" a lock file that another user planted is replaced when it is locked.
/// Never fails: a lock file that cannot be created makes the later locking fail.
/// @param path data file; only its first 1023 bytes are looked at
VELDFIREWALL_API std::string getLockFile(const std::string &path);

/// Reads and parses the JSON document at `path` under its lock, waiting up to 30 s for the lock.
/// @param value receives the document; its content after a failure is unspecified
/// @return false, logged, when the file is missing, no regular file, unreadable, no JSON (nesting beyond the parser's
///         limit counts so) or the lock is not free in time
/// @throws boost::interprocess::interprocess_exception when the lock file cannot be opened or locked
VELDFIREWALL_API bool jsonFileLoad(Json::Value &value, const std::string &path);

/// Replaces the document at `path`, under its lock (waiting up to 30 s): writes `path` + ".tmp", syncs it, renames it
/// over `path` and syncs the directory. After a failure, or the death of the process at any instant, the old document
/// is whole; after success the new one survives a power loss. The permissions of a replaced file are kept.
/// @return false, logged, when the lock is not free in time or a step of the write fails
/// @throws boost::interprocess::interprocess_exception when the lock file cannot be opened or locked
VELDFIREWALL_API bool jsonFileDump(const Json::Value &value, const std::string &path);

}  // namespace FW

#endif
