// SPDX-License-Identifier: Apache-2.0
// A child process that is stopped before and after each of its system calls.
#include "tracedChild.h"

#include <sys/ptrace.h>
#include <sys/uio.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <csignal>
#include <stdexcept>

#include "processes.h"

namespace veldtest {

TracedChild::TracedChild(const std::function<void()> &function) {
    child = startChild([&] {
        if (ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0)
            return 1;
        raise(SIGSTOP);
        function();
        return 0;
    });
    int status = 0;
    waitpid(child, &status, 0);
    if (!WIFSTOPPED(status) ||
        ptrace(PTRACE_SETOPTIONS, child, nullptr, PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL) != 0) {
        kill(child, SIGKILL);
        throw std::runtime_error("processes may not be traced here");
    }
}

TracedChild::~TracedChild() {
    if (child > 0) {
        kill(child, SIGKILL);
        waitForChild(child);
    }
}

bool TracedChild::next() {
    int status = 0;
    for (int signal = 0;; signal = WSTOPSIG(status)) {
        ptrace(PTRACE_SYSCALL, child, nullptr, signal);
        if (waitpid(child, &status, 0) != child || !WIFSTOPPED(status)) {
            child = -1;
            return false;
        }
        if (WSTOPSIG(status) == (SIGTRAP | 0x80))
            break;
    }
    __ptrace_syscall_info info = {};
    ptrace(static_cast<__ptrace_request>(PTRACE_GET_SYSCALL_INFO), child, sizeof(info), &info);
    atEntry = info.op == PTRACE_SYSCALL_INFO_ENTRY;
    if (atEntry) {
        number = info.entry.nr;
        std::copy(info.entry.args, info.entry.args + arguments.size(), arguments.begin());
    } else {
        result = info.exit.rval;
    }
    return true;
}

std::string TracedChild::text(uint64_t address) const {
    std::string found;
    char character = 0;
    const iovec local = {&character, 1};
    for (;; ++address) {
        const iovec remote = {reinterpret_cast<void *>(address), 1};
        if (process_vm_readv(child, &local, 1, &remote, 1, 0) != 1 || character == '\0')
            return found;
        found += character;
    }
}

}  // namespace veldtest
