// SPDX-License-Identifier: Apache-2.0
// Child processes of tests.
#include "processes.h"

#include "handle.h"

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/wait.h>

#include <cstdio>
#include <exception>
#include <stdexcept>

namespace veldtest {
namespace {

/// A file without a name, open in this process only. Unlike a pipe it never fills up.
Handle makeBuffer() {
    return {memfd_create("output", MFD_CLOEXEC), "memfd_create"};
}

std::string readBuffer(const Handle &buffer) {
    std::string text(static_cast<size_t>(lseek(buffer.get(), 0, SEEK_END)), '\0');
    if (pread(buffer.get(), text.data(), text.size(), 0) != static_cast<ssize_t>(text.size()))
        throw systemError("read a program's output");
    return text;
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
    for (const auto &word : command)
        arguments.push_back(const_cast<char *>(word.c_str()));
    arguments.push_back(nullptr);
    const Handle input(open("/dev/null", O_RDONLY | O_CLOEXEC), "open /dev/null");
    const Handle output = makeBuffer();
    const Handle errors = makeBuffer();
    const int status = runInChild([&] {
        for (const auto &[from, to] : {std::pair(&input, 0), {&output, 1}, {&errors, 2}})
            dup2(from->get(), to);
        execvp(arguments[0], arguments.data());
        throw systemError("start " + command[0]);
        return 0;
    });
    return {status, readBuffer(output), readBuffer(errors)};
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
