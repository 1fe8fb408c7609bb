// SPDX-License-Identifier: Apache-2.0
// The machine's own iptables, used on the sandbox's network.
#include "realIptables.h"

#include "files.h"
#include "processes.h"
#include "sandbox.h"

#include <unistd.h>

#include <exception>
#include <sstream>

namespace veldtest {
namespace {

const std::vector<std::string> programs = {"/sbin/iptables", "/sbin/ip6tables"};

}  // namespace

bool realIptables(std::string *reason) {
    requireSandbox("try iptables");
    try {
        for (const auto &program : programs) {
            runChecked({program, "-N", "SANDBOX_PROBE"});
            runChecked(
                {program, "-A", "SANDBOX_PROBE", "-p", "tcp", "-m", "multiport", "--dports", "1,2", "-j", "DROP"});
            runChecked({program, "-A", "SANDBOX_PROBE", "-m", "state", "--state", "ESTABLISHED", "-j", "ACCEPT"});
            runChecked({program, "-F", "SANDBOX_PROBE"});
            runChecked({program, "-X", "SANDBOX_PROBE"});
        }
        return true;
    } catch (const std::exception &error) {
        if (reason != nullptr)
            *reason = error.what();
        return false;
    }
}

bool useIptablesBackend(const std::string &backend) {
    requireSandbox("replace iptables");
    for (const auto &program : programs) {
        for (const std::string part : {"", "-restore", "-save"}) {
            // "/sbin/iptables" + "-nft" + "-save"; looked up in both places, as merged and unmerged systems have it.
            const std::string name = program + "-" + backend + part;
            std::string found;
            for (const std::string prefix : {"/usr", ""}) {
                if (access((prefix + name).c_str(), X_OK) == 0)
                    found = prefix + name;
            }
            if (found.empty())
                return false;
            unlink((program + part).c_str());
            if (symlink(found.c_str(), (program + part).c_str()) != 0)
                return false;
        }
    }
    return true;
}

void createFirewallChains() {
    requireSandbox("create the firewall chains");
    for (const auto &program : programs) {
        for (const std::string hook : {"INPUT", "FORWARD"}) {
            runChecked({program, "-N", hook + "_FIREWALL"});
            runChecked({program, "-A", hook, "-j", hook + "_FIREWALL"});
        }
    }
}

std::vector<std::string> listRules(const std::string &program, const std::string &chain) {
    requireSandbox("list rules");
    std::vector<std::string> command = {program, "-S"};
    if (!chain.empty())
        command.push_back(chain);
    std::vector<std::string> rules;
    std::istringstream lines(runChecked(command));
    for (std::string line; std::getline(lines, line);)
        rules.push_back(line);
    return rules;
}

}  // namespace veldtest
