// SPDX-License-Identifier: Apache-2.0
// Turning what the libraries below throw into a logged failure, where an operation promises to throw nothing.
#ifndef VELDFIREWALL_SRC_RUNORLOG_H
#define VELDFIREWALL_SRC_RUNORLOG_H

#include <exception>

#include "utils/log.h"

namespace FW {

/// The operation's result; false, logged, when it throws.
template <typename Operation> bool runOrLog(const char *source, int line, const Operation &operation) {
    try {
        return operation();
    } catch (const std::exception &error) {
        logMessage(LOG_ERR, source, line, "Ended by an exception: %s", error.what());
        return false;
    }
}

}  // namespace FW

#define FW_RUN_OR_LOG(operation) ::FW::runOrLog(__FILE_NAME__, __LINE__, operation)

#endif
