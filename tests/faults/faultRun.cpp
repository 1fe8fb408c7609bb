// SPDX-License-Identifier: Apache-2.0
// A child and its descendants under ptrace, and a system call of theirs replaced.
#include "faultRun.h"

#include <elf.h>
#include <sys/ptrace.h>
#include <sys/syscall.h>
#include <sys/uio.h>
#include <sys/user.h>
#include <sys/wait.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <cstddef>
#include <map>
#include <stdexcept>

#include "processes.h"

namespace veldtest {
namespace {

/// Lets the call, at whose entry the process stands, be one that does not exist.
bool callSkip(pid_t process) {
#if defined(__x86_64__)
    return ptrace(PTRACE_POKEUSER, process, offsetof(user_regs_struct, orig_rax), -1) == 0;
#elif defined(__aarch64__)
    int none = -1;
    iovec part = {&none, sizeof(none)};
    return ptrace(PTRACE_SETREGSET, process, NT_ARM_SYSTEM_CALL, &part) == 0;
#else
    (void)process;
    return false;
#endif
}

/// Sets what the call, at whose return the process stands, gives back.
void resultSet(pid_t process, long result) {
#if defined(__x86_64__)
    ptrace(PTRACE_POKEUSER, process, offsetof(user_regs_struct, rax), result);
#elif defined(__aarch64__)
    user_regs_struct registers = {};
    iovec all = {&registers, sizeof(registers)};
    ptrace(PTRACE_GETREGSET, process, NT_PRSTATUS, &all);
    registers.regs[0] = static_cast<unsigned long>(result);
    ptrace(PTRACE_SETREGSET, process, NT_PRSTATUS, &all);
#else
    (void)process, (void)result;
#endif
}

const std::map<uint64_t, std::vector<int>> &errorTable() {
    struct Group {
        std::vector<int> errors;
        std::vector<long> numbers;
    };
    static const std::vector<Group> groups = {
        {{EMFILE, EACCES, EIO}, {SYS_openat}},
        {{EIO, EINTR}, {SYS_read}},
        {{ENOSPC, EIO, EINTR}, {SYS_write}},
        {{EIO}, {SYS_pread64, SYS_close, SYS_ftruncate, SYS_fstat, SYS_getdents64, SYS_ioctl, SYS_unlinkat}},
        {{EIO, ENOSPC}, {SYS_fsync, SYS_renameat2}},
        {{EINVAL}, {SYS_lseek}},
        {{EPERM, EROFS}, {SYS_fchmod}},
        {{EACCES}, {SYS_newfstatat, SYS_faccessat}},
        {{EINTR, ENOLCK}, {SYS_fcntl}},
        {{EINTR}, {SYS_flock, SYS_wait4}},
        {{ENOMEM}, {SYS_mmap, SYS_mprotect, SYS_bind}},
        {{EMFILE, ENOMEM}, {SYS_memfd_create}},
        {{EMFILE}, {SYS_dup3, SYS_pipe2}},
        {{EAGAIN, ENOMEM}, {SYS_clone, SYS_clone3}},
        {{ENOENT, EACCES, ENOMEM}, {SYS_execve}},
        {{EMFILE, EACCES}, {SYS_socket}},
        {{ECONNREFUSED}, {SYS_connect}},
        {{ENOBUFS, EPERM}, {SYS_sendmsg}},
        {{ENOBUFS}, {SYS_sendto, SYS_recvmsg, SYS_recvfrom}},
        {{EPERM}, {SYS_setsockopt, SYS_getsockopt}},
        {{ENOSPC}, {SYS_mkdirat}},
#ifdef SYS_open  // calls that newer machines do not have
        {{EMFILE, EACCES, EIO}, {SYS_open}},
        {{EACCES}, {SYS_stat, SYS_lstat, SYS_access}},
        {{EIO, ENOSPC}, {SYS_rename}},
        {{EIO}, {SYS_unlink}},
        {{ENOSPC}, {SYS_mkdir}},
        {{EMFILE}, {SYS_dup2, SYS_pipe}},
        {{EAGAIN, ENOMEM}, {SYS_vfork, SYS_fork}},
#endif
#ifdef SYS_renameat
        {{EIO, ENOSPC}, {SYS_renameat}},
#endif
    };
    static const std::map<uint64_t, std::vector<int>> table = [] {
        std::map<uint64_t, std::vector<int>> errors;
        for (const Group &group : groups) {
            for (const long number : group.numbers)
                errors[static_cast<uint64_t>(number)] = group.errors;
        }
        return errors;
    }();
    return table;
}

class Tracer {
public:
    Tracer(std::optional<FaultPoint> faultAt, int faultError) : at(faultAt), error(faultError) {}

