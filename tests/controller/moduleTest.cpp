// SPDX-License-Identifier: Apache-2.0
// Which modules are handed to the platform, in which order, and what the state file says afterwards.
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <veld/km.h>

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

// Found before those of libveldkm.
extern "C" __attribute__((visibility("default"))) int VLIBIptablesModInsert(const char *owner,
                                                                            const VLIBCSZLIST *list) {
    return noteCall("insert", owner, list);
}

extern "C" __attribute__((visibility("default"))) int VLIBIptablesModRemove(const char *owner,
                                                                            const VLIBCSZLIST *list) {
    return noteCall("remove", owner, list);
}

namespace {

using Modules = FW::VELD_IPTABLES_MODULES;

class ModuleTest : public FirewallTest {
protected:
    ModuleTest() {
        calls.clear();
        failingCall.clear();
        writeFile(MODULE_LIST,
                  "KERNEL_MODULES_CORE=\"c1  c2 \"\nKERNEL_MODULES_COMMON=m1\nKERNEL_MODULES_NAT=\"n1 n2\"\n"
                  "IPV6_MODULES=\"v1 v2\"\n");
    }

    static std::string state() { return pathExists(MODULE_STATE) ? readFile(MODULE_STATE) : ""; }
};

TEST_F(ModuleTest, CoreIsInsertedInOrderAndRemovedBackwards) {
    EXPECT_EQ(VELDIptablesCodeModeLoad("nat-box"), 0);
    EXPECT_EQ(state(), "nat-box=\"yes\"\n");
    EXPECT_TRUE(Modules::isModuleLoad("nat-box"));
    EXPECT_EQ(VELDIptablesCoreModUnload("nat-box"), 0);
    EXPECT_EQ(state(), "nat-box=\"no\"\n");
    EXPECT_FALSE(Modules::isModuleLoad("nat-box"));
    EXPECT_THAT(calls, ElementsAre("insert nat-box c1,c2,m1,v1,v2", "remove nat-box v2,v1,m1,c2,c1"));
}

TEST_F(ModuleTest, NatComesAfterCoreAndLeavesBeforeIt) {
    EXPECT_EQ(VELDIptablesNATModLoad("router"), 0);
    EXPECT_EQ(VELDIptablesNATModUnload("router"), 0);
    EXPECT_THAT(calls, ElementsAre("insert router c1,c2,m1,v1,v2", "insert router n1,n2", "remove router n2,n1",
                                   "remove router v2,v1,m1,c2,c1"));
    EXPECT_EQ(state(), "router=\"no\"\n");
}

TEST_F(ModuleTest, EachOwnerHasItsOwnState) {
    EXPECT_TRUE(Modules::moduleInsert("a", {"x.ko", "", "y.ko"}));
    EXPECT_TRUE(Modules::moduleInsert("b", {"x.ko"}));
    EXPECT_TRUE(Modules::moduleRemove("a", {"x.ko"}));
    EXPECT_EQ(state(), "a=\"no\"\nb=\"yes\"\n");
    EXPECT_FALSE(Modules::isModuleLoad("a"));
    EXPECT_TRUE(Modules::isModuleLoad("b"));
    EXPECT_FALSE(Modules::isModuleLoad("c"));
    EXPECT_THAT(calls, ElementsAre("insert a x.ko,,y.ko", "insert b x.ko", "remove a x.ko"));
}

TEST_F(ModuleTest, FailureOfThePlatformLeavesTheStateAndStopsTheRest) {
    failingCall = "insert router c1,c2,m1,v1,v2";
    EXPECT_EQ(VELDIptablesNATModLoad("router"), -1);
    EXPECT_EQ(state(), "");
    EXPECT_THAT(errors(), ElementsAre("veldIptablesModule.cpp Failed to VLIBIptablesModInsert()",
                                      "veldIptablesModule.cpp Failed to moduleInsert(router, c1 c2 m1 v1 v2)"));
    failingCall.clear();
    EXPECT_EQ(VELDIptablesNATModLoad("router"), 0);
    log.clear();
    calls.clear();
    failingCall = "remove router n2,n1";
    EXPECT_EQ(VELDIptablesNATModUnload("router"), -1);
    EXPECT_EQ(state(), "router=\"yes\"\n");
    EXPECT_THAT(calls, ElementsAre("remove router n2,n1"));
    EXPECT_THAT(errors(), ElementsAre("veldIptablesModule.cpp Failed to VLIBIptablesModRemove()",
                                      "veldIptablesModule.cpp Failed to moduleRemove(router, n2 n1)"));
}

struct ListFile {
    const char *name;
    const char *text;
    std::vector<std::string> core;  ///< empty: cannot be read
    const char *missing;
};

class ModuleListFile : public ModuleTest, public testing::WithParamInterface<ListFile> {};

TEST_P(ModuleListFile, IsReadAsAWholeOrNotAtAll) {
    const ListFile &file = GetParam();
    writeFile(MODULE_LIST, file.text);
    std::vector<std::string> modules = {"untouched"};
    EXPECT_EQ(Modules::coreCommonModuleLoad(modules), !file.core.empty());
    EXPECT_EQ(modules, file.core.empty() ? std::vector<std::string>{"untouched"} : file.core);
    if (file.core.empty()) {
        EXPECT_EQ(VELDIptablesNATModLoad("x"), -1);
        EXPECT_EQ(VELDIptablesCoreModUnload("x"), -1);
        EXPECT_THAT(calls, IsEmpty());
        EXPECT_EQ(errors()[0],
                  std::string("veldIptablesModule.cpp Failed to get key ") + file.missing + " from " + MODULE_LIST);
    }
}

INSTANTIATE_TEST_SUITE_P(
    Case, ModuleListFile,
    testing::Values(ListFile{"BlanksBetween",
                             "KERNEL_MODULES_CORE=\"a  b\"\nKERNEL_MODULES_COMMON=\" c \"\nIPV6_MODULES=d\n",
                             {"a", "b", "c", "d"},
                             ""},
                    ListFile{"BlanksAtTheEnds",
                             "KERNEL_MODULES_CORE=\" a\"\nKERNEL_MODULES_COMMON=b\nIPV6_MODULES=\"c \"\n",
                             {"", "a", "b", "c", ""},
                             ""},
                    ListFile{"NoIpv6", "KERNEL_MODULES_CORE=a\nKERNEL_MODULES_COMMON=b\n", {}, "IPV6_MODULES"},
                    ListFile{"EmptyIpv6",
                             "KERNEL_MODULES_CORE=a\nKERNEL_MODULES_COMMON=b\nIPV6_MODULES=\"\"\n",
                             {},
                             "IPV6_MODULES"},
                    ListFile{"NoCommon", "KERNEL_MODULES_CORE=a\nIPV6_MODULES=b\n", {}, "KERNEL_MODULES_COMMON"},
                    ListFile{"Empty", "", {}, "KERNEL_MODULES_CORE"}),
    [](const auto &entry) { return entry.param.name; });

TEST_F(ModuleTest, NatListThatIsMissingStopsNatBeforeAnyModule) {
    writeFile(MODULE_LIST, "KERNEL_MODULES_CORE=a\nKERNEL_MODULES_COMMON=b\nIPV6_MODULES=c\nOTHER=\"x y\"\n");
    EXPECT_EQ(VELDIptablesNATModLoad("x"), -1);
    EXPECT_EQ(VELDIptablesNATModUnload("x"), -1);
    EXPECT_THAT(calls, IsEmpty());
    EXPECT_THAT(errors(), Contains("veldIptablesModule.cpp Failed to natModuleLoad()").Times(2));
    std::vector<std::string> modules = {"old"};
    EXPECT_TRUE(Modules::iptablesModListGet("OTHER", modules));
    EXPECT_THAT(modules, ElementsAre("x", "y"));
    EXPECT_FALSE(Modules::iptablesModListGet("NONE", modules));
    EXPECT_THAT(modules, ElementsAre("x", "y"));
}

TEST_F(ModuleTest, OnlyTheExactYesCountsAsLoaded) {
    for (const auto &[value, loaded] : {std::pair("\"yes\"", true),
                                        {"yes", true},
                                        {"\"yes \"", false},
                                        {"YES", false},
                                        {"yess", false},
                                        {"no", false},
                                        {"\"\"", false}}) {
        writeFile(MODULE_STATE, std::string("other=yes\nfw=") + value + "\n");
        EXPECT_EQ(Modules::isModuleLoad("fw"), loaded) << value;
    }
    EXPECT_THAT(errors(), IsEmpty());
}

TEST_F(ModuleTest, StateFilePlantedByAnotherUserIsNotTrusted) {
    writeFile(MODULE_STATE, "fw=yes\n");
    if (chown(MODULE_STATE, 65534, 65534) != 0)
        GTEST_SKIP() << "only one user id exists here: no file of another user";
    EXPECT_FALSE(Modules::isModuleLoad("fw"));
    EXPECT_TRUE(Modules::moduleInsert("fw", {"x.ko"}));
    struct stat status {};
    ASSERT_EQ(stat(MODULE_STATE, &status), 0);
    EXPECT_EQ(status.st_uid, geteuid());
    EXPECT_EQ(state(), "fw=\"yes\"\n");
}

TEST_F(ModuleTest, LinkPlantedAsStateFileIsNotFollowed) {
    writeFile("/tmp/victim", "precious\n");
    ASSERT_EQ(symlink("/tmp/victim", MODULE_STATE), 0);
    EXPECT_TRUE(Modules::moduleInsert("fw", {"x.ko"}));
    EXPECT_EQ(readFile("/tmp/victim"), "precious\n");
    EXPECT_TRUE(Modules::isModuleLoad("fw"));
}

TEST_F(ModuleTest, StateIsWrittenAlsoWithoutItsLock) {
    std::string path = FW::getLockFile(MODULE_STATE);
    const int file = open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600);
    struct flock whole {};
    whole.l_type = F_WRLCK;
    whole.l_whence = SEEK_SET;
    ASSERT_EQ(fcntl(file, F_OFD_SETLK, &whole), 0);
    EXPECT_TRUE(Modules::moduleInsert("fw", {"x.ko"}));  // after 30 seconds
    EXPECT_EQ(state(), "fw=\"yes\"\n");
    EXPECT_THAT(errors(), Contains("veldIptablesModule.cpp Failed to get lock " + path + " but still continue"));
    close(file);
}

