// SPDX-License-Identifier: Apache-2.0
// A child process that is stopped before and after each of its system calls.
#ifndef VELD_TEST_TRACED_CHILD_H
#define VELD_TEST_TRACED_CHILD_H

#include <sys/types.h>

#include <array>
#include <cstdint>
#include <functional>
#include <string>

namespace veldtest {

/// A forked child that runs a function, one system call at a time.
class TracedChild {
public:
    /// Throws std::runtime_error when processes may not be traced here.
    explicit TracedChild(const std::function<void()> &function);
    /// Kills the child if it still lives.
    ~TracedChild();
    TracedChild(const TracedChild &) = delete;
    TracedChild &operator=(const TracedChild &) = delete;

    /// Runs to the next entry into or return from a system call. @return false when the child has ended
    bool next();

    bool atEntry = false;
    uint64_t number = 0;                       ///< of the system call
    std::array<uint64_t, 6> arguments = {};    ///< of the system call
    int64_t result = 0;                        ///< after the return
    std::string text(uint64_t address) const;  ///< a string in the child's memory

private:
    pid_t child = -1;
};

}  // namespace veldtest

#endif
