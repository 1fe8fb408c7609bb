// SPDX-License-Identifier: Apache-2.0
// Sets up the appliance of the demonstration inside the sandbox: installation, start-up, network, administrator.
#include "appliance.h"

#include "files.h"
#include "processes.h"
#include "sandbox.h"

#include <veldfirewall/veldFW.h>

#include <sstream>
#include <stdexcept>
#include <string>
#include <tuple>

namespace demo {
namespace {

const std::string shippedProfiles = "/usr/veld/etc.defaults/firewall.d/";
const std::string profiles = "/usr/veld/etc/firewall.d/";
const std::string hookDirectory = "/usr/veld/etc/hooks.d/net/";
const std::string noteFile = "/run/firewall-hooks.notes";

FW::FWRULE makeRule(const std::string &name, FW::FW_POLICY policy, int ipType) {
    FW::FWRULE rule;
    rule.name = name;
    rule.policy = policy;
    rule.ipType = ipType;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.portGroup = FW::FW_PORT_GROUP_ANY;
    return rule;
}

FW::FWRULE denyAddress(const std::string &name, int ipType, const std::string &address) {
    FW::FWRULE rule = makeRule(name, FW::FW_POLICY_DENY, ipType);
    rule.ipGroup = FW::FW_IP_GROUP_ADDRESS;
    rule.ipList = {address};
    return rule;
}

}  // namespace

void installBuild(const std::string &buildDirectory) {
    veldtest::requireSandbox("install the build");
    veldtest::runChecked({"cmake", "--install", buildDirectory, "--prefix", "/tmp/veldfirewall"});
    for (const auto &name : veldtest::listDirectory(shippedProfiles)) {
        if (!veldtest::pathExists(profiles + name))
            veldtest::writeFile(profiles + name, veldtest::readFile(shippedProfiles + name));
    }
}

void joinNetworks(const veldtest::NetworkNamespace &client) {
    veldtest::addVethPair("eth0", client, "eth0");
    for (const auto &[addresses, prefix, outside] :
         {std::tuple{addressesV4, "/24", "203.0.113.0/24"}, {addressesV6, "/64", "2001:db8:99::/64"}}) {
        veldtest::addAddress("eth0", std::string(addresses.appliance) + prefix);
        for (const char *address : {addresses.local, addresses.denied, addresses.outside})
            veldtest::addAddress("eth0", std::string(address) + prefix, &client);
        veldtest::setUp("eth0");
        veldtest::setUp("eth0", &client);
        veldtest::ip({"route", "add", outside, "dev", "eth0"});
    }
}

void installHooks() {
    for (const std::string hook : {"firewall_enable", "firewall_disable"})
        veldtest::writeFile(hookDirectory + hook + "/10-note",
                            "#!/bin/sh\necho \"" + hook + " $1 RESULT=$RESULT\" >> " + noteFile + "\n", 0755);
}

std::vector<std::string> hookNotes() {
    std::vector<std::string> notes;
    if (!veldtest::pathExists(noteFile))
        return notes;
    std::istringstream lines(veldtest::readFile(noteFile));
    for (std::string line; std::getline(lines, line);)
        notes.push_back(line);
    return notes;
}

FW::FWPROFILE editProfile() {
    FW::VELDFW_PROFILE store;
    FW::FWPROFILE profile;
    if (!store.profileGet("default", profile))
        throw std::runtime_error("the shipped profile \"default\" cannot be read");

    FW::FWRULE web = makeRule("Web for everyone", FW::FW_POLICY_ALLOW, FW::FW_IP_TYPE_BOTH);
    web.portGroup = FW::FW_PORT_GROUP_SERVICE;
    web.portList = {"https"};
    FW::FWRULE telnet = makeRule("No telnet", FW::FW_POLICY_DENY, FW::FW_IP_TYPE_BOTH);
    telnet.portGroup = FW::FW_PORT_GROUP_PORT;
    telnet.portList = {std::to_string(portTelnet)};
    const std::vector<FW::FWRULE> added = {
        web, telnet, denyAddress("Denied computer (IPv6)", FW::FW_IP_TYPE_V6, addressesV6.denied),
        denyAddress("Denied computer (IPv4)", FW::FW_IP_TYPE_V4, addressesV4.denied)};
    auto &rules = profile.rules[FW::FW_ADAPTER_GLOBAL];
    rules.insert(rules.begin(), added.begin(), added.end());

    if (!store.profileSet("default", profile))
        throw std::runtime_error("the profile \"default\" cannot be stored");
    FW::FWPROFILE stored;
    if (!store.profileGet("default", stored))
        throw std::runtime_error("the stored profile \"default\" cannot be read");
    return stored;
}

}  // namespace demo
