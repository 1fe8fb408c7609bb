// SPDX-License-Identifier: Apache-2.0
// Running a program with input, and keeping what it prints.
#ifndef VELDFIREWALL_SRC_PROGRAMRUN_H
#define VELDFIREWALL_SRC_PROGRAMRUN_H

#include <string>
#include <vector>

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

/// Runs a program without a shell and waits for it. It inherits no descriptors beyond 0 to 2.
ProgramRun programRun(const ProgramCall &call);

/// Runs all of them at the same time, each as programRun() does, and waits for all. @return the results in order
std::vector<ProgramRun> programsRun(const std::vector<ProgramCall> &calls);

}  // namespace FW

#endif
