// SPDX-License-Identifier: Apache-2.0
// Files that only their owner may read.
#ifndef VELDFWCTL_NEWFILE_H
#define VELDFWCTL_NEWFILE_H

#include <string>

namespace veldfwctl {

/// Replaces a file as a whole, with mode 0600: on failure the old one stays. @throws Failure
void fileReplace(const std::string &path, const std::string &text);

/// Writes what must not be lost to a new file in /var/tmp or /tmp. @return its path, or empty when that failed
std::string rescueFileWrite(const std::string &text);

}  // namespace veldfwctl

#endif
