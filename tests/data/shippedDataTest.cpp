// SPDX-License-Identifier: Apache-2.0
// What is installed is what the library reads: profile, service definitions, module list.
#include "files.h"
#include "processes.h"
#include "realIptables.h"
#include "sandbox.h"
#include "systemLog.h"

#include <veld/core.h>
#include <veld/serviceconf.h>
#include <veldfirewall/veldFW.h>
#include <veldfirewall/veldIptablesModule.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <syslog.h>

#include <algorithm>
#include <cstdlib>
#include <map>
#include <set>
#include <string>
#include <vector>

using namespace veldtest;

namespace {

const std::string shippedProfile = "/usr/veld/etc.defaults/firewall.d/1.json";
const std::string activeProfile = "/usr/veld/etc/firewall.d/1.json";
const std::string definitions = "/usr/veld/etc/services.d/";

void installData() {
    requireSandbox("install the data");
    runChecked({VELD_CMAKE_COMMAND, "--install", VELD_BUILD_DIR, "--component", "data"});
}

class ShippedData : public testing::Test {
protected:
    void SetUp() override {
        installData();
        ASSERT_FALSE(pathExists(activeProfile));
        writeFile(activeProfile, readFile(shippedProfile));
    }

    /// Whatever a reader refuses, it reports.
    void TearDown() override {
        for (const auto &message : m_log.messages())
            EXPECT_GT(message.priority, LOG_ERR) << message.text;
    }

