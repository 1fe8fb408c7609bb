// SPDX-License-Identifier: Apache-2.0
// JSON files under inter-process locks, replaced atomically.
#include "veldfirewall/utils.h"

#include <boost/interprocess/exceptions.hpp>
#include <json/reader.h>
#include <json/writer.h>

#include <fcntl.h>
#include <libgen.h>
#include <sys/stat.h>
#include <unistd.h>
#include <veld/sdk.h>

#include <array>
#include <cerrno>
#include <climits>
#include <cstdio>
#include <cstring>

#include "utils/descriptor.h"
#include "utils/fileLock.h"
#include "utils/jsonFile.h"
#include "utils/log.h"

// The document format on disk is that of JsonCpp's older reader and writer.
#pragma GCC diagnostic ignored "-Wdeprecated-declarations"

namespace FW {

namespace {

constexpr const char *LOCK_DIRECTORY = "/var/lock/firewall/";
constexpr const char *FALLBACK_LOCK_DIRECTORY = "/tmp/";
constexpr mode_t LOCK_DIRECTORY_MODE = 0770;
constexpr mode_t LOCK_FILE_MODE = 0660;
constexpr mode_t DATA_FILE_MODE = 0666;
constexpr size_t LOCKED_PATH_SIZE = 1024;
constexpr const char *LOCK_EXTENSION = ".lock";

/// Whether the directory's limit leaves room for the name of the lock file. Anybody's file that happens to lie among
/// the profiles can fail this; such a file counts as unreadable.
bool isLockable(const std::string &path) {
    const size_t nameLength = path.size() - (path.rfind('/') + 1);
    if (nameLength + std::strlen(LOCK_EXTENSION) > NAME_MAX) {
        FW_LOG_ERR("Failed to open json file %s: the name is too long for its lock file", path.c_str());
        return false;
    }
    return true;
}

/// Opens an existing regular file for reading. Devices, pipes and directories are refused, without waiting for them.
int regularFileOpen(const std::string &path) {
    const int fd = open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY);
    struct stat status = {};
    if (fd >= 0 && (fstat(fd, &status) != 0 || !S_ISREG(status.st_mode))) {
        close(fd);
        return -1;
    }
    return fd;
}

bool jsonParse(const std::string &text, Json::Value &value) {
    try {
        return Json::Reader().parse(text.data(), text.data() + text.size(), value);
    } catch (const Json::Exception &) {
        return false;  // nested deeper than the parser's limit
    }
}

/// A rename is on the disk only when its directory is.
bool directorySync(const std::string &filePath) {
    const size_t slash = filePath.rfind('/');
    const std::string directory = slash == std::string::npos ? "." : filePath.substr(0, slash + 1);
    const Descriptor fd(open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    return fd.isOpen() && fsync(fd.get()) == 0;
}

/// Writes the document to `temporaryPath` and brings it to the disk.
bool temporaryWrite(const std::string &temporaryPath, const std::string &text, const std::string &replacedPath) {
    Descriptor fd(open(temporaryPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK,
                       DATA_FILE_MODE));
    if (!fd.isOpen()) {
        FW_LOG_ERR("Failed to open json file %s", temporaryPath.c_str());
        return false;
    }
    struct stat replaced = {};
    const bool keepMode = stat(replacedPath.c_str(), &replaced) == 0;
    if ((keepMode && fchmod(fd.get(), replaced.st_mode & 07777) != 0) || !writeAll(fd.get(), text) ||
        fsync(fd.get()) != 0 || !fd.close()) {
        FW_LOG_ERR("Failed to write json file %s: %s", temporaryPath.c_str(), std::strerror(errno));
        unlink(temporaryPath.c_str());
        return false;
    }
    return true;
}

/// The part of a dump that runs under the lock.
bool lockedReplace(const Json::Value &value, const std::string &path) {
    const std::string temporaryPath = path + ".tmp";
    if (!temporaryWrite(temporaryPath, Json::StyledWriter().write(value), path)) {
        return false;
    }
    if (rename(temporaryPath.c_str(), path.c_str()) != 0) {
        FW_LOG_ERR("Failed to rename to %s", path.c_str());
        unlink(temporaryPath.c_str());
        return false;
    }
    if (!directorySync(path)) {
        FW_LOG_ERR("Failed to sync the directory of %s: %s", path.c_str(), std::strerror(errno));
        return false;
    }
    return true;
}

}  // namespace

std::string getLockFile(const std::string &path) {
    const char *directory = LOCK_DIRECTORY;
    if (VELDFSMkdirP(LOCK_DIRECTORY, LOCK_DIRECTORY_MODE) != 0) {
        FW_LOG_DEBUG("Failed to create path: %s", std::strerror(errno));
        directory = FALLBACK_LOCK_DIRECTORY;
    }
    std::array<char, LOCKED_PATH_SIZE> buffer = {};
    std::snprintf(buffer.data(), buffer.size(), "%s", path.c_str());
    std::string lockPath = std::string(directory) + basename(buffer.data()) + LOCK_EXTENSION;
    if (access(lockPath.c_str(), F_OK) != 0) {
        Descriptor(open(lockPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC | O_NOFOLLOW, LOCK_FILE_MODE));
    }
    return lockPath;
}

bool jsonFileLoad(Json::Value &value, const std::string &path) {
    if (access(path.c_str(), F_OK) != 0) {
        FW_LOG_ERR("File %s does not exist", path.c_str());
        return false;
    }
    if (!isLockable(path)) {
        return false;
    }
    std::string text;
    {
        FileLock lock(getLockFile(path));
        if (!lock.lockUntil(fileLockDeadline())) {
            FW_LOG_ERR("Failed to get lock timeout");
            return false;
        }
        const Descriptor fd(regularFileOpen(path));
        if (!fd.isOpen()) {
            FW_LOG_ERR("Failed to open json file %s", path.c_str());
            return false;
        }
        if (!readAll(fd.get(), text)) {
            FW_LOG_ERR("Failed to read json file %s: %s", path.c_str(), std::strerror(errno));
            return false;
        }
    }
    if (!jsonParse(text, value)) {
        FW_LOG_ERR("Failed to parse Json value of %s", path.c_str());
        return false;
    }
    return true;
}

bool jsonFileDump(const Json::Value &value, const std::string &path) {
    if (!isLockable(path)) {
        return false;
    }
    FileLock lock(getLockFile(path));
    if (!lock.lockUntil(fileLockDeadline())) {
        FW_LOG_ERR("Failed to get lock timeout");
        return false;
    }
    return lockedReplace(value, path);
}

JsonFileCreated jsonFileCreate(const Json::Value &value, const std::string &path) {
    FileLock lock(getLockFile(path));
    if (!lock.lockUntil(fileLockDeadline())) {
        FW_LOG_ERR("Failed to get lock timeout");
        return JsonFileCreated::FAILED;
    }
    struct stat status = {};
    if (lstat(path.c_str(), &status) == 0) {
        return JsonFileCreated::EXISTS;
    }
    return lockedReplace(value, path) ? JsonFileCreated::YES : JsonFileCreated::FAILED;
}

void jsonFileRemove(const std::string &path) {
    const std::string lockPath = getLockFile(path);
    FileLock lock(lockPath);
    bool locked = false;
    try {
        locked = lock.lockUntil(fileLockDeadline());
    } catch (const boost::interprocess::interprocess_exception &) {
        locked = false;
    }
    unlink(path.c_str());
    if (locked) {
        unlink(lockPath.c_str());
    }
}

}  // namespace FW
