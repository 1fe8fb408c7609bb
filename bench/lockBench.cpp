// SPDX-License-Identifier: Apache-2.0
// The processor time of waiting for a lock that another holds.
#include "benchmarks.h"
#include "fixtures.h"

#include <fcntl.h>
#include <unistd.h>
#include <veld/core.h>

#include <chrono>
#include <thread>

#include "veldfirewall/utils.h"

namespace veldbench {

namespace {

constexpr const char *PLATFORM_LOCK = "/run/bench.lock";

/// Holds the record lock of a file for a time, released by a thread of its own.
class HeldLock {
public:
    HeldLock(const std::string &path, std::chrono::milliseconds time)
        : m_file(open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600)) {
        struct flock whole = {};
        whole.l_type = F_WRLCK;
        whole.l_whence = SEEK_SET;
        require(m_file >= 0 && fcntl(m_file, F_OFD_SETLK, &whole) == 0, "cannot lock " + path);
        m_release = std::thread([this, time] {
            std::this_thread::sleep_for(time);
            close(m_file);
        });
    }
    ~HeldLock() { m_release.join(); }
    HeldLock(const HeldLock &) = delete;
    HeldLock &operator=(const HeldLock &) = delete;

private:
    int m_file;
    std::thread m_release;
};

/// Subject: processor time of `wait`, floor: the time that it waited.
void measureWait(benchmark::State &state, const std::string &lockPath, std::chrono::milliseconds held,
                 const std::function<void()> &wait) {
    std::vector<double> used;
    std::vector<double> waited;
    std::vector<double> ratios;
    for ([[maybe_unused]] auto round : state) {
        const HeldLock lock(lockPath, held);
        waited.push_back(microseconds([&] { used.push_back(processorMicroseconds(wait)); }));
        ratios.push_back(used.back() / waited.back());
        require(waited.back() >= std::chrono::duration<double, std::micro>(held).count() * 0.9, "did not wait");
        state.SetIterationTime(waited.back() / 1e6);
    }
    report(state, {0.02}, median(used), median(waited), median(ratios));
}

}  // namespace

void registerLockBenchmarks(const Scale &scale) {
    const std::chrono::milliseconds held(scale.smoke ? 100 : 1000);
    registerBar("waiting/jsonFileLoad, processor beside wall", scale.rounds(5), [held](benchmark::State &state) {
        const std::string path = fillStore(1, 1).front();
        measureWait(state, FW::getLockFile(path), held, [&] {
            Json::Value document;
            require(FW::jsonFileLoad(document, path), "jsonFileLoad() failed");
        });
    });
    registerBar("waiting/VLIBCFileLockTimeByFile, as above", scale.rounds(5), [held](benchmark::State &state) {
        measureWait(state, PLATFORM_LOCK, held, [] {
            int file = -1;
            require(VLIBCFileLockTimeByFile(PLATFORM_LOCK, 1, 10, &file) == 1, "no lock");
            VLIBCFileUnlockByFile(file);
        });
    });
}

}  // namespace veldbench
