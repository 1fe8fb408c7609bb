// SPDX-License-Identifier: Apache-2.0
// Key/value files: reading, and replacing a line so that a reader sees the old file or the new one, never a part.
#include "core/keyValueText.h"

#include "common/log.h"
#include "common/trustedFile.h"

#include <climits>
#include <fcntl.h>
#include <memory>

namespace veld {
namespace {

// No configuration file is near this size; it bounds what a broken one can do.
constexpr std::size_t kLargestFile = std::size_t{16} * 1024 * 1024;

int fail(int error) {
    VELD_SET_ERROR(systemErrorCode(error));
    errno = error;
    return -1;
}

int badParameter(const char *what) {
    VELD_LOG(LOG_ERR, "bad parameter: %s", what);
    VELD_SET_ERROR(kBadParameter);
    errno = EINVAL;
    return -1;
}

void logUntrusted(const std::string &path, const OpenedFile &file, const char *consequence) {
    VELD_LOG(LOG_WARNING, "%s %s, in a directory in which every user may create files: %s", path.c_str(),
             file.reason.c_str(), consequence);
}

// Reads the value: 0 and a value or none, or negative with the last error.
int readValue(const char *path, const char *key, std::optional<std::string> &value) {
    OpenedFile file = openRegularFile(path, O_RDONLY, liesInSharedDirectory(path));
    if (file.untrusted()) {
        logUntrusted(path, file, "it is not read");
        VELD_SET_ERROR(kUntrustedFile);
        errno = file.error;
        return -1;
    }
    std::string content;
    const int error = file.fd ? readWhole(file.fd.get(), kLargestFile, content) : file.error;
    if (error != 0)
        return fail(error);
    value = findKeyValue(content, key);
    return 0;
}

int writeAll(int fd, std::string_view content) {
    while (!content.empty()) {
        const ssize_t count = write(fd, content.data(), content.size());
        if (count < 0 && errno != EINTR)
            return errno;
        if (count > 0)
            content.remove_prefix(static_cast<std::size_t>(count));
    }
    return 0;
}

int syncDirectory(const std::string &path) {
    const UniqueFd directory(open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!directory)
        return errno;
    // EINVAL: a file system that has nothing to synchronise.
    return fsync(directory.get()) == 0 || errno == EINVAL ? 0 : errno;
}

// Writes the new file completely to the disk under another name. `old` gives owner and mode when there was one.
int writeTemporary(const std::string &path, const struct stat *old, std::string_view content) {
    UniqueFd fd(open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, old != nullptr ? 0600 : 0644));
    if (!fd)
        return errno;
    if (old != nullptr) {
        // Only root can give a file away; anybody else goes on with a file of his own.
        if (old->st_uid != geteuid() || old->st_gid != getegid())
            (void)!fchown(fd.get(), old->st_uid, old->st_gid);
        if (fchmod(fd.get(), old->st_mode & 07777) != 0)
            return errno;
    }
    if (const int error = writeAll(fd.get(), content); error != 0)
        return error;
    if (fsync(fd.get()) != 0)
        return errno;
    return close(fd.release()) == 0 ? 0 : errno;
}

int replaceFile(const std::string &path, const struct stat *old, std::string_view content) {
    const std::string temporary = uniqueNameBeside(path);
    int error = writeTemporary(temporary, old, content);
    if (error == 0 && rename(temporary.c_str(), path.c_str()) != 0)
        error = errno;
    if (error != 0) {
        unlink(temporary.c_str());
        return error;
    }
    return syncDirectory(parentDirectory(path));
}

// In a directory of our own an administrator may have put a link to the file's real place: the link stays.
std::string resolveOwnLink(const std::string &path) {
    struct stat info {};
    if (liesInSharedDirectory(path) || lstat(path.c_str(), &info) != 0 || !S_ISLNK(info.st_mode))
        return path;
    const std::unique_ptr<char, void (*)(void *)> target(realpath(path.c_str(), nullptr), free);
    return target != nullptr ? target.get() : path;
}

int setValue(const std::string &givenPath, const char *key, const char *value) {
    const std::string path = resolveOwnLink(givenPath);
    OpenedFile file = openRegularFile(path, O_RDONLY, liesInSharedDirectory(path));
    std::string content;
    int error = 0;
    if (file.fd) {
        error = readWhole(file.fd.get(), kLargestFile, content);
    } else if (file.untrusted()) {
        logUntrusted(path, file, "it is replaced, its content is lost");
        // A rename replaces anything but a directory.
        error = S_ISDIR(file.info.st_mode) ? removeUntrusted(path) : 0;
    } else if (file.error != ENOENT) {
        error = file.error;
    }
    if (error == 0) {
        const std::string changed = replaceKeyValue(content, key, value);
        if (!file.fd || changed != content)
            error = replaceFile(path, file.fd ? &file.info : nullptr, changed);
    }
    if (error == 0)
        return 0;
    VELD_LOG(LOG_ERR, "%s: cannot set %s: %s", path.c_str(), key, errorText(error).c_str());
    return fail(error);
}

}  // namespace
}  // namespace veld

int VLIBCFileGetKeyValue(const char *file, const char *key, char *buf, int size, int /*flags*/) {
    return veld::guarded(__func__, -1, [&] {
        if (file == nullptr || key == nullptr || buf == nullptr || size < 1)
            return veld::badParameter("a file, a key and a buffer are needed");
        buf[0] = '\0';
        std::optional<std::string> value;
        if (veld::readValue(file, key, value) < 0)
            return -1;
        const std::string text = value.value_or("");
        // strnlen(): a NUL in the file ends the value for every reader of the buffer.
        const std::size_t length = strnlen(text.c_str(), static_cast<std::size_t>(size) - 1);
        memcpy(buf, text.data(), length);
        buf[length] = '\0';
        return static_cast<int>(length);
    });
}

int VLIBCFileSetKeyValue(const char *file, const char *key, const char *value, int /*flags*/) {
    return veld::guarded(__func__, -1, [&] {
        if (file == nullptr || *file == '\0' || key == nullptr || value == nullptr)
            return veld::badParameter("a file, a key and a value are needed");
        if (!veld::isRepresentableKey(key))
            return veld::badParameter(
                "a key must not be empty, begin or end with blanks, begin with '#', or hold '=' or "
                "control characters");
        if (!veld::isRepresentableValue(value))
            return veld::badParameter("a value must not hold quotes or line breaks");
        return veld::setValue(file, key, value);
    });
}

int VLIBCFileCheckKeyValue(const char *file, const char *key, const char *value, int /*flags*/) {
    return veld::guarded(__func__, 0, [&] {
        std::optional<std::string> stored;
        if (file == nullptr || key == nullptr || value == nullptr || veld::readValue(file, key, stored) < 0)
            return 0;
        return stored == value ? 1 : 0;
    });
}

int VLIBCFileExist(const char *path) {
    struct stat info {};
    return path != nullptr && stat(path, &info) == 0 && S_ISREG(info.st_mode) ? 1 : 0;
}
