// SPDX-License-Identifier: Apache-2.0
// Starting programs without a shell, waiting for them, and keeping what they write to standard error.
#pragma once

#include "common/uniqueFd.h"

#include <cstdint>
#include <string>
#include <string_view>
#include <sys/types.h>
#include <vector>

namespace veld {

// What to start. The three streams are descriptors above 2, or -1 for /dev/null. The child has default signal
// dispositions, an empty signal mask, and no other descriptor.
struct SpawnRequest {
    const char *path = nullptr;
    char *const *arguments = nullptr;    // with the program's name, ends with nullptr
    char *const *environment = nullptr;  // ends with nullptr; nullptr: the own environment
    int standardInput = -1;
    int standardOutput = -1;
    int standardError = -1;
    bool ownProcessGroup = false;
};

// Starts the program: 0 and its process number in `process`, or an errno value.
int spawnProcess(const SpawnRequest &request, pid_t &process) noexcept;

// Waits for the end of the process: 0 and its wait status, or an errno value (ECHILD: the caller ignores SIGCHLD or
// has collected the status elsewhere).
int waitForProcess(pid_t process, int &status);

// `fd`, moved above the three standard streams when it is one of them (a process may have started without those).
UniqueFd aboveStandardStreams(UniqueFd fd) noexcept;

// What one program wrote to standard error. It goes to a file in memory and not to a pipe, so that the program never
// waits for a reader and a process that it left behind never keeps the reader waiting.
class ErrorOutput {
public:
    // Invalid (-1) when no such file can be made; the program then runs with its standard error at /dev/null.
    static ErrorOutput create() noexcept;

    int descriptor() const { return fd_.get(); }
    // Reads what was written so far and ends the writing: later writers, left behind by the program, get EPERM rather
    // than memory that nobody ever frees.
    void finish();
    bool empty() const { return text_.empty(); }
    // Logs each line as "<prefix>: <line>".
    void log(int priority, const std::string &prefix) const;

private:
    UniqueFd fd_;
    std::string text_;
    std::uint64_t omitted_ = 0;  // bytes beyond those kept
};

// The lines of the text without empty ones and trailing blanks; bytes that would garble a log become '?'.
std::vector<std::string> printableLines(std::string_view text);

// "exited with status 3", "was killed by signal 9 (KILL)".
std::string describeStatus(int status);

// The program and its arguments, separated by blanks.
std::string commandLine(const char *path, char *const *arguments);

// Why a program could not be started. Names /dev/null when that is what is missing.
std::string describeStartError(int error);

}  // namespace veld
