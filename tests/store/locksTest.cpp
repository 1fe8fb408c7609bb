// SPDX-License-Identifier: Apache-2.0
// Locks exclude threads, processes and Boost's file locks, also when lock files are unlinked, and no writer is lost.
#include "storeFixture.h"
#include "utils/fileLock.h"
#include "utils/jsonFile.h"

#include <veld/core.h>

#include <boost/interprocess/sync/file_lock.hpp>
#include <sys/mman.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <thread>

using namespace veldtest;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::Not;

namespace {

const std::string lockPath = lockDirectory + "1.json.lock";
const std::string path = profileDirectory + "1.json";

/// What the processes of a test share.
struct Shared {
    std::atomic<int> ready{0};
    std::atomic<int> inside{0};
    std::atomic<int> intrusions{0};
    std::atomic<int> visits{0};
    std::atomic<bool> held{false};
};

Shared &sharedMemory() {
    void *memory = mmap(nullptr, sizeof(Shared), PROT_READ | PROT_WRITE, MAP_SHARED | MAP_ANONYMOUS, -1, 0);
    return *new (memory) Shared;
}

void waitUntilReady(Shared &shared, int count) {
    ++shared.ready;
    while (shared.ready < count)
        std::this_thread::yield();
}

/// Starts processes that do something at the same moment, and expects that each returns 0.
void runAtOnce(const std::vector<std::function<int()>> &functions) {
    Shared &shared = sharedMemory();
    std::vector<pid_t> processes;
    for (const auto &function : functions)
        processes.push_back(startChild([&] {
            waitUntilReady(shared, static_cast<int>(functions.size()));
            return function();
        }));
    for (const pid_t process : processes)
        EXPECT_EQ(waitForChild(process), 0);
}

/// Does something under the lock. @return false when the lock was not got
using Visit = bool (*)(const std::function<void()> &inside);

bool visitByStore(const std::function<void()> &inside) {
    FW::FileLock lock(lockPath);
    const bool locked = lock.lockUntil(FW::fileLockDeadline());
    if (locked)
        inside();
    return locked;
}

bool visitByPlatform(const std::function<void()> &inside) {
    int fd = -1;
    if (VLIBCFileLockTimeByFile(lockPath.c_str(), 1, 30, &fd) != 1)
        return false;
    inside();
    return VLIBCFileUnlockByFile(fd) != 0;
}

// No system log here: its thread would keep sanitized children from starting threads of their own.
class Locks : public testing::TestWithParam<Visit> {
protected:
    Locks() { FW::getLockFile(path); }
};

TEST_P(Locks, OnlyOneThreadOfOneProcessIsInsideAlsoWhenTheLockFileIsUnlinked) {
    for (const bool unlinking : {false, true}) {
        SCOPED_TRACE(unlinking ? "unlinked" : "kept");
        Shared &shared = sharedMemory();
        const auto visitOften = [&] {
            waitUntilReady(shared, 12);
            for (int i = 0; i < 150; ++i)
                GetParam()([&] {
                    if (shared.inside.fetch_add(1) != 0)
                        ++shared.intrusions;
                    std::this_thread::yield();
                    --shared.inside;
                    // The others wait for this file; from now on, whoever gets its lock has the lock of nothing.
                    if (unlinking && i % 3 == 0)
                        unlink(lockPath.c_str());
                    ++shared.visits;
                });
        };
        runAtOnce(std::vector<std::function<int()>>(4, [&] {
            std::thread threads[] = {std::thread(visitOften), std::thread(visitOften), std::thread(visitOften)};
            for (std::thread &thread : threads)
                thread.join();
            return 0;
        }));
        EXPECT_EQ(shared.intrusions, 0);
        EXPECT_EQ(shared.visits, 12 * 150);
    }
}

/// Starts a process that holds the lock with Boost's file_lock for so long, and returns once it does.
pid_t startBoostHolder(Shared &shared, unsigned seconds) {
    FW::getLockFile(path);
    const pid_t holder = startChild([&shared, seconds] {
        boost::interprocess::file_lock lock(lockPath.c_str());
        lock.lock();
        shared.held = true;
        sleep(seconds);
        shared.held = false;
        return 0;
    });
    while (!shared.held)
        std::this_thread::yield();
    return holder;
}

TEST_P(Locks, AWaiterSleepsUntilTheHolderIsGone) {
    Shared &shared = sharedMemory();
    const pid_t holder = startBoostHolder(shared, 1);
    timespec before = {};
    timespec after = {};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &before);
    EXPECT_TRUE(GetParam()([&] { EXPECT_FALSE(shared.held); }));
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &after);
    EXPECT_EQ(after.tv_sec, before.tv_sec);
    EXPECT_LT(after.tv_nsec - before.tv_nsec, 20'000'000);
    EXPECT_EQ(waitForChild(holder), 0);
}

INSTANTIATE_TEST_SUITE_P(By, Locks, testing::Values(visitByStore, visitByPlatform),
                         [](const auto &entry) { return entry.index == 0 ? "Store" : "Platform"; });

class StoreLocks : public Store {};

TEST_F(StoreLocks, NoLockReachesAProgram) {
    FW::FileLock lock(FW::getLockFile(path));
    ASSERT_TRUE(lock.lockUntil(FW::fileLockDeadline()));
    EXPECT_FALSE(FW::FileLock(lockPath).lockUntil(boost::posix_time::microsec_clock::universal_time()));
    EXPECT_THAT(runChecked({"ls", "-l", "/proc/" + std::to_string(getpid()) + "/fd"}), HasSubstr(".lock"));
    EXPECT_THAT(runChecked({"ls", "-l", "/proc/self/fd"}), Not(HasSubstr(".lock")));
}

TEST_F(StoreLocks, LoadAndDumpGiveUpAfterThirtySeconds) {
    store("1.json", "{}");
    store("deeper/1.json", "{}");  // shares the lock file
    Shared &shared = sharedMemory();
    const pid_t holder = startBoostHolder(shared, 60);
    const auto start = std::chrono::steady_clock::now();
    std::thread loader([&] {
        Json::Value value;
        EXPECT_FALSE(FW::jsonFileLoad(value, profileDirectory + "deeper/1.json"));
    });
    EXPECT_FALSE(FW::jsonFileDump(json("[]"), path));
    loader.join();
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(29'900));
    EXPECT_TRUE(shared.held);
    kill(holder, SIGKILL);
    waitForChild(holder);
    EXPECT_EQ(storedText("1.json"), "{}");
    EXPECT_THAT(takeErrors(),
                ElementsAre("utils.cpp Failed to get lock timeout", "utils.cpp Failed to get lock timeout"));
    EXPECT_TRUE(FW::jsonFileDump(json("[]"), path)) << "the lock of a killed process is free";
}

TEST_F(StoreLocks, ProfilesThatProcessesCreateAtTheSameMomentAreAllKept) {
    store("1.json", namedDocument("first"));
    std::vector<std::function<int()>> creators;
    for (const char letter : std::string("abcdefghij"))
        creators.emplace_back([letter] {
            srand(1);  // all draw the same file names
            bool created = true;
            for (int i = 0; i < 4; ++i)
                created = FW::VELDFW_PROFILE().profileCreate(letter + std::to_string(i)) && created;
            return created ? 0 : 1;
        });
    runAtOnce(creators);
    EXPECT_EQ(listDirectory(profileDirectory).size(), 41u);
    EXPECT_EQ(names().size(), 41u);
}

}  // namespace
