// SPDX-License-Identifier: Apache-2.0
// Running programs: results, reasons in the log, and what a program inherits.
#include "commandRecorder.h"
#include "core/runProgram.h"
#include "files.h"
#include "processes.h"
#include "systemLog.h"
#include "veld/core.h"

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>

using namespace veldtest;
using testing::HasSubstr;

namespace {

int runShell(const std::string &script, int wait = 1) {
    const char *const arguments[] = {"sh", "-c", script.c_str(), nullptr};
    return VLIBCExecv("/bin/sh", const_cast<char *const *>(arguments), wait);
}

/// A program at `path` that notes each run in `path`.runs, runs `script` with the number of the run in $n.
void installCounting(const std::string &path, const std::string &script) {
    writeFile(path, "#!/bin/sh\necho run >> " + path + ".runs\nn=$(wc -l < " + path + ".runs)\n" + script + "\n", 0755);
}

size_t runsOf(const std::string &path) {
    const std::string runs = readFile(path + ".runs");
    return static_cast<size_t>(std::count(runs.begin(), runs.end(), '\n'));
}

int runCounting(const std::string &path, std::chrono::milliseconds busyTime) {
    const char *const arguments[] = {path.c_str(), nullptr};
    return veld::runProgram(path.c_str(), const_cast<char *const *>(arguments), busyTime);
}

TEST(Exec, ResultIsZeroOnlyForExitStatusZeroAndTheLogSaysWhy) {
    SystemLog log;
    EXPECT_EQ(runShell("exit 0"), 0);
    EXPECT_TRUE(log.messages().empty()) << log.text();
    EXPECT_EQ(runShell("echo 'no such chain' >&2; printf 'bad\\001byte' >&2; exit 3"), -1);
    EXPECT_EQ(runShell("kill -9 $$"), -1);
    const char *const missing[] = {"x", "-A", "INPUT", nullptr};
    EXPECT_EQ(VLIBCExecv("/no/such/program", const_cast<char *const *>(missing), 1), -1);
    const std::string command = "/bin/sh -c echo 'no such chain' >&2; printf 'bad\\001byte' >&2; exit 3: ";
    EXPECT_TRUE(log.contains(command + "no such chain")) << log.text();
    EXPECT_TRUE(log.contains(command + "bad?byte")) << log.text();
    EXPECT_TRUE(log.contains(command + "exited with status 3")) << log.text();
    EXPECT_TRUE(log.contains("was killed by signal 9 (KILL)")) << log.text();
    EXPECT_TRUE(log.contains("/no/such/program -A INPUT: cannot be started: No such file or directory")) << log.text();
    for (const LogMessage &message : log.messages())
        EXPECT_EQ(message.priority, 3) << message.text;
    EXPECT_EQ(VLIBCExecv(nullptr, const_cast<char *const *>(missing), 1), -1);
    EXPECT_EQ(VLIBCExecv("/bin/true", nullptr, 1), -1);
}

TEST(Exec, ErrorOutputOfASuccessIsAWarning) {
    SystemLog log;
    EXPECT_EQ(runShell("echo deprecated >&2"), 0);
    ASSERT_EQ(log.messages().size(), 1U) << log.text();
    EXPECT_EQ(log.messages()[0].priority, 4);
    EXPECT_THAT(log.messages()[0].text, HasSubstr(": deprecated"));
}

TEST(Exec, TenMegabytesOfErrorOutputNeitherBlockNorFloodTheLog) {
    SystemLog log;
    EXPECT_EQ(
        runShell("yes 0123456789012345678901234567890123456789012345678901234567890 | head -c 10485760 >&2; exit 5"),
        -1);
    EXPECT_TRUE(log.contains("exited with status 5")) << log.text();
    EXPECT_TRUE(log.contains("(10420224 more bytes of standard error are left out)"));
    EXPECT_LT(log.messages().size(), 1200U);
}

TEST(Exec, ReturnsWhileADaemonStillHoldsStandardError) {
    EXPECT_EQ(runShell("sleep 1000 & echo $! > /run/daemon; exit 0"), 0);
    const pid_t daemon = std::stoi(readFile("/run/daemon"));
    EXPECT_EQ(kill(daemon, 0), 0) << "the daemon had ended, so that nothing was shown";
    kill(daemon, SIGKILL);
}

TEST(Exec, ProgramInheritsNoDescriptorSignalMaskOrDisposition) {
    CommandRecorder recorder;
    const int plain = dup(1);  // without close-on-exec
    int lock = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile("/run/a.lock", 1, 0, &lock), 1);
    EXPECT_NE(fcntl(lock, F_GETFD) & FD_CLOEXEC, 0);
    const char *const arguments[] = {"/sbin/iptables", "-L", nullptr};
    EXPECT_EQ(VLIBCExecv("/sbin/iptables", const_cast<char *const *>(arguments), 1), 0);
    ASSERT_EQ(recorder.commands().size(), 1U);
    EXPECT_TRUE(recorder.commands()[0].inheritedHandles.empty());
    close(plain);
    EXPECT_NE(VLIBCFileUnlockByFile(lock), 0);

