// SPDX-License-Identifier: Apache-2.0
// The lock under which the kernel's rules are changed.
#ifndef VELDFIREWALL_SRC_EXECLOCK_H
#define VELDFIREWALL_SRC_EXECLOCK_H

#include <veld/core.h>

namespace FW {

/// Keeps other processes from changing the kernel's rules, as long as it lives.
class ExecLock {
public:
    /// Waits up to 30 seconds.
    ExecLock() : taken(VLIBCFileLockTimeByFile(LOCK_FILE, EXCLUSIVE, LOCK_SECONDS, &descriptor) != 0) {}
    ~ExecLock() { release(); }
    ExecLock(const ExecLock &) = delete;
    ExecLock &operator=(const ExecLock &) = delete;

    /// False when others held it all the time.
    bool isTaken() const { return taken; }
    /// @return false when a lock that was taken cannot be released
    bool release() {
        const int releasing = taken ? descriptor : -1;
        taken = false;
        return releasing < 0 || VLIBCFileUnlockByFile(releasing) != 0;
    }

private:
    static constexpr const char *LOCK_FILE = "/tmp/firewall_iptables_exec.lock";
    static constexpr int EXCLUSIVE = 1;
    static constexpr int LOCK_SECONDS = 30;

    int descriptor = -1;
    bool taken;
};

}  // namespace FW

#endif
