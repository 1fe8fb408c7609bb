// SPDX-License-Identifier: Apache-2.0
// VELDFSMkdirP(): a directory with its parents.
#include "veld/sdk.h"

#include "common/log.h"
#include "common/trustedFile.h"

#include <algorithm>
#include <sys/stat.h>

namespace veld {
namespace {

// What is at the path already, or has just been made there by somebody else: 0 when it serves, or an errno value.
int acceptExisting(const std::string &path) {
    struct stat info {};
    if (stat(path.c_str(), &info) != 0)
        return errno;
    if (!S_ISDIR(info.st_mode))
        return ENOTDIR;
    // In a directory such as /tmp another user may have made it, to own what is put there, or linked it to another.
    if (liesInSharedDirectory(path)) {
        if (lstat(path.c_str(), &info) != 0)
            return errno;
        if (!S_ISDIR(info.st_mode) || (info.st_uid != 0 && info.st_uid != geteuid())) {
            VELD_LOG(LOG_WARNING, "directory %s %s %u; it is not used", path.c_str(),
                     S_ISDIR(info.st_mode) ? "belongs to user" : "is a link made by user", info.st_uid);
            return EPERM;
        }
    }
    return 0;
}

int makeDirectories(const std::string &path, mode_t mode) {
    int error = mkdir(path.c_str(), mode) == 0 ? 0 : errno;
    if (error == ENOENT) {
        const std::string parent = parentDirectory(path);
        if (parent == path || parent == ".")
            return error;
        // Parents must let us in, whatever the mode of the directory proper.
        error = makeDirectories(parent.substr(0, std::max<std::size_t>(parent.find_last_not_of('/') + 1, 1)),
                                mode | S_IWUSR | S_IXUSR);
        if (error == 0)
            error = mkdir(path.c_str(), mode) == 0 ? 0 : errno;
    }
    return error == EEXIST ? acceptExisting(path) : error;
}

}  // namespace
}  // namespace veld

int VELDFSMkdirP(const char *path, mode_t mode) {
    return veld::guarded(__func__, -1, [&] {
        int error = EINVAL;
        if (path != nullptr) {
            std::string name = path;
            name.erase(std::max<std::size_t>(name.find_last_not_of('/') + 1, name.empty() ? 0 : 1));
            error = name.empty() ? ENOENT : veld::makeDirectories(name, mode);
        }
        if (error == 0)
            return 0;
        VELD_SET_ERROR(error == EINVAL ? veld::kBadParameter : veld::systemErrorCode(error));
        errno = error;
        return -1;
    });
}
