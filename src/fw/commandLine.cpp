// SPDX-License-Identifier: Apache-2.0
// Splits a command line into an argument vector of fixed size.
#include "fw/commandLine.h"

#include <algorithm>
#include <string_view>

namespace FW {

CommandSplit commandLineSplit(const std::string &commandLine, CommandArguments &arguments) {
    const size_t countLimit = arguments.vector.size() - 2;
    const size_t usedLimit = arguments.text.size() - 2;
    size_t used = 0;
    size_t begin = 0;
    while (begin < commandLine.size()) {
        size_t end = commandLine.find(' ', begin);
        if (end == std::string::npos) {
            end = commandLine.size();
        }
        const std::string_view piece = std::string_view(commandLine).substr(begin, end - begin);
        begin = end + 1;
        if (piece.empty()) {
            continue;
        }
        if (arguments.count > countLimit || used > usedLimit) {
            return CommandSplit::TOO_MANY;
        }
        char *const argument = arguments.text.data() + used;
        const size_t room = arguments.text.size() - used - 1;
        argument[piece.copy(argument, std::min(piece.size(), room))] = '\0';
        arguments.vector[arguments.count++] = argument;
        used += piece.size() + 1;
    }
    arguments.vector[arguments.count] = nullptr;
    // A piece that was cut has pushed the mark past the end: it cannot have been followed by another.
    return used == 0 || used > arguments.text.size() ? CommandSplit::EMPTY_OR_TOO_LONG : CommandSplit::OK;
}

}  // namespace FW
