// SPDX-License-Identifier: Apache-2.0
// Every case in cases/ is a test; and what a case cannot show: what is remembered, steps called by themselves.
#include <syslog.h>

#include <algorithm>
#include <optional>
#include <stdexcept>

#include "caseTable.h"
#include "files.h"
#include "network.h"
#include "systemLog.h"
#include "veldfirewall/fwDB.h"
#include "veldfirewall/fwIptables.h"

using namespace veldtest;

namespace {

using Words = std::vector<std::string>;

// Prints the answer for the interface, or the interface itself, and notes its arguments.
constexpr const char *TOOL = "/usr/veld/sbin/veldnetdtool";
constexpr const char *TOOL_SCRIPT =
    "#!/bin/sh\n"
    "[ $# = 2 ] && [ \"$1\" = --get-ipv6-router-interface ] && echo \"$2\" >> /run/tool-runs\n"
    "[ -e \"/run/tool-answer.$2\" ] && exec printf %b \"$(cat \"/run/tool-answer.$2\")\"\n"
    "printf %s \"$2\"\n";

std::pair<std::string, std::string> cut(const std::string &text, char separator) {
    const size_t at = text.find(separator);
    return at == std::string::npos ? std::pair(text, std::string())
                                   : std::pair(text.substr(0, at), text.substr(at + 1));
}

/// The rule of "ADAPTER field=value ...", by way of the document of a new rule.
FW::FWRULE parseRule(const Words &words) {
    Json::Value document;
    FW::VELDFW_JSON_DB().ruleListToJson({{"rules", {FW::FWRULE()}}}, document);
    Json::Value &members = document["rules"][0];
    std::optional<Words> chains;
    for (size_t i = 1; i < words.size(); ++i) {
        const auto [key, value] = cut(words[i], '=');
        if (key == "chainList")
            chains = split(value, ',');
        else if (!members.isMember(key))
            throw std::out_of_range(key);
        else if (members[key].isString())
            members[key] = value;
        else if (!members[key].isArray())
            members[key] = std::stoi(value);
        else
            for (const std::string &item : split(value, ','))
                members[key].append(item);
    }
    std::map<std::string, std::vector<FW::FWRULE>> rules;
    FW::VELDFW_JSON_DB().jsonToRuleList(document, rules);
    FW::FWRULE rule = rules["rules"][0];
    if (chains)
        rule.chainList = {chains->begin(), chains->end()};  // reading a document would add both chains of the firewall
    return rule;
}

/// A case that is read: the sandbox looks as it says, and this is the call and what must come out.
struct TranslationCase {
    /// Throws std::runtime_error that names file and line for what it does not know.
    void read(const std::string &name);
    void applyLine(int line, const std::string &key, const std::string &rest);

    bool keepEstablished = false;
    std::optional<std::string> client;
    FW::FWPROFILE profile;
    bool fails = false;
    Words log;                                    ///< "error fwIptables.cpp text", all in order
    std::optional<Words> toolRuns;                ///< the interface of each run of the network tool
    std::map<std::string, std::string> commands;  ///< "v4 eth0" to its indented lines
};

void TranslationCase::applyLine(int line, const std::string &key, const std::string &rest) {
    const Words words = split(rest, ' ');
    const std::map<std::string, std::function<void()>> lines = {
        {"interfaces", [&] { std::for_each(words.begin(), words.end(), addDummyInterface); }},
        {"pppoe", [&] { writeFile("/run/ppp-pppoe.pid", "4711\n" + rest + "\n"); }},
        {"wireless", [&] { writeFile("/etc.defaults/veldinfo.conf", "support_wireless=\"yes\"\n"); }},
        {"service", [&] { writeFile("/usr/veld/etc/services.d/" + std::to_string(line) + ".json", rest); }},
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
        {"tool-asked", [&] { toolRuns = words; }},
        {"v4", [&] { commands["v4 " + rest]; }},
        {"v6", [&] { commands["v6 " + rest]; }}};
    lines.at(key)();
}

void TranslationCase::read(const std::string &name) {
    std::string group;
    int number = 0;
    for (const std::string &line : split(readFile(VELD_CASE_DIRECTORY "/" + name), '\n')) {
        ++number;
        if (line.empty() || line.front() == '#')
            continue;
        try {
            if (line.front() == ' ') {
                commands.at(group) += line + "\n";
            } else {
                group = line;
                applyLine(number, cut(line, ' ').first, cut(line, ' ').second);
            }
        } catch (const std::logic_error &) {
            throw std::runtime_error(name + ":" + std::to_string(number) + ": not understood: " + line);
        }
    }
}

/// The commands as a case lists them: "v4 eth0" to its indented lines.
std::map<std::string, std::string> groupsOf(const Json::Value &cmdList) {
    std::map<std::string, std::string> groups;
    for (const std::string &family : cmdList.getMemberNames()) {
        for (const std::string &group : cmdList[family].getMemberNames()) {
            for (const Json::Value &command : cmdList[family][group])
                groups[family + " " + group] += "    " + command.asString() + "\n";
        }
    }
    return groups;
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
    EXPECT_EQ(groupsOf(cmdList), wanted.commands);
    EXPECT_EQ(libraryMessages(log), wanted.log) << log.text();
    if (wanted.toolRuns) {
        EXPECT_EQ(split(pathExists("/run/tool-runs") ? readFile("/run/tool-runs") : "", '\n'), *wanted.toolRuns);
    }
}

Words caseNames() {
    Words names;
    for (const std::string &file : listDirectory(VELD_CASE_DIRECTORY)) {
        if (cut(file, '.').second == "case")
            names.push_back(cut(file, '.').first);
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
    EXPECT_EQ(groupsOf(cmdList)["v4 vpn"], "    -t filter -A INPUT_FIREWALL -i vpn -j LOG\n"
                                           "    -t filter -A INPUT_FIREWALL -i vpn \n");
    EXPECT_EQ(groupsOf(cmdList).size(), 1u);
}

}  // namespace
