// SPDX-License-Identifier: Apache-2.0
// VLIBCFileLockTimeByFile() with a finer time.
#pragma once

#include <chrono>

namespace veld {

// Takes the lock on the file at `path`, creating it when missing: true and its descriptor in `fd`, or false with errno
// (ETIMEDOUT when others held it all the time). A time of 0 is a single try.
bool lockFile(const char *path, bool exclusive, std::chrono::milliseconds time, int &fd);

}  // namespace veld
