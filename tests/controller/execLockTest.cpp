// SPDX-License-Identifier: Apache-2.0
// The lock that keeps processes from applying profiles at the same time.
#include <fcntl.h>
#include <unistd.h>

#include <csignal>

#include "commandRecorder.h"
#include "files.h"
#include "firewallTest.h"
#include "processes.h"

using namespace veldtest;
using testing::ElementsAre;
using testing::IsEmpty;

namespace {

class ExecLock : public FirewallTest {
protected:
    ExecLock() { writeFile(SETTINGS, R"({"status": true, "profile": "default"})"); }

    /// A process that takes the lock, and returns the result of `whileHeld` once that is over.
    static pid_t startHolder(const std::function<int()> &whileHeld) {
        int ready[2];
        EXPECT_EQ(pipe2(ready, O_CLOEXEC), 0);
        const pid_t holder = startChild([&] {
            const int file = open(EXEC_LOCK, O_RDWR | O_CREAT, 0600);
            struct flock whole {};
            whole.l_type = F_WRLCK;
            whole.l_whence = SEEK_SET;
            if (fcntl(file, F_OFD_SETLK, &whole) != 0 || write(ready[1], "x", 1) != 1)
                return 100;
            return whileHeld();
        });
        close(ready[1]);
        char byte = 0;
        EXPECT_EQ(read(ready[0], &byte, 1), 1);
        close(ready[0]);
        return holder;
    }

    CommandRecorder recorder;
};

TEST_F(ExecLock, ReloadWaitsUntilAnotherProcessIsDone) {
    const pid_t holder = startHolder([this] {
        usleep(1000 * 1000);
        return static_cast<int>(recorder.lines().size());
    });
    EXPECT_TRUE(firewall.fwReload(true)) << log.text();
    EXPECT_EQ(waitForChild(holder), 0) << "commands ran while the lock was held";
    EXPECT_FALSE(recorder.lines().empty());
}

TEST_F(ExecLock, ReloadGivesUpWhenTheLockIsNeverFree) {
    const pid_t holder = startHolder([] {
        pause();
        return 0;
    });
    EXPECT_FALSE(firewall.fwReload(true));
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp TIMEOUT: getting lock"));
    EXPECT_THAT(recorder.lines(), IsEmpty());
    kill(holder, SIGKILL);
    waitForChild(holder);
    EXPECT_TRUE(isSwitchedOn());
}

TEST_F(ExecLock, ReloadsOfSeveralProcessesNeverMix) {
    std::vector<pid_t> processes;
    for (int i = 0; i < 4; ++i)
        processes.push_back(startChild([this] { return firewall.fwReload(true) ? 0 : 1; }));
    for (const pid_t process : processes)
        EXPECT_EQ(waitForChild(process), 0) << log.text();
    const auto lines = recorder.lines();
    ASSERT_EQ(lines.size() % 4, 0u);
    const size_t length = lines.size() / 4;
    for (size_t i = 0; i < lines.size(); ++i)
        EXPECT_EQ(lines[i], lines[i % length]) << "at command " << i;
}

TEST_F(ExecLock, IsFreeWhileADaemonThatAHookLeftBehindStillRuns) {
    // One in each hook: that of disabling runs below a reload that holds the lock, because a command is refused.
    for (const std::string name : {"enable", "disable"})
        writeFile("/usr/veld/etc/hooks.d/net/firewall_" + name + "/50-daemon",
                  "#!/bin/sh\nsleep 600 &\necho $! >> /run/hook-daemon\n", 0755);
    recorder.failMatching("-i lo", 2, "refused");
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_TRUE(execLockIsFree());
    recorder.clear();
    EXPECT_TRUE(firewall.fwEnable()) << log.text();
    int alive = 0;
    std::istringstream daemons(readFile("/run/hook-daemon"));
    for (pid_t daemon = 0; daemons >> daemon;) {
        alive += kill(daemon, 0) == 0 ? 1 : 0;
        kill(daemon, SIGKILL);
    }
    EXPECT_EQ(alive, 6) << "daemons that were there to the end";
}

}  // namespace
