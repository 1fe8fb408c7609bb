// SPDX-License-Identifier: Apache-2.0
// Files that are written as a whole.
#ifndef VELDFWCTL_NEWFILE_H
#define VELDFWCTL_NEWFILE_H

#include <sys/types.h>

#include <string>

namespace veldfwctl {

/// Replaces a regular file as a whole: on failure the old one stays. Only the owner may read it, unless told otherwise.
/// @param remedy what to do when it cannot be written
/// @throws Failure
void fileReplace(const std::string &path, const std::string &text, mode_t mode = 0600,
                 const std::string &remedy = "name a file in a directory that can be written");

/// Writes what must not be lost to a new file in /var/tmp or /tmp. @return its path, or empty when that failed
std::string rescueFileWrite(const std::string &text);

}  // namespace veldfwctl

#endif
