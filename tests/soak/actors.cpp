// SPDX-License-Identifier: Apache-2.0
// Those who work on the rules and profiles at the same time.
#include "actors.h"

#include "files.h"
#include "network.h"
#include "processes.h"

#include <fcntl.h>
#include <malloc.h>
#include <sys/file.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <fstream>
#include <map>
#include <random>
#include <set>
#include <sstream>
#include <stdexcept>
#include <thread>

#include "veldfirewall/veldFW.h"

namespace veldsoak {

namespace {

using std::chrono::milliseconds;

constexpr unsigned WARM_UP = 20;  // rounds after which a process holds what it will ever hold
constexpr const char *XTABLES_LOCK = "/run/xtables.lock";
constexpr const char *OWN_CHAIN = "NEIGHBOUR";
const std::vector<std::string> SERVICES = {"soak_web", "soak_files", "soak_mail"};

class Dice {
public:
    explicit Dice(unsigned seed) : engine(seed) {}
    unsigned below(unsigned limit) { return std::uniform_int_distribution<unsigned>(0, limit - 1)(engine); }

private:
    std::mt19937 engine;
};

void count(Tally &tally, bool succeeded, const std::string &what) {
    ++tally.done;
    if (!succeeded) {
        ++tally.failed;
        std::printf("failed: %s\n", what.c_str());
        std::fflush(stdout);
    }
}

void measure(Footprint &footprint) {
    malloc_trim(0);
    footprint.descriptors = static_cast<long>(veldtest::listDirectory("/proc/self/fd").size());
    std::ifstream in("/proc/self/status");
    for (std::string line; std::getline(in, line);) {
        if (line.rfind("VmRSS:", 0) == 0) {
            footprint.kilobytes = std::stol(line.substr(6));
        }
    }
}

FW::FWRULE makeRule(Dice &dice, size_t n) {
    FW::FWRULE rule;
    rule.name = "Rule " + std::to_string(n);
    rule.policy = dice.below(3) == 0 ? FW::FW_POLICY_DENY : FW::FW_POLICY_ALLOW;
    rule.ipType = FW::FW_IP_TYPE_BOTH;
    rule.ipGroup = FW::FW_IP_GROUP_ANY;
    rule.portGroup = FW::FW_PORT_GROUP_PORT;
    rule.protocol = dice.below(2) == 0 ? FW::FW_PROTO_TCP : FW::FW_PROTO_UDP;
    rule.portList = {std::to_string(1 + dice.below(60000))};
    switch (dice.below(4)) {
    case 0:
        rule.ipType = FW::FW_IP_TYPE_V4;
        rule.ipGroup = FW::FW_IP_GROUP_NETWORK;
        rule.ipList = {"10." + std::to_string(dice.below(256)) + ".0.0", "255.255.0.0"};
        break;
    case 1:
        rule.ipType = FW::FW_IP_TYPE_V6;
        rule.ipGroup = FW::FW_IP_GROUP_ADDRESS;
        rule.ipList = {"fd00::" + std::to_string(dice.below(9999))};
        break;
    case 2:
        rule.portGroup = FW::FW_PORT_GROUP_SERVICE;
        rule.portList = {SERVICES[dice.below(static_cast<unsigned>(SERVICES.size()))]};
        break;
    default:
        break;
    }
    return rule;
}

FW::FWPROFILE makeProfile(Dice &dice, const std::string &name) {
    FW::FWPROFILE profile;
    profile.name = name;
    for (const std::string adapter : {"eth0", "eth1", FW::FW_ADAPTER_GLOBAL}) {
        const unsigned rules = 1 + dice.below(8);
        for (unsigned n = 0; n < rules; ++n) {
            profile.rules[adapter].push_back(makeRule(dice, n));
        }
        profile.adapterPolicyMap[adapter] = adapter == FW::FW_ADAPTER_GLOBAL ? FW::FW_POLICY_NONE : FW::FW_POLICY_DENY;
    }
    return profile;
}

/// The whole life of a profile. It can come back: the other editor had read it when it was deleted, and wrote it later,
/// because edits of all profiles hold no lock from reading to writing.
void editOwn(Shared &shared, Dice &dice, const std::string &name) {
    FW::VELDFW_PROFILE profiles;
    const std::string newName = name + " renamed";
    const auto doneOrBack = [&](bool done, const std::string &taken, const std::string &what) {
        const bool back = !done && profiles.profileExist(taken);
        shared.profilesBroughtBack += back ? 1 : 0;
        count(shared.edits, done || back, what);
    };
    doneOrBack(profiles.profileCreate(name), name, "profileCreate()");
    count(shared.edits, profiles.profileSet(name, makeProfile(dice, name)), "profileSet()");
    doneOrBack(profiles.profileRename(name, newName), newName, "profileRename()");
    for (const std::string &left : {name, newName}) {
        count(shared.edits, profiles.profileDelete(left), "profileDelete()");
    }
}

}  // namespace

std::string profileName(int n) {
    return "profile " + std::to_string(n);
}

void worldPrepare(unsigned seed) {
    veldtest::writeFile("/usr/veld/etc.defaults/iptables_modules_list", "KERNEL_MODULES_CORE=\"no_such_core.ko\"\n"
                                                                        "KERNEL_MODULES_COMMON=\"no_such_common.ko\"\n"
                                                                        "KERNEL_MODULES_NAT=\"no_such_nat.ko\"\n"
                                                                        "IPV6_MODULES=\"no_such_ipv6.ko\"\n");
    veldtest::writeFile("/usr/veld/sbin/veldnetdtool", "#!/bin/sh\nprintf %s \"$2\"\n", 0755);
    int port = 8000;
    for (const std::string &service : SERVICES) {
        veldtest::writeFile("/usr/veld/etc/services.d/" + service + ".json", "{\"name\": \"" + service +
                                                                                 R"(", "enabled": true,
  "source": {"protocol": "tcp", "ports": []}, "destination": {"protocol": "tcp", "ports": [")" +
                                                                                 std::to_string(port++) + "\"]}}");
    }
    for (const char *interface : {"eth0", "eth1"}) {
        veldtest::addDummyInterface(interface);
    }
    Dice dice(seed);
    for (int n = 0; n < PROFILES; ++n) {
        veldtest::writeFile("/usr/veld/etc/firewall.d/" + std::to_string(n + 1) + ".json",
                            "{\"name\": \"" + profileName(n) + "\"}");
        if (!FW::VELDFW_PROFILE().profileSet(profileName(n), makeProfile(dice, profileName(n)))) {
            throw std::runtime_error("profileSet() failed");
        }
    }
    Json::Value settings;
    settings["status"] = true;
    settings["profile"] = profileName(0);
    if (!FW::VELDFW().configSet(settings)) {
        throw std::runtime_error("configSet() failed");
    }
}

int reload(Shared &shared, unsigned seed) {
    openlog(nullptr, LOG_NDELAY, 0);  // its descriptor is not to look like growth
    Dice dice(seed);
    FW::VELDFW firewall;
    for (unsigned round = 0; !shared.stop; ++round) {
        const std::string name = profileName(static_cast<int>(dice.below(PROFILES)));
        const bool changed =
            FW::VELDFW_PROFILE().profileSet(name, makeProfile(dice, name)) && firewall.fwProfileConfigSet(name, false);
        count(shared.edits, changed, "change the active profile to " + name);
        if (round % 2 == 0) {
            count(shared.specifiedReloads, firewall.fwReload(true), "fwReload()");
        } else {
            FW::FwApplyFailure failure;
            const bool applied = firewall.fwReloadAtomic(true, failure);
            count(shared.atomicReloads, applied, "fwReloadAtomic(): " + failure.command + ": " + failure.message);
        }
        if (round == WARM_UP) {
            measure(shared.reloaderEarly);
        }
    }
    measure(shared.reloaderLate);
    return 0;
}

int edit(Shared &shared, unsigned seed) {
    Dice dice(seed);
    FW::VELDFW_PROFILE profiles;
    while (!shared.stop) {
        const std::string &service = SERVICES[dice.below(static_cast<unsigned>(SERVICES.size()))];
        switch (dice.below(3)) {
        case 0:
            count(shared.edits, profiles.profileAddServToReserve("eth0", service, FW::FW_POLICY_ALLOW, false),
                  "profileAddServToReserve()");
            break;
        case 1:
            count(shared.edits, profiles.profileRemoveServ(service), "profileRemoveServ()");
            break;
        default:
            editOwn(shared, dice, "of editor " + std::to_string(seed));
            break;
        }
        std::this_thread::sleep_for(milliseconds(dice.below(40)));
    }
    return 0;
}

int query(Shared &shared, unsigned seed) {
    openlog(nullptr, LOG_NDELAY, 0);
    Dice dice(seed);
    for (unsigned round = 0; !shared.stop; ++round) {
        std::map<std::string, FW::FW_POLICY> verdicts;
        FW::PortCompareST port;
        port.port = std::to_string(1 + dice.below(60000));
        count(shared.queries, FW::VELDFW().fwPortIsBlocked(port, "", verdicts), "fwPortIsBlocked()");
        count(shared.queries, FW::VELDFW().fwServIsBlocked(SERVICES[0], "eth0", verdicts), "fwServIsBlocked()");
        std::map<std::string, FW::FWPROFILE> all;
        count(shared.queries, FW::VELDFW_PROFILE().profileEnum(all) && all.size() >= PROFILES, "profileEnum()");
        if (round == WARM_UP) {
            measure(shared.querierEarly);
        }
        std::this_thread::sleep_for(milliseconds(dice.below(30)));
    }
    measure(shared.querierLate);
    return 0;
}

std::string neighbourRules() {
    std::multiset<std::string> rules;
    for (const std::string program : {"iptables", "ip6tables"}) {
        for (const std::string table : {"filter", "nat"}) {
            std::istringstream lines(veldtest::runChecked({"/sbin/" + program, "-w", "30", "-t", table, "-S"}));
            for (std::string line; std::getline(lines, line);) {
                if (line.find(OWN_CHAIN) != std::string::npos) {
                    rules.insert(program + " " + table + " " + line + "\n");
                }
            }
        }
    }
    std::string text;
    for (const std::string &rule : rules) {
        text += rule;
    }
    return text;
}

int neighbour(Shared &shared, unsigned seed) {
    Dice dice(seed);
    std::multiset<std::string> left;
    // Appends and deletes a rule in the words in which the kernel's rules are listed.
    const auto run = [&](const std::string &program, const std::string &table, const std::string &command) {
        std::vector<std::string> words = {"/sbin/" + program, "-w", "30", "-t", table};
        std::istringstream in(command);
        for (std::string word; in >> word;) {
            words.push_back(word);
        }
        const veldtest::ProgramResult result = veldtest::runProgram(words);
        count(shared.neighbourSteps, result.succeeded(),
              program + " -t " + table + " " + command + ": " + result.errors);
        return result.succeeded();
    };
    const auto add = [&](const std::string &program, const std::string &table, const std::string &command) {
        if (run(program, table, command)) {
            left.insert(program + " " + table + " " + command + "\n");
        }
    };
    const auto remove = [&](const std::string &program, const std::string &table, const std::string &command) {
        const char inverse = command[1] == 'A' ? 'D' : 'X';
        if (run(program, table, std::string("-") + inverse + command.substr(2))) {
            left.erase(left.find(program + " " + table + " " + command + "\n"));
        }
    };
    std::vector<std::vector<std::string>> containers;  // program, table, commands
    for (unsigned number = 0; !shared.stop; ++number) {
        const std::string program = dice.below(2) == 0 ? "iptables" : "ip6tables";
        const std::string table = dice.below(2) == 0 ? "filter" : "nat";
        const std::string chain = OWN_CHAIN + std::to_string(number);
        const std::string hook = table == "nat" ? "PREROUTING" : "FORWARD";
        const std::string port = std::to_string(1 + dice.below(60000));
        containers.push_back(
            {program, table, "-N " + chain, "-A " + chain + " -p tcp -m tcp --dport " + port + " -j ACCEPT",
             "-A " + chain + " -p udp -m udp --dport " + port + " -j RETURN", "-A " + hook + " -i eth1 -j " + chain});
        const std::vector<std::string> &started = containers.back();
        for (size_t i = 2; i < started.size(); ++i) {
            add(program, table, started[i]);
        }
        if (containers.size() > 6) {
            const unsigned ended = dice.below(static_cast<unsigned>(containers.size()));
            const std::vector<std::string> container = containers[ended];
            for (size_t i = container.size(); i > 2; --i) {
                remove(container[0], container[1], container[i - 1]);
            }
            containers.erase(containers.begin() + ended);
        }
        std::this_thread::sleep_for(milliseconds(dice.below(60)));
    }
    std::string text;
    for (const std::string &rule : left) {
        text += rule;
    }
    veldtest::writeFile(NEIGHBOUR_RULES, text);
    return 0;
}

int holdLock(Shared &shared, unsigned seed) {
    Dice dice(seed);
    while (!shared.stop) {
        const int file = open(XTABLES_LOCK, O_RDONLY | O_CREAT | O_CLOEXEC, 0600);
        count(shared.heldLocks, file >= 0 && flock(file, LOCK_EX) == 0, "hold the lock of the xtables programs");
        std::this_thread::sleep_for(milliseconds(dice.below(10) == 0 ? 1500 : dice.below(100)));
        close(file);
        std::this_thread::sleep_for(milliseconds(300 + dice.below(1500)));
    }
    return 0;
}

}  // namespace veldsoak
