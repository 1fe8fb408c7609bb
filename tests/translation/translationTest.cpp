// SPDX-License-Identifier: Apache-2.0
// Every case in cases/ is a test; and what a case cannot show: what is remembered, steps called by themselves.
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <json/json.h>
#include <syslog.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <functional>
#include <optional>
#include <sstream>
#include <stdexcept>

#include "files.h"
#include "network.h"
#include "systemLog.h"
#include "veldfirewall/fwIptables.h"

using namespace veldtest;
using testing::ElementsAre;

namespace {

using Words = std::vector<std::string>;

// Prints the answer for the interface, or the interface itself, and notes its arguments.
constexpr const char *TOOL = "/usr/veld/sbin/veldnetdtool";
constexpr const char *TOOL_SCRIPT =
    "#!/bin/sh\n"
    "echo \"$*\" >> /run/tool-runs\n"
    "[ -e \"/run/tool-answer.$2\" ] && exec printf %b \"$(cat \"/run/tool-answer.$2\")\"\n"
    "printf %s \"$2\"\n";

Words split(const std::string &text, char separator) {
    Words pieces;
    std::istringstream stream(text);
    for (std::string piece; std::getline(stream, piece, separator);)
        pieces.push_back(piece);
    return pieces;
}

std::pair<std::string, std::string> cut(const std::string &text, char separator) {
    const size_t at = text.find(separator);
    return at == std::string::npos ? std::pair(text, std::string())
                                   : std::pair(text.substr(0, at), text.substr(at + 1));
}

FW::FWRULE parseRule(const Words &words) {
    FW::FWRULE rule;
    const std::map<std::string, int32_t *> numbers = {{"adapterDirect", &rule.adapterDirect},
                                                      {"ipType", &rule.ipType},
                                                      {"ipDirect", &rule.ipDirect},
                                                      {"ipGroup", &rule.ipGroup},
                                                      {"portDirect", &rule.portDirect},
                                                      {"portGroup", &rule.portGroup},
                                                      {"protocol", &rule.protocol}};
    const std::map<std::string, std::function<void(const std::string &)>> others = {
        {"enable", [&](const std::string &value) { rule.enable = value != "0"; }},
        {"blLog", [&](const std::string &value) { rule.blLog = value != "0"; }},
        {"policy", [&](const std::string &value) { rule.policy = static_cast<FW::FW_POLICY>(std::stoi(value)); }},
        {"name", [&](const std::string &value) { rule.name = value; }},
        {"table", [&](const std::string &value) { rule.table = value; }},
        {"ipList", [&](const std::string &value) { rule.ipList = split(value, ','); }},
        {"portList", [&](const std::string &value) { rule.portList = split(value, ','); }},
        {"chainList", [&](const std::string &value) {
             const Words chains = split(value, ',');
             rule.chainList = {chains.begin(), chains.end()};
         }}};
    for (size_t i = 1; i < words.size(); ++i) {  // the first names the adapter
        const auto [key, value] = cut(words[i], '=');
        if (const auto number = numbers.find(key); number != numbers.end())
            *number->second = std::stoi(value);
        else
            others.at(key)(value);
    }
    return rule;
}

void installService(const Words &words) {
    Json::Value json;
    json["name"] = words.at(0);
    json["enabled"] = true;
    for (size_t i = 1; i < words.size(); ++i) {
        if (words[i] == "disabled") {
            json["enabled"] = false;
            continue;
        }
        const auto [side, service] = cut(words[i], '=');
        const auto [protocol, ports] = cut(service, ':');
        json[side]["protocol"] = protocol;
        json[side]["ports"] = Json::Value(Json::arrayValue);
        for (const std::string &port : split(ports, ','))
            json[side]["ports"].append(port);
    }
    writeFile("/usr/veld/etc/services.d/" + words[0] + ".json", json.toStyledString());
}

/// A case that is read: the sandbox looks as it says, and this is the call and what must come out.
struct TranslationCase {
    /// Throws std::runtime_error that names file and line for what it does not know.
    void read(const std::string &name);
    void applyLine(const std::string &key, const std::string &rest);

