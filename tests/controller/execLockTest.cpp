// SPDX-License-Identifier: Apache-2.0
// The lock that keeps processes from applying profiles at the same time.
#include <unistd.h>
#include <veld/core.h>

#include <csignal>
#include <sstream>
#include <thread>

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

    CommandRecorder recorder;
};

TEST_F(ExecLock, ReloadWaitsForTheLockAndGivesUpWhenItIsNeverFree) {
    int lock = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile(EXEC_LOCK, 1, 0, &lock), 1);
    EXPECT_FALSE(firewall.fwReload(true));
    EXPECT_THAT(errors(), ElementsAre("veldFW.cpp TIMEOUT: getting lock"));
    EXPECT_TRUE(isSwitchedOn());
    std::thread holder([&] {
        sleep(1);
        EXPECT_THAT(recorder.lines(), IsEmpty()) << "commands ran while the lock was held";
        VLIBCFileUnlockByFile(lock);
    });
    EXPECT_TRUE(firewall.fwReload(true)) << log.text();
    holder.join();
    EXPECT_FALSE(recorder.lines().empty());
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
    // The hook of disabling runs below a reload that holds the lock, because a command is refused.
    for (const char *action : {"enable", "disable"})
        installHook(action, "50-daemon", "sleep 600 &\necho $! >> /run/hook-daemons");
    recorder.failMatching("-i lo", 2, "refused");
    EXPECT_FALSE(firewall.fwEnable());
    EXPECT_TRUE(execLockIsFree());
    std::istringstream daemons(readFile("/run/hook-daemons"));
    int alive = 0;
    for (pid_t daemon = 0; daemons >> daemon;)
        alive += kill(daemon, SIGKILL) == 0 ? 1 : 0;
    EXPECT_EQ(alive, 4) << "daemons that were there to the end";
}

}  // namespace
