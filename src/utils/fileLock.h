// SPDX-License-Identifier: Apache-2.0
// An exclusive lock file that excludes processes and threads alike.
#ifndef VELDFIREWALL_SRC_FILELOCK_H
#define VELDFIREWALL_SRC_FILELOCK_H

#include <boost/date_time/posix_time/posix_time_types.hpp>

#include <string>

namespace FW {

/// A whole-file record lock that belongs to its own open descriptor. Unlike the record locks of Boost's file_lock,
/// which it excludes and is excluded by, it keeps out other threads of the process, and it is not lost when another
/// descriptor of the file is closed. The descriptor is not inherited by programs that the process starts.
class FileLock {
public:
    /// @param path lock file, created when missing
    explicit FileLock(std::string path);
    /// Releases the lock.
    ~FileLock();
    FileLock(const FileLock &) = delete;
    FileLock &operator=(const FileLock &) = delete;

    /// Waits for the lock, asleep between tries. A lock file that was unlinked meanwhile is made and locked anew, so
    /// that nobody holds the lock of a file that others no longer see.
    /// @param deadline UTC
    /// @return false when the deadline passed
    /// @throws boost::interprocess::interprocess_exception when the lock file cannot be opened or locked
    bool lockUntil(const boost::posix_time::ptime &deadline);

private:
    std::string path;
    int descriptor = -1;

    bool sharedDirectoryLock(const boost::posix_time::ptime &deadline);
    void open();
    void close();
    bool tryLock();
    bool isStillAtPath() const;
};

/// The deadline of a lock that is requested now.
boost::posix_time::ptime fileLockDeadline();

}  // namespace FW

#endif
