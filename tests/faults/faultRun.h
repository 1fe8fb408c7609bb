// SPDX-License-Identifier: Apache-2.0
// Runs a function in a child of which one system call, its own or one of the programs that it starts, fails or is the
// last.
#ifndef VELD_TEST_FAULT_RUN_H
#define VELD_TEST_FAULT_RUN_H

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

namespace veldtest {

/// One system call of a run.
struct FaultPoint {
    int process = 0;      ///< 0: the child itself; then its descendants in the order of their starts
    int index = 0;        ///< among the calls of the process: processes that run side by side mix as they like
    uint64_t number = 0;  ///< of the system call
};

struct FaultRun {
    int status = 0;          ///< of the child: the function's result, 128 + signal when killed, 125 when it threw
    bool wasStruck = false;  ///< the fault's point was reached
    std::vector<FaultPoint> points;  ///< all calls that count
};

constexpr int killProcess = -1;

/// Calls that cannot fail, or only in ways that no caller can see, do not count.
/// @param at the call that the fault strikes (or the next one of its process that has the same number)
/// @param error its errno; killProcess: the process that makes the call is killed there
/// Throws std::runtime_error when processes may not be traced, or calls not be replaced, here.
FaultRun runWithFault(const std::function<int()> &function, std::optional<FaultPoint> at = {}, int error = killProcess);

/// The errors that apply to a system call.
std::vector<int> errorsOf(uint64_t number);

}  // namespace veldtest

#endif
