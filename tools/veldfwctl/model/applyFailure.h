// SPDX-License-Identifier: Apache-2.0
// Finds in the library's messages which command failed and what it said.
#ifndef VELDFWCTL_APPLYFAILURE_H
#define VELDFWCTL_APPLYFAILURE_H

#include <string>
#include <vector>

namespace veldfwctl {

/// The command that made an operation fail.
struct FailedCommand {
    std::string command;            ///< program and arguments; empty when no command failed
    std::string said;               ///< what the program said, and how it ended
    std::vector<std::string> rest;  ///< the messages that concern other things
};

/// @param messages as they were logged, without "source:line "
FailedCommand failedCommandFind(const std::vector<std::string> &messages);

}  // namespace veldfwctl

#endif
