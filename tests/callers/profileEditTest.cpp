// SPDX-License-Identifier: Apache-2.0
// Edits that span all stored profiles, the active profile, and the plain functions for both: what is stored, logged and
// reloaded, NULL and error codes.
#include "commandRecorder.h"
#include "files.h"
#include "storedConfiguration.h"

#include <gmock/gmock.h>
#include <veld/core.h>
#include <veldfirewall/veldFW.h>
#include <veldfirewall/veldIptablesModule.h>
#include <veldfirewall/veldfirewall_c.h>

#include <algorithm>
#include <functional>

using namespace FW;
using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class ProfileEdit : public testing::Test {
protected:
    void SetUp() override {
        installPlatformData();
        defineService("ssh", "tcp", R"("22")");
        defineService("web", "tcp", R"("80", "443")");
        const std::vector<FWRULE> rules = {serviceRule(FW_POLICY_DENY, {"ftp"})};
        storeProfile("1.json", {"a", {{"eth0", rules}}, {{"eth0", FW_POLICY_DENY}, {"global", FW_POLICY_ALLOW}}});
        storeProfile("2.json", {"b", {{"eth0", rules}}, {}});
        storeProfile("3.json", {"c", {}, {}});
        storeSettings(true, "a");
        VLIBCErrSetEx(0, "none", 0);
        recorder.clear();
    }
    /// How often rules were applied since the last call.
    std::ptrdiff_t reloads() {
        const auto lines = recorder.lines();
        recorder.clear();
        return std::count(lines.begin(), lines.end(), "/sbin/iptables --policy INPUT DROP");
    }
    /// The policy of the profile's front rule and the services that it reserves.
    static std::string reserved(const std::string &profile, const std::string &adapter = "global") {
        const auto rules = storedProfile(profile).rules[adapter];
        std::string text = rules.empty() ? "" : std::to_string(rules[0].policy) + ":";
        for (const std::string &name : rules.empty() ? std::vector<std::string>() : rules[0].portList)
            text += "[" + name + "]";
        return text;
    }

    CommandRecorder recorder;
    SystemLog log;
};

TEST_F(ProfileEdit, ReserveSplitsAtCommasTakesZeroForDenyAndReloadsOnceForOne) {
    struct Case {
        const char *list;
        int allow, reload;
        const char *front;
    };
    const Case cases[] = {{"ssh,web", 0, 0, "1:[ssh][web]"},
                          {"ssh,,web", -7, 2, "0:[ssh][web]"},
                          {",ssh,", 1, -1, "0:[][ssh]"},
                          {"ssh,web", 1, 1, "0:[ssh][web]"}};
    for (const Case &entry : cases) {
        SetUp();
        EXPECT_EQ(VLIBFwRuleReserveServInsert(entry.list, entry.allow, entry.reload), 0);
        for (const char *profile : {"a", "b", "c"})
            EXPECT_EQ(reserved(profile), entry.front);
        EXPECT_EQ(reloads(), entry.reload == 1 ? 1 : 0);
    }
    EXPECT_TRUE(VELDFW_PROFILE().profileAddServToReserve("eth1", "web", FW_POLICY_DENY, true));
    EXPECT_EQ(reloads(), 1);
    EXPECT_EQ(reserved("c", "eth1"), "1:[web]");
    EXPECT_EQ(storedProfile("c").adapterPolicyMap,
              (std::map<std::string, FW_POLICY>{{"eth1", FW_POLICY_ALLOW}, {"global", FW_POLICY_NONE}}));
    EXPECT_EQ(listDirectory(profileDirectory).size(), 4u) << "each in its own file";
    storeSettings(false, "a");
    EXPECT_EQ(VLIBFwRuleReserveServInsert("ssh", 1, 1), 0);
    EXPECT_EQ(reloads(), 0);
    EXPECT_THAT(errorsOf(log), IsEmpty());
}

TEST_F(ProfileEdit, ARemovedServiceLeavesEveryProfileAndNothingIsReloaded) {
    EXPECT_EQ(VLIBFwServRemoveRec("ftp"), 0);
    EXPECT_THAT(storedProfile("a").rules, IsEmpty());
    EXPECT_THAT(storedProfile("b").rules, IsEmpty());
    EXPECT_EQ(storedProfile("c").adapterPolicyMap.count("global"), 1u) << "stored, although not concerned";
    EXPECT_EQ(reloads(), 0);
}

