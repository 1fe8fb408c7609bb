// SPDX-License-Identifier: Apache-2.0
// File locks: whom they exclude, what waiting costs, and files that vanish or were planted.
#include "core/lockFile.h"
#include "files.h"
#include "planting.h"
#include "systemLog.h"
#include "veld/core.h"

#include <boost/interprocess/sync/file_lock.hpp>
#include <sys/resource.h>

#include <csignal>
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

/// Takes the lock, shows that nobody else has it meanwhile, does something, and gives it back.
bool beAlone(const std::function<void()> &meanwhile) {
    const int fd = takeLock(60);
    const bool entered = fd >= 0 && mkdir("/run/inside", 0700) == 0;
    usleep(200);
    const bool left = entered && rmdir("/run/inside") == 0;
    meanwhile();
    return VLIBCFileUnlockByFile(fd) != 0 && left;
}

void expectSuccess(const std::vector<pid_t> &children) {
    for (const pid_t child : children)
        ASSERT_EQ(waitForChild(child), 0);
}

TEST(FileLock, ExcludesThreadsProcessesAndBoostAlike) {
    const int fd = takeLock();
    ASSERT_GE(fd, 0);
    bool inThread = true;
    std::thread([&] { inThread = tryLock(); }).join();
    EXPECT_FALSE(inThread);
    EXPECT_EQ(runInChild([] { return tryLock() ? 1 : 0; }), 0);
    boost::interprocess::file_lock boostLock(path.c_str());
    EXPECT_FALSE(boostLock.try_lock());
    errno = 0;
    EXPECT_FALSE(tryLock());
    EXPECT_EQ(errno, ETIMEDOUT);
    EXPECT_NE(VLIBCFileUnlockByFile(fd), 0);
    EXPECT_EQ(VLIBCFileUnlockByFile(fd), 0) << "closed already";
    ASSERT_TRUE(boostLock.try_lock());
    EXPECT_EQ(runInChild([] { return tryLock() ? 1 : 0; }), 0);
    boostLock.unlock();
    const int shared = takeLock(0, false);
    EXPECT_TRUE(tryLock(false));
    EXPECT_FALSE(tryLock(true));
    EXPECT_NE(VLIBCFileUnlockByFile(shared), 0);
    EXPECT_TRUE(tryLock(true));
}

TEST(FileLock, UnlinkedUnderWaitingProcessesAndThreadsNeverLetsTwoIn) {
    const auto work = [] {
        int failures = 0;
        for (int n = 0; n < 60; ++n) {
            // The others wait for this file; from its removal on, whoever gets its lock has the lock of nothing.
            failures += beAlone([n] {
                if (n % 2 == 0)
                    unlink(path.c_str());
            })
                            ? 0
                            : 1;
        }
        return failures;
    };
    std::vector<pid_t> children;
    for (int i = 0; i < 6; ++i)
        children.push_back(startChild([&] {
            int failuresOfThread = 0;
            std::thread thread([&] { failuresOfThread = work(); });
            const int failures = work();
            thread.join();
            return failures + failuresOfThread == 0 ? 0 : 1;
        }));
    expectSuccess(children);
}

TEST(FileLock, WaitingASecondCostsLessThanTwentyMilliseconds) {
    const int holder = takeLock();
    const auto microseconds = [] {
        rusage usage{};
        getrusage(RUSAGE_THREAD, &usage);
        return (usage.ru_utime.tv_sec + usage.ru_stime.tv_sec) * 1000000 + usage.ru_utime.tv_usec +
               usage.ru_stime.tv_usec;
    };
    const auto before = microseconds();
    EXPECT_EQ(takeLock(1), -1);
    EXPECT_LT(microseconds() - before, 20000);
    VLIBCFileUnlockByFile(holder);
}

TEST(FileLock, MissingDirectoryAndWrongParametersFailWithTheirError) {
    for (const auto &[wrong, error] : {std::pair("/run/no/such/lock", ENOENT), std::pair("/run", EISDIR)}) {
        int fd = 5;
        EXPECT_EQ(VLIBCFileLockTimeByFile(wrong, 1, 5, &fd), 0);
        EXPECT_EQ(errno, error);
        EXPECT_EQ(fd, -1);
        EXPECT_EQ(VLIBCErrGet(), 0x0E00 | error);
    }
    EXPECT_EQ(VLIBCFileUnlockByFile(-1), 0);
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
        struct stat info {};
        ASSERT_EQ(lstat(path.c_str(), &info), 0);
        EXPECT_TRUE(isOwnFile(path));
        EXPECT_EQ(info.st_mode & 0777U, 0600U) << "others could hold the lock";
        EXPECT_TRUE(log.contains(path)) << log.text();
        EXPECT_FALSE(tryLock());
        EXPECT_NE(VLIBCFileUnlockByFile(fd), 0);
        EXPECT_FALSE(pathExists("/run/nothing"));
    }
}

TEST(FileLock, ManyProcessesReplacingAPlantedFileNeverLetTwoIn) {
    SKIP_WITHOUT_OTHER_USERS();
    for (int round = 0; round < 150; ++round) {
        unlink(path.c_str());
        ASSERT_EQ(asStranger([] { return writeFile(path, "", 0666), true; }), 0);
        int gate[2];
        ASSERT_EQ(pipe(gate), 0);
        std::vector<pid_t> children;
        for (int i = 0; i < 6; ++i)
            children.push_back(startChild([&gate] {
                // All start at once, when the gate's last writer closes it.
                close(gate[1]);
                char none = 0;
                return read(gate[0], &none, 1) == 0 && beAlone([] {}) ? 0 : 1;
            }));
        close(gate[0]);
        close(gate[1]);
        expectSuccess(children);
    }
}

TEST(FileLock, WhatCannotBeRemovedFailsWithAMessage) {
    SKIP_WITHOUT_OTHER_USERS();
    SystemLog log;
    writeFile("/run/existing", "");
    ASSERT_EQ(symlink("/run/existing", path.c_str()), 0);  // by root, in /tmp: not the stranger's to remove
    EXPECT_EQ(asStranger([] { return takeLock() == -1 && errno == EPERM; }), 0);
    EXPECT_TRUE(log.contains("is a symbolic link and cannot be removed")) << log.text();
}

}  // namespace
