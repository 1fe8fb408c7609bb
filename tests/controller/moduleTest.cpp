// SPDX-License-Identifier: Apache-2.0
// Which modules are handed to the platform, in which order, and what the state file says afterwards.
#include <veld/core.h>
#include <veld/km.h>

#include <thread>

#include "commandRecorder.h"
#include "files.h"
#include "firewallTest.h"
#include "veldfirewall/utils.h"
#include "veldfirewall/veldIptablesModule.h"
#include "veldfirewall/veldfirewall_c.h"

using namespace veldtest;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

std::vector<std::string> calls;  ///< "insert owner a,b,"
std::string failingCall;         ///< the call with this text fails

int noteCall(const std::string &operation, const char *owner, const VLIBCSZLIST *list) {
    std::string call = operation + " " + owner + " ";
    for (int i = 0; i < list->nItem; ++i)
        call += (i > 0 ? "," : "") + std::string(VLIBCSzListGet(list, i));
    calls.push_back(call);
    return call == failingCall ? -1 : 0;
}

}  // namespace

// Found before those of libveldkm, by all tests of this program.
extern "C" {
__attribute__((visibility("default"))) int VLIBIptablesModInsert(const char *owner, const VLIBCSZLIST *list) {
    return noteCall("insert", owner, list);
}
__attribute__((visibility("default"))) int VLIBIptablesModRemove(const char *owner, const VLIBCSZLIST *list) {
    return noteCall("remove", owner, list);
}
}

