// SPDX-License-Identifier: Apache-2.0
// How a run of the tool ends.
#ifndef VELDFWCTL_ERRORS_H
#define VELDFWCTL_ERRORS_H

#include <stdexcept>

namespace veldfwctl {

/// Exit statuses of the tool.
enum ExitStatus : int {
    STATUS_DONE = 0,
    STATUS_NO = 1,  ///< the answer to the question is no: blocked, drift, findings
    STATUS_USAGE = 2,
    STATUS_FAILED = 3,
};

/// A wrong command line or value; nothing was changed. The text says what, which and what to do.
struct UsageError : std::runtime_error {
    using std::runtime_error::runtime_error;
};

/// The job could not be done. The text says what, which and what to do.
struct Failure : std::runtime_error {
    using std::runtime_error::runtime_error;
};

}  // namespace veldfwctl

#endif
