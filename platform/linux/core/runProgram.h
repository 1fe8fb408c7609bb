// SPDX-License-Identifier: Apache-2.0
// VLIBCExecv() with the times that tests need shorter.
#pragma once

#include <chrono>

namespace veld {

// True for the file names of the xtables programs: iptables, ip6tables, xtables and what they begin.
bool isXtablesProgram(const char *path);

// Runs the program and waits for it: 0, or -1 when it cannot start, is killed or exits with a status other than 0.
// Exit status 4 of an xtables program is tried again until `busyTime` has passed.
int runProgram(const char *path, char *const argv[], std::chrono::milliseconds busyTime);

// Starts the program and leaves it alone: 0, or -1 when it cannot be started.
int startProgram(const char *path, char *const argv[]);

}  // namespace veld
