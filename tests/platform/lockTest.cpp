// SPDX-License-Identifier: Apache-2.0
// File locks: whom they exclude, what waiting costs, and files that vanish or were planted.
#include "core/lockFile.h"
#include "files.h"
#include "planting.h"
#include "systemLog.h"
#include "veld/core.h"

#include <boost/interprocess/sync/file_lock.hpp>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/resource.h>
#include <sys/stat.h>

#include <atomic>
#include <csignal>
#include <thread>

using namespace veldtest;

namespace {

const std::string path = "/tmp/some.lock";

bool tryLock(bool exclusive = true) {
    int fd = -1;
    return VLIBCFileLockTimeByFile(path.c_str(), exclusive ? 1 : 0, 0, &fd) == 1 && VLIBCFileUnlockByFile(fd) != 0;
}

/// Nobody else may be between these two. False when somebody was.
bool enterAlone() {
    return mkdir("/run/inside", 0700) == 0;
}
bool leave() {
    return rmdir("/run/inside") == 0;
}

TEST(FileLock, ExcludesThreadsProcessesAndBoostAlike) {
    int fd = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 1, &fd), 1);
    bool inThread = true;
    std::thread([&] { inThread = tryLock(); }).join();
    EXPECT_FALSE(inThread);
    EXPECT_EQ(runInChild([] { return tryLock() ? 1 : 0; }), 0);
    boost::interprocess::file_lock boostLock(path.c_str());
    EXPECT_FALSE(boostLock.try_lock());
    int second = 0;
    errno = 0;
    EXPECT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &second), 0);
    EXPECT_EQ(errno, ETIMEDOUT);
    EXPECT_EQ(second, -1);

    EXPECT_NE(VLIBCFileUnlockByFile(fd), 0);
    EXPECT_EQ(VLIBCFileUnlockByFile(fd), 0) << "closed already";
    ASSERT_TRUE(boostLock.try_lock());
    EXPECT_EQ(runInChild([] { return tryLock() ? 1 : 0; }), 0);
    boostLock.unlock();
    EXPECT_TRUE(tryLock());
}

TEST(FileLock, SharersExcludeOnlyExclusiveHolders) {
    int fd = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 0, 0, &fd), 1);
    EXPECT_TRUE(tryLock(false));
    EXPECT_FALSE(tryLock(true));
    EXPECT_NE(VLIBCFileUnlockByFile(fd), 0);
    EXPECT_TRUE(tryLock(true));
}

TEST(FileLock, ThreadsIncrementACounterWithoutLoss) {
    int counter = 0;
    std::vector<std::thread> threads;
    threads.reserve(4);
    for (int i = 0; i < 4; ++i)
        threads.emplace_back([&] {
            for (int n = 0; n < 50; ++n) {
                int fd = -1;
                ASSERT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 60, &fd), 1);
                // Atomic accesses, so that only the lock, which thread checkers do not know, makes the sum right.
                const int seen = __atomic_load_n(&counter, __ATOMIC_RELAXED);
                std::this_thread::yield();
                __atomic_store_n(&counter, seen + 1, __ATOMIC_RELAXED);
                VLIBCFileUnlockByFile(fd);
            }
        });
    for (std::thread &thread : threads)
        thread.join();
    EXPECT_EQ(counter, 200);
}

TEST(FileLock, FileUnlinkedUnderWaitersNeverLetsTwoIn) {
    std::vector<pid_t> children;
    children.reserve(8);
    for (int i = 0; i < 8; ++i)
        children.push_back(startChild([i] {
            for (int n = 0; n < 60; ++n) {
                int fd = -1;
                if (VLIBCFileLockTimeByFile(path.c_str(), 1, 60, &fd) != 1)
                    return 2;
                if (!enterAlone())
                    return 3;
                usleep(200);
                if (!leave())
                    return 4;
                // The others wait for this file; from here on, whoever gets its lock has the lock of nothing.
                if ((n + i) % 2 == 0)
                    unlink(path.c_str());
                VLIBCFileUnlockByFile(fd);
            }
            return 0;
        }));
    for (const pid_t child : children)
        EXPECT_EQ(waitForChild(child), 0);
}

TEST(FileLock, WaitingASecondCostsLessThanTwentyMilliseconds) {
    int holder = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &holder), 1);
    rusage before{};
    getrusage(RUSAGE_THREAD, &before);
    int fd = -1;
    EXPECT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 1, &fd), 0);
    rusage after{};
    getrusage(RUSAGE_THREAD, &after);
    const auto microseconds = [](const rusage &usage) {
        return (usage.ru_utime.tv_sec + usage.ru_stime.tv_sec) * 1000000 + usage.ru_utime.tv_usec +
               usage.ru_stime.tv_usec;
    };
    const auto cost = microseconds(after) - microseconds(before);
    RecordProperty("microseconds", std::to_string(cost));
    EXPECT_LT(cost, 20000);
    VLIBCFileUnlockByFile(holder);
}

