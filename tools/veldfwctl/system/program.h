// SPDX-License-Identifier: Apache-2.0
// Runs programs with input, and keeps what they print.
#ifndef VELDFWCTL_PROGRAM_H
#define VELDFWCTL_PROGRAM_H

#include <string>
#include <vector>

namespace veldfwctl {

/// What came of a program.
struct ProgramOutput {
    int status = 0;  ///< exit status, or 128 + signal
    std::string output;
    std::string errors;
};

/// Runs a program, in the network namespace of the calling thread, and waits for it.
/// @param command absolute path and arguments
/// @throws Failure when it cannot be started
ProgramOutput programRun(const std::vector<std::string> &command, const std::string &input = "");

/// The same. @throws Failure with what it said when it does not exit with 0
std::string programRequire(const std::vector<std::string> &command, const std::string &input = "");

}  // namespace veldfwctl

#endif
