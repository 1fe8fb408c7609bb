// SPDX-License-Identifier: Apache-2.0
// Edits of one administrator at a time.
#ifndef VELDFWCTL_EDITLOCK_H
#define VELDFWCTL_EDITLOCK_H

#include <veldfirewall/veldFW.h>

#include <functional>
#include <string>

namespace veldfwctl {

/// Keeps other runs of this tool from editing profiles, as long as it lives. The library guards each file, but not the
/// time between reading a profile and writing it back changed. Programs that use the library are not kept out.
class EditLock {
public:
    /// Waits up to 10 seconds. @throws Failure when another run edits all that time, or there is no room on /run
    EditLock();
    ~EditLock();
    EditLock(const EditLock &) = delete;
    EditLock &operator=(const EditLock &) = delete;

private:
    int descriptor = -1;
};

/// require() of an operation that changes stored profiles, under the lock.
void editRequire(const std::string &what, const std::string &remedy, const std::function<bool()> &operation);

/// Reads a profile, lets `edit` change it, and stores it, all under the lock. What `edit` throws leaves it as it was.
/// @param named the profile; the active one when empty
/// @return the profile as it is stored now
/// @throws as profileChosen() and profileWrite() do
FW::FWPROFILE profileEdit(const std::string &named, const std::function<void(FW::FWPROFILE &profile)> &edit);

}  // namespace veldfwctl

#endif
