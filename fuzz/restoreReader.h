// SPDX-License-Identifier: Apache-2.0
// Reads a line as iptables-restore does: the counterpart against which what is written for it is checked.
#ifndef VELD_FUZZ_RESTORE_READER_H
#define VELD_FUZZ_RESTORE_READER_H

#include <string>
#include <vector>

namespace veldtest {

/// The arguments of a line. White space separates; double quotes hold it together, and in them a backslash stands
/// before a character that is meant literally; a closing quote ends the argument.
inline std::vector<std::string> restoreArguments(const std::string &line) {
    std::vector<std::string> arguments;
    std::string argument;
    bool quoted = false;
    for (size_t i = 0; i < line.size(); ++i) {
        const char c = line[i];
        if (quoted && c == '\\' && i + 1 < line.size()) {
            argument += line[++i];
        } else if (quoted && c != '"') {
            argument += c;
        } else if (!quoted && c == '"') {
            quoted = true;
        } else if (quoted || ((c == ' ' || c == '\t' || c == '\n') && !argument.empty())) {
            arguments.push_back(argument);
            argument.clear();
            quoted = false;
        } else if (c != ' ' && c != '\t' && c != '\n') {
            argument += c;
        }
    }
    if (!argument.empty())
        arguments.push_back(argument);
    return arguments;
}

}  // namespace veldtest

#endif
