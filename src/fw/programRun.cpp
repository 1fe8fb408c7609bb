// SPDX-License-Identifier: Apache-2.0
// Running a program with input, and keeping what it prints. The platform's VLIBCExecv() gives no input and prints to
// the log; its pipes keep one direction only.
#include "fw/programRun.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <csignal>
#include <cstring>
#include <utility>

#include "utils/descriptor.h"

namespace FW {

namespace {

/// A file in memory: unlike a pipe it never blocks the program, and a process that the program leaves behind cannot
/// keep us waiting for its end.
Descriptor memoryFile(const char *name) {
    return Descriptor(memfd_create(name, MFD_CLOEXEC));
}

bool contentRead(const Descriptor &file, std::string &text) {
    return lseek(file.get(), 0, SEEK_SET) == 0 && readAll(file.get(), text);
}

/// The environment of this process with the call's setting in front, where it counts.
std::vector<char *> environmentOf(const ProgramCall &call) {
    std::vector<char *> environment;
    if (call.setting != nullptr) {
        environment.push_back(const_cast<char *>(call.setting));
    }
    for (char **entry = environ; *entry != nullptr; ++entry) {
        environment.push_back(*entry);
    }
    environment.push_back(nullptr);
    return environment;
}

int spawn(const ProgramCall &call, int in, int out, int err, pid_t &process) {
    std::vector<char *> arguments;
    arguments.reserve(call.command.size() + 1);
    for (const std::string &argument : call.command) {
        arguments.push_back(const_cast<char *>(argument.c_str()));
    }
    arguments.push_back(nullptr);
    std::vector<char *> environment = environmentOf(call);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in, STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, out, STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, err, STDERR_FILENO);
    posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    sigset_t signals;
    sigfillset(&signals);
    posix_spawnattr_setsigdefault(&attributes, &signals);
    sigemptyset(&signals);
    posix_spawnattr_setsigmask(&attributes, &signals);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGDEF | POSIX_SPAWN_SETSIGMASK);
    const int error = posix_spawn(&process, arguments[0], &actions, &attributes, arguments.data(), environment.data());
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
    return error;
}

}  // namespace

StartedProgram::StartedProgram(const ProgramCall &call)
    : in(memoryFile("input")), out(memoryFile("output")), err(memoryFile("errors")),
      inputSize(static_cast<off_t>(call.input.size())) {
    if (!in.isOpen() || !out.isOpen() || !err.isOpen() || !writeAll(in.get(), call.input) ||
        lseek(in.get(), 0, SEEK_SET) != 0) {
        reason = std::string("no memory for its input and output: ") + std::strerror(errno);
    } else if (const int error = spawn(call, in.get(), out.get(), err.get(), process); error != 0) {
        process = -1;
        reason = std::string("cannot be started: ") + std::strerror(error);
    }
}

StartedProgram::~StartedProgram() {
    while (process >= 0 && waitpid(process, nullptr, 0) < 0 && errno == EINTR) {
    }
}

ProgramRun StartedProgram::wait() {
    ProgramRun run;
    run.message = reason;
    if (process < 0) {
        return run;
    }
    int status = 0;
    const pid_t waited = std::exchange(process, -1);
    while (waitpid(waited, &status, 0) < 0) {
        if (errno != EINTR) {
            run.message = std::string("its exit status is lost: ") + std::strerror(errno);
            return run;
        }
    }
    if (!contentRead(out, run.output) || !contentRead(err, run.message)) {
        run.message = std::string("what it printed is lost: ") + std::strerror(errno);
        return run;
    }
    run.succeeded = status == 0;
    run.message.erase(run.message.find_last_not_of(" \n") + 1);
    if (WIFSIGNALED(status)) {
        run.message += " (killed by signal " + std::to_string(WTERMSIG(status)) + ")";
    } else if (run.message.empty() && status != 0) {
        run.message = "exited with status " + std::to_string(WEXITSTATUS(status));
    }
    // iptables-restore takes an input that it cannot read for an empty one, and succeeds. The offset is shared.
    if (run.succeeded && lseek(in.get(), 0, SEEK_CUR) != inputSize) {
        run.succeeded = false;
        run.message += "ended before it had read all of its input";
    }
    return run;
}

ProgramRun programRun(const ProgramCall &call) {
    return StartedProgram(call).wait();
}

}  // namespace FW
