// SPDX-License-Identifier: Apache-2.0
// What is installed is what the library reads: profile, service definitions, module list.
#include "files.h"
#include "processes.h"
#include "systemLog.h"

#include <veld/core.h>
#include <veld/serviceconf.h>
#include <veldfirewall/veldFW.h>
#include <veldfirewall/veldIptablesModule.h>

#include <syslog.h>

#include <set>

using namespace veldtest;

namespace {

const std::string shippedProfile = "/usr/veld/etc.defaults/firewall.d/1.json";
const std::string activeProfile = "/usr/veld/etc/firewall.d/1.json";
const std::string definitions = "/usr/veld/etc/services.d/";

void installData(const std::string &stage = "") {
    runChecked({"env", "DESTDIR=" + stage, VELD_CMAKE_COMMAND, "--install", VELD_BUILD_DIR, "--component", "data"});
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

std::vector<std::string> itemsOf(const VLIBCSZLIST *list) {
    return {list->items, list->items + list->nItem};
}

TEST_F(ShippedData, EveryServiceIsRegisteredUnderItsFileNameWithItsPortsInOrder) {
    VELDFWSERVICE_HANDLE registry = nullptr;
    ASSERT_GT(VELDFwServiceEnum(&registry), 0);
    const auto files = listDirectory(definitions);
    EXPECT_GE(files.size(), 30u);
    for (const auto &file : files) {
        SCOPED_TRACE(file);
        const auto *service = VELDFWServiceFind(registry, file.substr(0, file.rfind(".json")).c_str());
        ASSERT_NE(service, nullptr);
        EXPECT_NE(service->data, 0);
        EXPECT_THAT(service->dstProtocol,
                    testing::AnyOf(VELDFW_SERVICE_TCP, VELDFW_SERVICE_UDP, VELDFW_SERVICE_TCP_UDP));
        EXPECT_TRUE(itemsOf(service->srcPorts).empty()) << "a server's clients use any port";
        EXPECT_FALSE(itemsOf(service->dstPorts).empty());
        int last = 0;
        for (const auto &port : itemsOf(service->dstPorts)) {
            EXPECT_GT(std::stoi(port), last) << "out of order or double: " << port;
            last = std::stoi(port.substr(port.find('-') + 1));
        }
    }
    // Their names select the raw IP protocols beside the ports.
    EXPECT_THAT(itemsOf(VELDFWServiceFind(registry, "vpn_server_pptp")->dstPorts), testing::ElementsAre("1723"));
    EXPECT_THAT(itemsOf(VELDFWServiceFind(registry, "vpn_server_ipsec")->dstPorts),
                testing::ElementsAre("500", "4500"));
    VELDFwServiceFree(registry);
}

TEST_F(ShippedData, EveryModuleListCanBeReadAndHoldsModuleFiles) {
    std::set<std::string> seen;
    for (const char *key : {"KERNEL_MODULES_CORE", "KERNEL_MODULES_COMMON", "IPV6_MODULES", "KERNEL_MODULES_NAT"}) {
        std::vector<std::string> modules;
        ASSERT_TRUE(FW::VELD_IPTABLES_MODULES::iptablesModListGet(key, modules)) << key;
        for (const auto &module : modules) {
            EXPECT_THAT(module, testing::MatchesRegex("[a-zA-Z0-9_]+\\.ko"));
            EXPECT_TRUE(seen.insert(module).second) << module << " is listed twice";
        }
    }
}

TEST_F(ShippedData, TheActiveProfileStaysAsItIsWhenStoredAndOpensPortsToTheLocalNetworkOnly) {
    FW::VELDFW_PROFILE store;
    FW::VELDFW firewall;
    std::string name;
    ASSERT_TRUE(firewall.fwProfileConfigGet(name));
    FW::FWPROFILE profile;
    ASSERT_TRUE(store.profileGet(name, profile));
    Json::Value before;
    Json::Value after;
    ASSERT_TRUE(store.profileDbLoad(name, before));
    ASSERT_TRUE(store.profileSet(name, profile));
    ASSERT_TRUE(store.profileDbLoad(name, after));
    EXPECT_EQ(before, after);

    Json::Value on;
    on["status"] = true;
    ASSERT_TRUE(firewall.configSet(on));
    for (const char *port : {"22", "445", "5000", "65535"}) {
        for (const auto protocol : {FW::FW_PROTO_TCP, FW::FW_PROTO_UDP}) {
            FW::PortCompareST query;
            query.protocol = protocol;
            query.port = port;
            std::map<std::string, FW::FW_POLICY> verdicts;
            ASSERT_TRUE(firewall.fwPortIsBlocked(query, "eth0", verdicts));
            EXPECT_EQ(verdicts["eth0"], FW::FW_POLICY_PARTIAL) << port;
        }
    }
}

TEST(InstallData, WhatBelongsToTheMachineIsNeverOverwrittenAndAStageTakesEverything) {
    installData("/tmp/stage");
    EXPECT_TRUE(listDirectory("/usr/veld").empty());
    for (const std::string &path :
         {shippedProfile, definitions + "smb.json", std::string("/usr/veld/etc.defaults/iptables_modules_list"),
          std::string("/etc.defaults/veldinfo.conf")})
        EXPECT_TRUE(pathExists("/tmp/stage" + path)) << path;
    EXPECT_FALSE(pathExists("/etc.defaults/veldinfo.conf"));
    for (const std::string &path : {activeProfile, std::string("/etc.defaults/veldinfo.conf")})
        writeFile(path, "the administrator's");
    installData();
    for (const std::string &path : {activeProfile, std::string("/etc.defaults/veldinfo.conf")})
        EXPECT_EQ(readFile(path), "the administrator's");
    EXPECT_TRUE(pathExists(shippedProfile));
}

}  // namespace
