// SPDX-License-Identifier: Apache-2.0
// Measures an operation beside its floor, the least that the same work must cost.
#ifndef VELD_BENCH_PAIRED_MEASUREMENT_H
#define VELD_BENCH_PAIRED_MEASUREMENT_H

#include <benchmark/benchmark.h>

#include <functional>
#include <string>

namespace veldbench {

/// How much is measured.
struct Scale {
    bool smoke = false;  ///< only that everything runs
    /// Rounds of one measurement.
    int rounds(int full) const { return smoke ? 1 : full; }
};

/// What a result is compared with.
struct Bar {
    double limit = 1;         ///< largest ratio of subject to floor
    const char *unit = "us";  ///< of subject and floor
};

/// An operation and its floor. What they do is checked by them: they throw when it is not what should be measured.
struct Pair {
    std::function<void()> subject;
    std::function<void()> floor;
    std::function<void()> prepare = {};  ///< before each run of either, not measured
    /// Both only compute, in this thread: their processor time is measured, not what others make them wait.
    bool computesOnly = false;
};

/// Registers a benchmark of that name that runs `rounds` rounds. An exception of `body` makes it a failure.
void registerBar(const std::string &name, int rounds, const std::function<void(benchmark::State &)> &body);
/// Runs subject and floor in turn, swapping their order from round to round, so that a slow second of the machine hits
/// both. Reports the medians of both and the median of the rounds' ratios.
void measurePair(benchmark::State &state, const Bar &bar, const Pair &pair);
/// Reports a result that was obtained otherwise.
void report(benchmark::State &state, const Bar &bar, double subject, double floor, double ratio);

/// Wall-clock time of a run in microseconds.
double microseconds(const std::function<void()> &run);
/// Processor time of this thread, in the kernel too, in microseconds.
double processorMicroseconds(const std::function<void()> &run);
double median(std::vector<double> values);
/// Throws std::runtime_error with `what` unless `holds`.
void require(bool holds, const std::string &what);

}  // namespace veldbench

#endif
