// SPDX-License-Identifier: Apache-2.0
// A command list as input of iptables-restore: written, refused, and found again by line number. Plain functions.
#ifndef VELDFIREWALL_SRC_RESTOREINPUT_H
#define VELDFIREWALL_SRC_RESTOREINPUT_H

#include <optional>
#include <string>
#include <vector>

#include "fw/commandList.h"

namespace FW {

/// One family's commands as one input of iptables-restore --noflush.
struct RestoreInput {
    std::string text;
    std::vector<size_t> commandOfLine;      ///< line number - 1 to index of the command; npos for a line of our own
    std::vector<std::string> foreignRules;  ///< appends to tables other than "filter", as "TABLE CHAIN arguments" lines

    static constexpr size_t NO_COMMAND = static_cast<size_t>(-1);
};

/// Why a command cannot be part of the input, and which.
struct RestoreRefusal {
    size_t command = 0;  ///< index in the commands given
    std::string reason;
};

/// Writes the input that flushes both firewall chains and appends the rules of `commands` (all of one family) in order,
/// the table "filter" first, other tables in sections of their own in the order of their first rule.
/// A command is refused when iptables-restore would read it differently from iptables: anything but an append, a line
/// break, a second table, an option that only one of the two knows, or more than one command can hold.
/// @return nothing when all went in
std::optional<RestoreRefusal> restoreInputWrite(const std::vector<ListedCommand> &commands, RestoreInput &input);

/// One argument as iptables-restore reads it back: in quotes where it has to be.
std::string restoreQuoted(const std::string &argument);

/// The line number that iptables-restore names in what it prints, or 0.
size_t restoreFailedLine(const std::string &printed);

/// From the output of iptables-save: the input that puts both firewall chains back as they were then.
std::string restoreInputOfSaved(const std::string &saved);

/// The input that takes the rules of `input` out of the tables other than "filter" again, last first; empty without
/// any.
std::string restoreInputOfRemoval(const RestoreInput &input);

/// The first `lines` lines of the "filter" section as an input for tables in which the firewall chains do not exist.
std::string restoreInputOfTrial(const RestoreInput &input, size_t lines);

}  // namespace FW

#endif
