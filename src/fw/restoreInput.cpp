// SPDX-License-Identifier: Apache-2.0
// A command list as input of iptables-restore.
#include "fw/restoreInput.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <cstdlib>
#include <map>
#include <string_view>

#include "fw/commandLine.h"
#include "veldfirewall/fwRecords.h"

namespace FW {

namespace {

struct Append {
    size_t command;  ///< index in the commands given
    std::string table;
    std::string chain;
    std::string rule;  ///< chain and what follows, as they stand behind "-A "
};

/// Options with which iptables-restore means something else than iptables, or nothing at all: the table, which belongs
/// to the section; the family, for which it skips the line silently; the tables' lock and the module loader, which
/// belong to the program; and those that end it, successfully, with nothing committed.
constexpr std::array<std::string_view, 8> FOREIGN_OPTIONS = {"table",         "ipv4",     "ipv6", "wait",
                                                             "wait-interval", "modprobe", "help", "version"};
constexpr std::string_view FOREIGN_LETTERS = "t46wWMhV";
constexpr std::string_view FLAG_LETTERS = "fbvnx";  // other letters may follow these in the same argument

bool isForeignOption(std::string_view argument) {
    if (argument.size() < 2 || argument[0] != '-') {
        return false;
    }
    if (argument[1] != '-') {
        const bool bundle = argument.size() > 2 && FLAG_LETTERS.find(argument[1]) != std::string_view::npos;
        return bundle || FOREIGN_LETTERS.find(argument[1]) != std::string_view::npos;
    }
    const std::string_view name = argument.substr(2, argument.find('=') - 2);
    // Any beginning of a long option stands for it.
    return !name.empty() && std::any_of(FOREIGN_OPTIONS.begin(), FOREIGN_OPTIONS.end(),
                                        [&](std::string_view option) { return option.substr(0, name.size()) == name; });
}

/// Characters that iptables-restore reads as they are, wherever they stand.
constexpr std::array<bool, 256> plainCharacters() {
    std::array<bool, 256> plain = {};
    for (const char c : std::string_view("ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789-_.,:/!+=@%")) {
        plain[static_cast<unsigned char>(c)] = true;
    }
    return plain;
}

void quotedAppend(std::string &text, std::string_view argument) {
    static constexpr std::array<bool, 256> PLAIN = plainCharacters();
    if (!argument.empty() && std::all_of(argument.begin(), argument.end(), [](unsigned char c) { return PLAIN[c]; })) {
        text += argument;
        return;
    }
    text += '"';
    for (const char c : argument) {
        if (c == '"' || c == '\\') {
            text += '\\';
        }
        text += c;
    }
    text += '"';
}

bool isTableName(std::string_view table) {
    return !table.empty() &&
           std::all_of(table.begin(), table.end(), [](unsigned char c) { return std::isalnum(c) != 0 || c == '_'; });
}

std::optional<std::string> appendRead(const std::string &commandLine, Append &append) {
    if (commandLine.find('\n') != std::string::npos || commandLine.find('\0') != std::string::npos) {
        return "a line break or NUL in it would end the line";
    }
    CommandArguments arguments;
    if (commandLineSplit(commandLine, arguments) != CommandSplit::OK) {
        return "it has no arguments, or more than a command can hold";
    }
    std::vector<std::string_view> words(arguments.vector.begin() + 1,
                                        arguments.vector.begin() + static_cast<long>(arguments.count));
    append.table = FILTER_TABLE;
    if (words.size() >= 2 && words[0] == "-t") {
        if (!isTableName(words[1])) {
            return "it names no table";
        }
        append.table = words[1];
        words.erase(words.begin(), words.begin() + 2);
    }
    if (words.size() < 2 || words[0] != "-A") {
        return "it does not append a rule";
    }
    append.chain = words[1];
    for (auto word = words.begin() + 1; word != words.end(); ++word) {
        if (isForeignOption(*word)) {
            return "iptables-restore reads \"" + std::string(*word) + "\" differently";
        }
        append.rule += append.rule.empty() ? "" : " ";
        quotedAppend(append.rule, *word);
    }
    return std::nullopt;
}

void lineAppend(RestoreInput &input, const std::string &line, size_t command = RestoreInput::NO_COMMAND) {
    input.text += line + "\n";
    input.commandOfLine.push_back(command);
}

bool isFirewallChain(const std::string &table, const std::string &chain) {
    return table == FILTER_TABLE && std::find(FW_CHAINS.begin(), FW_CHAINS.end(), chain) != FW_CHAINS.end();
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
        lineAppend(input, "-A " + append.rule, append.command);
        if (!isFirewallChain(table, append.chain)) {
            input.foreignRules.push_back({table, append.chain, append.rule});
        }
    }
    lineAppend(input, "COMMIT");
}

/// The lines of what iptables-save prints; a line break in quotes belongs to the line.
std::vector<std::string> savedLines(const std::string &saved) {
    std::vector<std::string> lines;
    bool quoted = false;
    size_t begin = 0;
    for (size_t i = 0; i < saved.size(); ++i) {
        if (saved[i] == '"') {
            quoted = !quoted;
        } else if (saved[i] == '\\' && quoted) {
            ++i;
        } else if (saved[i] == '\n' && !quoted) {
            lines.push_back(saved.substr(begin, i - begin));
            begin = i + 1;
        }
    }
    lines.push_back(saved.substr(begin));
    return lines;
}

/// Tables and chains as iptables-save prints them.
struct SavedTables {
    std::vector<std::string> lines;

    explicit SavedTables(const std::string &saved) : lines(savedLines(saved)) {}