    bool keepEstablished = false;
    std::optional<std::string> client;
    FW::FWPROFILE profile;
    bool fails = false;
    Words log;                                    ///< "error fwIptables.cpp text", all in order
    std::optional<Words> toolRuns;                ///< arguments of each run of the network tool
    std::map<std::string, std::string> commands;  ///< "v4 eth0" to its indented lines
};

void TranslationCase::applyLine(const std::string &key, const std::string &rest) {
    const Words words = split(rest, ' ');
    const auto askedFor = [&] {
        toolRuns.emplace();
        for (const std::string &interface : words)
            toolRuns->push_back("--get-ipv6-router-interface " + interface);
    };
    const std::map<std::string, std::function<void()>> lines = {
        {"interfaces", [&] { std::for_each(words.begin(), words.end(), addDummyInterface); }},
        {"pppoe", [&] { writeFile("/run/ppp-pppoe.pid", "4711\n" + rest + "\n"); }},
        {"wireless", [&] { writeFile("/etc.defaults/veldinfo.conf", "support_wireless=\"yes\"\n"); }},
        {"service", [&] { installService(words); }},
        {"service-registry-empty", [&] { writeFile("/etc/services", ""); }},
        {"geoip", [&] { writeFile("/usr/share/xt_geoip/" + words.at(0), std::string(std::stoul(words.at(1)), '\1')); }},
        {"tunnel", [&] { writeFile("/run/tool-answer." + words.at(0), cut(rest, ' ').second); }},
        {"network-tool-missing", [&] { removeAll(TOOL); }},
        {"keep-established", [&] { keepEstablished = true; }},
        {"client", [&] { client = rest; }},
        {"rule", [&] { profile.rules[words.at(0)].push_back(parseRule(words)); }},
        {"policy", [&] { profile.adapterPolicyMap[words.at(0)] = static_cast<FW::FW_POLICY>(std::stoi(words.at(1))); }},
        {"fails", [&] { fails = true; }},
        {"preamble-spelled-out", [&] { commands.clear(); }},
        {"log", [&] { log.push_back(rest); }},
        {"tool-asked", askedFor},
        {"v4", [&] { commands["v4 " + rest]; }},
        {"v6", [&] { commands["v6 " + rest]; }}};
    lines.at(key)();
}

void TranslationCase::read(const std::string &name) {
    std::ifstream file(std::string(VELD_CASE_DIRECTORY "/") + name);
    if (!file)
        throw std::runtime_error(name + ": cannot be opened");
    std::string group;
    int number = 0;
    for (std::string line; std::getline(file, line);) {
        ++number;
        if (line.empty() || line.front() == '#')
            continue;
        try {
            if (line.front() == ' ') {
                commands.at(group) += line + "\n";
                continue;
            }
            group = line;
            const auto [key, rest] = cut(line, ' ');
            applyLine(key, rest);
        } catch (const std::logic_error &) {
            throw std::runtime_error(name + ":" + std::to_string(number) + ": not understood: " + line);
        }
    }
}

std::string toText(const std::map<std::string, std::string> &commands) {
    std::string text;
    for (const auto &[group, lines] : commands)
        text += group + "\n" + lines;
    return text;
}

std::string toText(const Json::Value &cmdList) {
    std::map<std::string, std::string> commands;
    for (const std::string &family : cmdList.getMemberNames()) {
        for (const std::string &group : cmdList[family].getMemberNames()) {
            for (const Json::Value &command : cmdList[family][group])
                commands[family + " " + group] += "    " + command.asString() + "\n";
        }
    }
    return toText(commands);
}

/// What the translation wrote, without line numbers.
Words libraryMessages(SystemLog &log) {
    Words texts;
    for (const LogMessage &message : log.messages()) {
        const auto [source, text] = cut(message.text, ':');
        if (source == "fwIptables.cpp" || source == "fwGeoip.cpp")
            texts.push_back((message.priority == LOG_ERR ? "error " : "debug ") + source + " " + cut(text, ' ').second);
    }
    return texts;
}

class Translator : public testing::Test {
protected:
    Translator() {
        // Names that the machine's own services database knows must not come in.
        writeFile("/etc/services", "discard 9/tcp\n");
        writeFile(TOOL, TOOL_SCRIPT, 0755);
    }
};

class Translation : public Translator, public testing::WithParamInterface<std::string> {};

TEST_P(Translation, GivesTheCommandsOfTheCase) {
    TranslationCase wanted;
    wanted.read("preamble.commands");
    wanted.read(GetParam() + ".case");
    SystemLog log;
    FW::VELDFW_IPTABLES_RULES translator;
    Json::Value cmdList;
    translator.jIptablesCmdInit(cmdList);
    const auto &[rules, policies] = std::tie(wanted.profile.rules, wanted.profile.adapterPolicyMap);
    const bool outcome =
        wanted.client
            ? translator.fwRulesToIptablesRules(wanted.keepEstablished, rules, policies, cmdList, *wanted.client)
            : translator.fwRulesToIptablesRules(wanted.keepEstablished, rules, policies, cmdList);
    EXPECT_EQ(outcome, !wanted.fails);
    EXPECT_EQ(toText(cmdList), toText(wanted.commands));
    EXPECT_EQ(libraryMessages(log), wanted.log) << log.text();
    if (wanted.toolRuns) {
        EXPECT_EQ(split(pathExists("/run/tool-runs") ? readFile("/run/tool-runs") : "", '\n'), *wanted.toolRuns);
    }
}

Words caseNames() {
    Words names;
    for (const auto &entry : std::filesystem::directory_iterator(VELD_CASE_DIRECTORY)) {
        if (entry.path().extension() == ".case")
            names.push_back(entry.path().stem());
    }
    return names;
}

INSTANTIATE_TEST_SUITE_P(Case, Translation, testing::ValuesIn(caseNames()),
                         [](const auto &entry) { return entry.param; });

TEST_F(Translator, RemembersWhatIsThereAndAsksAgainForWhatIsNot) {
    FW::VELDFW_IPTABLES_RULES translator;
    EXPECT_FALSE(translator.adapterIsEnabled("pppoe") || translator.adapterIsEnabled("vpn"));
    for (const char *name : {"eth0", "ppp0", "tun5"})
        addDummyInterface(name);
    writeFile("/run/ppp-pppoe.pid", "4711\nppp0\n");
    for (const char *name : {"eth0", "pppoe", "vpn"})
        EXPECT_TRUE(translator.adapterIsEnabled(name)) << name;
    for (const char *name : {"eth0", "ppp0", "tun5"})
        removeInterface(name);
    removeAll("/run/ppp-pppoe.pid");
    for (const char *name : {"eth0", "pppoe", "vpn"}) {
        EXPECT_TRUE(translator.adapterIsEnabled(name)) << name;
        EXPECT_FALSE(FW::VELDFW_IPTABLES_RULES().adapterIsEnabled(name)) << name;
    }
}

TEST_F(Translator, StepsByThemselvesNameAnAbsentVpnAndKeepTheBlankBeforeNoTarget) {
    FW::VELDFW_IPTABLES_RULES translator;
    FW::FWRULE rule;
    rule.policy = FW::FW_POLICY_NONE;
    rule.blLog = true;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.portGroup = FW::FW_PORT_GROUP_ANY;
    rule.chainList = {"INPUT_FIREWALL"};
    Json::Value args;
    translator.iptablesRulesInit(args);
    ASSERT_TRUE(translator.FwRuleToIptablesArg("vpn", rule, args));
    Json::Value cmdList;
    translator.iptablesArgToCmd("vpn", rule, args, cmdList);
    EXPECT_EQ(toText(cmdList), "v4 vpn\n"
                               "    -t filter -A INPUT_FIREWALL -i vpn -j LOG\n"
                               "    -t filter -A INPUT_FIREWALL -i vpn \n");
}

}  // namespace
