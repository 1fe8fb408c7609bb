// SPDX-License-Identifier: Apache-2.0
// Running programs: results, reasons in the log, and what a program inherits.
#include "commandRecorder.h"
#include "core/runProgram.h"
#include "files.h"
#include "processes.h"
#include "systemLog.h"
#include "veld/core.h"

#include <fcntl.h>
#include <sys/wait.h>
#include <syslog.h>
#include <unistd.h>

#include <csignal>

using namespace veldtest;

namespace {

int run(std::vector<const char *> words, int wait = 1) {
    const char *program = words[0];
    words.push_back(nullptr);
    return VLIBCExecv(program, const_cast<char *const *>(words.data()), wait);
}

int runShell(const std::string &script, int wait = 1) {
    return run({"/bin/sh", "-c", script.c_str()}, wait);
}

/// Runs a program at `path` that notes each run and has their number in $n. @return how often it ran, negative when it
/// failed
int runCounting(const std::string &path, const std::string &script, int busyMilliseconds) {
    writeFile(path, "#!/bin/sh\necho >> " + path + ".runs\nn=$(wc -l < " + path + ".runs)\n" + script + "\n", 0755);
    const char *const arguments[] = {path.c_str(), nullptr};
    const bool succeeded = veld::runProgram(path.c_str(), const_cast<char *const *>(arguments),
                                            std::chrono::milliseconds(busyMilliseconds)) == 0;
    return static_cast<int>(readFile(path + ".runs").size()) * (succeeded ? 1 : -1);
}

TEST(Exec, ResultIsZeroOnlyForExitStatusZeroAndTheLogSaysWhy) {
    SystemLog log;
    EXPECT_EQ(runShell("exit 0"), 0);
    EXPECT_TRUE(log.messages().empty()) << log.text();
    EXPECT_EQ(runShell("echo 'no such chain' >&2; printf 'bad\\001byte' >&2; exit 3"), -1);
    EXPECT_EQ(runShell("kill -9 $$"), -1);
    for (const int wait : {0, 1})
        EXPECT_EQ(run({"/no/such/program", "-A", "INPUT"}, wait), -1);
    const std::string command = "/bin/sh -c echo 'no such chain' >&2; printf 'bad\\001byte' >&2; exit 3: ";
    const std::pair<std::string, size_t> messages[] = {
        {command + "no such chain", 1},
        {command + "bad?byte", 1},
        {command + "exited with status 3", 1},
        {"was killed by signal 9 (KILL)", 1},
        {"/no/such/program -A INPUT: cannot be started: No such file or directory", 2}};
    for (const auto &[message, count] : messages)
        EXPECT_EQ(log.count(message), count) << message << "\n" << log.text();
    log.clear();
    EXPECT_EQ(runShell("echo deprecated >&2"), 0);
    ASSERT_EQ(log.count(": deprecated"), 1U) << log.text();
    EXPECT_EQ(log.messages().at(0).priority, LOG_WARNING) << "error output of a success";
    char *const none[] = {nullptr};
    EXPECT_EQ(VLIBCExecv(nullptr, none, 1), -1);
    for (char *const *arguments : {none, static_cast<char *const *>(nullptr)})
        EXPECT_EQ(VLIBCExecv("/bin/true", arguments, 1), -1);
}

TEST(Exec, TenMegabytesOfErrorOutputNeitherBlockNorFloodTheLog) {
    SystemLog log;
    EXPECT_EQ(runShell("yes 0123456789012345678901234567890 | head -c 10485760 >&2; exit 5"), -1);
    EXPECT_TRUE(log.contains("exited with status 5")) << log.text();
    EXPECT_TRUE(log.contains("(10420224 more bytes of standard error are left out)"));
    EXPECT_LT(log.messages().size(), 2200U);
}

TEST(Exec, ReturnsWhileADaemonStillHoldsStandardError) {
    EXPECT_EQ(runShell("sleep 1000 & echo $! > /run/daemon; exit 0"), 0);
    EXPECT_EQ(kill(std::stoi(readFile("/run/daemon")), SIGKILL), 0) << "it had ended, so that nothing was shown";
}

TEST(Exec, ProgramInheritsNoDescriptorSignalMaskOrDisposition) {
    CommandRecorder recorder;
    const int plain = dup(1);  // without close-on-exec
    int lock = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile("/run/a.lock", 1, 0, &lock), 1);
    EXPECT_NE(fcntl(lock, F_GETFD) & FD_CLOEXEC, 0);
    EXPECT_EQ(run({"/sbin/iptables", "-L"}), 0);
    EXPECT_TRUE(recorder.commands().at(0).inheritedHandles.empty());
    close(plain);

