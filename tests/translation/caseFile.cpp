// SPDX-License-Identifier: Apache-2.0
// Reads translation cases.
#include "caseFile.h"

#include <fstream>
#include <functional>
#include <sstream>
#include <stdexcept>

namespace veldtest {
namespace {

std::vector<std::string> split(const std::string &text, char separator) {
    std::vector<std::string> pieces;
    std::istringstream stream(text);
    for (std::string piece; std::getline(stream, piece, separator);)
        pieces.push_back(piece);
    return pieces;
}

std::pair<std::string, std::string> cut(const std::string &text, char separator) {
    const size_t at = text.find(separator);
    if (at == std::string::npos)
        return {text, ""};
    return {text.substr(0, at), text.substr(at + 1)};
}

FW::FWRULE parseRule(const std::vector<std::string> &words) {
    FW::FWRULE rule;
    for (const std::string &word : words) {
        const auto [key, value] = cut(word, '=');
        const auto number = [text = value] { return std::stoi(text); };
        const std::map<std::string, std::function<void(const std::string &)>> fields = {
            {"enable", [&](const std::string &) { rule.enable = number() != 0; }},
            {"adapterDirect", [&](const std::string &) { rule.adapterDirect = number(); }},
            {"policy", [&](const std::string &) { rule.policy = static_cast<FW::FW_POLICY>(number()); }},
            {"blLog", [&](const std::string &) { rule.blLog = number() != 0; }},
            {"name", [&](const std::string &text) { rule.name = text; }},
            {"table", [&](const std::string &text) { rule.table = text; }},
            {"chainList",
             [&](const std::string &text) {
                 const auto chains = split(text, ',');
                 rule.chainList = {chains.begin(), chains.end()};
             }},
            {"ipType", [&](const std::string &) { rule.ipType = number(); }},
            {"ipDirect", [&](const std::string &) { rule.ipDirect = number(); }},
            {"ipGroup", [&](const std::string &) { rule.ipGroup = number(); }},
            {"ipList", [&](const std::string &text) { rule.ipList = split(text, ','); }},
            {"portDirect", [&](const std::string &) { rule.portDirect = number(); }},
            {"portGroup", [&](const std::string &) { rule.portGroup = number(); }},
            {"protocol", [&](const std::string &) { rule.protocol = number(); }},
            {"portList", [&](const std::string &text) { rule.portList = split(text, ','); }},
        };
        fields.at(key)(value);
    }
    return rule;
}

CaseService parseService(const std::vector<std::string> &words) {
    CaseService service;
    service.name = words.at(0);
    for (size_t i = 1; i < words.size(); ++i) {
        if (words[i] == "disabled") {
            service.enabled = false;
            continue;
        }
        const auto [side, ports] = cut(words[i], '=');
        if (side != "source" && side != "destination")
            throw std::out_of_range(side);
        const auto [protocol, list] = cut(ports, ':');
        service.sides[side] = {protocol, split(list, ',')};
    }
    return service;
}

/// One line of a case, already without indentation; `words` are its pieces between blanks, without the first.
void parseLine(TranslationCase &result, const std::string &key, const std::vector<std::string> &words,
               const std::string &rest) {
    const auto tail = [&words](size_t first) {
        return std::vector<std::string>(words.begin() + static_cast<std::ptrdiff_t>(first), words.end());
    };
    const std::map<std::string, std::function<void()>> lines = {
        {"interfaces", [&] { result.interfaces = words; }},
        {"pppoe", [&] { result.pppoeInterface = words.at(0); }},
        {"wireless", [&] { result.wireless = true; }},
        {"service", [&] { result.services.push_back(parseService(words)); }},
        {"service-registry-empty", [&] { result.serviceRegistryEmpty = true; }},
        {"geoip", [&] { result.geoipFiles[words.at(0)] = std::stoul(words.at(1)); }},
        {"tunnel",
         [&] {
             std::string &answer = result.tunnelAnswers[words.at(0)];
             answer = words.size() > 1 ? words[1] : "";
             if (const size_t at = answer.find("\\n"); at != std::string::npos)
                 answer.replace(at, 2, "\n");
         }},
        {"network-tool-missing", [&] { result.networkToolMissing = true; }},
        {"keep-established", [&] { result.keepEstablished = true; }},
        {"client",
         [&] {
             result.hasClient = true;
             result.client = rest;
         }},
        {"rule", [&] { result.profile.rules[words.at(0)].push_back(parseRule(tail(1))); }},
        {"policy",
         [&] { result.profile.adapterPolicyMap[words.at(0)] = static_cast<FW::FW_POLICY>(std::stoi(words.at(1))); }},
        {"fails", [&] { result.fails = true; }},
        {"preamble-spelled-out", [&] { result.preambleSpelledOut = true; }},
        {"log", [&] { result.log.push_back(rest); }},
        {"tool-asked",
         [&] {
             result.toolRunsGiven = true;
             result.toolRuns = words;
         }},
        {"v4", [&] { result.commands["v4 " + rest]; }},
        {"v6", [&] { result.commands["v6 " + rest]; }},
    };
    lines.at(key)();
}

}  // namespace

TranslationCase readCase(const std::string &path) {
    std::ifstream file(path);
    if (!file)
        throw std::runtime_error(path + ": cannot be opened");
    TranslationCase result;
    std::string group;
    int number = 0;
    for (std::string line; std::getline(file, line);) {
        ++number;
        if (line.empty() || line.front() == '#')
            continue;
        if (line.front() == ' ') {  // a command of the group above
            if (group.empty())
                throw std::runtime_error(path + ":" + std::to_string(number) + ": a command without a group");
            result.commands[group].push_back(line.substr(line.find_first_not_of(' ')));
            continue;
        }
        const auto [key, rest] = cut(line, ' ');
        group = key == "v4" || key == "v6" ? line : "";
        try {
            parseLine(result, key, split(rest, ' '), rest);
        } catch (const std::logic_error &error) {
            throw std::runtime_error(path + ":" + std::to_string(number) + ": not understood: " + line + " (" +
                                     error.what() + ")");
        }
    }
    return result;
}

}  // namespace veldtest