TEST_F(ProfileEdit, ARenamedAdapterReloadsOnlyWhenTheActiveProfilesPoliciesNamedIt) {
    EXPECT_EQ(VLIBFwChangeAdatper("eth0", "bond0", 2), 0);
    EXPECT_EQ(reloads(), 0);
    EXPECT_EQ(storedProfile("a").adapterPolicyMap.at("bond0"), FW_POLICY_DENY);
    EXPECT_EQ(reserved("a", "bond0") + reserved("a", "eth0") + reserved("b", "bond0"), "1:[ftp]1:[ftp]");
    EXPECT_EQ(VLIBFwChangeAdatper("bond0", "bond1", 1), 0);
    EXPECT_EQ(reloads(), 1);
    // The active profile names the adapter in its rules alone, another profile in its policies.
    storeProfile("1.json", {"a", {{"eth0", {serviceRule(FW_POLICY_DENY, {"ssh"})}}}, {}});
    storeProfile("2.json", {"b", {}, {{"eth0", FW_POLICY_DENY}}});
    EXPECT_EQ(VLIBFwChangeAdatper("eth0", "eth5", 1), 0);
    EXPECT_EQ(reloads(), 0);
    writeFile(settingsFile, R"({"status": true})");
    EXPECT_EQ(VLIBFwChangeAdatper("eth5", "eth6", 1), -1) << "needs the name of the active profile";
    EXPECT_EQ(storedProfile("b").adapterPolicyMap.count("eth6"), 0u);
}

TEST_F(ProfileEdit, TheFirstProfileThatCannotBeStoredEndsTheEditWithoutAReload) {
    const std::pair<std::function<int()>, std::vector<std::string>> edits[] = {
        {[] { return VLIBFwRuleReserveServInsert("ssh,web", 1, 1); },
         {"veldFW.cpp Failed to set profile", "veldfirewall_c.cpp Failed to assign serv [ssh]"}},
        {[] { return VLIBFwServRemoveRec("ftp"); }, {"veldFW.cpp Failed to profile set [b]"}},
        {[] { return VLIBFwChangeAdatper("eth0", "eth1", 1); }, {"veldFW.cpp Failed to profile set [b]"}},
    };
    const auto text = [](const char *file) { return readFile(profileDirectory + file); };
    makeDirectories(profileDirectory + "2.json.tmp");  // in the way of the write
    for (const auto &[edit, errors] : edits) {
        SetUp();
        const std::string first = text("1.json"), others = text("2.json") + text("3.json");
        log.clear();
        EXPECT_EQ(edit(), -1);
        EXPECT_NE(text("1.json"), first);
        EXPECT_EQ(text("2.json") + text("3.json"), others);
        EXPECT_EQ(reloads(), 0);
        EXPECT_THAT(errorsOf(log), testing::IsSupersetOf(errors));
    }
    EXPECT_EQ(VELDFwRuleHup(), -1) << "no reload after a failed update";
    EXPECT_EQ(reloads(), 0);
}

TEST_F(ProfileEdit, TheActiveProfileIsStoredBesideOtherSettingsAndAppliedOnlyOnRequest) {
    const auto active = [] {
        std::string name;
        EXPECT_TRUE(VELDFW().fwProfileConfigGet(name));
        return name;
    };
    storeProfile("2.json", {"b", {{"global", {portRule(FW_POLICY_DENY, "81")}}}, {}});
    writeFile(settingsFile, R"({"status": true, "profile": "a", "foreign": [1]})");
    for (const std::string name : {"A", "", "gone"}) {
        EXPECT_FALSE(VELDFW().fwProfileConfigSet(name, true));
        EXPECT_EQ(lastError(log), "veldFW.cpp Profile " + name + " is not in database");
    }
    EXPECT_EQ(active(), "a");
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("b", false));
    EXPECT_EQ(active(), "b");
    EXPECT_THAT(readFile(settingsFile), testing::HasSubstr("foreign"));
    EXPECT_EQ(reloads(), 0);
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("b", true));
    EXPECT_THAT(recorder.lines(), Contains("/sbin/iptables -t filter -A INPUT_FIREWALL -p tcp --dport 81 -j DROP"));
    recorder.failMatching("--dport 81");
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("b", true));
    EXPECT_EQ(active(), "b");
    EXPECT_FALSE(storedStatus());
    reloads();
    EXPECT_TRUE(VELDFW().fwProfileConfigSet("a", true)) << "only stored while the firewall is off";
    EXPECT_EQ(reloads(), 0);
    makeDirectories(settingsFile + ".tmp");  // in the way of the write
    EXPECT_FALSE(VELDFW().fwProfileConfigSet("b", false));
    EXPECT_EQ(lastError(log), "veldFW.cpp Falied to configSet()");
    EXPECT_EQ(active(), "a");
}

