// SPDX-License-Identifier: Apache-2.0
// Commands as input of iptables-restore.
#include "model/restoreText.h"

#include <veldfirewall/fwRecords.h>

#include <algorithm>
#include <cctype>
#include <map>

#include "frame/errors.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

constexpr const char *FILTER = "filter";

/// iptables-restore splits at blanks as well, but knows quotes and comments.
std::string quoted(const std::string &word) {
    const bool plain = !word.empty() && std::all_of(word.begin(), word.end(), [](unsigned char c) {
        return std::isalnum(c) != 0 || std::string("-_.,:/!+=@%").find(static_cast<char>(c)) != std::string::npos;
    });
    if (plain) {
        return word;
    }
    std::string text = "\"";
    for (const char c : word) {
        text += c == '"' || c == '\\' ? "\\" : "";
        text += c;
    }
    return text + "\"";
}

}  // namespace

CommandWords commandWordsSplit(const std::string &command) {
    std::vector<std::string> words = split(command, ' ');
    words.erase(std::remove(words.begin(), words.end(), ""), words.end());
    CommandWords result;
    auto next = words.begin();
    const auto take = [&] { return next == words.end() ? std::string() : *next++; };
    result.program = take();
    if (next != words.end() && *next == "-t") {
        take();
        result.table = take();
    }
    if (next != words.end() && *next == "-A") {
        take();
        result.chain = take();
    }
    result.rest.assign(next, words.end());
    return result;
}

std::string restoreTextWrite(const std::vector<std::string> &commands) {
    std::map<std::string, std::string> others;  // sections of tables but "filter"
    std::string text = std::string("*") + FILTER + "\n";
    for (const char *chain : {FW::FW_CHAIN_INPUT, FW::FW_CHAIN_FORWARD}) {
        text += std::string(":") + chain + " - [0:0]\n";
    }
    for (const std::string &command : commands) {
        const CommandWords words = commandWordsSplit(command);
        if (words.chain.empty() || words.table.empty() || command.find('\n') != std::string::npos) {
            throw Failure("iptables-restore cannot be told \"" + command + "\"; mend the rule that it comes from");
        }
        std::string &section = words.table == FILTER ? text : others[words.table];
        section += "-A " + quoted(words.chain);
        for (const std::string &word : words.rest) {
            section += " " + quoted(word);
        }
        section += "\n";
    }
    text += "COMMIT\n";
    for (const auto &[table, section] : others) {
        text += "*" + table + "\n" + section + "COMMIT\n";
    }
    return text;
}

}  // namespace veldfwctl
