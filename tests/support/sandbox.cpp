// SPDX-License-Identifier: Apache-2.0
// Namespaces and processes of a sandbox.
#include "sandbox.h"

#include "handle.h"
#include "processes.h"

#include <linux/close_range.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <csignal>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <stdexcept>

namespace veldtest {
namespace {

bool entered = false;
SandboxInfo info;

void writeIdMap(const std::string &file, const std::string &text) {
    std::ofstream out(file);
    out << text << std::flush;
    if (!out)
        throw systemError("write \"" + text + "\" to " + file);
}

void unshareNamespaces() {
    const int spaces = CLONE_NEWNS | CLONE_NEWNET | CLONE_NEWPID | CLONE_NEWIPC | CLONE_NEWUTS;
    const auto uid = geteuid();
    const auto gid = getegid();
    if (uid == 0 && unshare(spaces) == 0)
        return;
    if (unshare(spaces | CLONE_NEWUSER) != 0)
        throw systemError("the kernel gives this user no namespaces: unshare");
    writeIdMap("/proc/self/setgroups", "deny");
    writeIdMap("/proc/self/uid_map", "0 " + std::to_string(uid) + " 1");
    writeIdMap("/proc/self/gid_map", "0 " + std::to_string(gid) + " 1");
    info.userNamespace = true;
}

/// Replaces "/" of this process's mount namespace. What leads to the program, the working directory and the build stays
/// visible.
void enterPrivateRoot() {
    namespace fs = std::filesystem;
    const std::string directory = fs::current_path();
    runChecked({"sh", VELD_SOURCE_DIR "/tests/support/sandboxRoot.sh", info.userNamespace ? "links" : "overlay",
                fs::read_symlink("/proc/self/exe"), directory, VELD_SOURCE_DIR, VELD_BINARY_DIR});
    info.overlay = !fs::exists("/.host");
    if (chdir(directory.c_str()) != 0 && chdir("/") != 0)
        throw systemError("chdir /");
}

/// Process 1 of the sandbox: collects orphans until `main` has ended. When it exits, the kernel ends all the others.
[[noreturn]] void reapUntil(pid_t main) {
    for (;;) {
        int status = 0;
        const pid_t ended = waitpid(-1, &status, 0);
        if (ended == main) {
            if (WIFSIGNALED(status))
                std::fprintf(stderr, "ended by signal %d (%s)\n", WTERMSIG(status), strsignal(WTERMSIG(status)));
            _exit(WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status));
        }
        if (ended < 0 && errno != EINTR)
            _exit(127);
    }
}

pid_t forkOrThrow() {
    std::fflush(nullptr);
    const pid_t child = fork();
    if (child < 0)
        throw systemError("fork");
    return child;
}

}  // namespace

int runInSandbox(const std::function<int()> &body, const std::function<int(const std::string &)> &unavailable) {
    // The outermost process stays outside, so that a sandbox that cannot be finished leaves no half-changed process.
    const pid_t builder = forkOrThrow();
    if (builder != 0)
        return waitForChild(builder);
    prctl(PR_SET_PDEATHSIG, SIGKILL);
    // What our starter left open is not to reach the programs that tests start.
    close_range(STDERR_FILENO + 1, ~0U, CLOSE_RANGE_CLOEXEC);
    int code = 127;
    try {
        unshareNamespaces();
        const pid_t first = forkOrThrow();
        if (first != 0)
            _exit(waitForChild(first));
        prctl(PR_SET_PDEATHSIG, SIGKILL);
        enterPrivateRoot();
        runChecked({"ip", "link", "set", "lo", "up"});
        entered = true;
        const pid_t main = forkOrThrow();
        if (main != 0)
            reapUntil(main);
    } catch (const std::exception &error) {
        code = unavailable(error.what());
        std::fflush(nullptr);
        _exit(code);
    }
    code = body();
    std::fflush(nullptr);
    // No exit(): the handlers of the outermost process are that process's business. The leak checker, which runs from
    // an exit handler, is the exception that the body calls itself if it wants it.
    _exit(code);
}

bool inSandbox() {
    return entered;
}

void requireSandbox(const std::string &action) {
    if (!entered)
        throw std::logic_error("outside a sandbox, refused: " + action);
}

const SandboxInfo &sandboxInfo() {
    return info;
}

}  // namespace veldtest
