// SPDX-License-Identifier: Apache-2.0
// A command list as input of iptables-restore: written, refused, and found again by line number. Plain functions.
#ifndef VELDFIREWALL_SRC_RESTOREINPUT_H
#define VELDFIREWALL_SRC_RESTOREINPUT_H

#include <optional>
#include <string>
#include <vector>

#include "fw/commandList.h"

namespace FW {

/// The table of the firewall chains.
inline constexpr const char *FILTER_TABLE = "filter";

/// One family's commands as one input of iptables-restore --noflush.
struct RestoreInput {
    /// A rule that is not in the firewall chains: it is appended, and nothing is flushed for it.
    struct ForeignRule {
        std::string table;
        std::string chain;
        std::string line;  ///< chain and arguments, as they stand behind "-A "
    };

    std::string text;
    std::vector<size_t> commandOfLine;  ///< line number - 1 to index of the command; NO_COMMAND: a line of our own
    std::vector<std::string> tables;    ///< "filter", then the others in the order of their first rule
    std::vector<ForeignRule> foreignRules;

    static constexpr size_t NO_COMMAND = static_cast<size_t>(-1);

    /// The text of a line, counted from 1.
    std::string line(size_t number) const;
};

/// Why a command cannot be part of the input, and which.
struct RestoreRefusal {
    size_t command = 0;  ///< index in the commands given
    std::string reason;
};

/// Writes the input that flushes both firewall chains and appends the rules of `commands` (all of one family) in order,
/// each table in a section of its own.
/// A command is refused when iptables-restore would read it differently from iptables: anything but an append, a line
/// break, a second table, an option that only one of the two knows or that ends the program, or more than one command
/// can hold.
/// @return nothing when all went in
std::optional<RestoreRefusal> restoreInputWrite(const std::vector<ListedCommand> &commands, RestoreInput &input);

/// One argument as iptables-restore reads it back: in quotes where it has to be.
std::string restoreQuoted(const std::string &argument);

/// The line number that iptables-restore names in what it prints, or 0. Numbers in the arguments that it repeats are
/// not taken for it.
size_t restoreFailedLine(const std::string &printed);

// `saved` is what iptables-save --counters prints of all tables of an input.

/// Whether a rule of the firewall chains holds a line break: no input can put it back.
bool savedRulesHoldLineBreak(const std::string &saved);

/// The input, with counters, that undoes `input`: it puts the firewall chains back as `before` has them, and takes the
/// other rules out again. Empty when `now` shows nothing to undo.
std::string restoreInputOfUndo(const RestoreInput &input, const std::string &before, const std::string &now);

/// The first `lines` lines of `input` for a network namespace without rules: behind those of `saved`.
std::string restoreInputOfTrial(const RestoreInput &input, const std::string &saved, size_t lines);

}  // namespace FW

#endif
