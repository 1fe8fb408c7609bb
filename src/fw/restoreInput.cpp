// SPDX-License-Identifier: Apache-2.0
// A command list as input of iptables-restore.
#include "fw/restoreInput.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cstdlib>
#include <string_view>

#include "fw/commandLine.h"
#include "veldfirewall/fwRecords.h"

namespace FW {

namespace {

constexpr const char *FILTER_TABLE = "filter";

struct Append {
    size_t command;  ///< index in the commands given
    std::string table;
    std::vector<std::string> arguments;  ///< chain and what follows "-A"
};

/// Options with which iptables-restore means something else than iptables, or nothing at all: the table, which belongs
/// to the section; the family, for which it skips the line silently; the tables' lock and the module loader, which
/// belong to the program.
constexpr std::array<std::string_view, 6> FOREIGN_OPTIONS = {"table", "ipv4",          "ipv6",
                                                             "wait",  "wait-interval", "modprobe"};
constexpr std::string_view FOREIGN_LETTERS = "t46wWM";
constexpr std::string_view FLAG_LETTERS = "vnx";  // other letters may follow these in the same argument

bool isForeignOption(const std::string &argument) {
    if (argument.size() < 2 || argument[0] != '-') {
        return false;
    }
    if (argument[1] != '-') {
        const bool bundle = argument.size() > 2 && FLAG_LETTERS.find(argument[1]) != std::string_view::npos;
        return bundle || FOREIGN_LETTERS.find(argument[1]) != std::string_view::npos;
    }
    const std::string_view name = std::string_view(argument).substr(2, argument.find('=') - 2);
    // Any beginning of a long option stands for it.
    return !name.empty() && std::any_of(FOREIGN_OPTIONS.begin(), FOREIGN_OPTIONS.end(),
                                        [&](std::string_view option) { return option.substr(0, name.size()) == name; });
}

bool isTableName(const std::string &table) {
    return !table.empty() &&
           std::all_of(table.begin(), table.end(), [](unsigned char c) { return std::isalnum(c) != 0 || c == '_'; });
}

std::optional<std::string> appendRead(const std::string &commandLine, Append &append) {
    if (commandLine.find_first_of(std::string("\n\0", 2)) != std::string::npos) {
        return "a line break or NUL in it would end the line";
    }
    CommandArguments arguments;
    if (commandLineSplit(commandLine, arguments) != CommandSplit::OK) {
        return "it has no arguments, or more than a command can hold";
    }
    std::vector<std::string> words(arguments.vector.begin() + 1,
                                   arguments.vector.begin() + static_cast<long>(arguments.count));
    append.table = FILTER_TABLE;
    if (words.size() >= 2 && words[0] == "-t") {
        append.table = words[1];
        words.erase(words.begin(), words.begin() + 2);
        if (!isTableName(append.table)) {
            return "it names no table";
        }
    }
    if (words.size() < 2 || words[0] != "-A") {
        return "it does not append a rule";
    }
    append.arguments.assign(words.begin() + 1, words.end());
    const auto foreign = std::find_if(append.arguments.begin(), append.arguments.end(), isForeignOption);
    if (foreign != append.arguments.end()) {
        return "iptables-restore reads \"" + *foreign + "\" differently";
    }
    return std::nullopt;
}

std::string argumentsText(const std::vector<std::string> &arguments) {
    std::string text;
    for (const std::string &argument : arguments) {
        text += text.empty() ? "" : " ";
        text += restoreQuoted(argument);
    }
    return text;
}

void lineAppend(RestoreInput &input, const std::string &line, size_t command = RestoreInput::NO_COMMAND) {
    input.text += line + "\n";
    input.commandOfLine.push_back(command);
}

void sectionAppend(RestoreInput &input, const std::string &table, const std::vector<Append> &appends) {
    lineAppend(input, "*" + table);
    if (table == FILTER_TABLE) {
        for (const char *chain : FW_CHAINS) {
            lineAppend(input, std::string("-F ") + chain);
        }
    }
    for (const Append &append : appends) {
        if (append.table != table) {
            continue;
        }
        const std::string rule = argumentsText(append.arguments);
        lineAppend(input, "-A " + rule, append.command);
        if (table != FILTER_TABLE) {
            input.foreignRules.push_back(table + " " + rule);
        }
    }
    lineAppend(input, "COMMIT");
}

}  // namespace

std::optional<RestoreRefusal> restoreInputWrite(const std::vector<ListedCommand> &commands, RestoreInput &input) {
    std::vector<Append> appends;
    std::vector<std::string> tables = {FILTER_TABLE};
    for (size_t i = 0; i < commands.size(); ++i) {
        Append append;
        append.command = i;
        if (const std::optional<std::string> reason = appendRead(commands[i].commandLine, append)) {
            return RestoreRefusal{i, *reason};
        }
        if (std::find(tables.begin(), tables.end(), append.table) == tables.end()) {
            tables.push_back(append.table);
        }
        appends.push_back(std::move(append));
    }
    for (const std::string &table : tables) {
        sectionAppend(input, table, appends);
    }
    return std::nullopt;
}

std::string restoreQuoted(const std::string &argument) {
    const bool plain = !argument.empty() && std::all_of(argument.begin(), argument.end(), [](unsigned char c) {
        return std::isalnum(c) != 0 ||
               std::string_view("-_.,:/!+=@%").find(static_cast<char>(c)) != std::string_view::npos;
    });
    if (plain) {
        return argument;
    }
    std::string quoted = "\"";
    for (const char c : argument) {
        if (c == '"' || c == '\\') {
            quoted += '\\';
        }
        quoted += c;
    }
    return quoted + "\"";
}

size_t restoreFailedLine(const std::string &printed) {
    for (size_t at = printed.find("line"); at != std::string::npos; at = printed.find("line", at + 1)) {
        const size_t digits = printed.find_first_not_of(": ", at + 4);
        if (digits != std::string::npos && std::isdigit(static_cast<unsigned char>(printed[digits])) != 0) {
            return std::strtoul(printed.c_str() + digits, nullptr, 10);
        }
    }
    return 0;
}

std::string restoreInputOfSaved(const std::string &saved) {
    std::string text = std::string("*") + FILTER_TABLE + "\n";
    for (const char *chain : FW_CHAINS) {
        text += std::string("-F ") + chain + "\n";
    }
    bool inFilter = false;
    for (size_t begin = 0; begin < saved.size();) {
        const size_t end = std::min(saved.find('\n', begin), saved.size());
        const std::string line = saved.substr(begin, end - begin);
        begin = end + 1;
        if (line[0] == '*') {
            inFilter = line == std::string("*") + FILTER_TABLE;
        }
        // With counters: "[packets:bytes] -A CHAIN ..."
        const size_t rule = line[0] == '[' ? std::min(line.find(' '), line.size() - 1) + 1 : 0;
        for (const char *chain : FW_CHAINS) {
            const std::string start = std::string("-A ") + chain + " ";
            if (inFilter && line.compare(rule, start.size(), start) == 0) {
                text += line + "\n";
            }
        }
    }
    return text + "COMMIT\n";
}

std::string restoreInputOfRemoval(const RestoreInput &input) {
    std::string text;
    std::string openTable;
    for (auto rule = input.foreignRules.rbegin(); rule != input.foreignRules.rend(); ++rule) {
        const size_t blank = rule->find(' ');
        const std::string table = rule->substr(0, blank);
        if (table != openTable) {
            text += openTable.empty() ? "" : "COMMIT\n";
            text += "*" + table + "\n";
            openTable = table;
        }
        text += "-D" + rule->substr(blank) + "\n";
    }
    return openTable.empty() ? text : text + "COMMIT\n";
}

std::string restoreInputOfTrial(const RestoreInput &input, size_t lines) {
    std::string text = std::string("*") + FILTER_TABLE + "\n";
    for (const char *chain : FW_CHAINS) {
        text += std::string(":") + chain + " - [0:0]\n";
    }
    size_t begin = 0;
    for (size_t line = 0; line < lines && begin < input.text.size(); ++line) {
        const size_t end = input.text.find('\n', begin);
        if (input.commandOfLine[line] != RestoreInput::NO_COMMAND) {
            text += input.text.substr(begin, end + 1 - begin);
        }
        begin = end + 1;
    }
    return text + "COMMIT\n";
}

}  // namespace FW
