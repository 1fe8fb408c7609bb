// SPDX-License-Identifier: Apache-2.0
// File locks: whom they exclude, and files that were planted. What waiting costs and what happens when the file is
// unlinked is tested together with the locks of the profile store.
#include "planting.h"
#include "systemLog.h"
#include "veld/core.h"

#include <boost/interprocess/sync/file_lock.hpp>

#include <thread>

using namespace veldtest;

namespace {

const std::string path = "/tmp/some.lock";

/// The lock's descriptor, -1 when it was not got in that time.
int takeLock(int seconds = 0, bool exclusive = true) {
    int fd = -1;
    return VLIBCFileLockTimeByFile(path.c_str(), exclusive ? 1 : 0, seconds, &fd) == 1 ? fd : -1;
}

bool tryLock(bool exclusive = true) {
    const int fd = takeLock(0, exclusive);
    return fd >= 0 && VLIBCFileUnlockByFile(fd) != 0;
}

TEST(FileLock, ExcludesThreadsProcessesAndBoostAlike) {
    const int fd = takeLock();
    ASSERT_GE(fd, 0);
    std::thread([] { EXPECT_FALSE(tryLock()); }).join();
    boost::interprocess::file_lock boostLock(path.c_str());
    EXPECT_FALSE(boostLock.try_lock());
    errno = 0;
    EXPECT_FALSE(tryLock());
    EXPECT_EQ(errno, ETIMEDOUT);
    EXPECT_NE(VLIBCFileUnlockByFile(fd), 0);
    for (const int closed : {fd, -1})
        EXPECT_EQ(VLIBCFileUnlockByFile(closed), 0);
    ASSERT_TRUE(boostLock.try_lock());
    EXPECT_EQ(runInChild([] { return tryLock() ? 1 : 0; }), 0);
    boostLock.unlock();
    const int shared = takeLock(0, false);
    EXPECT_TRUE(tryLock(false));
    EXPECT_FALSE(tryLock(true));
    EXPECT_NE(VLIBCFileUnlockByFile(shared), 0);
    EXPECT_TRUE(tryLock(true));
    for (const auto &[wrong, error] : {std::pair("/run/no/such/lock", ENOENT), std::pair("/run", EISDIR)}) {
        int none = 5;
        EXPECT_EQ(VLIBCFileLockTimeByFile(wrong, 1, 5, &none), 0);
        EXPECT_EQ(errno, error);
        EXPECT_EQ(none, -1);
        EXPECT_EQ(VLIBCErrGet(), 0x0E00 | error);
    }
}

TEST(FileLock, WhatAnotherUserPlantedIsReplacedByTheHolderOfTheGuardAndNeverFollowed) {
    SKIP_WITHOUT_OTHER_USERS();
    writeFile("/run/existing", "");
    makeDirectories("/run/veld", 0700);
    SystemLog log;
    for (const Planted &planted : plantedThings(path, "/run/existing", "")) {
        SCOPED_TRACE(planted.what);
        removeAll(path);
        log.clear();
        ASSERT_EQ(asStranger(planted.plant), 0);
        int guard = -1;
        ASSERT_EQ(VLIBCFileLockTimeByFile("/run/veld/lock-files", 1, 0, &guard), 1);
        EXPECT_FALSE(tryLock());
        EXPECT_FALSE(isOwnFile(path));
        EXPECT_NE(VLIBCFileUnlockByFile(guard), 0);
        const int fd = takeLock();
        ASSERT_GE(fd, 0) << log.text();
        EXPECT_TRUE(isOwnFile(path, 0600)) << "others could hold the lock";
        EXPECT_TRUE(log.contains(path)) << log.text();
        EXPECT_FALSE(tryLock());
        EXPECT_NE(VLIBCFileUnlockByFile(fd), 0);
        EXPECT_FALSE(pathExists("/run/nothing"));
    }
    removeAll(path);
    ASSERT_EQ(symlink("/run/existing", path.c_str()), 0);  // by root, in /tmp: not the stranger's to remove
    EXPECT_EQ(asStranger([] { return takeLock() == -1 && errno == EPERM; }), 0);
    EXPECT_TRUE(log.contains("is a symbolic link and cannot be removed")) << log.text();
}

}  // namespace
