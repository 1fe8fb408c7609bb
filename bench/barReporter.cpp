// SPDX-License-Identifier: Apache-2.0
// Prints the results as a table: subject, floor, ratio, bar, and whether it is met.
#include "barReporter.h"

#include <cstdio>

namespace veldbench {

bool BarReporter::ReportContext(const Context &context) {
    std::printf("%d processors; medians of interleaved rounds; the ratio is that of the rounds\n\n",
                context.cpu_info.num_cpus);
    std::printf("%-50s %6s %12s %12s %8s %6s\n", "", "rounds", "subject", "floor", "ratio", "bar");
    return true;
}

void BarReporter::ReportRuns(const std::vector<Run> &runs) {
    for (const Run &run : runs) {
        const std::string name = run.run_name.function_name;
        if (run.error_occurred) {
            std::printf("%-50s failed: %s\n", name.c_str(), run.error_message.c_str());
            ++m_failures;
            continue;
        }
        const auto counter = [&](const char *key) { return run.counters.at(key).value; };
        const bool met = counter("met") != 0;
        std::printf("%-50s %6lld %9.1f %-2s %9.1f %-2s %8.3f %6.2f  %s\n", name.c_str(),
                    static_cast<long long>(run.iterations), counter("subject"), run.report_label.c_str(),
                    counter("floor"), run.report_label.c_str(), counter("ratio"), counter("bar"),
                    met ? "met" : "NOT MET");
        m_missed += met ? 0 : 1;
    }
    std::fflush(stdout);
}

}  // namespace veldbench
