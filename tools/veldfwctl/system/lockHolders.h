// SPDX-License-Identifier: Apache-2.0
// Which processes hold locks on files.
#ifndef VELDFWCTL_LOCKHOLDERS_H
#define VELDFWCTL_LOCKHOLDERS_H

#include <string>
#include <vector>

namespace veldfwctl {

struct LockHolder {
    std::string path;
    int process = 0;
    std::string program;  ///< the name of the process
};

/// Looks at the open files of all processes, because /proc/locks names no process for locks of open file descriptions.
/// Locks of other users' processes are seen by root only.
/// @param directories the locked files lie in one of these ("/tmp/")
std::vector<LockHolder> lockHoldersFind(const std::vector<std::string> &directories);

}  // namespace veldfwctl

#endif
