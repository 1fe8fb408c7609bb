// SPDX-License-Identifier: Apache-2.0
// Directories with their parents, and plug-in hooks.
#include "veld/sdk.h"
#include "planting.h"
#include "sdk/hookDirectory.h"
#include "systemLog.h"

using namespace veldtest;

namespace {

const std::string hooks = "/usr/veld/etc/hooks.d/net/firewall_enable/";

void installHook(const std::string &name, const std::string &script, mode_t mode = 0755) {
    writeFile(hooks + name, "#!/bin/sh\n" + script + "\n", mode);
}

int runHook(int code, const char *result = "0", const char *hook = "net/firewall_enable") {
    VLIBPLUGIN_HANDLE handle = nullptr;
    if (VLIBPluginSDKInit("net", hook, &handle) < 0)
        return -2;
    EXPECT_EQ(VLIBPluginSetArg(handle, "RESULT", result), 0);
    const int outcome = VLIBPluginAction(code, handle);
    VLIBPluginExit(handle);
    return outcome;
}

TEST(MkdirP, CreatesParentsAcceptsWhatIsThereAndTellsWhatFails) {
    umask(022);
    const std::pair<const char *, int> cases[] = {
        {"/var/lock/firewall/", 0}, {"/var/lock/firewall/", 0}, {"/", 0},     {"/run//a/b///c//", 0},
        {"/etc/passwd", ENOTDIR},   {"/etc/passwd/x", ENOTDIR}, {"", ENOENT}, {"/proc/veld/x", ENOENT}};
    for (const auto &[path, error] : cases) {
        errno = 0;
        EXPECT_EQ(VELDFSMkdirP(path, 0770), error == 0 ? 0 : -1) << path;
        EXPECT_TRUE(error == 0 || errno == error) << path;
    }
    struct stat info {};
    ASSERT_EQ(stat("/var/lock/firewall", &info), 0);
    EXPECT_EQ(info.st_mode & 07777U, 0750U) << "the mode is subject to the umask";
    ASSERT_EQ(stat("/run/a/b", &info), 0);
    EXPECT_EQ(info.st_mode & 07700U, 0700U) << "parents can be entered by their owner";
}

TEST(MkdirP, DirectoryPlantedInASharedOneIsRefused) {
    SKIP_WITHOUT_OTHER_USERS();
    SystemLog log;
    ASSERT_EQ(asStranger([] { return mkdir("/var/lock/firewall", 0777) == 0 && symlink("/etc", "/tmp/dir") == 0; }), 0);
    for (const char *path : {"/var/lock/firewall/", "/tmp/dir"}) {
        EXPECT_EQ(VELDFSMkdirP(path, 0770), -1) << path;
        EXPECT_EQ(errno, EPERM) << path;
    }
    EXPECT_TRUE(log.contains("/var/lock/firewall belongs to user 65534; it is not used")) << log.text();
}

TEST(Hook, ExecutablesRunInByteOrderWithActionAndArguments) {
    SystemLog log;
    EXPECT_EQ(runHook(VLIB_PLUGIN_PRE), 0) << "a hook that nobody has";
    for (const char *name : {"10", "9", "B", ".hidden"})
        installHook(name, std::string("echo ") + name + " >> /run/trace");
    installHook("b", "echo b $1 $RESULT $HOME >> /run/trace");
    installHook("readme", "echo readme >> /run/trace", 0644);
    makeDirectories(hooks + "directory");
    setenv("HOME", "/home/x", 1);
    setenv("RESULT", "of the host program", 1);
    EXPECT_EQ(runHook(VLIB_PLUGIN_PRE), 0) << log.text();
    EXPECT_EQ(runHook(VLIB_PLUGIN_POST, "-1"), 0);
    EXPECT_EQ(readFile("/run/trace"), "10\n9\nB\nb pre 0 /home/x\n10\n9\nB\nb post -1 /home/x\n");
    EXPECT_TRUE(log.messages().empty()) << log.text();
    EXPECT_EQ(runHook(VLIB_PLUGIN_PRE, "0", "net/firewall_enable/b"), -1) << "no directory";
    for (const char *name : {"", "/etc", "../etc", "net/../../etc", "net//x", "net/", ".", "net/.x"})
        EXPECT_EQ(runHook(VLIB_PLUGIN_PRE, "0", name), -2) << name;
}

TEST(Hook, FailingAndHangingProgramsAreNamedAndTheOthersStillRun) {
    SystemLog log;
    installHook("1-fails", "echo broken >&2; exit 3");
    installHook("2-dies", "kill -9 $$");
    writeFile(hooks + "3-nonsense", "#!/no/such/interpreter\n", 0755);
    installHook("4-hangs", "sleep 1000 & echo $! > /run/child; trap '' TERM; wait");
    installHook("5-works", "touch /run/worked");
    EXPECT_FALSE(veld::runHookDirectory(hooks, "pre", {}, std::chrono::seconds(1)));
    EXPECT_TRUE(pathExists("/run/worked"));
    for (const std::string reason :
         {"1-fails pre: broken", "1-fails pre: exited with status 3", "2-dies pre: was killed by signal 9 (KILL)",
          "3-nonsense pre: cannot be started", "4-hangs pre: still ran after 1000 ms and was killed"})
        EXPECT_TRUE(log.contains("firewall_enable//" + reason)) << reason << "\n" << log.text();
    // The hook's own child ends, too. An orphan stays a zombie until process 1 has collected it.
    EXPECT_EQ(runProgram({"sh", "-c", "while grep -q 'State:.[^Z]' /proc/$(cat /run/child)/status; do :; done"}).status,
              0);
}

}  // namespace
