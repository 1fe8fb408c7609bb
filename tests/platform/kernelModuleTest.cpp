// SPDX-License-Identifier: Apache-2.0
// Kernel modules: what is skipped, what is an error. No real module is loaded.
#include "files.h"
#include "km/moduleActions.h"
#include "processes.h"
#include "systemLog.h"
#include "veld/km.h"

#include <gtest/gtest.h>
#include <unistd.h>

using namespace veldtest;

namespace {

const std::string modules = "/run/lib/modules/1.0";

TEST(KernelModules, UnknownOnesAreToldAndAreNoFailure) {
    const std::pair<const char *, const char *> names[] = {{"/lib/modules/x/xt-mac.ko.xz", "xt_mac"},
                                                           {"xt_mac", "xt_mac"}};
    for (const auto &[file, name] : names)
        EXPECT_EQ(veld::moduleName(file), name) << file;
    SystemLog log;
    PVLIBCSZLIST list = VLIBCSzListAlloc(4);
    VLIBCSzListPush(&list, "veld_no_such_module.ko");
    VLIBCSzListPush(&list, "");
    EXPECT_EQ(VLIBIptablesModInsert("firewall", list), 0);
    EXPECT_EQ(VLIBIptablesModRemove("firewall", list), 0);
    VLIBCSzListFree(list);
    EXPECT_EQ(log.count("kernel module veld_no_such_module for firewall: not known to the running kernel"), 1U)
        << log.text();
    EXPECT_LT(VLIBIptablesModInsert("firewall", nullptr), 0);
}

TEST(KernelModules, ModuleThatExistsAndCannotBeLoadedIsAnErrorAndEndsTheList) {
    // One module is compiled in, the other a file that no kernel loads: any relocatable object is a module to depmod.
    makeDirectories(modules + "/kernel");
    writeFile(modules + "/modules.builtin", "kernel/veld_builtin.ko\n");
    writeFile(modules + "/modules.order", "kernel/veld_broken.ko\n");
    writeFile("/run/empty.c", "int veld_broken;\n");
    runChecked({"cc", "-c", "-o", modules + "/kernel/veld_broken.ko", "/run/empty.c"});
    if (access("/sbin/depmod", X_OK) != 0 || !runProgram({"/sbin/depmod", "-b", "/run", "1.0"}).succeeded())
        GTEST_SKIP() << "no working depmod on this machine";
    SystemLog log;
    EXPECT_TRUE(veld::insertModules("firewall", {"veld_builtin.ko"}, modules.c_str()));
    EXPECT_TRUE(log.messages().empty()) << log.text();
    EXPECT_FALSE(veld::insertModules("firewall", {"veld_broken.ko", "veld_after.ko"}, modules.c_str()));
    EXPECT_TRUE(log.contains("kernel module veld_broken for firewall: cannot be loaded: ")) << log.text();
    EXPECT_FALSE(log.contains("veld_after")) << log.text();
    EXPECT_TRUE(veld::removeModules("firewall", {"veld_builtin.ko", "veld_broken.ko"}, modules.c_str())) << log.text();
}

}  // namespace