TEST_F(ModuleTest, StateThatCannotBeWrittenFailsTheCall) {
    EXPECT_FALSE(Modules::moduleInsert("bad=key", {"x.ko"}));
    ASSERT_EQ(errors().size(), 1u) << log.text();
    EXPECT_THAT(errors()[0], testing::StartsWith("veldIptablesModule.cpp failed to set key /tmp/iptables_serv_mod_list "
                                                 "to file bad=key[0x"));
}

TEST_F(ModuleTest, PlainFunctionsRefuseNoName) {
    for (int (*function)(const char *) :
         {VELDIptablesCodeModeLoad, VELDIptablesCoreModUnload, VELDIptablesNATModLoad, VELDIptablesNATModUnload})
        EXPECT_EQ(function(nullptr), -1);
    EXPECT_THAT(errors(), Contains("veldIptablesModule.cpp servName is NULL").Times(4));
    EXPECT_THAT(calls, IsEmpty());
}

TEST_F(ModuleTest, FirewallAddsItsOwnAfterCoreAndRemovesThemBeforeIt) {
    const CommandRecorder recorder;
    EXPECT_TRUE(firewall.fwEnable());
    EXPECT_TRUE(firewall.fwReload(true));
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_THAT(calls,
                ElementsAre("insert firewall c1,c2,m1,v1,v2", "insert firewall compat_xtables.ko,xt_geoip.ko,xt_mac.ko",
                            "remove firewall xt_mac.ko,xt_geoip.ko,compat_xtables.ko",
                            "remove firewall v2,v1,m1,c2,c1"));
}

