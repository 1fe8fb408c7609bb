// SPDX-License-Identifier: Apache-2.0
// Opening files in directories in which other users may create names.
#include "common/trustedFile.h"

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <fcntl.h>
#include <sys/random.h>

namespace veld {

std::string parentDirectory(const std::string &path) {
    const std::size_t slash = path.rfind('/');
    if (slash == std::string::npos)
        return ".";
    return slash == 0 ? "/" : path.substr(0, slash);
}

bool liesInSharedDirectory(const std::string &path) {
    struct stat info {};
    return stat(parentDirectory(path).c_str(), &info) == 0 && (info.st_mode & S_IWOTH) != 0;
}

std::string whyUntrusted(const struct stat &info, uid_t self) {
    if (S_ISLNK(info.st_mode))
        return "is a symbolic link";
    if (!S_ISREG(info.st_mode))
        return S_ISDIR(info.st_mode) ? "is a directory" : "is no regular file";
    if (info.st_uid != 0 && info.st_uid != self)
        return "belongs to user " + std::to_string(info.st_uid);
    if (info.st_nlink > 1)
        return "has " + std::to_string(info.st_nlink) + " hard links";
    return {};
}

OpenedFile openRegularFile(const std::string &path, int flags, bool shared) {
    OpenedFile file;
    // O_NONBLOCK: opening a FIFO must not wait for its other end.
    const int always = O_CLOEXEC | O_NONBLOCK | O_NOCTTY | (shared ? O_NOFOLLOW : 0);
    file.fd = UniqueFd(open(path.c_str(), flags | always));
    if (!file.fd) {
        file.error = errno;
        // The name may be taken by something that cannot be opened at all: a link, a socket, a directory, a file that
        // only its owner may read.
        if (shared && file.error != ENOENT && lstat(path.c_str(), &file.info) == 0)
            file.reason = whyUntrusted(file.info, geteuid());
        if (file.untrusted())
            file.error = EPERM;
        return file;
    }
    if (fstat(file.fd.get(), &file.info) != 0)
        file.error = errno;
    else if (shared && !(file.reason = whyUntrusted(file.info, geteuid())).empty())
        file.error = EPERM;
    else if (!S_ISREG(file.info.st_mode))
        file.error = S_ISDIR(file.info.st_mode) ? EISDIR : EINVAL;
    if (file.error != 0)
        file.fd.reset();
    return file;
}

int readWhole(int fd, std::size_t limit, std::string &content) {
    content.clear();
    char buffer[16384];
    for (;;) {
        const ssize_t count = read(fd, buffer, sizeof buffer);
        if (count == 0)
            return 0;
        if (count < 0) {
            if (errno == EINTR)
                continue;
            return errno;
        }
        content.append(buffer, static_cast<std::size_t>(count));
        if (content.size() > limit)
            return EFBIG;
    }
}

int removeUntrusted(const std::string &path) {
    if (unlink(path.c_str()) == 0 || errno == ENOENT)
        return 0;
    const int error = errno;
    struct stat info {};
    if (lstat(path.c_str(), &info) != 0)
        return errno == ENOENT ? 0 : errno;
    if (!S_ISDIR(info.st_mode))
        return error;
    return rename(path.c_str(), uniqueNameBeside(path).c_str()) == 0 ? 0 : errno;
}

std::string uniqueNameBeside(const std::string &path) {
    std::uint64_t number = 0;
    while (getrandom(&number, sizeof number, 0) < 0 && errno == EINTR) {
    }
    char digits[18];
    (void)snprintf(digits, sizeof digits, ".%016llx", static_cast<unsigned long long>(number));
    return path + digits;
}

}  // namespace veld