    sigset_t usr1;
    sigemptyset(&usr1);
    sigaddset(&usr1, SIGUSR1);
    sigprocmask(SIG_BLOCK, &usr1, nullptr);
    signal(SIGPIPE, SIG_IGN);
    // Not through a shell, which would unblock the signals.
    EXPECT_EQ(run({"/bin/dd", "if=/proc/self/status", "of=/run/status", "status=none"}), 0);
    EXPECT_EQ(runShell("streams=$(readlink /proc/$$/fd/0 /proc/$$/fd/1); echo \"$streams\" > /run/streams"), 0);
    sigprocmask(SIG_UNBLOCK, &usr1, nullptr);
    signal(SIGPIPE, SIG_DFL);
    // 32 and 33 are the C library's own; posix_spawn() leaves them ignored.
    EXPECT_NE(readFile("/run/status").find("SigBlk:\t0000000000000000\nSigIgn:\t0000000180000000\n"),
              std::string::npos);
    EXPECT_EQ(readFile("/run/streams"), "/dev/null\n/dev/null\n");
}

TEST(Exec, CallerWithoutStandardStreamsOrExitStatusesLearnsWhatHappened) {
    SystemLog log;
    const auto withoutStreams = [] {
        for (const int stream : {0, 1, 2})
            close(stream);
        return runShell("test -r /dev/fd/0 && echo out && echo reason >&2 && exit 7") == -1 ? 0 : 1;
    };
    const auto withoutStatuses = [] {
        signal(SIGCHLD, SIG_IGN);
        return runShell("exit 0") == -1 ? 0 : 1;
    };
    EXPECT_EQ(runInChild(withoutStreams), 0);
    EXPECT_EQ(runInChild(withoutStatuses), 0);
    for (const char *reason : {": reason", "exited with status 7", "its exit status is lost: No child processes"})
        EXPECT_TRUE(log.contains(reason)) << log.text();
}

TEST(Exec, BusyTablesAreTriedAgainUntilTheyAreFree) {
    SystemLog log;
    EXPECT_EQ(runCounting("/run/ip6tables-restore", "[ $n -ge 3 ] || { echo locked >&2; exit 4; }", 10'000), 3);
    EXPECT_FALSE(log.contains("locked"));
    EXPECT_LT(runCounting("/run/iptables", "echo locked >&2; exit 4", 60), -1);
    EXPECT_TRUE(log.contains("/run/iptables: locked")) << log.text();
    EXPECT_TRUE(log.contains("/run/iptables: exited with status 4 at every try")) << log.text();
    EXPECT_EQ(runCounting("/run/other", "exit 4", 10'000), -1) << "a lock for xtables programs only";
}

TEST(Exec, ProgramThatIsNotWaitedForLeavesNoChild) {
    // It waits for our write: waiting for it would never end.
    runChecked({"mkfifo", "/run/go", "/run/answer"});
    EXPECT_EQ(runShell("read line < /run/go; echo $line > /run/answer", 0), 0);
    EXPECT_EQ(waitpid(-1, nullptr, 0), -1);
    EXPECT_EQ(errno, ECHILD);
    EXPECT_EQ(runChecked({"sh", "-c", "echo done > /run/go; cat /run/answer"}), "done\n");
}

TEST(Popen, ReadsFromAndWritesToAProgramAndTellsItsStatus) {
    SystemLog log;
    char *const end = nullptr;
    FILE *reader =
        VLIBCPopen("/bin/sh", "r", "-c", "printf '%s' \"$1\"; echo why >&2; exit 6", "sh", "$HOME ; text", end);
    // A second program must not hold the first one's pipe.
    FILE *writer = VLIBCPopen("/bin/sh", "w", "-c", "cat > /run/written", end);
    ASSERT_TRUE(reader != nullptr && writer != nullptr);
    char line[64] = "";
    EXPECT_NE(fgets(line, sizeof line, reader), nullptr);
    EXPECT_STREQ(line, "$HOME ; text");
    EXPECT_EQ(VLIBCPclose(reader), 6);
    EXPECT_TRUE(log.contains(": why")) << log.text();
    fputs("words", writer);
    EXPECT_EQ(VLIBCPclose(writer), 0);
    EXPECT_EQ(readFile("/run/written"), "words");
    EXPECT_EQ(VLIBCPopen("/no/such/program", "r", end), nullptr);
    EXPECT_EQ(VLIBCPopen("/bin/true", "rw", end), nullptr);
    EXPECT_EQ(VLIBCPclose(VLIBCPopen("/bin/sh", "r", "-c", "kill -9 $$", end)), -1);
}

}  // namespace
