// SPDX-License-Identifier: Apache-2.0
// Measures an operation beside its floor, the least that the same work must cost.
#include "pairedMeasurement.h"

#include <algorithm>
#include <chrono>
#include <ctime>
#include <stdexcept>

namespace veldbench {

void registerBar(const std::string &name, int rounds, const std::function<void(benchmark::State &)> &body) {
    benchmark::RegisterBenchmark(name.c_str(),
                                 [body](benchmark::State &state) {
                                     try {
                                         body(state);
                                     } catch (const std::exception &error) {
                                         state.SkipWithError(error.what());
                                     }
                                 })
        ->Iterations(rounds)
        ->UseManualTime();
}

void measurePair(benchmark::State &state, const Bar &bar, const Pair &pair) {
    std::vector<double> subjects;
    std::vector<double> floors;
    std::vector<double> ratios;
    const auto measure = [&](const std::function<void()> &run) {
        if (pair.prepare) {
            pair.prepare();
        }
        return pair.computesOnly ? processorMicroseconds(run) : microseconds(run);
    };
    // Unmeasured, so that neither pays for what is only done once.
    measure(pair.floor);
    measure(pair.subject);
    bool subjectFirst = false;
    for ([[maybe_unused]] auto round : state) {
        double subject = subjectFirst ? measure(pair.subject) : 0;
        const double floor = measure(pair.floor);
        subject = subjectFirst ? subject : measure(pair.subject);
        subjectFirst = !subjectFirst;
        subjects.push_back(subject);
        floors.push_back(floor);
        ratios.push_back(subject / floor);
        state.SetIterationTime(subject / 1e6);
    }
    report(state, bar, median(subjects), median(floors), median(ratios));
}

void report(benchmark::State &state, const Bar &bar, double subject, double floor, double ratio) {
    state.counters["subject"] = subject;
    state.counters["floor"] = floor;
    state.counters["ratio"] = ratio;
    state.counters["bar"] = bar.limit;
    state.counters["met"] = ratio <= bar.limit ? 1 : 0;
    state.SetLabel(bar.unit);
}

double microseconds(const std::function<void()> &run) {
    const auto begin = std::chrono::steady_clock::now();
    run();
    return std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - begin).count();
}

double processorMicroseconds(const std::function<void()> &run) {
    const auto now = [] {
        timespec time = {};
        clock_gettime(CLOCK_THREAD_CPUTIME_ID, &time);
        return static_cast<double>(time.tv_sec) * 1e6 + static_cast<double>(time.tv_nsec) / 1e3;
    };
    const double begin = now();
    run();
    return now() - begin;
}

double median(std::vector<double> values) {
    require(!values.empty(), "nothing was measured");
    std::sort(values.begin(), values.end());
    const size_t middle = values.size() / 2;
    return values.size() % 2 == 1 ? values[middle] : (values[middle - 1] + values[middle]) / 2;
}

void require(bool holds, const std::string &what) {
    if (!holds) {
        throw std::runtime_error(what);
    }
}

}  // namespace veldbench