    FaultRun run(const std::function<int()> &function) {
        child = startChild([&] {
            if (ptrace(PTRACE_TRACEME, 0, nullptr, nullptr) != 0)
                return 126;
            raise(SIGSTOP);
            return function();
        });
        int status = 0;
        waitpid(child, &status, 0);
        constexpr int options = PTRACE_O_TRACESYSGOOD | PTRACE_O_EXITKILL | PTRACE_O_TRACECLONE | PTRACE_O_TRACEFORK |
                                PTRACE_O_TRACEVFORK | PTRACE_O_TRACEEXEC;
        if (!WIFSTOPPED(status) || ptrace(PTRACE_SETOPTIONS, child, nullptr, options) != 0) {
            kill(child, SIGKILL);
            throw std::runtime_error("processes may not be traced here");
        }
        traced[child] = {};
        ptrace(PTRACE_SYSCALL, child, nullptr, 0);
        while (!traced.empty()) {
            const pid_t process = waitpid(-1, &status, __WALL);
            if (process < 0)
                break;
            if (WIFSTOPPED(status))
                stopped(process, status);
            else
                ended(process, status);
        }
        if (cannotReplace)
            throw std::runtime_error("system calls cannot be replaced here");
        return result;
    }

private:
    struct Traced {
        int ordinal = 0;
        int calls = 0;
        uint64_t number = 0;
        bool isStruck = false;
    };

    void ended(pid_t process, int status) {
        traced.erase(process);
        if (process == child)
            result.status = WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
    }

    void stopped(pid_t process, int status) {
        int signal = 0;
        if (traced.count(process) == 0) {
            traced[process].ordinal = ++started;  // stopped by SIGSTOP at its start
        } else if (WSTOPSIG(status) == (SIGTRAP | 0x80)) {
            if (!systemCall(process, traced[process]))
                return;
        } else if (status >> 16 == 0) {
            signal = WSTOPSIG(status) == SIGSTOP ? 0 : WSTOPSIG(status);
        }
        ptrace(PTRACE_SYSCALL, process, nullptr, signal);
    }

    /// @return false when the process is gone
    bool systemCall(pid_t process, Traced &state) {
        __ptrace_syscall_info info = {};
        ptrace(static_cast<__ptrace_request>(PTRACE_GET_SYSCALL_INFO), process, sizeof(info), &info);
        if (info.op == PTRACE_SYSCALL_INFO_EXIT) {
            if (state.isStruck)
                resultSet(process, -error);
            state.isStruck = false;
            return true;
        }
        if (info.op != PTRACE_SYSCALL_INFO_ENTRY || errorTable().count(info.entry.nr) == 0)
            return true;
        const FaultPoint point = {state.ordinal, state.calls++, info.entry.nr};
        result.points.push_back(point);
        // Memory is not taken at the same points in every run: then it is the next call of that kind.
        const bool isMet = at && at->process == point.process && at->index <= point.index && at->number == point.number;
        if (!isMet || result.wasStruck)
            return true;
        result.wasStruck = true;
        if (error == killProcess) {
            kill(process, SIGKILL);
            return false;
        }
        // A close that reports an error has closed the descriptor all the same.
        state.isStruck = info.entry.nr == SYS_close || callSkip(process);
        cannotReplace = !state.isStruck;
        return true;
    }

    const std::optional<FaultPoint> at;
    const int error;
    pid_t child = -1;
    int started = 0;
    bool cannotReplace = false;
    std::map<pid_t, Traced> traced;
    FaultRun result;
};

}  // namespace

FaultRun runWithFault(const std::function<int()> &function, std::optional<FaultPoint> at, int error) {
    return Tracer(at, error).run(function);
}

std::vector<int> errorsOf(uint64_t number) {
    return errorTable().at(number);
}

}  // namespace veldtest
