// SPDX-License-Identifier: Apache-2.0
// The machine's own iptables, used on the sandbox's network.
#include "realIptables.h"

#include "caseTable.h"
#include "processes.h"
#include "sandbox.h"

#include <stdexcept>

namespace veldtest {
namespace {

ProgramResult runShell(const std::string &script) {
    requireSandbox("use iptables");
    return runProgram({"sh", "-ec", script});
}

}  // namespace

bool realIptables(std::string *reason) {
    const auto tried = runShell(R"(
        for program in /sbin/iptables /sbin/ip6tables; do
            $program -N SANDBOX_PROBE
            $program -A SANDBOX_PROBE -p tcp -m multiport --dports 1,2 -j DROP
            $program -A SANDBOX_PROBE -m state --state ESTABLISHED -j ACCEPT
            $program -F SANDBOX_PROBE
            $program -X SANDBOX_PROBE
        done)");
    if (reason != nullptr)
        *reason = tried.errors;
    return tried.succeeded();
}

bool useIptablesBackend(const std::string &backend) {
    // "/sbin/iptables" + "-nft" + "-save"; looked up in both places, as merged and unmerged systems have it.
    return runShell("for program in /sbin/iptables /sbin/ip6tables; do for part in '' -restore -save; do\n"
                    "    name=$program-" +
                    backend +
                    "$part; [ ! -x /usr$name ] || name=/usr$name; [ -x $name ]\n"
                    "    ln -sf $name $program$part\n"
                    "done; done")
        .succeeded();
}

void createFirewallChains() {
    const auto made = runShell(R"(
        for program in /sbin/iptables /sbin/ip6tables; do
            for hook in INPUT FORWARD; do
                $program -N ${hook}_FIREWALL
                $program -A $hook -j ${hook}_FIREWALL
            done
        done)");
    if (!made.succeeded())
        throw std::runtime_error("the firewall chains cannot be created: " + made.errors);
}

std::vector<std::string> listRules(const std::string &program, const std::string &chain) {
    requireSandbox("list rules");
    std::vector<std::string> command = {program, "-S"};
    if (!chain.empty())
        command.push_back(chain);
    return split(runChecked(command), '\n');
}

}  // namespace veldtest
