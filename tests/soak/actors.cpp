// SPDX-License-Identifier: Apache-2.0
// Those who work on the rules and profiles at the same time.
#include "actors.h"

#include "caseTable.h"
#include "files.h"
#include "network.h"
#include "processes.h"
#include "profileGenerator.h"

#include <fcntl.h>
#include <malloc.h>
#include <sys/file.h>
#include <syslog.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <fstream>
#include <map>
#include <numeric>
#include <set>
#include <stdexcept>
#include <thread>

#include "veldfirewall/veldFW.h"

namespace veldsoak {

namespace {

using std::chrono::milliseconds;
using veldtest::ProfileGenerator;

constexpr unsigned WARM_UP = 20;  // rounds after which a process holds what it will ever hold
constexpr const char *XTABLES_LOCK = "/run/xtables.lock";
constexpr const char *OWN_CHAIN = "NEIGHBOUR";
const std::vector<std::string> SERVICES = {"https", "smb", "smtp"};

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

/// The whole life of a profile. It can come back: the other editor had read it when it was deleted, and wrote it later,
/// because edits of all profiles hold no lock from reading to writing.
void editOwn(Shared &shared, ProfileGenerator &random, const std::string &name) {
    FW::VELDFW_PROFILE profiles;
    const std::string newName = name + " renamed";
    const auto doneOrBack = [&](bool done, const std::string &taken, const std::string &what) {
        const bool back = !done && profiles.profileExist(taken);
        shared.profilesBroughtBack += back ? 1 : 0;
        count(shared.edits, done || back, what);
    };
    doneOrBack(profiles.profileCreate(name), name, "profileCreate()");
    count(shared.edits, profiles.profileSet(name, random.profile(name, 8)), "profileSet()");
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
    for (const std::string &file : veldtest::listDirectory(VELD_DATA_DIR "/services.d")) {
        veldtest::writeFile("/usr/veld/etc/services.d/" + file,
                            veldtest::readFile(VELD_DATA_DIR "/services.d/" + file));
    }
    for (const char *interface : {"eth0", "eth1"}) {
        veldtest::addDummyInterface(interface);
    }
    ProfileGenerator random(seed);
    Json::Value settings;
    settings["status"] = true;
    settings["profile"] = profileName(0);
    veldtest::makeDirectories("/usr/veld/etc/firewall.d");
    bool stored = FW::VELDFW().configSet(settings);
    for (int n = 0; n < PROFILES; ++n) {
        const std::string name = profileName(n);
        FW::VELDFW_PROFILE profiles;
        stored = stored && profiles.profileCreate(name) && profiles.profileSet(name, random.profile(name, 8));
    }
    if (!stored) {
        throw std::runtime_error("the profiles cannot be stored");
    }
}

int reload(Shared &shared, unsigned seed) {
    openlog(nullptr, LOG_NDELAY, 0);  // its descriptor is not to look like growth
    ProfileGenerator random(seed);
    FW::VELDFW firewall;
    for (unsigned round = 0; !shared.stop; ++round) {
        const std::string name = profileName(random.below(PROFILES));
        const bool changed =
            FW::VELDFW_PROFILE().profileSet(name, random.profile(name, 8)) && firewall.fwProfileConfigSet(name, false);
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
    ProfileGenerator random(seed);
    FW::VELDFW_PROFILE profiles;
    while (!shared.stop) {
        const std::string service = random.oneOf(SERVICES);
        const int what = random.below(3);
        if (what == 0) {
            count(shared.edits, profiles.profileAddServToReserve("eth0", service, FW::FW_POLICY_ALLOW, false),
                  "profileAddServToReserve()");
        } else if (what == 1) {
            count(shared.edits, profiles.profileRemoveServ(service), "profileRemoveServ()");
        } else {
            editOwn(shared, random, "of editor " + std::to_string(seed));
        }
        std::this_thread::sleep_for(milliseconds(random.below(40)));
    }
    return 0;
}

int query(Shared &shared, unsigned seed) {
    openlog(nullptr, LOG_NDELAY, 0);
    ProfileGenerator random(seed);
    for (unsigned round = 0; !shared.stop; ++round) {
        std::map<std::string, FW::FW_POLICY> verdicts;
        FW::PortCompareST port;
        port.port = std::to_string(1 + random.below(60000));
        count(shared.queries, FW::VELDFW().fwPortIsBlocked(port, "", verdicts), "fwPortIsBlocked()");
        count(shared.queries, FW::VELDFW().fwServIsBlocked(SERVICES[0], "eth0", verdicts), "fwServIsBlocked()");
        std::map<std::string, FW::FWPROFILE> all;
        count(shared.queries, FW::VELDFW_PROFILE().profileEnum(all) && all.size() >= PROFILES, "profileEnum()");
        if (round == WARM_UP) {
            measure(shared.querierEarly);
        }
        std::this_thread::sleep_for(milliseconds(random.below(30)));
    }
    measure(shared.querierLate);
    return 0;
}

std::string neighbourRules() {
    std::multiset<std::string> rules;
    for (const std::string program : {"iptables", "ip6tables"}) {
        for (const std::string table : {"filter", "nat"}) {
            const std::string listing = veldtest::runChecked({"/sbin/" + program, "-w", "30", "-t", table, "-S"});
            for (const std::string &line : veldtest::split(listing, '\n')) {
                if (line.find(OWN_CHAIN) != std::string::npos) {
                    rules.insert(program + " " + table + " " + line + "\n");
                }
            }
        }
    }
    return std::accumulate(rules.begin(), rules.end(), std::string());
}

int neighbour(Shared &shared, unsigned seed) {
    struct Container {
        std::string program, table;
        std::vector<std::string> commands;  ///< in the words in which the kernel's rules are listed
    };
    ProfileGenerator random(seed);
    const auto run = [&](const Container &container, const std::string &command) {
        std::vector<std::string> words = {"/sbin/" + container.program, "-w", "30", "-t", container.table};
        const std::vector<std::string> more = veldtest::split(command, ' ');
        words.insert(words.end(), more.begin(), more.end());
        const veldtest::ProgramResult result = veldtest::runProgram(words);
        count(shared.neighbourSteps, result.succeeded(), container.program + " " + command + ": " + result.errors);
    };
    std::vector<Container> containers;
    for (unsigned number = 0; !shared.stop; ++number) {
        const std::string table = random.oneOf<std::string>({"filter", "nat"});
        const std::string chain = OWN_CHAIN + std::to_string(number);
        const std::string hook = table == "nat" ? "PREROUTING" : "FORWARD";
        const std::string port = std::to_string(1 + random.below(60000));
        containers.push_back(
            {random.oneOf<std::string>({"iptables", "ip6tables"}),
             table,
             {"-N " + chain, "-A " + chain + " -p tcp -m tcp --dport " + port + " -j ACCEPT",
              "-A " + chain + " -p udp -m udp --dport " + port + " -j RETURN", "-A " + hook + " -i eth1 -j " + chain}});
        for (const std::string &command : containers.back().commands) {
            run(containers.back(), command);
        }
        if (containers.size() > 6) {
            const auto ended = containers.begin() + random.below(static_cast<int>(containers.size()));
            for (auto command = ended->commands.rbegin(); command != ended->commands.rend(); ++command) {
                run(*ended, ((*command)[1] == 'A' ? "-D" : "-X") + command->substr(2));
            }
            containers.erase(ended);
        }
        std::this_thread::sleep_for(milliseconds(random.below(60)));
    }
    std::multiset<std::string> left;
    for (const Container &container : containers) {
        for (const std::string &command : container.commands) {
            left.insert(container.program + " " + container.table + " " + command + "\n");
        }
    }
    veldtest::writeFile(NEIGHBOUR_RULES, std::accumulate(left.begin(), left.end(), std::string()));
    return 0;
}

int holdLock(Shared &shared, unsigned seed) {
    ProfileGenerator random(seed);
    while (!shared.stop) {
        const int file = open(XTABLES_LOCK, O_RDONLY | O_CREAT | O_CLOEXEC, 0600);
        count(shared.heldLocks, file >= 0 && flock(file, LOCK_EX) == 0, "hold the lock of the xtables programs");
        std::this_thread::sleep_for(milliseconds(random.below(10) == 0 ? 1500 : random.below(100)));
        close(file);
        std::this_thread::sleep_for(milliseconds(300 + random.below(1500)));
    }
    return 0;
}

}  // namespace veldsoak