    /// The rules of a chain, without the counters where `withCounters` is false.
    std::vector<std::string> rules(const std::string &table, const std::string &chain, bool withCounters) const {
        std::vector<std::string> found;
        const std::string start = "-A " + chain + " ";
        ofTable(table, [&](const std::string &line) {
            // With counters: "[packets:bytes] -A CHAIN ..."
            const size_t rule = !line.empty() && line[0] == '[' ? line.find(' ') + 1 : 0;
            if ((line + " ").compare(rule, start.size(), start) == 0) {
                found.push_back(line.substr(withCounters ? 0 : rule));
            }
        });
        return found;
    }

private:
    template <typename Use> void ofTable(const std::string &table, const Use &use) const {
        bool inTable = false;
        for (const std::string &line : lines) {
            if (!line.empty() && line[0] == '*') {
                inTable = line == "*" + table;
            } else if (inTable) {
                use(line);
            }
        }
    }
};

/// The lines that take the rules of one foreign chain out again.
std::string foreignUndo(const std::vector<std::string> &ours, const std::string &chain,
                        const std::vector<std::string> &before, const std::vector<std::string> &now) {
    std::string text;
    if (now.size() == before.size()) {
        return text;
    }
    // "-D rule" takes the first of equal rules, which may have stood elsewhere before. By number it is ours for sure
    // as long as nobody else has changed the chain.
    if (now.size() == before.size() + ours.size() && std::equal(before.begin(), before.end(), now.begin())) {
        for (size_t i = 0; i < ours.size(); ++i) {
            text += "-D " + chain + " " + std::to_string(before.size() + 1) + "\n";
        }
        return text;
    }
    for (auto rule = ours.rbegin(); rule != ours.rend(); ++rule) {
        text += "-D " + *rule + "\n";
    }
    return text;
}

}  // namespace

std::optional<RestoreRefusal> restoreInputWrite(const std::vector<ListedCommand> &commands, RestoreInput &input) {
    std::vector<Append> appends;
    std::vector<std::string> &tables = input.tables;
    tables = {FILTER_TABLE};
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
    std::string quoted;
    quotedAppend(quoted, argument);
    return quoted;
}

size_t restoreFailedLine(const std::string &printed) {
    // At the start of a line only: an argument that the program repeats cannot hold a line break.
    static constexpr std::array<std::string_view, 2> STARTS = {"Error occurred at line: ", "line "};
    static constexpr std::string_view FAILED = "-restore: line ";
    for (const std::string_view start : STARTS) {
        for (size_t begin = 0; begin < printed.size();) {
            const size_t end = std::min(printed.find('\n', begin), printed.size());
            const std::string line = printed.substr(begin, end - begin);
            begin = end + 1;
            size_t number = line.compare(0, start.size(), start) == 0 ? start.size() : std::string::npos;
            const size_t failed = line.find(FAILED);
            if (number == std::string::npos && failed != std::string::npos && line.find(' ') > failed) {
                number = failed + FAILED.size();
            }
            if (number != std::string::npos) {
                return std::strtoul(line.c_str() + number, nullptr, 10);
            }
        }
    }
    return 0;
}

std::string RestoreInput::line(size_t number) const {
    size_t begin = 0;
    for (size_t i = 1; i < number && begin < text.size(); ++i) {
        begin = text.find('\n', begin) + 1;
    }
    return text.substr(begin, text.find('\n', begin) - begin);
}

bool savedRulesHoldLineBreak(const std::string &saved) {
    const SavedTables tables(saved);
    const auto holdsLineBreak = [](const std::string &line) { return line.find('\n') != std::string::npos; };
    if (std::none_of(tables.lines.begin(), tables.lines.end(), holdsLineBreak)) {
        return false;
    }
    return std::any_of(FW_CHAINS.begin(), FW_CHAINS.end(), [&](const char *chain) {
        const std::vector<std::string> rules = tables.rules(FILTER_TABLE, chain, false);
        return std::any_of(rules.begin(), rules.end(), holdsLineBreak);
    });
}

std::string restoreInputOfUndo(const RestoreInput &input, const std::string &before, const std::string &now) {
    const SavedTables tablesBefore(before);
    const SavedTables tablesNow(now);
    std::string text;
    for (const std::string &table : input.tables) {
        std::string section;
        if (table == FILTER_TABLE) {
            for (const std::string chain : FW_CHAINS) {
                if (tablesBefore.rules(table, chain, false) == tablesNow.rules(table, chain, false)) {
                    continue;
                }
                section += "-F " + chain + "\n";
                for (const std::string &rule : tablesBefore.rules(table, chain, true)) {
                    section += rule + "\n";
                }
            }
        }
        std::map<std::string, std::vector<std::string>> ours;
        for (const RestoreInput::ForeignRule &rule : input.foreignRules) {
            if (rule.table == table) {
                ours[rule.chain].push_back(rule.line);
            }
        }
        for (const auto &[chain, rules] : ours) {
            section += foreignUndo(rules, restoreQuoted(chain), tablesBefore.rules(table, chain, false),
                                   tablesNow.rules(table, chain, false));
        }
        if (!section.empty()) {
            text += "*" + table + "\n" + section + "COMMIT\n";
        }
    }
    return text;
}

std::string restoreInputOfTrial(const RestoreInput &input, const std::string &saved, size_t lines) {
    size_t end = 0;
    for (size_t line = 0; line < lines && end < input.text.size(); ++line) {
        end = input.text.find('\n', end) + 1;
    }
    // Without its rules the saved tables would not show from where the firewall chains are reached, on which it depends
    // whether the kernel accepts some matches.
    std::string text = saved + input.text.substr(0, end);
    static const std::string COMMIT = "COMMIT\n";
    const bool isOpen = end > 0 && input.text.compare(end - std::min(end, COMMIT.size()), COMMIT.size(), COMMIT) != 0;
    return isOpen ? text + COMMIT : text;
}

}  // namespace FW
