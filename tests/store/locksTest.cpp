// SPDX-License-Identifier: Apache-2.0
// Locks exclude threads, processes and Boost's file locks, also when lock files are unlinked, and no writer is lost.
#include "storeFixture.h"
#include "utils/fileLock.h"
#include "utils/jsonFile.h"

#include <boost/interprocess/sync/file_lock.hpp>
#include <sys/mman.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <new>
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

/// Enters the lock many times. `unlinking` visitors take the lock file away as the last thing that they do inside.
void visitOften(Shared &shared, bool unlinking) {
    for (int i = 0; i < 150; ++i) {
        FW::FileLock lock(lockPath);
        if (!lock.lockUntil(FW::fileLockDeadline()))
            continue;
        if (shared.inside.fetch_add(1) != 0)
            ++shared.intrusions;
        std::this_thread::yield();
        --shared.inside;
        if (unlinking && i % 3 == 0)
            unlink(lockPath.c_str());
        ++shared.visits;
    }
}

// No system log here: its thread would keep sanitized children from starting threads of their own.
TEST(Locks, OnlyOneThreadOfOneProcessIsInsideAlsoWhenTheLockFileIsUnlinked) {
    for (const bool unlinking : {false, true}) {
        SCOPED_TRACE(unlinking ? "unlinked" : "kept");
        Shared &shared = sharedMemory();
        FW::getLockFile(path);
        std::vector<pid_t> processes;
        for (int process = 0; process < 4; ++process) {
            processes.push_back(startChild([&] {
                std::vector<std::thread> threads;
                for (int thread = 0; thread < 3; ++thread)
                    threads.emplace_back([&] {
                        waitUntilReady(shared, 12);
                        visitOften(shared, unlinking);
                    });
                for (std::thread &thread : threads)
                    thread.join();
                return 0;
            }));
        }
        for (const pid_t process : processes)
            EXPECT_EQ(waitForChild(process), 0);
        EXPECT_EQ(shared.intrusions, 0);
        EXPECT_EQ(shared.visits, 12 * 150);
    }
}

/// Starts a process that holds the lock with Boost's file_lock for so long, and returns once it does.
pid_t startBoostHolder(Shared &shared, std::chrono::milliseconds duration) {
    FW::getLockFile(path);
    const pid_t holder = startChild([&shared, duration] {
        boost::interprocess::file_lock lock(lockPath.c_str());
        lock.lock();
        shared.held = true;
        std::this_thread::sleep_for(duration);
        shared.held = false;
        lock.unlock();
        return 0;
    });
    while (!shared.held)
        std::this_thread::yield();
    return holder;
}

double threadCpuSeconds() {
    timespec used = {};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &used);
    return static_cast<double>(used.tv_sec) + static_cast<double>(used.tv_nsec) * 1e-9;
}

class StoreLocks : public Store {};

TEST_F(StoreLocks, AWaiterSleepsUntilTheHolderIsGone) {
    store("1.json", "{}");
    Shared &shared = sharedMemory();
    const pid_t holder = startBoostHolder(shared, std::chrono::seconds(1));
    const double before = threadCpuSeconds();
    Json::Value value;
    EXPECT_TRUE(FW::jsonFileLoad(value, path));
    const double used = threadCpuSeconds() - before;
    EXPECT_FALSE(shared.held);
    EXPECT_LT(used, 0.020);
    EXPECT_EQ(waitForChild(holder), 0);
}

TEST_F(StoreLocks, AThreadOfTheSameProcessWaitsToo) {
    store("1.json", "{}");
    std::atomic<bool> held{true};
    auto lock = std::make_unique<FW::FileLock>(FW::getLockFile(path));
    ASSERT_TRUE(lock->lockUntil(FW::fileLockDeadline()));
    std::thread waiter([&] {
        EXPECT_TRUE(FW::jsonFileDump(json("{'name': 'n'}"), path));
        EXPECT_FALSE(held);
    });
    Json::Value value;
    EXPECT_FALSE(FW::FileLock(lockPath).lockUntil(boost::posix_time::microsec_clock::universal_time() +
                                                  boost::posix_time::milliseconds(300)));
    EXPECT_EQ(storedText("1.json"), "{}");
    held = false;
    lock.reset();
    waiter.join();
}

