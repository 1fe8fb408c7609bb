// SPDX-License-Identifier: Apache-2.0
// Edits of one administrator at a time.
#include "system/editLock.h"

#include <sys/stat.h>
#include <veld/core.h>

#include <cerrno>
#include <cstring>

#include "frame/errors.h"
#include "frame/libraryCall.h"
#include "system/store.h"

namespace veldfwctl {

namespace {

constexpr const char *DIRECTORY = "/run/veld";
constexpr const char *LOCK = "/run/veld/edit.lock";
constexpr int EXCLUSIVE = 1;
constexpr int WAIT_SECONDS = 10;

}  // namespace

EditLock::EditLock() {
    mkdir(DIRECTORY, S_IRWXU);  // if it cannot be made, the lock tells
    if (VLIBCFileLockTimeByFile(LOCK, EXCLUSIVE, WAIT_SECONDS, &descriptor) == 0) {
        throw Failure(std::string("Cannot lock ") + LOCK + ": " + std::strerror(errno) +
                      "; either another veldfwctl edits the profiles (see \"veldfwctl doctor\"), or this is not run as "
                      "root, with room on /run");
    }
}

EditLock::~EditLock() {
    VLIBCFileUnlockByFile(descriptor);
}

void editRequire(const std::string &what, const std::string &remedy, const std::function<bool()> &operation) {
    const EditLock lock;
    require(what, remedy, operation);
}

FW::FWPROFILE profileEdit(const std::string &named, const std::function<void(FW::FWPROFILE &profile)> &edit) {
    const EditLock lock;
    FW::FWPROFILE profile = profileChosen(named);
    edit(profile);
    profileWrite(profile);
    return profile;
}

}  // namespace veldfwctl
