// SPDX-License-Identifier: Apache-2.0
// Edits of all profiles, beside writing their documents.
#include "benchmarks.h"
#include "fixtures.h"

#include <algorithm>
#include <cstdio>
#include <iterator>

#include "veldfirewall/utils.h"
#include "veldfirewall/veldFW.h"

namespace veldbench {

namespace {

void reserveService(FW::FW_POLICY policy) {
    require(FW::VELDFW_PROFILE().profileAddServToReserve(FW::FW_ADAPTER_GLOBAL, "added_service", policy, false),
            "profileAddServToReserve() failed");
}

/// Alternates the policy, so that each call changes every profile; the profiles do not grow.
struct Reservation {
    FW::FW_POLICY next = FW::FW_POLICY_ALLOW;

    void run() {
        reserveService(next);
        next = next == FW::FW_POLICY_ALLOW ? FW::FW_POLICY_DENY : FW::FW_POLICY_ALLOW;
    }
};

/// The profile directory in memory, or on the disk.
class StorePlace {
public:
    StorePlace(const DiskDirectory &disk, bool onDisk) : m_onDisk(onDisk) {
        clearStore();
        if (m_onDisk) {
            disk.mountAt(STORE);
            clearStore();
        }
    }
    ~StorePlace() {
        if (m_onDisk) {
            DiskDirectory::unmountFrom(STORE);
        }
    }
    StorePlace(const StorePlace &) = delete;
    StorePlace &operator=(const StorePlace &) = delete;

private:
    bool m_onDisk;
};

void dump(const Json::Value &document, const std::string &path) {
    require(FW::jsonFileDump(document, path), "jsonFileDump() failed");
}

Json::Value load(const std::string &path) {
    Json::Value document;
    require(FW::jsonFileLoad(document, path), "jsonFileLoad() failed");
    return document;
}

/// An edit beside writing the same documents, and beside reading each of them once as well.
void registerShares(const Scale &scale, const DiskDirectory &disk, bool onDisk) {
    const size_t profiles = scale.smoke ? 10 : 100;
    const std::string name = std::string("reserve/") + (onDisk ? "disk" : "memory") +
                             ", profiles:" + std::to_string(profiles) + ", rules:100";
    const auto registerShare = [&](const std::string &besides, double limit, bool readsToo) {
        registerBar(name + besides, scale.rounds(15), [=, &disk](benchmark::State &state) {
            const StorePlace store(disk, onDisk);
            const auto paths = fillStore(profiles, 100);
            Reservation reservation;
            reservation.run();
            std::vector<Json::Value> documents;
            std::transform(paths.begin(), paths.end(), std::back_inserter(documents), load);
            const auto floor = [&] {
                for (size_t i = 0; i < paths.size(); ++i) {
                    if (readsToo) {
                        dump(load(paths[i]), paths[i]);
                    } else {
                        dump(documents[i], paths[i]);
                    }
                }
            };
            measurePair(state, {limit}, {[&] { reservation.run(); }, floor, {}, !onDisk});
        });
    };
    // The writes are 80 % of the edit when the edit is at most 1.25 times the writes.
    registerShare(" beside writes", 1.25, false);
    if (!onDisk) {
        // A second scan would double it.
        registerShare(" beside loads+writes", 2.0, true);
    }
}

void registerGrowth(const Scale &scale, const DiskDirectory &disk, size_t most) {
    registerBar("reserve/growth, profiles:" + std::to_string(most) + " beside 10 x " + std::to_string(most / 10),
                scale.rounds(5), [=, &disk](benchmark::State &state) {
                    const StorePlace store(disk, false);
                    std::vector<double> large;
                    std::vector<double> small;
                    std::vector<double> ratios;
                    const auto measure = [](size_t profiles, int times) {
                        fillStore(profiles, 20);
                        Reservation reservation;
                        reservation.run();
                        return processorMicroseconds([&] {
                            for (int i = 0; i < times; ++i) {
                                reservation.run();
                            }
                        });
                    };
                    for ([[maybe_unused]] auto round : state) {
                        large.push_back(measure(most, 1));
                        small.push_back(measure(most / 10, 10));
                        ratios.push_back(large.back() / small.back());
                        state.SetIterationTime(large.back() / 1e6);
                    }
                    report(state, {1.5}, median(large), median(small), median(ratios));
                });
}

}  // namespace

void registerEditBenchmarks(const Scale &scale, const DiskDirectory &disk) {
    registerShares(scale, disk, false);
    registerGrowth(scale, disk, 100);
    if (!scale.smoke) {
        registerGrowth(scale, disk, 1000);
    }
    std::string reason;
    if (disk.available(reason)) {
        registerShares(scale, disk, true);
    } else {
        std::printf("Edits are measured in memory only; for those on a disk, run in a directory of one: %s\n",
                    reason.c_str());
    }
}

}  // namespace veldbench