    SystemLog m_log;
};

/// "80" gives {80, 80}; nothing when the text is neither a port nor a range of ports.
bool parsePorts(const std::string &text, std::pair<long, long> &range) {
    char *end = nullptr;
    range.first = std::strtol(text.c_str(), &end, 10);
    range.second = *end == '-' ? std::strtol(end + 1, &end, 10) : range.first;
    return !text.empty() && *end == '\0' && range.first >= 1 && range.first <= range.second && range.second <= 65535;
}

std::vector<std::string> itemsOf(const VLIBCSZLIST *list) {
    std::vector<std::string> items;
    for (int i = 0; VLIBCSzListGet(list, i) != nullptr; ++i)
        items.emplace_back(VLIBCSzListGet(list, i));
    return items;
}

TEST_F(ShippedData, EveryServiceIsRegisteredUnderItsFileNameWithValidPorts) {
    VELDFWSERVICE_HANDLE registry = nullptr;
    ASSERT_GT(VELDFwServiceEnum(&registry), 0);
    const auto files = listDirectory(definitions);
    EXPECT_GE(files.size(), 30u);
    for (const auto &file : files) {
        SCOPED_TRACE(file);
        const std::string name = file.substr(0, file.rfind(".json"));
        const auto *service = VELDFWServiceFind(registry, name.c_str());
        ASSERT_NE(service, nullptr);
        EXPECT_NE(service->data, 0);
        EXPECT_THAT(service->dstProtocol,
                    testing::AnyOf(VELDFW_SERVICE_TCP, VELDFW_SERVICE_UDP, VELDFW_SERVICE_TCP_UDP));
        const auto ports = itemsOf(service->dstPorts);
        EXPECT_FALSE(ports.empty());
        EXPECT_TRUE(itemsOf(service->srcPorts).empty()) << "a server's clients use any port";
        long last = 0;
        for (const auto &port : ports) {
            std::pair<long, long> range;
            EXPECT_TRUE(parsePorts(port, range)) << port;
            EXPECT_GT(range.first, last) << "out of order or double: " << port;
            last = range.second;
        }
    }
    // Their names select the raw IP protocols beside the ports.
    EXPECT_EQ(itemsOf(VELDFWServiceFind(registry, "vpn_server_pptp")->dstPorts), std::vector<std::string>{"1723"});
    EXPECT_EQ(itemsOf(VELDFWServiceFind(registry, "vpn_server_ipsec")->dstPorts),
              (std::vector<std::string>{"500", "4500"}));
    VELDFwServiceFree(registry);
}

TEST_F(ShippedData, EveryModuleListCanBeReadAndHoldsModuleFiles) {
    std::set<std::string> seen;
    for (const char *key : {"KERNEL_MODULES_CORE", "KERNEL_MODULES_COMMON", "IPV6_MODULES", "KERNEL_MODULES_NAT"}) {
        SCOPED_TRACE(key);
        std::vector<std::string> modules;
        ASSERT_TRUE(FW::VELD_IPTABLES_MODULES::iptablesModListGet(key, modules));
        EXPECT_FALSE(modules.empty());
        for (const auto &module : modules) {
            EXPECT_THAT(module, testing::MatchesRegex("[a-zA-Z0-9_]+\\.ko"));
            EXPECT_TRUE(seen.insert(module).second) << module << " is listed twice";
        }
    }
}

TEST_F(ShippedData, TheDefaultProfileIsTheActiveOneAndStoringChangesNothing) {
    FW::VELDFW_PROFILE store;
    std::string name;
    ASSERT_TRUE(FW::VELDFW().fwProfileConfigGet(name));
    FW::FWPROFILE profile;
    ASSERT_TRUE(store.profileGet(name, profile));
    Json::Value before;
    Json::Value after;
    ASSERT_TRUE(store.profileDbLoad(name, before));
    ASSERT_TRUE(store.profileSet(name, profile));
    ASSERT_TRUE(store.profileDbLoad(name, after));
    EXPECT_EQ(before, after);
}

TEST_F(ShippedData, PortsAreOpenToTheLocalNetworkOnly) {
    ASSERT_TRUE(FW::VELDFW().configSet([] {
        Json::Value on;
        on["status"] = true;
        return on;
    }()));
    for (const char *port : {"22", "445", "5000", "65535"}) {
        for (const auto protocol : {FW::FW_PROTO_TCP, FW::FW_PROTO_UDP}) {
            FW::PortCompareST query;
            query.protocol = protocol;
            query.port = port;
            std::map<std::string, FW::FW_POLICY> verdicts;
            ASSERT_TRUE(FW::VELDFW().fwPortIsBlocked(query, "eth0", verdicts));
            EXPECT_EQ(verdicts["eth0"], FW::FW_POLICY_PARTIAL) << port;
        }
    }
}

TEST_F(ShippedData, TheKernelAcceptsTheDefaultProfileAndItsRulesEndInADeny) {
    std::string reason;
    if (!realIptables(&reason))
        GTEST_SKIP() << "iptables does not work here: " << reason;
    createFirewallChains();
    // Without the network tool each rule would log that it is missing; it is a program of its own.
    writeFile("/usr/veld/sbin/veldnetdtool", "#!/bin/sh\nprintf %s \"$2\"\n", 0755);
    ASSERT_TRUE(FW::VELDFW().fwEnable());
    EXPECT_EQ(listRules("/sbin/iptables", FW::FW_CHAIN_INPUT).back(), "-A INPUT_FIREWALL -j DROP");
    EXPECT_EQ(listRules("/sbin/ip6tables", FW::FW_CHAIN_INPUT).back(), "-A INPUT_FIREWALL -j DROP");
}

TEST(InstallData, WhatBelongsToTheMachineIsNeverOverwritten) {
    writeFile(activeProfile, "the administrator's");
    writeFile("/etc.defaults/veldinfo.conf", "the machine's");
    installData();
    EXPECT_EQ(readFile(activeProfile), "the administrator's");
    EXPECT_EQ(readFile("/etc.defaults/veldinfo.conf"), "the machine's");
    EXPECT_TRUE(pathExists(shippedProfile));
}

TEST(InstallData, DestdirStagesEverything) {
    setenv("DESTDIR", "/tmp/stage", 1);
    installData();
    EXPECT_TRUE(pathExists("/tmp/stage" + shippedProfile));
    EXPECT_TRUE(pathExists("/tmp/stage" + definitions + "smb.json"));
    EXPECT_TRUE(pathExists("/tmp/stage/usr/veld/etc.defaults/iptables_modules_list"));
    EXPECT_TRUE(pathExists("/tmp/stage/etc.defaults/veldinfo.conf"));
    EXPECT_TRUE(listDirectory("/usr/veld").empty());
    EXPECT_FALSE(pathExists("/etc.defaults/veldinfo.conf"));
}

}  // namespace
