// SPDX-License-Identifier: Apache-2.0
// Runs programs and keeps what they print.
#ifndef VELDFWCTL_PROGRAM_H
#define VELDFWCTL_PROGRAM_H

#include <string>
#include <vector>

namespace veldfwctl {

inline constexpr const char *IPTABLES = "/sbin/iptables";
inline constexpr const char *IP6TABLES = "/sbin/ip6tables";

struct ProgramOutput {
    int status = 0;      ///< exit status; 128 + signal when killed; 127 when it could not be started
    std::string output;  ///< standard output
    std::string errors;  ///< standard error, or why it could not be started
    bool succeeded() const { return status == 0; }
    /// What the program said against it, or else how it ended; one line.
    std::string reason() const;
};

/// Runs a program without a shell, in the network namespace of the calling thread, and waits for it. Uses no file on a
/// disk.
/// @param command an absolute path and arguments
/// @param input its standard input
ProgramOutput programRun(const std::vector<std::string> &command, const std::string &input = "");

/// The same. @return what it printed
/// @throws Failure when it does not exit with 0
std::string programRequire(const std::vector<std::string> &command, const std::string &input = "");

}  // namespace veldfwctl

#endif
