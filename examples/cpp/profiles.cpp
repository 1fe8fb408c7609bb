// SPDX-License-Identifier: Apache-2.0
// Lists the stored profiles, adds a rule to one or tries it first, and asks what the active one does with a port.
#include <veldfirewall/veldFW.h>

#include <exception>
#include <iostream>
#include <map>
#include <string>
#include <vector>

namespace {

enum ExitStatus { EXIT_OK = 0, EXIT_BLOCKED = 1, EXIT_USAGE = 2, EXIT_FAILED = 3 };

const char usage[] = "usage: profiles list                             profiles, and how many rules each has\n"
                     "       profiles on|off                           switch the firewall\n"
                     "       profiles deny PROFILE ADAPTER ADDRESS     put a rule in front that drops an IPv4 address\n"
                     "       profiles try PROFILE ADAPTER ADDRESS      the same on trial, until a line is read from\n"
                     "                [CLIENT]                         standard input: \"keep\" keeps it. The\n"
                     "                                                 CLIENT's connections must stand the trial.\n"
                     "       profiles ask PORT tcp|udp                 is the destination port blocked, per adapter\n"
                     "exit status: 0 done or open, 1 blocked somewhere, 2 usage, 3 failed (see the system log)\n";

int list() {
    std::map<std::string, FW::FWPROFILE> profiles;
    if (!FW::VELDFW_PROFILE().profileEnum(profiles)) {
        return EXIT_FAILED;
    }
    std::string active;
    FW::VELDFW().fwProfileConfigGet(active);
    for (const auto &[name, profile] : profiles) {
        std::size_t rules = 0;
        for (const auto &[adapter, list] : profile.rules) {
            rules += list.size();
        }
        std::cout << (name == active ? "* " : "  ") << name << ": " << rules << " rules\n";
    }
    return EXIT_OK;
}

int switchTo(bool on) {
    FW::VELDFW firewall;
    return (on ? firewall.fwEnable() : firewall.fwDisable()) ? EXIT_OK : EXIT_FAILED;
}

FW::FWRULE denyRule(const std::string &address) {
    FW::FWRULE rule;
    rule.name = "deny " + address;
    rule.policy = FW::FW_POLICY_DENY;
    rule.ipGroup = FW::FW_IP_GROUP_ADDRESS;
    rule.ipList = {address};
    rule.portGroup = FW::FW_PORT_GROUP_ANY;
    return rule;
}

bool withDenyRule(const std::string &name, const std::string &adapter, const std::string &address,
                  FW::FWPROFILE &profile) {
    if (!FW::VELDFW_PROFILE().profileGet(name, profile)) {
        return false;
    }
    auto &rules = profile.rules[adapter];
    rules.insert(rules.begin(), denyRule(address));
    return true;
}

int deny(const std::string &name, const std::string &adapter, const std::string &address) {
    FW::FWPROFILE profile;
    // The kernel follows at once when the firewall is on.
    return withDenyRule(name, adapter, address, profile) && FW::VELDFW_PROFILE().profileSet(name, profile) &&
                   FW::VELDFW().fwReload(true)
               ? EXIT_OK
               : EXIT_FAILED;
}

int tryDeny(const std::string &name, const std::string &adapter, const std::string &address,
            const std::string &client) {
    FW::VELDFW firewall;
    FW::VELDFW_PROFILE store;
    FW::FWPROFILE profile;
    if (!withDenyRule(name, adapter, address, profile) || !store.CreateTestProfile(name, profile)) {
        return EXIT_FAILED;
    }
    bool succeeded = firewall.TestApplyingProfile(name, client);
    std::string answer;
    if (succeeded) {
        std::cout << "on trial; \"keep\" keeps it, anything else brings the old rules back" << std::endl;
        std::getline(std::cin, answer);
    }
    if (answer == "keep") {
        succeeded = store.AdoptTestProfile(name);
    }
    // Both in any case: without the reload the trial would go on.
    const bool removed = store.RemoveTestProfile(name);
    const bool reloaded = firewall.fwReload(true);
    return succeeded && removed && reloaded ? EXIT_OK : EXIT_FAILED;
}

int ask(const std::string &port, const std::string &protocol) {
    FW::PortCompareST query;
    query.protocol = protocol == "udp" ? FW::FW_PROTO_UDP : FW::FW_PROTO_TCP;
    query.port = port;
    std::map<std::string, FW::FW_POLICY> verdicts;
    if (!FW::VELDFW().fwPortIsBlocked(query, "", verdicts)) {
        return EXIT_FAILED;
    }
    static const std::map<FW::FW_POLICY, std::string> words = {{FW::FW_POLICY_ALLOW, "open"},
                                                               {FW::FW_POLICY_DENY, "blocked"},
                                                               {FW::FW_POLICY_NONE, "as the adapters say"},
                                                               {FW::FW_POLICY_PARTIAL, "blocked for some addresses"}};
    int status = EXIT_OK;
    for (const auto &[adapter, verdict] : verdicts) {
        std::cout << adapter << ": " << words.at(verdict) << "\n";
        if (verdict == FW::FW_POLICY_DENY || verdict == FW::FW_POLICY_PARTIAL) {
            status = EXIT_BLOCKED;
        }
    }
    return status;
}

int run(const std::vector<std::string> &words) {
    if (words.size() == 1 && words[0] == "list") {
        return list();
    }
    if (words.size() == 1 && (words[0] == "on" || words[0] == "off")) {
        return switchTo(words[0] == "on");
    }
    if (words.size() == 4 && words[0] == "deny") {
        return deny(words[1], words[2], words[3]);
    }
    if ((words.size() == 4 || words.size() == 5) && words[0] == "try") {
        return tryDeny(words[1], words[2], words[3], words.size() == 5 ? words[4] : "");
    }
    if (words.size() == 3 && words[0] == "ask" && (words[2] == "tcp" || words[2] == "udp")) {
        return ask(words[1], words[2]);
    }
    const bool help = words.size() == 1 && words[0] == "--help";
    (help ? std::cout : std::cerr) << usage;
    return help ? EXIT_OK : EXIT_USAGE;
}

}  // namespace

int main(int argc, char *argv[]) {
    try {
        const int status = run({argv + 1, argv + argc});
        if (status == EXIT_FAILED) {
            std::cerr << "profiles: failed; the system log has the reason\n";
        }
        return status;
    } catch (const std::exception &error) {  // a stored document of the wrong types
        std::cerr << "profiles: " << error.what() << "\n";
        return EXIT_FAILED;
    }
}