TEST(FileLock, MissingDirectoryAndWrongParametersFailWithTheirError) {
    int fd = 5;
    EXPECT_EQ(VLIBCFileLockTimeByFile("/run/no/such/lock", 1, 5, &fd), 0);
    EXPECT_EQ(errno, ENOENT);
    EXPECT_EQ(fd, -1);
    EXPECT_EQ(VLIBCErrGet(), 0x0E00 | ENOENT);
    EXPECT_EQ(VLIBCFileLockTimeByFile("/run", 1, 5, &fd), 0);
    EXPECT_EQ(errno, EISDIR);
    EXPECT_EQ(VLIBCFileLockTimeByFile(nullptr, 1, 5, &fd), 0);
    EXPECT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 5, nullptr), 0);
    EXPECT_EQ(VLIBCFileUnlockByFile(-1), 0);
}

struct Planted {
    const char *what;
    bool (*plant)();
};

TEST(FileLock, WhatAnotherUserPlantedIsReplacedAndNeverFollowed) {
    SKIP_WITHOUT_OTHER_USERS();
    const Planted cases[] = {
        {"file", [] { return open(path.c_str(), O_CREAT | O_RDWR, 0666) >= 0; }},
        {"link to nothing", [] { return symlink("/run/victim", path.c_str()) == 0; }},
        {"link to a file", [] { return symlink("/run/existing", path.c_str()) == 0; }},
        {"FIFO", [] { return mkfifo(path.c_str(), 0666) == 0; }},
        {"full directory", [] { return mkdir(path.c_str(), 0777) == 0 && mkdir((path + "/x").c_str(), 0777) == 0; }},
    };
    writeFile("/run/existing", "");
    SystemLog log;
    for (const Planted &planted : cases) {
        unlink(path.c_str());
        log.clear();
        ASSERT_EQ(asStranger(planted.plant), 0) << planted.what;
        int fd = -1;
        ASSERT_EQ(VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &fd), 1) << planted.what << log.text();
        struct stat info {};
        ASSERT_EQ(lstat(path.c_str(), &info), 0);
        EXPECT_TRUE(S_ISREG(info.st_mode)) << planted.what;
        EXPECT_EQ(info.st_uid, 0U) << planted.what;
        EXPECT_EQ(info.st_mode & 0777U, 0600U) << planted.what << ": others could hold the lock";
        EXPECT_TRUE(log.contains(path)) << planted.what << log.text();
        EXPECT_FALSE(tryLock()) << planted.what;
        EXPECT_NE(VLIBCFileUnlockByFile(fd), 0);
        EXPECT_FALSE(pathExists("/run/victim"));
    }
}

TEST(FileLock, ManyProcessesReplacingAPlantedFileNeverLetTwoIn) {
    SKIP_WITHOUT_OTHER_USERS();
    for (int round = 0; round < 150; ++round) {
        unlink(path.c_str());
        ASSERT_EQ(asStranger([] { return open(path.c_str(), O_CREAT | O_RDWR, 0666) >= 0; }), 0);
        int gate[2];
        ASSERT_EQ(pipe(gate), 0);
        std::vector<pid_t> children;
        children.reserve(6);
        for (int i = 0; i < 6; ++i)
            children.push_back(startChild([&gate] {
                // All start at once, when the gate's last writer closes it.
                close(gate[1]);
                char none = 0;
                int fd = -1;
                if (read(gate[0], &none, 1) != 0 || VLIBCFileLockTimeByFile(path.c_str(), 1, 60, &fd) != 1)
                    return 2;
                const bool alone = enterAlone();
                usleep(500);
                return alone && leave() && VLIBCFileUnlockByFile(fd) != 0 ? 0 : 3;
            }));
        close(gate[0]);
        close(gate[1]);
        for (const pid_t child : children)
            ASSERT_EQ(waitForChild(child), 0);
    }
}

TEST(FileLock, PlantedFileIsOnlyRemovedByTheHolderOfTheGuard) {
    SKIP_WITHOUT_OTHER_USERS();
    ASSERT_EQ(asStranger([] { return open(path.c_str(), O_CREAT | O_RDWR, 0666) >= 0; }), 0);
    makeDirectories("/run/veld", 0700);
    int guard = -1;
    ASSERT_EQ(VLIBCFileLockTimeByFile("/run/veld/lock-files", 1, 0, &guard), 1);
    EXPECT_FALSE(tryLock());
    struct stat info {};
    ASSERT_EQ(lstat(path.c_str(), &info), 0);
    EXPECT_EQ(info.st_uid, stranger);
    EXPECT_NE(VLIBCFileUnlockByFile(guard), 0);
    EXPECT_TRUE(tryLock());
}

TEST(FileLock, WhatCannotBeRemovedFailsWithAMessage) {
    SKIP_WITHOUT_OTHER_USERS();
    SystemLog log;
    writeFile("/run/existing", "");
    ASSERT_EQ(symlink("/run/existing", path.c_str()), 0);  // by root, in /tmp: not the stranger's to remove
    EXPECT_EQ(asStranger([] {
                  int fd = -1;
                  return VLIBCFileLockTimeByFile(path.c_str(), 1, 0, &fd) == 0 && errno == EPERM;
              }),
              0);
    EXPECT_TRUE(log.contains("is a symbolic link and cannot be removed")) << log.text();
}

}  // namespace
