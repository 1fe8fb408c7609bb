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

/// Runs a program (absolute path first) without a shell and waits for it. It inherits no descriptors beyond 0 to 2.
ProgramRun programRun(const std::vector<std::string> &command, const std::string &input);

}  // namespace FW

#endif