TEST_F(ProfileEdit, NullIsRefusedAndNoExceptionReachesAProgramThatCannotCatchIt) {
    for (const char *list : {static_cast<const char *>(nullptr), ""}) {
        EXPECT_EQ(VLIBFwRuleReserveServInsert(list, 1, 1), -1);
        EXPECT_EQ(VLIBCErrGet(), 0x0D00);
        EXPECT_STREQ(VLIBCErrorGetFile(), "veldfirewall_c.cpp");
        VLIBCErrSetEx(0, "none", 0);
    }
    EXPECT_EQ(VLIBFwServRemoveRec(nullptr), -1);
    EXPECT_EQ(VLIBFwChangeAdatper("eth0", nullptr, 1), -1);
    EXPECT_EQ(VLIBFwChangeAdatper(nullptr, nullptr, 1), -1);
    EXPECT_EQ(VLIBCErrGet(), 0);
    EXPECT_THAT(log.messages(), IsEmpty());
    writeFile(profileDirectory + "1.json", R"({"name": "a", "rules": {"eth0": [{"policy": {}}]}})");
    EXPECT_EQ(VELDFwRuleHup(), -1);
    EXPECT_EQ(lastError(log), "veldfirewall_c.cpp Ended by an exception: Value is not convertible to Int.");
    EXPECT_EQ(VLIBFwServRemoveRec("ssh"), -1);
    EXPECT_EQ(VLIBFwChangeAdatper("eth0", "eth1", 1), -1);
    EXPECT_EQ(VELDFwPortsCheckAllowByAdapter("eth0", "ssh"), -1);
    EXPECT_EQ(VLIBFwRuleReserveServInsert("ssh", 1, 1), -1);
    EXPECT_EQ(reloads(), 0);
}

TEST_F(ProfileEdit, HupUpdatesAndReloadsAndResetSwitchesOff) {
    storeProfile("1.json", {"a", {{"eth0", {serviceRule(FW_POLICY_DENY, {"gone", "ssh"})}}}, {}});
    EXPECT_EQ(VELDFwRuleHup(), 0);
    EXPECT_EQ(reserved("a", "eth0"), "1:[ssh]");
    EXPECT_THAT(recorder.lines(), Contains("/sbin/iptables -A INPUT_FIREWALL -m state --state ESTABLISHED,RELATED -j "
                                           "ACCEPT"));
    VELDFwReset();
    EXPECT_FALSE(storedStatus());
    EXPECT_THAT(recorder.lines(), Contains("/sbin/ip6tables -F FORWARD_FIREWALL"));
}

TEST_F(ProfileEdit, ModulesAreMarkedForTheirOwner) {
    using Functions = std::pair<int (*)(const char *), int (*)(const char *)>;
    for (const auto &[load, unload] : {Functions{VELDIptablesCodeModeLoad, VELDIptablesCoreModUnload},
                                       Functions{VELDIptablesNATModLoad, VELDIptablesNATModUnload}}) {
        EXPECT_EQ(load("nas"), 0);
        EXPECT_TRUE(VELD_IPTABLES_MODULES::isModuleLoad("nas"));
        EXPECT_EQ(unload("nas"), 0);
        EXPECT_FALSE(VELD_IPTABLES_MODULES::isModuleLoad("nas"));
        EXPECT_EQ(load(nullptr), -1);
        EXPECT_EQ(unload(nullptr), -1);
        EXPECT_EQ(lastError(log), "veldIptablesModule.cpp servName is NULL");
    }
}

}  // namespace
