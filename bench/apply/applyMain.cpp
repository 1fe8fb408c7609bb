// SPDX-License-Identifier: Apache-2.0
// Measures ways of applying a profile in a sandbox.
//
//   veld_bench_apply [--smoke | --quick] [--rounds=N] [--rules=N] [--packages=DIRECTORY] [--out=FILE]
//
// --quick: without the ways that change rule by rule, and without the hundred reloads.
// --rules: only profiles of that many rules (at most 1000).
// --packages: installs the Debian packages in it (ufw, firewalld and what they need) into the sandbox first.
// --smoke: the smallest profile, one round each; tells whether everything runs, not how fast. Exit status 1 when
// something could not be run or does not do what it is measured for; a missed bar is only printed.
#include "applyWay.h"
#include "comparison.h"
#include "files.h"
#include "otherFirewalls.h"
#include "realIptables.h"
#include "sandbox.h"
#include "systemLog.h"

#include <json/writer.h>

#include <cstdio>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <memory>
#include <string>

namespace {

struct Options {
    veldbench::ComparisonPlan plan;
    std::string packages;
    std::string out;
};

bool optionRead(const std::string &option, Options &options) {
    const size_t equals = option.find('=');
    const std::string name = option.substr(0, equals);
    const std::string value = equals == std::string::npos ? "" : option.substr(equals + 1);
    if (option == "--smoke") {
        options.plan.sizes = {10};
        options.plan.rounds = options.plan.slowRounds = 1;
        options.plan.continuityReloads = 3;
        options.plan.continuityRules = 10;
    } else if (option == "--quick") {
        options.plan.oneByOne = false;
        options.plan.continuityReloads = 0;
    } else if (name == "--rounds" && std::atoi(value.c_str()) > 0) {
        options.plan.rounds = std::atoi(value.c_str());
    } else if (name == "--rules" && std::atoi(value.c_str()) >= 10 && std::atoi(value.c_str()) <= 1000) {
        options.plan.sizes = {static_cast<size_t>(std::atoi(value.c_str()))};
        options.plan.continuityRules = options.plan.sizes.front();
    } else if (name == "--packages" && !value.empty()) {
        options.packages = std::filesystem::absolute(value).string();
    } else if (name == "--out" && !value.empty()) {
        options.out = value;
    } else {
        return false;
    }
    return true;
}

int measure(const Options &options, std::FILE *out) {
    veldtest::SystemLog log;
    try {
        std::string reason;
        if (!veldtest::realIptables(&reason)) {
            std::printf("skipped: no working iptables: %s\n", reason.c_str());
            return std::getenv("CI") != nullptr ? 1 : 0;
        }
        if (!options.packages.empty()) {
            veldbench::packagesInstall(options.packages);
        }
        veldbench::installationPrepare();
        const Json::Value results = veldbench::compare(options.plan);
        if (out != nullptr) {
            const std::string text = Json::writeString(Json::StreamWriterBuilder(), results) + "\n";
            if (std::fwrite(text.data(), 1, text.size(), out) != text.size() || std::fflush(out) != 0) {
                std::perror("the results cannot be written");
                return 1;
            }
        }
        return 0;
    } catch (const std::exception &error) {
        std::fprintf(stderr, "%s\nsystem log:\n%s\n", error.what(), log.text().c_str());
        return 1;
    }
}

}  // namespace

int main(int argc, char **argv) {
    if (argc == 3 && std::string(argv[1]) == "--way") {  // started by applyIn()
        return veldbench::processOfWay(argv[2]);
    }
    Options options;
    for (int i = 1; i < argc; ++i) {
        if (!optionRead(argv[i], options)) {
            std::fprintf(stderr, "%s: what is \"%s\"?\n", argv[0], argv[i]);
            return 2;
        }
    }
    // The file lies outside the sandbox, so it is opened before.
    std::unique_ptr<std::FILE, int (*)(std::FILE *)> out(nullptr, std::fclose);
    if (!options.out.empty()) {
        out.reset(std::fopen(options.out.c_str(), "we"));
        if (!out) {
            std::perror(options.out.c_str());
            return 1;
        }
    }
    return veldtest::runInSandbox([&] { return measure(options, out.get()); },
                                  [](const std::string &reason) {
                                      std::printf("skipped: no sandbox: %s\n", reason.c_str());
                                      return std::getenv("CI") != nullptr ? 1 : 0;
                                  });
}
