// SPDX-License-Identifier: Apache-2.0
// Runs programs and keeps what they print.
#include "system/program.h"

#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>
#include <system_error>

#include "frame/context.h"
#include "frame/errors.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

/// Text in memory that a program can read or write as a file: unlike pipes, three of them cannot block each other.
class MemoryText {
public:
    explicit MemoryText(const std::string &text = "") : m_handle(memfd_create("veldfwctl-program", MFD_CLOEXEC)) {
        if (m_handle < 0 || pwrite(m_handle, text.data(), text.size(), 0) != static_cast<ssize_t>(text.size())) {
            throw std::system_error(errno, std::generic_category(), "memory for a program's text");
        }
    }
    ~MemoryText() { close(m_handle); }
    MemoryText(const MemoryText &) = delete;
    MemoryText &operator=(const MemoryText &) = delete;

    int handle() const { return m_handle; }
    std::string text() const {
        std::string all;
        std::array<char, 4096> buffer;
        ssize_t count = 0;
        while ((count = pread(m_handle, buffer.data(), buffer.size(), static_cast<off_t>(all.size()))) > 0) {
            all.append(buffer.data(), static_cast<size_t>(count));
        }
        return all;
    }

private:
    int m_handle;
};

}  // namespace

std::string ProgramOutput::reason() const {
    const std::string said = oneLine(errors);
    return said.empty() ? "exited with status " + std::to_string(status) : said;
}

ProgramOutput programRun(const std::vector<std::string> &command, const std::string &input) {
    const MemoryText in(input);
    const MemoryText out;
    const MemoryText error;
    std::vector<char *> arguments;
    arguments.reserve(command.size() + 1);
    for (const std::string &argument : command) {
        arguments.push_back(const_cast<char *>(argument.c_str()));
    }
    arguments.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in.handle(), STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, out.handle(), STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, error.handle(), STDERR_FILENO);
    posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
    pid_t process = -1;
    const int started = posix_spawn(&process, arguments[0], &actions, nullptr, arguments.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    ProgramOutput result;
    if (started != 0) {
        result.status = 127;
        result.errors = command[0] + ": " + std::strerror(started);
        return result;
    }
    int status = 0;
    while (waitpid(process, &status, 0) < 0 && errno == EINTR) {
    }
    result.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    result.output = out.text();
    result.errors = error.text();
    return result;
}

std::string programRequire(const std::vector<std::string> &command, const std::string &input) {
    ProgramOutput result = programRun(command, input);
    if (!result.succeeded()) {
        throw Failure("\"" + join(command, " ") + "\" failed: " + result.reason() +
                      "; run \"veldfwctl doctor\" to see what is missing");
    }
    return std::move(result.output);
}

}  // namespace veldfwctl
