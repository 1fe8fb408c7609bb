// SPDX-License-Identifier: Apache-2.0
// A command list as the commands that it stands for, in the order in which they are run.
#ifndef VELDFIREWALL_SRC_COMMANDLIST_H
#define VELDFIREWALL_SRC_COMMANDLIST_H

#include <json/value.h>

#include <string>
#include <vector>

namespace FW {

constexpr const char *FAMILY_V4 = "v4";
constexpr const char *FAMILY_V6 = "v6";
constexpr const char *IPTABLES_PROGRAM = "/sbin/iptables";
constexpr const char *IP6TABLES_PROGRAM = "/sbin/ip6tables";

struct ListedCommand {
    const char *family;       ///< "v4" or "v6"
    std::string group;        ///< member of the family's object
    unsigned index;           ///< position in the group's array
    std::string commandLine;  ///< program and arguments
};

/// All of "v4", then all of "v6"; in each the group "global" first, then the others in byte order.
/// @throws Json::LogicError when a member is of a type that cannot be walked
std::vector<ListedCommand> commandsInOrder(const Json::Value &commandList);

}  // namespace FW

#endif
