// SPDX-License-Identifier: Apache-2.0
// What the benchmarks work on: profiles, services, interfaces. All of it in the sandbox.
#include "fixtures.h"

#include "files.h"
#include "network.h"
#include "sandbox.h"

#include <json/writer.h>

#include <algorithm>
#include <array>
#include <cstdio>

#include "veldfirewall/fwDB.h"

// Documents are stored as JsonCpp's older writer writes them.
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"

namespace veldbench {

namespace {

constexpr const char *NETWORK_TOOL = "/usr/veld/sbin/veldnetdtool";
constexpr const char *NETWORK_TOOL_CALLS = "/run/network-tool-calls";
constexpr const char *SERVICES = "/usr/veld/etc/services.d/";
constexpr const char *COUNTRIES = "/usr/share/xt_geoip/";
constexpr int SERVICE_COUNT = 40;

std::string serviceName(int n) {
    return "service_" + std::to_string(n);
}

std::string address(size_t n) {
    return "10." + std::to_string(n / 65536 % 256) + "." + std::to_string(n / 256 % 256) + "." +
           std::to_string(n % 256);
}

void defineService(const std::string &name, const std::vector<int> &ports) {
    Json::Value definition;
    definition["name"] = name;
    definition["enabled"] = true;
    definition["source"]["protocol"] = "tcp";
    definition["source"]["ports"] = Json::Value(Json::arrayValue);
    definition["destination"]["protocol"] = "tcp";
    for (const int port : ports) {
        definition["destination"]["ports"].append(std::to_string(port));
    }
    veldtest::writeFile(SERVICES + name + ".json", documentText(definition));
}

FW::FWRULE makeRule(size_t n) {
    FW::FWRULE rule;
    rule.name = "Rule " + std::to_string(n);
    rule.policy = n % 3 == 0 ? FW::FW_POLICY_DENY : FW::FW_POLICY_ALLOW;
    rule.blLog = n % 16 == 5;
    rule.portGroup = FW::FW_PORT_GROUP_PORT;
    rule.portList = {std::to_string(1024 + n % 60000)};
    switch (n % 8) {
    case 0:
        rule.ipList = {address(n)};
        break;
    case 1:
        rule.ipGroup = FW::FW_IP_GROUP_NETWORK;
        rule.ipList = {address(n), "255.255.255.0"};
        rule.protocol = FW::FW_PROTO_UDP;
        rule.portList = {"5000-5010"};
        break;
    case 2:
        rule.ipGroup = FW::FW_IP_GROUP_RANGE;
        rule.ipList = {address(n), address(n + 9)};
        rule.protocol = FW::FW_PROTO_TCP_UDP;
        rule.portList = {"80", "443", "5000-5001", "6690", "8080", "8443", "9000-9010", "9100"};
        break;
    case 3:
        rule.ipType = FW::FW_IP_TYPE_BOTH;
        rule.ipGroup = FW::FW_IP_GROUP_ANY;
        rule.portGroup = FW::FW_PORT_GROUP_SERVICE;
        rule.portList = {serviceName(1), serviceName(static_cast<int>(n % SERVICE_COUNT))};
        break;
    case 4:
        rule.ipGroup = FW::FW_IP_GROUP_COUNTRY;
        rule.ipList = {"DE", "CH", "AT"};
        break;
    case 5:
        rule.ipType = FW::FW_IP_TYPE_V6;
        rule.ipList = {"fd00::" + std::to_string(n % 10000)};
        break;
    case 6:
        rule.ipType = FW::FW_IP_TYPE_BOTH;
        rule.ipGroup = FW::FW_IP_GROUP_ANY;
        rule.portGroup = FW::FW_PORT_GROUP_RESERVED;
        rule.protocol = FW::FW_PROTO_TCP_UDP;
        rule.portList = {serviceName(static_cast<int>(n % SERVICE_COUNT))};
        break;
    default:
        rule.ipList = {address(n)};
        rule.portGroup = FW::FW_PORT_GROUP_ANY;
        rule.portList.clear();
        break;
    }
    return rule;
}

}  // namespace

const std::vector<std::string> &interfaceNames() {
    static const std::vector<std::string> names = {"eth0", "eth1", "eth2"};
    return names;
}

void addInterfaces() {
    for (const std::string &name : interfaceNames()) {
        veldtest::addDummyInterface(name);
    }
}

void installNetworkTool() {
    veldtest::writeFile(NETWORK_TOOL,
                        std::string("#!/bin/sh\necho \"$2\" >>") + NETWORK_TOOL_CALLS + "\nprintf %s \"$2\"\n", 0755);
    veldtest::writeFile(NETWORK_TOOL_CALLS, "");
}

size_t takeNetworkToolCalls() {
    const std::string calls = veldtest::readFile(NETWORK_TOOL_CALLS);
    veldtest::writeFile(NETWORK_TOOL_CALLS, "");
    return static_cast<size_t>(std::count(calls.begin(), calls.end(), '\n'));
}

void installServices() {
    for (int n = 0; n < SERVICE_COUNT; ++n) {
        defineService(serviceName(n), {1000 + n, 3000 + n});
    }
    defineService(SERVICE_OF_SEVEN_PORTS, {7001, 7002, 7003, 7004, 7005, 7006, 7007});
}

void installCountries() {
    for (const std::string country : {"DE", "CH", "AT"}) {
        veldtest::writeFile(COUNTRIES + country + ".iv4", std::string(64, '\1'));
        veldtest::writeFile(COUNTRIES + country + ".iv6", std::string(64, '\1'));
    }
}

FW::FWPROFILE makeProfile(const std::string &name, size_t rules) {
    std::vector<std::string> adapters = interfaceNames();
    adapters.emplace_back(FW::FW_ADAPTER_GLOBAL);
    FW::FWPROFILE profile;
    profile.name = name;
    for (size_t n = 0; n < rules; ++n) {
        profile.rules[adapters[n / 8 % adapters.size()]].push_back(makeRule(n));
    }
    for (const std::string &adapter : adapters) {
        profile.adapterPolicyMap[adapter] = adapter == FW::FW_ADAPTER_GLOBAL ? FW::FW_POLICY_NONE : FW::FW_POLICY_DENY;
    }
    return profile;
}

Json::Value profileDocument(const FW::FWPROFILE &profile) {
    Json::Value document;
    FW::VELDFW_JSON_DB().profileToJson(profile, document);
    return document;
}

std::string documentText(const Json::Value &document) {
    return Json::StyledWriter().write(document);
}

std::string profileName(size_t n) {
    std::array<char, 32> name;
    std::snprintf(name.data(), name.size(), "profile %04zu", n);
    return name.data();
}

void clearStore() {
    veldtest::requireSandbox("empty the profile directory");
    veldtest::makeDirectories(STORE);
    for (const std::string &file : veldtest::listDirectory(STORE)) {
        veldtest::removeAll(std::string(STORE) + "/" + file);
    }
}

std::vector<std::string> fillStore(size_t profiles, size_t rulesEach) {
    clearStore();
    std::vector<std::string> paths;
    for (size_t n = 0; n < profiles; ++n) {
        paths.push_back(std::string(STORE) + "/" + std::to_string(1600000000 + n) + ".json");
        veldtest::writeFile(paths.back(), documentText(profileDocument(makeProfile(profileName(n), rulesEach))));
    }
    return paths;
}

}  // namespace veldbench
