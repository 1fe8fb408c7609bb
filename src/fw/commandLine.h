// SPDX-License-Identifier: Apache-2.0
// Splits a command line into an argument vector of fixed size.
#ifndef VELDFIREWALL_SRC_COMMANDLINE_H
#define VELDFIREWALL_SRC_COMMANDLINE_H

#include <array>
#include <cstddef>
#include <string>

namespace FW {

/// The arguments of one command: no heap, so these sizes are the limits of a command.
struct CommandArguments {
    std::array<char, 1024> text = {};     ///< the arguments, one after another, each with its NUL
    std::array<char *, 256> vector = {};  ///< pointers into `text`, ended by a null pointer
    size_t count = 0;
};

enum class CommandSplit {
    OK,
    TOO_MANY,           ///< more than 255 arguments, or no room is left for a further one
    EMPTY_OR_TOO_LONG,  ///< no argument at all, or the last one was cut
};

/// Splits at every single space; there is no quoting, and other white space belongs to the arguments. Empty pieces are
/// skipped. `arguments` is to be used only after OK.
CommandSplit commandLineSplit(const std::string &commandLine, CommandArguments &arguments);

}  // namespace FW

#endif
