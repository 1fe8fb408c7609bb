// SPDX-License-Identifier: Apache-2.0
// Directories with their parents, and plug-in hooks.
#include "veld/sdk.h"
#include "files.h"
#include "planting.h"
#include "sdk/hookDirectory.h"
#include "systemLog.h"
#include "veld/core.h"

#include <sys/stat.h>

#include <unistd.h>

#include <cerrno>
#include <csignal>

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

TEST(MkdirP, CreatesParentsAndAcceptsWhatIsThere) {
    const mode_t mask = umask(022);
    EXPECT_EQ(VELDFSMkdirP("/var/lock/firewall/", 0770), 0);
    EXPECT_EQ(VELDFSMkdirP("/var/lock/firewall/", 0770), 0);
    EXPECT_EQ(VELDFSMkdirP("/run//a/b///c//", 0400), 0);
    EXPECT_EQ(VELDFSMkdirP("/", 0755), 0);
    umask(mask);
    struct stat info {};
    ASSERT_EQ(stat("/var/lock/firewall", &info), 0);
    EXPECT_EQ(info.st_mode & 07777U, 0750U) << "the mode is subject to the umask";
    ASSERT_EQ(stat("/run/a/b", &info), 0);
    EXPECT_EQ(info.st_mode & 07777U, 0700U) << "parents can be entered by their owner";
    makeDirectories("/run/real");
    ASSERT_EQ(symlink("/run/real", "/run/link"), 0);
    EXPECT_EQ(VELDFSMkdirP("/run/link", 0755), 0);
}

TEST(MkdirP, FailuresSetErrno) {
    writeFile("/run/file", "");
    const std::pair<const char *, int> cases[] = {
        {"/run/file", ENOTDIR}, {"/run/file/below", ENOTDIR}, {"", ENOENT}, {"/proc/veld/x", ENOENT}};
    for (const auto &[path, error] : cases) {
        errno = 0;
        EXPECT_EQ(VELDFSMkdirP(path, 0755), -1) << path;
        EXPECT_EQ(errno, error) << path;
    }
    EXPECT_EQ(VELDFSMkdirP(nullptr, 0755), -1);
}

TEST(MkdirP, ManyCreatorsAtOnceAllSucceed) {
    std::vector<pid_t> children;
    children.reserve(8);
    for (int i = 0; i < 8; ++i)
        children.push_back(startChild([] {
            for (int n = 0; n < 50; ++n) {
                const std::string path = "/run/race/" + std::to_string(n) + "/a/b/c/d";
                if (VELDFSMkdirP(path.c_str(), 0755) != 0)
                    return 1;
            }
            return 0;
        }));
    for (const pid_t child : children)
        EXPECT_EQ(waitForChild(child), 0);
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
    installHook("b", "echo b $1 $RESULT $HOME >> /run/trace");
    installHook("10", "echo 10 >> /run/trace");
    installHook("9", "echo 9 >> /run/trace");
    installHook("B", "echo B >> /run/trace");
    installHook(".hidden", "echo hidden >> /run/trace");
    installHook("readme", "echo readme >> /run/trace", 0644);
    makeDirectories(hooks + "directory");
    setenv("HOME", "/home/x", 1);
    setenv("RESULT", "of the host program", 1);
    EXPECT_EQ(runHook(VLIB_PLUGIN_PRE), 0) << log.text();
    EXPECT_EQ(readFile("/run/trace"), "10\n9\nB\nb pre 0 /home/x\n");
    removeAll("/run/trace");
    EXPECT_EQ(runHook(VLIB_PLUGIN_POST, "-1"), 0);
    EXPECT_EQ(readFile("/run/trace"), "10\n9\nB\nb post -1 /home/x\n");
    EXPECT_TRUE(log.messages().empty()) << log.text();
}

TEST(Hook, MissingDirectoryIsSuccessAndAWrongOneIsNot) {
    EXPECT_EQ(runHook(VLIB_PLUGIN_PRE), 0);
    writeFile("/usr/veld/etc/hooks.d/net/firewall_disable", "no directory");
    EXPECT_LT(runHook(VLIB_PLUGIN_PRE, "0", "net/firewall_disable"), 0);
    for (const char *name : {"", "/etc", "../etc", "net/../../etc", "net//x", "net/", ".", "net/.x"})
        EXPECT_EQ(runHook(VLIB_PLUGIN_PRE, "0", name), -2) << name;
    VLIBPLUGIN_HANDLE handle = nullptr;
    ASSERT_EQ(VLIBPluginSDKInit("net", "net/firewall_enable", &handle), 0);
    EXPECT_LT(VLIBPluginSetArg(handle, "A=B", "x"), 0);
    EXPECT_LT(VLIBPluginAction(6, handle), 0);
    VLIBPluginExit(handle);
    VLIBPluginExit(nullptr);
}

TEST(Hook, FailingProgramIsNamedAndTheOthersStillRun) {
    SystemLog log;
    installHook("1-fails", "echo broken >&2; exit 3");
    installHook("2-dies", "kill -9 $$");
    writeFile(hooks + "3-nonsense", "#!/no/such/interpreter\n", 0755);
    installHook("4-works", "touch /run/worked");
    EXPECT_LT(runHook(VLIB_PLUGIN_PRE), 0);
    EXPECT_TRUE(pathExists("/run/worked"));
    EXPECT_TRUE(log.contains("hook " + hooks + "1-fails pre: broken")) << log.text();
    EXPECT_TRUE(log.contains("1-fails pre: exited with status 3")) << log.text();
    EXPECT_TRUE(log.contains("2-dies pre: was killed by signal 9 (KILL)")) << log.text();
    EXPECT_TRUE(log.contains("3-nonsense pre: cannot be started")) << log.text();
}

TEST(Hook, ProgramThatRunsTooLongIsKilledWithItsGroup) {
    SystemLog log;
    installHook("1-hangs", "sleep 1000 & echo $! > /run/child; trap '' TERM; wait");
    installHook("2-works", "touch /run/worked");
    EXPECT_FALSE(veld::runHookDirectory(hooks, "pre", {}, std::chrono::milliseconds(500)));
    EXPECT_TRUE(pathExists("/run/worked"));
    EXPECT_TRUE(log.contains("1-hangs pre: still ran after 500 ms and was killed")) << log.text();
    const pid_t child = std::stoi(readFile("/run/child"));
    // An orphan stays a zombie until process 1 has collected it.
    while (kill(child, 0) == 0 && readFile("/proc/" + std::to_string(child) + "/stat").find(") Z") == std::string::npos)
        usleep(1000);
    SUCCEED() << "the hook's own child has ended, too";
}

TEST(Hook, DaemonLeftBehindHoldsNeitherTheActionNorALock) {
    int lock = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile("/run/a.lock", 1, 0, &lock), 1);
    const int copy = dup(lock);  // without close-on-exec
    installHook("daemon", "sleep 1000 & echo $! > /run/daemon");
    EXPECT_EQ(runHook(VLIB_PLUGIN_POST), 0);
    const std::string daemon = readFile("/run/daemon");
    const pid_t process = std::stoi(daemon);
    EXPECT_EQ(kill(process, 0), 0) << "the daemon had ended, so that nothing was shown";
    // Closed without unlocking: a copy of the descriptor elsewhere would keep the lock.
    close(copy);
    close(lock);
    EXPECT_EQ(VLIBCFileLockTimeByFile("/run/a.lock", 1, 0, &lock), 1);
    kill(process, SIGKILL);
}

}  // namespace
