// SPDX-License-Identifier: Apache-2.0
// The lock under which the kernel's rules are changed.
#ifndef VELDFIREWALL_SRC_EXECLOCK_H
#define VELDFIREWALL_SRC_EXECLOCK_H

#include <veld/core.h>

#include "utils/log.h"

namespace FW {

/// Keeps other processes from changing the kernel's rules, as long as it lives.
class ExecLock {
public:
    /// Waits up to 30 seconds.
    ExecLock() : taken(VLIBCFileLockTimeByFile(LOCK_FILE, EXCLUSIVE, LOCK_SECONDS, &descriptor) != 0) {
        if (!taken) {
            logMessage(LOG_ERR, LOG_SOURCE, __LINE__, "TIMEOUT: getting lock");
        }
    }
    ~ExecLock() {
        if (taken && descriptor >= 0 && VLIBCFileUnlockByFile(descriptor) == 0) {
            logMessage(LOG_ERR, LOG_SOURCE, __LINE__, "Failed to unlock");
        }
    }
    ExecLock(const ExecLock &) = delete;
    ExecLock &operator=(const ExecLock &) = delete;

    /// False, logged, when others held it all the time.
    bool isTaken() const { return taken; }

private:
    static constexpr const char *LOCK_FILE = "/tmp/firewall_iptables_exec.lock";
    static constexpr const char *LOG_SOURCE = "veldFW.cpp";  // the messages are the controller's
    static constexpr int EXCLUSIVE = 1;
    static constexpr int LOCK_SECONDS = 30;

    int descriptor = -1;
    bool taken;
};

}  // namespace FW

#endif