TEST_F(StoreLocks, LoadAndDumpGiveUpAfterThirtySeconds) {
    store("1.json", "{}");
    store("deeper/1.json", "{}");  // shares the lock file
    Shared &shared = sharedMemory();
    const pid_t holder = startBoostHolder(shared, std::chrono::seconds(60));
    const auto start = std::chrono::steady_clock::now();
    Json::Value value;
    bool loaded = true;
    std::thread loader([&] { loaded = FW::jsonFileLoad(value, profileDirectory + "deeper/1.json"); });
    EXPECT_FALSE(FW::jsonFileDump(json("[]"), path));
    loader.join();
    EXPECT_FALSE(loaded);
    EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(29'900));
    EXPECT_TRUE(shared.held);
    kill(holder, SIGKILL);
    waitForChild(holder);
    EXPECT_EQ(storedText("1.json"), "{}");
    EXPECT_THAT(takeErrors(),
                ElementsAre("utils.cpp Failed to get lock timeout", "utils.cpp Failed to get lock timeout"));
    EXPECT_TRUE(FW::jsonFileDump(json("[]"), path)) << "the lock of a killed process is free";
}

TEST_F(StoreLocks, NoLockReachesAProgram) {
    FW::FileLock lock(FW::getLockFile(path));
    ASSERT_TRUE(lock.lockUntil(FW::fileLockDeadline()));
    EXPECT_THAT(runChecked({"ls", "-l", "/proc/" + std::to_string(getpid()) + "/fd"}), HasSubstr(".lock"));
    EXPECT_THAT(runChecked({"ls", "-l", "/proc/self/fd"}), Not(HasSubstr(".lock")));
}

TEST_F(StoreLocks, ReadersSeeWholeDocumentsWhileOthersReplaceAndRemoveThem) {
    Shared &shared = sharedMemory();
    store("0.json", "{}");
    store("1.json", namedDocument("n"));
    Json::Value document = json(namedDocument("n"));
    for (int i = 0; i < 500; ++i)
        document["filling"].append(i);
    const auto repeat = [&](const std::function<bool()> &action) {
        return startChild([&shared, action] {
            FW::VELDFW_JSON_DB().profileExist("n");
            waitUntilReady(shared, 5);
            for (int i = 0; i < 60; ++i) {
                if (!action())
                    return 1;
            }
            return 0;
        });
    };
    std::vector<pid_t> processes;
    for (int i = 0; i < 2; ++i)
        processes.push_back(repeat([&] { return FW::jsonFileDump(document, path); }));
    processes.push_back(repeat([] { return FW::VELDFW_JSON_DB().profileDbRemove("n"); }));
    for (int i = 0; i < 2; ++i)
        processes.push_back(repeat([] {
            Json::Value seen;
            FW::jsonFileLoad(seen, path);
            return true;
        }));
    for (const pid_t process : processes)
        EXPECT_EQ(waitForChild(process), 0);
    EXPECT_EQ(log.count("parse"), 0u) << log.text();
    EXPECT_EQ(log.count("rename"), 0u) << log.text();
}

TEST_F(StoreLocks, ProfilesThatProcessesCreateAtTheSameMomentAreAllKept) {
    store("1.json", namedDocument("first"));
    Shared &shared = sharedMemory();
    std::vector<pid_t> processes;
    for (int process = 0; process < 10; ++process) {
        processes.push_back(startChild([&, process] {
            srand(1);  // all draw the same file names
            waitUntilReady(shared, 10);
            for (int i = 0; i < 4; ++i) {
                if (!FW::VELDFW_PROFILE().profileCreate("p" + std::to_string(process) + "-" + std::to_string(i)))
                    return 1;
            }
            return 0;
        }));
    }
    for (const pid_t process : processes)
        EXPECT_EQ(waitForChild(process), 0);
    EXPECT_EQ(listDirectory(profileDirectory).size(), 41u);
    EXPECT_EQ(names().size(), 41u);
}

}  // namespace
