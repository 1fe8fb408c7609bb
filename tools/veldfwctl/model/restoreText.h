// SPDX-License-Identifier: Apache-2.0
// Commands as input of iptables-restore.
#ifndef VELDFWCTL_RESTORETEXT_H
#define VELDFWCTL_RESTORETEXT_H

#include <string>
#include <vector>

namespace veldfwctl {

/// A command in pieces, as the library splits it: at blanks, without quoting.
struct CommandWords {
    std::string program;
    std::string table = "filter";
    std::string chain;              ///< empty unless the command appends a rule
    std::vector<std::string> rest;  ///< what follows the chain
};

/// @param command program and arguments
CommandWords commandWordsSplit(const std::string &command);

/// Input for iptables-restore --noflush that makes the firewall's chains, or empties them, and appends the rules; a
/// section per table, "filter" first.
/// @param commands of one family, program and arguments
/// @throws Failure that names the command which cannot be said in such input
std::string restoreTextWrite(const std::vector<std::string> &commands);

}  // namespace veldfwctl

#endif
