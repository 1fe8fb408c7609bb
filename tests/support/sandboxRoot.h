// SPDX-License-Identifier: Apache-2.0
// The file system that a sandbox sees.
#ifndef VELD_TEST_SANDBOX_ROOT_H
#define VELD_TEST_SANDBOX_ROOT_H

namespace veldtest {

/// Replaces "/" of this process's mount namespace, which must be its own, and mounts a /proc for its pid namespace.
/// Throws std::runtime_error that names the step and the error.
/// @param ownsFiles user ids are those of the machine, so that root may write into directories of any owner
/// @return true when the new "/" is an overlay, false when it is a tmpfs of links and binds
bool enterPrivateRoot(bool ownsFiles);

}  // namespace veldtest

#endif
