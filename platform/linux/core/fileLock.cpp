// SPDX-License-Identifier: Apache-2.0
// File locks that exclude processes and threads alike: record locks bound to the open descriptor.
#include "core/lockFile.h"

#include "common/growingPause.h"
#include "common/log.h"
#include "common/trustedFile.h"

#include <algorithm>
#include <fcntl.h>

namespace veld {
namespace {

// Only root may create names in /run, so this one cannot be planted.
constexpr char kGuardDirectory[] = "/run/veld";
constexpr char kGuardFile[] = "/run/veld/lock-files";

using Deadline = Clock::time_point;

GrowingPause lockPause() {
    return {std::chrono::microseconds(500), std::chrono::milliseconds(10)};
}

// Polls: there is no waiting for a record lock with a deadline that leaves signals and other threads alone. 0,
// ETIMEDOUT, or another errno value.
int waitForRecordLock(int fd, short type, Deadline deadline) {
    GrowingPause pause = lockPause();
    for (;;) {
        struct flock lock {};
        lock.l_type = type;
        lock.l_whence = SEEK_SET;
        if (fcntl(fd, F_OFD_SETLK, &lock) == 0)
            return 0;
        if (errno != EAGAIN && errno != EACCES && errno != EINTR)
            return errno;
        if (!pause.sleepUntil(deadline))
            return ETIMEDOUT;
    }
}

// Whoever holds the guard may create lock files in shared directories and remove planted ones. Without it, one process
// could remove the good file that another has just put in the place of a planted one, and locked. Where it cannot be
// had (no root, /run not writable) the work goes on without: planted files cannot be removed then either, except in a
// directory of our own. 0, or ETIMEDOUT.
int guardLockFiles(Deadline deadline, UniqueFd &guard) {
    if (geteuid() != 0 || (mkdir(kGuardDirectory, 0700) != 0 && errno != EEXIST))
        return 0;
    guard = UniqueFd(open(kGuardFile, O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW, 0600));
    // It is only ever held for a moment, so that a single try for the lock proper may wait for it.
    const int error =
        guard ? waitForRecordLock(guard.get(), F_WRLCK, std::max(deadline, Clock::now() + std::chrono::seconds(1))) : 0;
    return error == ETIMEDOUT ? error : 0;
}

OpenedFile openExisting(const std::string &path, bool exclusive, bool shared) {
    OpenedFile file = openRegularFile(path, O_RDWR, shared);
    // To share a lock, reading is enough.
    if (!exclusive && !file.untrusted() && (file.error == EACCES || file.error == EROFS))
        file = openRegularFile(path, O_RDONLY, shared);
    return file;
}

// Opens the lock file, creating it when missing and replacing what another user planted.
OpenedFile openLockFile(const std::string &path, bool exclusive, Deadline deadline) {
    const bool shared = liesInSharedDirectory(path);
    OpenedFile file = openExisting(path, exclusive, shared);
    if (file.fd || (file.error != ENOENT && !file.untrusted()))
        return file;

    UniqueFd guard;
    if (const int error = shared ? guardLockFiles(deadline, guard) : 0; error != 0) {
        file.error = error;
        return file;
    }
    file = openExisting(path, exclusive, shared);
    if (file.untrusted()) {
        if (const int error = removeUntrusted(path); error != 0) {
            VELD_LOG(LOG_ERR, "lock file %s %s and cannot be removed: %s", path.c_str(), file.reason.c_str(),
                     errorText(error).c_str());
            file.error = error;
            return file;
        }
        VELD_LOG(LOG_WARNING, "lock file %s %s; it is replaced", path.c_str(), file.reason.c_str());
    } else if (file.fd || file.error != ENOENT) {
        return file;
    }
    // O_EXCL: neither a link nor a file that appeared meanwhile is opened. 0600: whoever may open the file may hold its
    // lock for ever.
    file = OpenedFile();
    file.fd = UniqueFd(open(path.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC | O_NOFOLLOW, 0600));
    if (!file.fd || fstat(file.fd.get(), &file.info) != 0)
        file.error = errno;
    return file;
}

bool pathLeadsTo(const std::string &path, const struct stat &locked) {
    struct stat now {};
    return stat(path.c_str(), &now) == 0 && now.st_dev == locked.st_dev && now.st_ino == locked.st_ino;
}

}  // namespace

bool lockFile(const char *path, bool exclusive, std::chrono::milliseconds time, int &fd) {
    const Deadline deadline = Clock::now() + time;
    GrowingPause pause = lockPause();
    int error = EAGAIN;
    // A file that comes and goes is no reason to give up a lock that nobody holds, so the first rounds ask no clock.
    for (int round = 0; error == EAGAIN && (round < 20 || pause.sleepUntil(deadline)); ++round) {
        OpenedFile file = openLockFile(path, exclusive, deadline);
        error = file.error;
        if (file.fd) {
            error = waitForRecordLock(file.fd.get(), exclusive ? F_WRLCK : F_RDLCK, deadline);
            if (error == 0 && pathLeadsTo(path, file.info)) {
                fd = file.fd.release();
                return true;
            }
            // Removed or replaced while we waited: others lock the new file, so this lock is worth nothing.
            if (error == 0)
                error = EAGAIN;
        } else if (error == EEXIST) {
            error = EAGAIN;  // appeared between the two ways of opening it
        }
    }
    if (error == EAGAIN)
        error = ETIMEDOUT;
    if (error != ETIMEDOUT)
        VELD_LOG(LOG_ERR, "lock file %s: %s", path, errorText(error).c_str());
    VELD_SET_ERROR(systemErrorCode(error));
    errno = error;
    return false;
}

}  // namespace veld

int VLIBCFileLockTimeByFile(const char *path, int exclusive, int seconds, int *fd) {
    return veld::guarded(__func__, 0, [&] {
        if (fd != nullptr)
            *fd = -1;
        if (path == nullptr || *path == '\0' || fd == nullptr) {
            VELD_SET_ERROR(veld::kBadParameter);
            errno = EINVAL;
            return 0;
        }
        return veld::lockFile(path, exclusive != 0, std::chrono::seconds(std::max(seconds, 0)), *fd) ? 1 : 0;
    });
}

int VLIBCFileUnlockByFile(int fd) {
    struct flock lock {};
    lock.l_type = F_UNLCK;
    lock.l_whence = SEEK_SET;
    // Unlocked before it is closed: a copy of the descriptor elsewhere would keep the lock otherwise.
    if (fd < 0 || fcntl(fd, F_OFD_SETLK, &lock) != 0) {
        const int error = fd < 0 ? EBADF : errno;
        VELD_SET_ERROR(veld::systemErrorCode(error));
        errno = error;
        return 0;
    }
    return close(fd) == 0 ? 1 : 0;
}
