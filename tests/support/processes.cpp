// SPDX-License-Identifier: Apache-2.0
// Child processes of tests.
#include "processes.h"

#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fcntl.h>

#include <array>
#include <cerrno>
#include <cstdio>
#include <exception>
#include <stdexcept>
#include <system_error>

namespace veldtest {
namespace {

std::system_error systemError(const std::string &what) {
    return std::system_error(errno, std::generic_category(), what);
}

/// Reads both pipes until both ends are closed, so that a program that fills one never waits for us.
void readBoth(int output, int errors, ProgramResult &result) {
    std::array<pollfd, 2> pipes = {pollfd{output, POLLIN, 0}, pollfd{errors, POLLIN, 0}};
    const std::array<std::string *, 2> texts = {&result.output, &result.errors};
    while (pipes[0].fd >= 0 || pipes[1].fd >= 0) {
        if (poll(pipes.data(), pipes.size(), -1) < 0 && errno != EINTR)
            throw systemError("poll");
        for (size_t i = 0; i < pipes.size(); ++i) {
            if (pipes[i].fd < 0 || pipes[i].revents == 0)
                continue;
            std::array<char, 4096> buffer;
            const ssize_t count = read(pipes[i].fd, buffer.data(), buffer.size());
            if (count > 0)
                texts[i]->append(buffer.data(), static_cast<size_t>(count));
            else
                pipes[i].fd = -1;
        }
    }
}

}  // namespace

pid_t startChild(const std::function<int()> &function) {
    std::fflush(nullptr);
    const pid_t child = fork();
    if (child < 0)
        throw systemError("fork");
    if (child != 0)
        return child;
    int code = 125;
    try {
        code = function();
    } catch (const std::exception &error) {
        std::fprintf(stderr, "child process: %s\n", error.what());
    }
    std::fflush(nullptr);
    _exit(code);
}

int waitForChild(pid_t child) {
    int status = 0;
    while (waitpid(child, &status, 0) < 0) {
        if (errno != EINTR)
            throw systemError("waitpid");
    }
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

int runInChild(const std::function<int()> &function) {
    return waitForChild(startChild(function));
}

ProgramResult runProgram(const std::vector<std::string> &command) {
    std::vector<char *> arguments;
    arguments.reserve(command.size() + 1);
    for (const auto &word : command)
        arguments.push_back(const_cast<char *>(word.c_str()));
    arguments.push_back(nullptr);
    std::array<int, 2> output;
    std::array<int, 2> errors;
    if (pipe2(output.data(), O_CLOEXEC) != 0 || pipe2(errors.data(), O_CLOEXEC) != 0)
        throw systemError("pipe");
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, output[1], 1);
    posix_spawn_file_actions_adddup2(&actions, errors[1], 2);
    pid_t child = -1;
    const int error = posix_spawnp(&child, arguments[0], &actions, nullptr, arguments.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    close(output[1]);
    close(errors[1]);
    ProgramResult result;
    if (error == 0) {
        readBoth(output[0], errors[0], result);
        result.status = waitForChild(child);
    }
    close(output[0]);
    close(errors[0]);
    if (error != 0)
        throw std::system_error(error, std::generic_category(), "start " + command[0]);
    return result;
}

std::string runChecked(const std::vector<std::string> &command) {
    const auto result = runProgram(command);
    if (!result.succeeded()) {
        std::string line;
        for (const auto &word : command)
            line += word + " ";
        throw std::runtime_error(line + "exited with " + std::to_string(result.status) + ": " + result.errors);
    }
    return result.output;
}

}  // namespace veldtest
