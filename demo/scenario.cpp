// SPDX-License-Identifier: Apache-2.0
// The course of the demonstration inside the sandbox.
#include "scenario.h"

#include "appliance.h"
#include "connectionTable.h"
#include "connections.h"
#include "files.h"
#include "realIptables.h"
#include "systemLog.h"

#include <veldfirewall/veldFW.h>

#include <syslog.h>

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <stdexcept>

namespace demo {
namespace {

const std::array<const char *, 2> programs = {"/sbin/iptables", "/sbin/ip6tables"};

void printHeading(const std::string &text) {
    std::printf("\n== %s\n", text.c_str());
}

std::string joined(const std::vector<std::string> &words, const char *separator) {
    std::string text;
    for (const auto &word : words)
        text += (text.empty() ? "" : separator) + word;
    return text;
}

void printProfile(const FW::FWPROFILE &profile) {
    const auto &rules = profile.rules.at(FW::FW_ADAPTER_GLOBAL);
    const std::array<const char *, 3> families = {"IPv4", "IPv6", "both"};
    std::printf("  profile \"%s\", list \"global\", first match wins\n", profile.name.c_str());
    for (size_t i = 0; i < rules.size(); ++i) {
        const auto &rule = rules[i];
        const std::string source = rule.ipGroup == FW::FW_IP_GROUP_ANY ? "any" : joined(rule.ipList, "/");
        std::string ports = rule.portGroup == FW::FW_PORT_GROUP_ANY ? "any" : joined(rule.portList, ",");
        if (rule.protocol == FW::FW_PROTO_ICMP)
            ports = "icmp";
        else if (rule.protocol == FW::FW_PROTO_IGMP)
            ports = "igmp";
        std::printf("  %2zu  %-5s  %-4s  from %-15s  port %-6s  %s\n", i + 1,
                    rule.policy == FW::FW_POLICY_ALLOW ? "allow" : "deny",
                    families.at(static_cast<size_t>(rule.ipType)), source.c_str(), ports.c_str(), rule.name.c_str());
    }
}

void printRules() {
    for (const char *program : programs) {
        const auto rules = veldtest::listRules(program, FW::FW_CHAIN_INPUT);
        std::printf("  %s -S %s\n", program, FW::FW_CHAIN_INPUT);
        for (const auto &rule : rules)
            std::printf("    %s\n", rule.c_str());
    }
}

/// Prints a check of something other than a connection. @return 1 when it failed
int check(bool holds, const std::string &what) {
    std::printf("  %-6s %s\n", holds ? "ok" : "WRONG", what.c_str());
    return holds ? 0 : 1;
}

/// The state of the kernel and of the settings after a switch.
int checkSwitched(bool on) {
    int wrong = 0;
    bool status = !on;
    wrong += check(FW::VELDFW().fwStatus(status) && status == on, on ? "the settings say on" : "the settings say off");
    for (const char *program : programs) {
        size_t count = 0;
        bool accepts = true;
        for (const auto *chain : {FW::FW_CHAIN_INPUT, FW::FW_CHAIN_FORWARD})
            count += veldtest::listRules(program, chain).size() - 1;  // the first line creates the chain
        for (const std::string chain : {"INPUT", "FORWARD"})
            accepts = accepts && veldtest::listRules(program, chain).at(0) == "-P " + chain + " ACCEPT";
        wrong +=
            check((count > 0) == on, std::string(program) + ": " + std::to_string(count) + " rules in both chains");
        wrong += check(accepts, std::string(program) + ": INPUT and FORWARD accept what the chains let through");
    }
    return wrong;
}

int checkHooks(const std::vector<std::string> &expected) {
    const auto notes = hookNotes();
    return check(notes == expected, "hooks were run: " + joined(notes, ", "));
}

int checkLog(veldtest::SystemLog &log) {
    int errors = 0;
    for (const auto &message : log.messages()) {
        if (message.priority <= LOG_ERR) {
            std::printf("  log: %s\n", message.text.c_str());
            ++errors;
        }
    }
    return check(errors == 0, "no error in the system log");
}

void reportNetwork(const std::function<void(const std::string &)> &report) {
    report(std::filesystem::read_symlink("/proc/thread-self/ns/net").string());
}

}  // namespace

int runScenario(const std::string &buildDirectory, const std::function<void(const std::string &)> &reportNamespace) {
    std::setvbuf(stdout, nullptr, _IOLBF, 0);
    veldtest::SystemLog log;
    int wrong = 0;

    printHeading("An appliance with eth0 and a client, joined by a veth pair");
    std::string reason;
    if (!veldtest::realIptables(&reason))
        throw std::runtime_error("iptables does not work here: " + reason);
    installBuild(buildDirectory);
    std::printf("  installed, with %zu service definitions\n",
                veldtest::listDirectory("/usr/veld/etc/services.d").size());
    const veldtest::NetworkNamespace client("client");
    client.run([&] { reportNetwork(reportNamespace); });
    joinNetworks(client);
    veldtest::createFirewallChains();
    installHooks();
    std::printf("  chains %s and %s created, INPUT and FORWARD jump to them\n", FW::FW_CHAIN_INPUT,
                FW::FW_CHAIN_FORWARD);

    printHeading("The shipped profile, with the administrator's four rules in front");
    const auto profile = editProfile();
    printProfile(profile);

    const veldtest::EchoServer server({portTelnet, portDns, portHttps, portSmb}, nullptr, true);
    auto rows = makeRows(client, profile);
    printHeading("Trying all connections before");
    observe(rows, client);

    printHeading("Enabling the firewall");
    wrong += check(FW::VELDFW().fwEnable(), "VELDFW::fwEnable");
    wrong += checkSwitched(true);
    wrong += checkHooks({"firewall_enable pre RESULT=0", "firewall_enable post RESULT=0"});
    printRules();
    std::printf("  trying all connections while enabled\n");
    observe(rows, client);

    printHeading("Disabling the firewall");
    wrong += check(FW::VELDFW().fwDisable(), "VELDFW::fwDisable");
    wrong += checkSwitched(false);
    wrong += checkHooks({"firewall_enable pre RESULT=0", "firewall_enable post RESULT=0",
                         "firewall_disable pre RESULT=0", "firewall_disable post RESULT=0"});
    std::printf("  trying all connections after disabling\n");
    observe(rows, client);
    wrong += checkLog(log);

    printHeading("What the profile says of each port and what the network did");
    std::printf(
        "  + allows, - denies; \"by source\": open for some source addresses only. The session exists since before "
        "the\n"
        "  firewall was enabled, on the denied port; the appliance sends on it, too. (A session on which only the\n"
        "  client sends, and that is older than the first rule that asks for connection states, is unknown to the\n"
        "  kernel's connection tracking; it is judged as a new one.)\n");
    wrong += printTable(rows);
    return wrong;
}

}  // namespace demo
