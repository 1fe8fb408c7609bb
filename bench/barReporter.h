// SPDX-License-Identifier: Apache-2.0
// Prints the results as a table: subject, floor, ratio, bar, and whether it is met.
#ifndef VELD_BENCH_BAR_REPORTER_H
#define VELD_BENCH_BAR_REPORTER_H

#include <benchmark/benchmark.h>

namespace veldbench {

class BarReporter : public benchmark::BenchmarkReporter {
public:
    bool ReportContext(const Context &context) override;
    void ReportRuns(const std::vector<Run> &runs) override;

    int failures() const { return m_failures; }  ///< benchmarks that could not be run
    int missed() const { return m_missed; }      ///< bars that were not met

private:
    int m_failures = 0;
    int m_missed = 0;
};

}  // namespace veldbench

#endif
