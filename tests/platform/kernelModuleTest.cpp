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

/// A module directory in which veld_builtin is compiled in and veld_broken is a file that no kernel loads.
bool makeModuleDirectory() {
    makeDirectories(modules + "/kernel");
    writeFile(modules + "/modules.builtin", "kernel/veld_builtin.ko\n");
    writeFile(modules + "/modules.order", "kernel/veld_broken.ko\n");
    // Any relocatable object is a module to depmod.
    writeFile("/run/empty.c", "int veld_broken;\n");
    runChecked({"cc", "-c", "-o", modules + "/kernel/veld_broken.ko", "/run/empty.c"});
    return access("/sbin/depmod", X_OK) == 0 && runProgram({"/sbin/depmod", "-b", "/run", "1.0"}).succeeded();
}

TEST(KernelModules, FileNamesBecomeModuleNames) {
    const std::pair<const char *, const char *> names[] = {{"xt_mac.ko", "xt_mac"},
                                                           {"xt-mac.ko.xz", "xt_mac"},
                                                           {"/lib/modules/x/xt_mac.ko.zst", "xt_mac"},
                                                           {"xt_mac", "xt_mac"},
                                                           {"", ""}};
    for (const auto &[file, name] : names)
        EXPECT_EQ(veld::moduleName(file), name) << file;
}

TEST(KernelModules, WithoutAModuleDirectoryAllAreUnknownAndThatIsNoFailure) {
    SystemLog log;
    EXPECT_TRUE(veld::insertModules("firewall", {"veld_one.ko", "", "veld_two.ko"}, "/run/none"));
    EXPECT_TRUE(log.contains("kernel module veld_one for firewall: not known to the running kernel")) << log.text();
    EXPECT_TRUE(log.contains("kernel module veld_two for firewall")) << log.text();
    EXPECT_TRUE(veld::removeModules("firewall", {"veld_one.ko", ""}, "/run/none"));
    EXPECT_EQ(log.messages().size(), 2U) << log.text();

    PVLIBCSZLIST list = VLIBCSzListAlloc(4);
    VLIBCSzListPush(&list, "veld_no_such_module.ko");
    VLIBCSzListPush(&list, "");
    EXPECT_EQ(VLIBIptablesModInsert("firewall", list), 0);
    EXPECT_EQ(VLIBIptablesModRemove("firewall", list), 0);
    VLIBCSzListFree(list);
    EXPECT_LT(VLIBIptablesModInsert("firewall", nullptr), 0);
}

TEST(KernelModules, ModuleThatExistsAndCannotBeLoadedIsAnErrorAndEndsTheList) {
    if (!makeModuleDirectory())
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
