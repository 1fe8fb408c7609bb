// SPDX-License-Identifier: Apache-2.0
// Kernel modules: what is skipped, what is an error. No real module is loaded.
#include "files.h"
#include "km/moduleActions.h"
#include "processes.h"
#include "systemLog.h"
#include "veld/km.h"

using namespace veldtest;

namespace {

TEST(KernelModules, UnknownOnesAreToldAndAreNoFailure) {
    for (const char *file : {"/lib/modules/x/xt-mac.ko.xz", "xt_mac"})
        EXPECT_EQ(veld::moduleName(file), "xt_mac");
    SystemLog log;
    PVLIBCSZLIST list = VLIBCSzListAlloc(4);
    VLIBCSzListPush(&list, "veld_no_such_module.ko");
    VLIBCSzListPush(&list, "");
    EXPECT_EQ(VLIBIptablesModInsert("firewall", list), 0);
    EXPECT_EQ(VLIBIptablesModRemove("firewall", list), 0);
    VLIBCSzListFree(list);
    EXPECT_EQ(log.count("kernel module veld_no_such_module for firewall: not known to the running kernel"), 1U);
    EXPECT_LT(VLIBIptablesModInsert("firewall", nullptr), 0);
}

TEST(KernelModules, ModuleThatExistsAndCannotBeLoadedIsAnErrorAndEndsTheList) {
    // One module is compiled in, the other a file that no kernel loads: any relocatable object is a module to depmod.
    const auto made = runProgram({"sh", "-ec", R"(
        mkdir -p /run/lib/modules/1.0/kernel
        cd /run/lib/modules/1.0
        echo kernel/veld_builtin.ko > modules.builtin
        echo kernel/veld_broken.ko > modules.order
        echo 'int veld_broken;' | cc -c -x c -o kernel/veld_broken.ko -
        /sbin/depmod -b /run 1.0)"});
    if (!made.succeeded())
        GTEST_SKIP() << "no working depmod on this machine: " << made.errors;
    constexpr const char *modules = "/run/lib/modules/1.0";
    SystemLog log;
    EXPECT_TRUE(veld::insertModules("firewall", {"veld_builtin.ko"}, modules));
    EXPECT_TRUE(log.messages().empty()) << log.text();
    EXPECT_FALSE(veld::insertModules("firewall", {"veld_broken.ko", "veld_after.ko"}, modules));
    EXPECT_TRUE(log.contains("kernel module veld_broken for firewall: cannot be loaded: ")) << log.text();
    EXPECT_FALSE(log.contains("veld_after")) << log.text();
    EXPECT_TRUE(veld::removeModules("firewall", {"veld_builtin.ko", "veld_broken.ko"}, modules)) << log.text();
}

}  // namespace
