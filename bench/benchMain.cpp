// SPDX-License-Identifier: Apache-2.0
// Runs the benchmarks in a sandbox.
//
//   veld_bench [--smoke] [options of Google Benchmark]
//
// --smoke: small inputs, one round each; tells whether everything runs, not how fast. Exit status 1 when a benchmark
// could not be run; a missed bar is only printed.
#include "barReporter.h"
#include "benchmarks.h"
#include "files.h"
#include "sandbox.h"

#include <unistd.h>

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>
#include <vector>

namespace {

constexpr const char *RESULTS_IN_SANDBOX = "/run/results.json";
const std::string OUT_OPTION = "--benchmark_out=";

/// The file that results go to lies outside the sandbox, so it is opened before.
struct Options {
    bool smoke = false;
    std::string resultsPath;
    std::vector<std::string> passed;
};

Options optionsRead(int argc, char **argv) {
    Options options;
    for (int i = 0; i < argc; ++i) {
        const std::string option = argv[i];
        if (option == "--smoke") {
            options.smoke = true;
        } else if (option.compare(0, OUT_OPTION.size(), OUT_OPTION) == 0) {
            options.resultsPath = option.substr(OUT_OPTION.size());
            options.passed.push_back(OUT_OPTION + RESULTS_IN_SANDBOX);
        } else {
            options.passed.push_back(option);
        }
    }
    return options;
}

int benchmarksRun(Options options, const veldbench::DiskDirectory &disk, std::FILE *results) {
    std::vector<char *> arguments;
    for (std::string &option : options.passed) {
        arguments.push_back(option.data());
    }
    arguments.push_back(nullptr);
    int count = static_cast<int>(options.passed.size());
    benchmark::Initialize(&count, arguments.data());
    if (benchmark::ReportUnrecognizedArguments(count, arguments.data())) {
        return 2;
    }
    const veldbench::Scale scale{options.smoke};
    veldbench::registerCommandBenchmarks(scale);
    veldbench::registerTranslationBenchmarks(scale);
    veldbench::registerStoreBenchmarks(scale);
    veldbench::registerLockBenchmarks(scale);
    veldbench::registerEditBenchmarks(scale, disk);
    veldbench::BarReporter reporter;
    const size_t run = benchmark::RunSpecifiedBenchmarks(&reporter);
    benchmark::Shutdown();
    std::printf("\n%zu benchmarks, %d failed to run, %d bars not met%s\n", run, reporter.failures(), reporter.missed(),
                options.smoke ? " (too short to tell)" : "");
    if (results != nullptr) {
        const std::string text = veldtest::readFile(RESULTS_IN_SANDBOX);
        if (std::fwrite(text.data(), 1, text.size(), results) != text.size() || std::fflush(results) != 0) {
            std::perror("the results cannot be written");
            return 1;
        }
    }
    return run == 0 || reporter.failures() > 0 ? 1 : 0;
}

}  // namespace

int main(int argc, char **argv) {
    const Options options = optionsRead(argc, argv);
    std::unique_ptr<std::FILE, int (*)(std::FILE *)> results(nullptr, std::fclose);
    if (!options.resultsPath.empty()) {
        results.reset(std::fopen(options.resultsPath.c_str(), "we"));
        if (!results) {
            std::perror(options.resultsPath.c_str());
            return 1;
        }
    }
    const veldbench::DiskDirectory disk(std::filesystem::current_path().string());
    return veldtest::runInSandbox([&] { return benchmarksRun(options, disk, results.get()); },
                                  [](const std::string &reason) {
                                      std::fprintf(stderr, "no sandbox: %s\n", reason.c_str());
                                      return 1;
                                  });
}
