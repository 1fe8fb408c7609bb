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

int spawn(const std::vector<std::string> &command, int in, int out, int err, pid_t &process) {
    std::vector<char *> arguments;
    arguments.reserve(command.size() + 1);
    for (const std::string &argument : command) {
        arguments.push_back(const_cast<char *>(argument.c_str()));
    }
    arguments.push_back(nullptr);
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
    const int error = posix_spawn(&process, arguments[0], &actions, &attributes, arguments.data(), environ);
    posix_spawnattr_destroy(&attributes);
    posix_spawn_file_actions_destroy(&actions);
    return error;
}

/// @return the exit status; negative, with the reason in `run.message`, when there is none
int runOnce(const std::vector<std::string> &command, const std::string &input, ProgramRun &run) {
    const Descriptor in = memoryFile("input");
    const Descriptor out = memoryFile("output");
    const Descriptor err = memoryFile("errors");
    if (!in.isOpen() || !out.isOpen() || !err.isOpen() || !writeAll(in.get(), input) ||
        lseek(in.get(), 0, SEEK_SET) != 0) {
        run.message = std::string("no memory for its input and output: ") + std::strerror(errno);
        return -1;
    }
    pid_t process = -1;
    if (const int error = spawn(command, in.get(), out.get(), err.get(), process); error != 0) {
        run.message = std::string("cannot be started: ") + std::strerror(error);
        return -1;
    }
    int status = 0;
    while (waitpid(process, &status, 0) < 0) {
        if (errno != EINTR) {
            run.message = std::string("its exit status is lost: ") + std::strerror(errno);
            return -1;
        }
    }
    if (!contentRead(out, run.output) || !contentRead(err, run.message)) {
        run.message = std::string("what it printed is lost: ") + std::strerror(errno);
        return -1;
    }
    run.message.erase(run.message.find_last_not_of(" \n") + 1);
    if (WIFSIGNALED(status)) {
        run.message += " (killed by signal " + std::to_string(WTERMSIG(status)) + ")";
        return -1;
    }
    // iptables-restore takes an input that it cannot read for an empty one, and succeeds. The offset is shared.
    if (WEXITSTATUS(status) == 0 && lseek(in.get(), 0, SEEK_CUR) != static_cast<off_t>(input.size())) {
        run.message += "ended before it had read all of its input";
        return -1;
    }
    if (run.message.empty() && WEXITSTATUS(status) != 0) {
        run.message = "exited with status " + std::to_string(WEXITSTATUS(status));
    }
    return WEXITSTATUS(status);
}

}  // namespace

ProgramRun programRun(const std::vector<std::string> &command, const std::string &input) {
    ProgramRun run;
    run.succeeded = runOnce(command, input, run) == 0;
    return run;
}

}  // namespace FW
