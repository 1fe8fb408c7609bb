// SPDX-License-Identifier: Apache-2.0
// Files that are written as a whole.
#include "system/newFile.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "frame/errors.h"

namespace veldfwctl {

namespace {

/// Makes a file from a template that ends in XXXXXX and fills it. @return its path, or empty with errno set
std::string newFileWrite(std::string pattern, const std::string &text, mode_t mode) {
    const int handle = mkostemp(pattern.data(), O_CLOEXEC);
    if (handle < 0) {
        return "";
    }
    size_t written = 0;
    bool succeeded = fchmod(handle, mode) == 0;
    while (succeeded && written < text.size()) {
        const ssize_t count = write(handle, text.data() + written, text.size() - written);
        succeeded = count > 0 || (count < 0 && errno == EINTR);
        written += count > 0 ? static_cast<size_t>(count) : 0;
    }
    succeeded = succeeded && fsync(handle) == 0;
    int error = errno;
    if (close(handle) != 0 && succeeded) {
        succeeded = false;
        error = errno;
    }
    if (!succeeded) {
        unlink(pattern.c_str());
        errno = error;
        return "";
    }
    return pattern;
}

}  // namespace

void fileReplace(const std::string &path, const std::string &text, mode_t mode, const std::string &remedy) {
    struct stat found = {};
    if (lstat(path.c_str(), &found) == 0 && !S_ISREG(found.st_mode)) {
        throw Failure("Cannot write " + path + ": it is no regular file; " + remedy);
    }
    const std::string temporary = newFileWrite(path + ".XXXXXX", text, mode);
    if (temporary.empty() || std::rename(temporary.c_str(), path.c_str()) != 0) {
        const int error = errno;
        if (!temporary.empty()) {
            unlink(temporary.c_str());
        }
        throw Failure("Cannot write " + path + ": " + std::strerror(error) + "; " + remedy);
    }
}

std::string rescueFileWrite(const std::string &text) {
    for (const char *pattern : {"/var/tmp/veldfwctl-backup.XXXXXX", "/tmp/veldfwctl-backup.XXXXXX"}) {
        if (std::string path = newFileWrite(pattern, text, 0600); !path.empty()) {
            return path;
        }
    }
    return "";
}

}  // namespace veldfwctl
