// SPDX-License-Identifier: Apache-2.0
// Running a program with input, and keeping what it prints.
#ifndef VELDFIREWALL_SRC_PROGRAMRUN_H
#define VELDFIREWALL_SRC_PROGRAMRUN_H

#include <sys/types.h>

#include <string>
#include <vector>

#include "utils/descriptor.h"

namespace FW {

struct ProgramRun {
    bool succeeded = false;  ///< started, read all of its input and exited with status 0
    std::string output;      ///< standard output
    std::string message;     ///< standard error, without the line break at its end; or why there is none
};

/// A program to be run.
struct ProgramCall {
    std::vector<std::string> command;  ///< absolute path first
    std::string input;
    const char *setting = nullptr;  ///< "NAME=value", added to this process's environment
};

/// A program on its way, run without a shell. It inherits no descriptors beyond 0 to 2.
class StartedProgram {
public:
    explicit StartedProgram(const ProgramCall &call);
    /// Waits for its end if nobody has.
    ~StartedProgram();
    StartedProgram(const StartedProgram &) = delete;
    StartedProgram &operator=(const StartedProgram &) = delete;

    /// Waits for its end. To be called once.
    ProgramRun wait();

private:
    Descriptor in;
    Descriptor out;
    Descriptor err;
    off_t inputSize;
    pid_t process = -1;  ///< -1: not started, or waited for
    std::string reason;  ///< why it was not started
};

/// Runs a program and waits for it.
ProgramRun programRun(const ProgramCall &call);

}  // namespace FW

#endif
