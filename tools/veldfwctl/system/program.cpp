// SPDX-License-Identifier: Apache-2.0
// Runs programs with input, and keeps what they print.
#include "system/program.h"

#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <cerrno>
#include <cstring>

#include "frame/errors.h"
#include "model/numbers.h"

namespace veldfwctl {

namespace {

/// A file in memory: unlike a pipe it is never full.
class MemoryFile {
public:
    MemoryFile() : m_handle(memfd_create("program", MFD_CLOEXEC)) {}
    ~MemoryFile() { close(m_handle); }
    MemoryFile(const MemoryFile &) = delete;
    MemoryFile &operator=(const MemoryFile &) = delete;

    int handle() const { return m_handle; }

    bool fill(const std::string &text) const {
        for (size_t done = 0; done < text.size();) {
            const ssize_t count = write(m_handle, text.data() + done, text.size() - done);
            if (count < 0) {
                return false;
            }
            done += static_cast<size_t>(count);
        }
        return lseek(m_handle, 0, SEEK_SET) == 0;
    }

    std::string content() const {
        std::string text;
        std::array<char, 8192> buffer = {};
        lseek(m_handle, 0, SEEK_SET);
        for (ssize_t count = 0; (count = read(m_handle, buffer.data(), buffer.size())) > 0;) {
            text.append(buffer.data(), static_cast<size_t>(count));
        }
        return text;
    }

private:
    int m_handle;
};

}  // namespace

ProgramOutput programRun(const std::vector<std::string> &command, const std::string &input) {
    const MemoryFile in;
    const MemoryFile out;
    const MemoryFile err;
    if (!in.fill(input)) {
        throw Failure("Cannot keep the input of " + command.front() + ": " + std::strerror(errno));
    }
    std::vector<std::string> words = command;
    std::vector<char *> arguments;
    arguments.reserve(words.size() + 1);
    for (std::string &word : words) {
        arguments.push_back(word.data());
    }
    arguments.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in.handle(), STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, out.handle(), STDOUT_FILENO);
    posix_spawn_file_actions_adddup2(&actions, err.handle(), STDERR_FILENO);
    posix_spawn_file_actions_addclosefrom_np(&actions, STDERR_FILENO + 1);
    pid_t process = -1;
    const int error = posix_spawn(&process, arguments.front(), &actions, nullptr, arguments.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    if (error != 0) {
        throw Failure("Cannot start " + command.front() + ": " + std::strerror(error) +
                      "; run \"veldfwctl doctor\" to see which programs are missing");
    }
    int status = 0;
    while (waitpid(process, &status, 0) < 0 && errno == EINTR) {
    }
    return {WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status), out.content(), err.content()};
}

std::string programRequire(const std::vector<std::string> &command, const std::string &input) {
    const ProgramOutput result = programRun(command, input);
    if (result.status != 0) {
        throw Failure("\"" + join(command, " ") + "\" failed with status " + std::to_string(result.status) + ": " +
                      result.errors);
    }
    return result.output;
}

}  // namespace veldfwctl
