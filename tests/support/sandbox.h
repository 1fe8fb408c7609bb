// SPDX-License-Identifier: Apache-2.0
// The private world that tests and the demo run in: their own mounts, network, processes and (if needed) user ids.
#ifndef VELD_TEST_SANDBOX_H
#define VELD_TEST_SANDBOX_H

#include <functional>
#include <string>

namespace veldtest {

/// How the sandbox was made.
struct SandboxInfo {
    bool overlay = false;        ///< "/" is an overlay; else a tmpfs of links to the machine's files
    bool userNamespace = false;  ///< user ids are mapped, only id 0 exists
};

/// Runs `body` in a sandbox and returns its result (128 + signal when it was killed), after every process that it left
/// behind was killed. In the sandbox any absolute path can be created or replaced; nothing of that reaches the machine.
/// /tmp, /run, /var/lock, /usr/veld and /dev are fresh, and only the loopback interface exists. The directories of the
/// running program, the working directory and the build stay visible (writes to them go through only when they lie
/// on a mount of their own or below a fresh directory). Call it from a process with a single thread.
/// @param unavailable called in place of `body`, with the reason, when this machine allows no sandbox
int runInSandbox(const std::function<int()> &body, const std::function<int(const std::string &reason)> &unavailable);

/// Whether this process runs in a sandbox.
bool inSandbox();
/// Throws std::logic_error that names `action` unless inSandbox(): what replaces files starts with this call.
void requireSandbox(const std::string &action);
/// How the sandbox of this process was made.
const SandboxInfo &sandboxInfo();

}  // namespace veldtest

#endif
