// SPDX-License-Identifier: Apache-2.0
// Child processes of tests.
#ifndef VELD_TEST_PROCESSES_H
#define VELD_TEST_PROCESSES_H

#include <sys/types.h>

#include <functional>
#include <string>
#include <vector>

namespace veldtest {

/// What a program did.
struct ProgramResult {
    int status = 0;      ///< exit status, or 128 + signal
    std::string output;  ///< standard output
    std::string errors;  ///< standard error
    bool succeeded() const { return status == 0; }
};

/// Runs a function in a forked child.
/// @return its result, 128 + signal when it was killed, 125 when it threw (the text goes to standard error)
int runInChild(const std::function<int()> &function);
/// Starts a function in a forked child and does not wait. End it with waitForChild().
pid_t startChild(const std::function<int()> &function);
/// Waits for a child: its exit status or 128 + signal.
int waitForChild(pid_t child);
/// Runs a program (looked up in PATH unless it holds a slash) without a shell and waits for it. When it cannot be
/// started, the status is 125, and `errors` says why.
ProgramResult runProgram(const std::vector<std::string> &command);
/// The same, and throws std::runtime_error with the command and what it printed unless it exits with 0.
std::string runChecked(const std::vector<std::string> &command);

}  // namespace veldtest

#endif
