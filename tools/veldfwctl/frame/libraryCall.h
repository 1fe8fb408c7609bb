// SPDX-License-Identifier: Apache-2.0
// Calls of the library, with the reasons of failures that it writes to the system log.
#ifndef VELDFWCTL_LIBRARYCALL_H
#define VELDFWCTL_LIBRARYCALL_H

#include <functional>
#include <string>
#include <vector>

namespace veldfwctl {

/// What came of a call.
struct CallResult {
    bool succeeded = false;
    std::vector<std::string> messages;  ///< what was logged meanwhile, without "source:line ", in order
};

/// Opens the system log under the tool's name.
void systemLogOpen();

/// Runs an operation of the library and keeps what it writes to the system log, which gets it too. Meanwhile standard
/// error leads to a file in memory. An exception counts as failure, its text as a message. Not from several threads.
CallResult libraryCall(const std::function<bool()> &operation);

/// The same, for operations that must succeed.
/// @param what what could not be done, with its name: "Cannot read profile \"office\""
/// @param remedy what to do about it
/// @throws Failure with `what`, the messages and `remedy` in one line
void require(const std::string &what, const std::string &remedy, const std::function<bool()> &operation);

/// Runs an operation in a process of its own, cut off from the terminal: neither a hang-up nor an interrupt nor the
/// death of the tool stops it half-way, which could leave the machine closed to everybody. Returns when it has ended.
/// @param watch called some 20 times a second meanwhile, with the id of the process
CallResult protectedCall(const std::function<bool()> &operation, const std::function<void(int process)> &watch);

/// "a; b; c" without repetitions; empty for no messages.
std::string messagesJoin(const std::vector<std::string> &messages);

/// The messages in what syslog() copied to standard error: lines "veldfwctl[12]: source.cpp:34 text"; other lines are
/// continued ones.
std::vector<std::string> logMessagesParse(const std::string &text);

}  // namespace veldfwctl

#endif
