// SPDX-License-Identifier: Apache-2.0
// Running a command list, beside starting the same programs and waiting for them.
#include "benchmarks.h"
#include "fixtures.h"

#include "files.h"
#include "realIptables.h"

#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <memory>
#include <sstream>
#include <vector>

#include "veldfirewall/veldFW.h"

namespace veldbench {

namespace {

constexpr const char *IPTABLES = "/sbin/iptables";

/// The same commands as a list of the library and as argument vectors.
struct Commands {
    Json::Value list;
    std::vector<std::vector<std::string>> words;

    void add(const std::string &arguments) {
        list["v4"][FW::FW_ADAPTER_GLOBAL].append(arguments);
        words.push_back({IPTABLES});
        std::istringstream in(arguments);
        for (std::string word; in >> word;) {
            words.back().push_back(word);
        }
    }
};

Commands makeCommands(int count) {
    Commands commands;
    for (int n = 0; n < count; ++n) {
        commands.add("-t filter -A INPUT_FIREWALL -i eth0 -s 10.0.0." + std::to_string(n % 250) + " -p tcp --dport " +
                     std::to_string(1024 + n) + " -j RETURN");
    }
    return commands;
}

void spawnAll(Commands &commands) {
    for (auto &words : commands.words) {
        std::vector<char *> arguments(words.size() + 1, nullptr);
        std::transform(words.begin(), words.end(), arguments.begin(), [](std::string &word) { return word.data(); });
        pid_t process = -1;
        int status = 0;
        require(posix_spawn(&process, IPTABLES, nullptr, nullptr, arguments.data(), environ) == 0, "cannot start");
        require(waitpid(process, &status, 0) == process && status == 0, "iptables failed");
    }
}

void registerRun(const std::string &name, int rounds, int count, const std::function<void()> &setUp,
                 const std::function<void()> &prepare) {
    registerBar(name, rounds, [=](benchmark::State &state) {
        setUp();
        const auto commands = std::make_shared<Commands>(makeCommands(count));
        measurePair(state, {1.05},
                    {[=] { require(FW::VELDFW().fwExec(commands->list), "fwExec() failed"); },
                     [=] { spawnAll(*commands); }, prepare});
    });
}

}  // namespace

void registerCommandBenchmarks(const Scale &scale) {
    registerRun(
        "fwExec/iptables/commands:10", scale.rounds(60), 10,
        [] {
            std::string reason;
            require(veldtest::realIptables(&reason), reason);
            veldtest::createFirewallChains();
        },
        [] { FW::VELDFW().fwClear(); });
    registerRun("fwExec/idle program/commands:20", scale.rounds(200), 20,
                [] { veldtest::installProgram(VELD_IDLE_PROGRAM, IPTABLES); }, {});
}

}  // namespace veldbench
