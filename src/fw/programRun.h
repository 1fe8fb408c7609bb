// SPDX-License-Identifier: Apache-2.0
// Running a program with input, and keeping what it prints.
#ifndef VELDFIREWALL_SRC_PROGRAMRUN_H
#define VELDFIREWALL_SRC_PROGRAMRUN_H

#include <string>
#include <vector>

namespace FW {

struct ProgramRun {
    bool succeeded = false;  ///< started and exited with status 0
    std::string output;      ///< standard output
    std::string message;     ///< standard error, without the line break at its end; or why there is none
};

/// Runs a program (absolute path first) without a shell and waits for it. It inherits no descriptors beyond 0 to 2.
/// While it exits with status 4, with which the xtables programs say that another one holds the tables, it is run again
/// for up to 10 seconds.
ProgramRun programRun(const std::vector<std::string> &command, const std::string &input);

}  // namespace FW

#endif