    sigset_t usr1;
    sigemptyset(&usr1);
    sigaddset(&usr1, SIGUSR1);
    sigprocmask(SIG_BLOCK, &usr1, nullptr);
    signal(SIGPIPE, SIG_IGN);
    EXPECT_EQ(runShell("grep -E '^Sig(Blk|Ign)' /proc/self/status > /run/signals;"
                       "streams=$(readlink /proc/$$/fd/0 /proc/$$/fd/1); echo \"$streams\" > /run/streams"),
              0);
    sigprocmask(SIG_UNBLOCK, &usr1, nullptr);
    signal(SIGPIPE, SIG_DFL);
    // 32 and 33 are the C library's own; posix_spawn() leaves them ignored.
    EXPECT_EQ(readFile("/run/signals"), "SigBlk:\t0000000000000000\nSigIgn:\t0000000180000000\n");
    EXPECT_EQ(readFile("/run/streams"), "/dev/null\n/dev/null\n");
}

TEST(Exec, CallerWithoutStandardStreamsLosesNothing) {
    SystemLog log;
    EXPECT_EQ(runInChild([] {
                  for (const int stream : {0, 1, 2})
                      close(stream);
                  return runShell("test -r /dev/fd/0 && echo out && echo reason >&2 && exit 7") == -1 ? 0 : 1;
              }),
              0);
    EXPECT_TRUE(log.contains(": reason")) << log.text();
    EXPECT_TRUE(log.contains("exited with status 7")) << log.text();
}

TEST(Exec, LostExitStatusIsAFailureThatNamesItsCause) {
    SystemLog log;
    EXPECT_EQ(runInChild([] {
                  signal(SIGCHLD, SIG_IGN);
                  return runShell("exit 0") == -1 ? 0 : 1;
              }),
              0);
    EXPECT_TRUE(log.contains("its exit status is lost: No child processes (does the calling program ignore SIGCHLD?)"))
        << log.text();
}

TEST(Exec, BusyTablesAreTriedAgainUntilTheyAreFree) {
    SystemLog log;
    installCounting("/run/ip6tables-restore", "[ $n -ge 3 ] || { echo locked >&2; exit 4; }");
    EXPECT_EQ(runCounting("/run/ip6tables-restore", std::chrono::seconds(10)), 0);
    EXPECT_EQ(runsOf("/run/ip6tables-restore"), 3U);
    EXPECT_FALSE(log.contains("locked"));

    installCounting("/run/iptables", "echo locked >&2; exit 4");
    EXPECT_EQ(runCounting("/run/iptables", std::chrono::milliseconds(60)), -1);
    EXPECT_GT(runsOf("/run/iptables"), 1U);
    EXPECT_TRUE(log.contains("/run/iptables: locked")) << log.text();
    EXPECT_TRUE(log.contains("/run/iptables: exited with status 4 at every try")) << log.text();

    installCounting("/run/other", "exit 4");
    EXPECT_EQ(runCounting("/run/other", std::chrono::seconds(10)), -1);
    EXPECT_EQ(runsOf("/run/other"), 1U) << "status 4 means a lock for xtables programs only";
}

TEST(Exec, ProgramThatIsNotWaitedForLeavesNoChild) {
    ASSERT_EQ(mkfifo("/run/go", 0600), 0);
    // It waits for our write: waiting for it would never end.
    EXPECT_EQ(runShell("read line < /run/go; echo $line > /run/answer.tmp; mv /run/answer.tmp /run/answer", 0), 0);
    EXPECT_EQ(waitpid(-1, nullptr, 0), -1);
    EXPECT_EQ(errno, ECHILD);
    const int go = open("/run/go", O_WRONLY);
    ASSERT_EQ(write(go, "done\n", 5), 5);
    close(go);
    while (!pathExists("/run/answer"))
        usleep(1000);
    EXPECT_EQ(readFile("/run/answer"), "done\n");
    const char *const missing[] = {"x", nullptr};
    EXPECT_EQ(VLIBCExecv("/no/such/program", const_cast<char *const *>(missing), 0), -1);
}

TEST(Popen, ReadsFromAndWritesToAProgramAndTellsItsStatus) {
    SystemLog log;
    FILE *reader = VLIBCPopen("/bin/sh", "r", "-c", "printf '%s' \"$1\"; echo why >&2; exit 6", "sh", "$HOME ; text",
                              static_cast<char *>(nullptr));
    ASSERT_NE(reader, nullptr);
    // A second program must not hold the first one's pipe.
    FILE *writer = VLIBCPopen("/bin/sh", "w", "-c", "cat > /run/written", static_cast<char *>(nullptr));
    ASSERT_NE(writer, nullptr);
    char line[64] = "";
    EXPECT_NE(fgets(line, sizeof line, reader), nullptr);
    EXPECT_STREQ(line, "$HOME ; text");
    EXPECT_EQ(VLIBCPclose(reader), 6);
    EXPECT_TRUE(log.contains(": why")) << log.text();
    fputs("words", writer);
    EXPECT_EQ(VLIBCPclose(writer), 0);
    EXPECT_EQ(readFile("/run/written"), "words");
}

TEST(Popen, FailuresAreTold) {
    EXPECT_EQ(VLIBCPopen("/no/such/program", "r", static_cast<char *>(nullptr)), nullptr);
    EXPECT_EQ(VLIBCPopen("/bin/true", "rw", static_cast<char *>(nullptr)), nullptr);
    FILE *killed = VLIBCPopen("/bin/sh", "r", "-c", "kill -9 $$", static_cast<char *>(nullptr));
    ASSERT_NE(killed, nullptr);
    EXPECT_EQ(VLIBCPclose(killed), -1);
    FILE *foreign = fopen("/dev/null", "r");
    EXPECT_EQ(VLIBCPclose(foreign), -1);
    fclose(foreign);
}

}  // namespace
