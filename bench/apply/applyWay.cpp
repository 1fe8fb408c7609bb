// SPDX-License-Identifier: Apache-2.0
// The ways of applying a profile, each run in a process of its own.
#include "applyWay.h"

#include "files.h"
#include "processes.h"
#include "windowProbe.h"

#include <fcntl.h>
#include <spawn.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <functional>
#include <sstream>
#include <stdexcept>
#include <vector>

#include "fw/commandList.h"
#include "fw/restoreInput.h"
#include "veldfirewall/veldFW.h"

namespace veldbench {

namespace {

constexpr const char *PROFILE = "bench";
constexpr const char *WORK = "/run/bench-apply/";  // exists in the sandbox only
constexpr const char *COMMANDS = "/run/bench-apply/commands";

using Arguments = std::vector<std::string>;

std::string inputPath(const std::string &family) {
    return WORK + family;
}

FW::FWRULE makeRule(size_t n) {
    FW::FWRULE rule;
    rule.name = "Rule " + std::to_string(n);
    rule.policy = n % 4 == 3 ? FW::FW_POLICY_DENY : FW::FW_POLICY_ALLOW;
    rule.ipType = FW::FW_IP_TYPE_BOTH;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.portGroup = FW::FW_PORT_GROUP_PORT;
    rule.protocol = n % 2 == 0 ? FW::FW_PROTO_TCP : FW::FW_PROTO_UDP;
    rule.portList = {std::to_string(1000 + n)};
    if (n % 5 == 1) {
        rule.portList.push_back(std::to_string(10000 + n));
    } else if (n % 5 == 2) {
        rule.portList = {std::to_string(20000 + 10 * n) + "-" + std::to_string(20004 + 10 * n)};
    }
    return rule;
}

FW::FWPROFILE makeProfile(size_t rules) {
    FW::FWPROFILE profile;
    profile.name = PROFILE;
    std::vector<FW::FWRULE> &list = profile.rules["eth0"];
    for (size_t n = 0; n < rules; ++n) {
        list.push_back(makeRule(n));
    }
    // Last, so that a probe passes all the others.
    const std::pair<int32_t, uint16_t> probed[] = {{FW::FW_PROTO_UDP, ALLOWED_PORT}, {FW::FW_PROTO_TCP, TRANSFER_PORT}};
    for (size_t i = 0; i < 2; ++i) {
        FW::FWRULE &rule = list[rules - 1 - i];
        rule.policy = FW::FW_POLICY_ALLOW;
        rule.protocol = probed[i].first;
        rule.portList = {std::to_string(probed[i].second)};
    }
    profile.adapterPolicyMap["eth0"] = FW::FW_POLICY_DENY;
    return profile;
}

void require(bool holds, const std::string &what) {
    if (!holds) {
        throw std::runtime_error(what);
    }
}

Arguments wordsOf(const std::string &line) {
    std::istringstream in(line);
    Arguments words;
    for (std::string word; in >> word;) {
        words.push_back(word);
    }
    return words;
}

/// Starts a program and waits for it; all that it prints goes to our standard output.
void runBare(const Arguments &command, const char *input = "/dev/null") {
    std::vector<char *> arguments;
    arguments.reserve(command.size() + 1);
    for (const std::string &word : command) {
        arguments.push_back(const_cast<char *>(word.c_str()));
    }
    arguments.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_addopen(&actions, STDIN_FILENO, input, O_RDONLY, 0);
    posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
    pid_t process = -1;
    const int error = posix_spawnp(&process, arguments[0], &actions, nullptr, arguments.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    int status = 0;
    require(error == 0 && waitpid(process, &status, 0) == process && status == 0, command[0] + " failed");
}

/// What the way does; whatever must be read for it is read here, before the clock starts.
std::function<void()> actionOf(const std::string &way) {
    if (way == LOAD) {
        return [] {
            FW::FWPROFILE profile;
            require(FW::VELDFW_PROFILE().profileGet(PROFILE, profile), "profileGet() failed");
        };
    }
    if (way == SPECIFIED_RELOAD) {
        return [] { require(FW::VELDFW().fwReload(true), "fwReload() failed"); };
    }
    if (way == ATOMIC_RELOAD) {
        return [] {
            FW::FwApplyFailure failure;
            require(FW::VELDFW().fwReloadAtomic(true, failure), "fwReloadAtomic() failed: " + failure.message);
        };
    }
    if (way == BARE_RESTORE) {
        return [] {
            runBare({std::string(FW::IPTABLES_PROGRAM) + "-restore", "--noflush"}, inputPath("v4").c_str());
            runBare({std::string(FW::IP6TABLES_PROGRAM) + "-restore", "--noflush"}, inputPath("v6").c_str());
        };
    }
    if (way == UFW_RELOAD || way == FIREWALLD_RELOAD) {
        return [command = wordsOf(way)] { runBare(command); };
    }
    require(way == PROCESS_LOOP, "no such way: " + way);
    std::vector<Arguments> commands;
    std::ifstream in(COMMANDS);
    for (std::string line; std::getline(in, line);) {
        commands.push_back(wordsOf(line));
    }
    return [commands] {
        for (const Arguments &command : commands) {
            runBare(command);
        }
    };
}

long ownPeakKilobytes() {
    std::ifstream in("/proc/self/status");
    for (std::string line; std::getline(in, line);) {
        if (line.rfind("VmHWM:", 0) == 0) {
            return std::stol(line.substr(6));
        }
    }
    return 0;
}

rusage usage(int whose) {
    rusage result = {};
    getrusage(whose, &result);
    return result;
}

double processorMilliseconds(const rusage &used) {
    const auto milliseconds = [](const timeval &time) {
        return static_cast<double>(time.tv_sec) * 1e3 + static_cast<double>(time.tv_usec) / 1e3;
    };
    return milliseconds(used.ru_utime) + milliseconds(used.ru_stime);
}

}  // namespace

void installationPrepare() {
    veldtest::makeDirectories(WORK);
    veldtest::writeFile("/usr/veld/etc/firewall.d/1.json", std::string("{\"name\": \"") + PROFILE + "\"}");
    veldtest::installProgram(VELD_NETWORK_TOOL, "/usr/veld/sbin/veldnetdtool");
    // None that the kernel knows: the machine's modules are not ours to load.
    veldtest::writeFile("/usr/veld/etc.defaults/iptables_modules_list", "KERNEL_MODULES_CORE=\"no_such_core.ko\"\n"
                                                                        "KERNEL_MODULES_COMMON=\"no_such_common.ko\"\n"
                                                                        "KERNEL_MODULES_NAT=\"no_such_nat.ko\"\n"
                                                                        "IPV6_MODULES=\"no_such_ipv6.ko\"\n");
}

size_t profilePrepare(const veldtest::NetworkNamespace &space, size_t rules) {
    require(FW::VELDFW_PROFILE().profileSet(PROFILE, makeProfile(rules)), "profileSet() failed");
    Json::Value settings;
    settings["status"] = true;
    settings["profile"] = PROFILE;
    require(FW::VELDFW().configSet(settings), "configSet() failed");
    Json::Value list;
    space.run([&] { require(FW::VELDFW().fwIptablesRulesEnum(PROFILE, list, true), "fwIptablesRulesEnum() failed"); });

    const std::vector<FW::ListedCommand> commands = FW::commandsInOrder(list);
    std::string lines;
    for (const std::string program : {FW::IPTABLES_PROGRAM, FW::IP6TABLES_PROGRAM}) {
        for (const std::string chain : {FW::FW_CHAIN_INPUT, FW::FW_CHAIN_FORWARD}) {
            lines += program + " -F " + chain + "\n";
        }
    }
    for (const FW::ListedCommand &command : commands) {
        lines += command.commandLine + "\n";
    }
    veldtest::writeFile(COMMANDS, lines);
    for (const std::string family : {FW::FAMILY_V4, FW::FAMILY_V6}) {
        std::vector<FW::ListedCommand> ofFamily;
        std::copy_if(commands.begin(), commands.end(), std::back_inserter(ofFamily),
                     [&](const FW::ListedCommand &command) { return command.family == family; });
        FW::RestoreInput input;
        require(!FW::restoreInputWrite(ofFamily, input), "restoreInputWrite() refused a command");
        veldtest::writeFile(inputPath(family), input.text);
    }
    return commands.size();
}

ApplyCost applyIn(const veldtest::NetworkNamespace &space, const std::string &way) {
    veldtest::ProgramResult result;
    space.run([&] { result = veldtest::runProgram({"/proc/self/exe", "--way", way}); });
    ApplyCost cost;
    require(result.succeeded() && std::sscanf(result.errors.c_str(), "%lf %lf %ld", &cost.milliseconds,
                                              &cost.processorMilliseconds, &cost.peakKilobytes) == 3,
            way + ": exit status " + std::to_string(result.status) + ": " + result.errors + result.output);
    return cost;
}

int processOfWay(const std::string &way) {
    try {
        require(veldtest::pathExists(WORK), "not in the sandbox of the benchmark");
        const std::function<void()> action = actionOf(way);
        const double before = processorMilliseconds(usage(RUSAGE_SELF));
        const auto start = std::chrono::steady_clock::now();
        action();
        const std::chrono::duration<double, std::milli> time = std::chrono::steady_clock::now() - start;
        const rusage children = usage(RUSAGE_CHILDREN);
        const double processor = processorMilliseconds(usage(RUSAGE_SELF)) - before + processorMilliseconds(children);
        std::fprintf(stderr, "%f %f %ld\n", time.count(), processor, std::max(ownPeakKilobytes(), children.ru_maxrss));
        return 0;
    } catch (const std::exception &error) {
        std::fprintf(stderr, "%s\n", error.what());
        return 1;
    }
}

}  // namespace veldbench
