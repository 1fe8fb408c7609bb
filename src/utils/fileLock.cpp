// SPDX-License-Identifier: Apache-2.0
// An exclusive lock file on open-file-description record locks.
#include "utils/fileLock.h"

#include <boost/date_time/posix_time/posix_time.hpp>
#include <boost/interprocess/exceptions.hpp>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>
#include <veld/core.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstring>
#include <thread>

namespace FW {

namespace {

constexpr long LOCK_TIMEOUT_US = 30'000'000;
constexpr const char *SHARED_DIRECTORY = "/tmp/";
constexpr int EXCLUSIVE = 1;
// Short at first, because most locks are held for one small file; long enough later to cost nothing.
constexpr std::chrono::microseconds FIRST_PAUSE(200);
constexpr std::chrono::microseconds LONGEST_PAUSE(10'000);

[[noreturn]] void throwSystemError() {
    throw boost::interprocess::interprocess_exception(boost::interprocess::error_info(errno));
}

}  // namespace

FileLock::FileLock(std::string lockPath) : path(std::move(lockPath)) {}

FileLock::~FileLock() {
    close();
}

bool FileLock::lockUntil(const boost::posix_time::ptime &deadline) {
    if (path.compare(0, std::strlen(SHARED_DIRECTORY), SHARED_DIRECTORY) == 0) {
        return sharedDirectoryLock(deadline);
    }
    auto pause = FIRST_PAUSE;
    for (;;) {
        if (descriptor < 0) {
            open();
        }
        if (tryLock()) {
            if (isStillAtPath()) {
                return true;
            }
            close();
            continue;
        }
        const auto now = boost::posix_time::microsec_clock::universal_time();
        if (now >= deadline) {
            return false;
        }
        const std::chrono::microseconds left((deadline - now).total_microseconds());
        std::this_thread::sleep_for(std::min(pause, left));
        pause = std::min(pause * 2, LONGEST_PAUSE);
    }
}

/// Where everybody may create files, the platform takes the lock: it knows a planted file from one of ours.
bool FileLock::sharedDirectoryLock(const boost::posix_time::ptime &deadline) {
    const auto left = deadline - boost::posix_time::microsec_clock::universal_time();
    const int seconds = static_cast<int>(std::max<long>(0, left.total_seconds()));
    return VLIBCFileLockTimeByFile(path.c_str(), EXCLUSIVE, seconds, &descriptor) == 1;
}

void FileLock::open() {
    descriptor = ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY, 0660);
    if (descriptor < 0) {
        throwSystemError();
    }
}

void FileLock::close() {
    if (descriptor >= 0) {
        ::close(descriptor);
        descriptor = -1;
    }
}

bool FileLock::tryLock() {
    struct flock whole = {};
    whole.l_type = F_WRLCK;
    whole.l_whence = SEEK_SET;
    if (fcntl(descriptor, F_OFD_SETLK, &whole) == 0) {
        return true;
    }
    if (errno != EAGAIN && errno != EACCES && errno != EINTR) {
        throwSystemError();
    }
    return false;
}

bool FileLock::isStillAtPath() const {
    struct stat locked = {};
    struct stat atPath = {};
    return fstat(descriptor, &locked) == 0 && lstat(path.c_str(), &atPath) == 0 && locked.st_dev == atPath.st_dev &&
           locked.st_ino == atPath.st_ino;
}

boost::posix_time::ptime fileLockDeadline() {
    return boost::posix_time::microsec_clock::universal_time() + boost::posix_time::microseconds(LOCK_TIMEOUT_US);
}

}  // namespace FW
