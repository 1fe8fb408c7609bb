// SPDX-License-Identifier: Apache-2.0
// A command list as the commands that it stands for, in the order in which they are run.
#include "fw/commandList.h"

#include "veldfirewall/fwRecords.h"

namespace FW {

namespace {

void groupAppend(const char *family, const char *program, const std::string &group, const Json::Value &arguments,
                 std::vector<ListedCommand> &commands) {
    unsigned index = 0;
    for (const Json::Value &text : arguments) {
        commands.push_back({family, group, index++, std::string(program) + " " + text.asString()});
    }
}

}  // namespace

std::vector<ListedCommand> commandsInOrder(const Json::Value &commandList) {
    std::vector<ListedCommand> commands;
    for (const auto &[family, program] :
         {std::pair(FAMILY_V4, IPTABLES_PROGRAM), std::pair(FAMILY_V6, IP6TABLES_PROGRAM)}) {
        if (!commandList.isMember(family)) {
            continue;
        }
        const Json::Value &section = commandList[family];
        if (section.isMember(FW_ADAPTER_GLOBAL)) {
            groupAppend(family, program, FW_ADAPTER_GLOBAL, section[FW_ADAPTER_GLOBAL], commands);
        }
        for (auto group = section.begin(); group != section.end(); ++group) {
            if (group.name() != FW_ADAPTER_GLOBAL) {
                groupAppend(family, program, group.name(), *group, commands);
            }
        }
    }
    return commands;
}

}  // namespace FW