namespace {

using Modules = FW::VELD_IPTABLES_MODULES;

const std::string ADD_CORE = "insert router c1,c2,m1,v1,v2";
const std::string ADD_NAT = "insert router n1,n2";
const std::string REMOVE_NAT = "remove router n2,n1";
const std::string REMOVE_CORE = "remove router v2,v1,m1,c2,c1";
const std::string ADD_OWN = "insert firewall compat_xtables.ko,xt_geoip.ko,xt_mac.ko";
const std::string REMOVE_OWN = "remove firewall xt_mac.ko,xt_geoip.ko,compat_xtables.ko";

class ModuleTest : public FirewallTest {
protected:
    ModuleTest() {
        writeFile(MODULE_LIST, "KERNEL_MODULES_CORE=\"c1  c2 \"\nKERNEL_MODULES_COMMON=m1\n"
                               "KERNEL_MODULES_NAT=\"n1 n2\"\nIPV6_MODULES=\"v1 v2\"\n");
    }
};

TEST_F(ModuleTest, ModulesAreInsertedInOrderAndRemovedBackwards) {
    EXPECT_EQ(VELDIptablesCodeModeLoad("router"), 0);
    EXPECT_TRUE(Modules::isModuleLoad("router"));
    EXPECT_FALSE(Modules::isModuleLoad("other"));
    EXPECT_EQ(VELDIptablesCoreModUnload("router"), 0);
    EXPECT_FALSE(Modules::isModuleLoad("router"));
    EXPECT_EQ(VELDIptablesNATModLoad("router"), 0);
    EXPECT_EQ(VELDIptablesNATModLoad("other"), 0);
    EXPECT_EQ(VELDIptablesNATModUnload("router"), 0);
    EXPECT_THAT(calls, ElementsAre(ADD_CORE, REMOVE_CORE, ADD_CORE, ADD_NAT, "insert other c1,c2,m1,v1,v2",
                                   "insert other n1,n2", REMOVE_NAT, REMOVE_CORE));
    EXPECT_EQ(readFile(MODULE_STATE), "router=\"no\"\nother=\"yes\"\n");
    for (auto *function :
         {VELDIptablesCodeModeLoad, VELDIptablesCoreModUnload, VELDIptablesNATModLoad, VELDIptablesNATModUnload})
        EXPECT_EQ(function(nullptr), -1);
    EXPECT_EQ(errors(), std::vector<std::string>(4, "veldIptablesModule.cpp servName is NULL"));
}

TEST_F(ModuleTest, FailureOfThePlatformLeavesTheStateAndStopsTheRest) {
    failingCall = ADD_CORE;
    EXPECT_EQ(VELDIptablesNATModLoad("router"), -1);
    EXPECT_FALSE(pathExists(MODULE_STATE));
    failingCall = REMOVE_NAT;
    EXPECT_EQ(VELDIptablesNATModLoad("router"), 0);
    EXPECT_EQ(VELDIptablesNATModUnload("router"), -1);
    EXPECT_EQ(readFile(MODULE_STATE), "router=\"yes\"\n");
    EXPECT_THAT(calls, ElementsAre(ADD_CORE, ADD_CORE, ADD_NAT, REMOVE_NAT));
    EXPECT_FALSE(Modules::moduleInsert("bad=key", {"x.ko"})) << "a state that cannot be written";
    EXPECT_THAT(errors(), ElementsAre("veldIptablesModule.cpp Failed to VLIBIptablesModInsert()",
                                      "veldIptablesModule.cpp Failed to moduleInsert(router, c1 c2 m1 v1 v2)",
                                      "veldIptablesModule.cpp Failed to VLIBIptablesModRemove()",
                                      "veldIptablesModule.cpp Failed to moduleRemove(router, n2 n1)",
                                      testing::HasSubstr("failed to set key /tmp/iptables_serv_mod_list")));
}

TEST_F(ModuleTest, ListIsReadAsAWholeOrNotAtAllAndOnlyTheExactYesCountsAsLoaded) {
    const std::string core = "KERNEL_MODULES_CORE=\" a  b\"\n";
    const std::string common = "KERNEL_MODULES_COMMON=c\n";
    const std::string ipv6 = "IPV6_MODULES=\"d \"\n";
    const std::pair<std::string, std::string> incomplete[] = {
        {"", "KERNEL_MODULES_CORE"},
        {core + ipv6, "KERNEL_MODULES_COMMON"},
        {core + common + "IPV6_MODULES=\"\"\n", "IPV6_MODULES"},
        {core + common + ipv6, "KERNEL_MODULES_NAT"},
    };
    for (const auto &[text, missing] : incomplete) {
        writeFile(MODULE_LIST, text);
        log.clear();
        EXPECT_EQ(VELDIptablesNATModLoad("x"), -1);
        EXPECT_EQ(VELDIptablesNATModUnload("x"), -1);
        EXPECT_THAT(errors(),
                    Contains("veldIptablesModule.cpp Failed to get key " + missing + " from " + MODULE_LIST).Times(2));
    }
    EXPECT_THAT(calls, IsEmpty());
    std::vector<std::string> modules;
    EXPECT_TRUE(Modules::coreCommonModuleLoad(modules));
    EXPECT_THAT(modules, ElementsAre("", "a", "b", "c", "d", "")) << "blanks at the ends stand for empty names";
    const std::pair<const char *, bool> states[] = {{"\"yes\"", true},   {"yes", true},   {"YES", false}, {"no", false},
                                                    {"\"yes \"", false}, {"yess", false}, {"\"\"", false}};
    for (const auto &[state, loaded] : states) {
        writeFile(MODULE_STATE, std::string("other=") + (loaded ? "no" : "yes") + "\nfw=" + state + "\n");
        EXPECT_EQ(Modules::isModuleLoad("fw"), loaded) << state;
    }
}

TEST_F(ModuleTest, AfterThirtySecondsTheStateIsWrittenWithoutItsLockAndAReloadIsGivenUp) {
    writeFile(SETTINGS, R"({"status": true, "profile": "default"})");
    const std::string path = FW::getLockFile(MODULE_STATE);
    int lock = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &lock), 1);
    int execLock = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile(EXEC_LOCK, 1, 0, &execLock), 1);
    std::thread reload([&] { EXPECT_FALSE(firewall.fwReload(true)); });
    EXPECT_TRUE(Modules::moduleInsert("fw", {"x.ko"}));
    reload.join();
    EXPECT_EQ(readFile(MODULE_STATE), "fw=\"yes\"\n");
    EXPECT_THAT(errors(),
                testing::IsSupersetOf({"veldIptablesModule.cpp Failed to get lock " + path + " but still continue",
                                       std::string("veldFW.cpp TIMEOUT: getting lock")}));
    EXPECT_TRUE(isSwitchedOn());
}

TEST_F(ModuleTest, FirewallNeedsItsOwnModulesButIsSwitchedOffEvenIfTheyStay) {
    const CommandRecorder recorder;
    installNotingHooks();
    failingCall = ADD_OWN;
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_THAT(recorder.lines(), IsEmpty());
    EXPECT_THAT(takeHookRuns(), IsEmpty());
    EXPECT_EQ(errors().back(), "veldFW.cpp Failed to firewallModLoad()");
    removeAll(MODULE_STATE);
    calls.clear();
    failingCall = REMOVE_OWN;
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_TRUE(firewall.fwReload(true)) << "which loads nothing again";
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_FALSE(isSwitchedOn());
    EXPECT_EQ(errors().back(), "veldFW.cpp Failed to moduleInsert()");
    failingCall.clear();
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_THAT(calls, ElementsAre("insert firewall c1,c2,m1,v1,v2", ADD_OWN, REMOVE_OWN, REMOVE_OWN,
                                   "remove firewall v2,v1,m1,c2,c1"));
}

}  // namespace