TEST_F(ModuleTest, FirewallIsSwitchedOffEvenIfItsModulesStay) {
    const CommandRecorder recorder;
    EXPECT_TRUE(firewall.fwEnable());
    calls.clear();
    failingCall = "remove firewall xt_mac.ko,xt_geoip.ko,compat_xtables.ko";
    EXPECT_TRUE(firewall.fwDisable());
    EXPECT_FALSE(isSwitchedOn());
    EXPECT_THAT(calls, ElementsAre(failingCall));
    EXPECT_THAT(errors(), ElementsAre("veldIptablesModule.cpp Failed to VLIBIptablesModRemove()",
                                      "veldFW.cpp Failed to moduleInsert()"));
}

TEST_F(ModuleTest, FirewallIsNotSwitchedOnWithoutItsModules) {
    const CommandRecorder recorder;
    installNotingHooks();
    failingCall = "insert firewall compat_xtables.ko,xt_geoip.ko,xt_mac.ko";
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_THAT(recorder.lines(), IsEmpty());
    EXPECT_THAT(hookRuns(), IsEmpty());
    EXPECT_THAT(errors(), ElementsAre("veldIptablesModule.cpp Failed to VLIBIptablesModInsert()",
                                      "veldFW.cpp Failed to moduleInsert()", "veldFW.cpp Failed to firewallModLoad()"));
}

}  // namespace
