// SPDX-License-Identifier: Apache-2.0
// What is found out about a machine: plain judgements on what programs and files say.
#include "model/diagnosis.h"

#include <veldfirewall/fwRecords.h>

#include <algorithm>
#include <map>
#include <sstream>

#include "model/numbers.h"

namespace veldfwctl {

namespace {

constexpr const char *RESTORE = "-restore";

/// Beginnings of the chain names and tables of other programs.
const std::vector<std::pair<std::string, std::string>> MANAGERS = {
    {"DOCKER", "Docker"},    {"ufw", "ufw"},         {"firewalld", "firewalld"},
    {"IN_", "firewalld"},    {"FWDI_", "firewalld"}, {"KUBE-", "Kubernetes"},
    {"CNI-", "CNI"},         {"NETAVARK", "Podman"}, {"f2b-", "fail2ban"},
    {"LIBVIRT_", "libvirt"}, {"cali-", "Calico"},    {"shorewall", "Shorewall"},
};
const std::set<std::string> WHOLE_FIREWALLS = {"ufw", "firewalld", "Shorewall"};

std::string managerOf(const std::string &name) {
    for (const auto &[beginning, manager] : MANAGERS) {
        if (name.rfind(beginning, 0) == 0) {
            return manager;
        }
    }
    return "";
}

/// "xt_LOG" of "kernel/net/netfilter/xt_LOG.ko.xz: kernel/...", as /proc/modules writes it.
std::string moduleName(const std::string &path) {
    const std::string file = path.substr(0, path.find(':'));
    const size_t slash = file.rfind('/');
    std::string name = slash == std::string::npos ? file : file.substr(slash + 1);
    name = name.substr(0, name.find('.'));
    std::replace(name.begin(), name.end(), '-', '_');
    return name;
}

}  // namespace

std::string backendOf(const std::string &version) {
    if (version.find("nf_tables") != std::string::npos) {
        return "nft";
    }
    return version.find("legacy") != std::string::npos ? "legacy" : "";
}

std::vector<Diagnosis> programsJudge(const std::vector<ProgramVersion> &programs) {
    std::vector<Diagnosis> findings;
    std::map<std::string, std::vector<std::string>> byBackend;
    for (const ProgramVersion &program : programs) {
        if (!program.error.empty()) {
            const bool isForAtomic = program.program.find(RESTORE) != std::string::npos;
            findings.push_back(
                {"programs", Verdict::PROBLEM, program.program + ": " + program.error,
                 std::string("install the package iptables") + (isForAtomic ? "; setup and --atomic need it" : "")});
            continue;
        }
        byBackend[backendOf(program.version)].push_back(program.program);
    }
    if (byBackend.size() == 1) {
        const std::string backend = byBackend.begin()->first;
        findings.push_back({"backend", Verdict::OK, backend.empty() ? "not told" : backend, ""});
    } else if (byBackend.size() > 1) {
        std::string text = "mixed:";
        for (const auto &[backend, names] : byBackend) {
            text += " " + join(names, ", ") + ": " + (backend.empty() ? "not told" : backend) + ";";
        }
        text.pop_back();
        findings.push_back({"backend", Verdict::PROBLEM, text,
                            "choose the same for both with \"update-alternatives --config iptables\" and \"... "
                            "ip6tables\", then run \"veldfwctl setup\" and \"veldfwctl reload\""});
    }
    return findings;
}

std::vector<Diagnosis> othersJudge(const std::vector<std::string> &listings, const std::string &nftTables,
                                   const std::string &backend) {
    std::set<std::string> managers;
    std::set<std::string> unknown;
    const auto see = [&](const std::string &name, const std::string &shown) {
        const std::string manager = managerOf(name);
        (manager.empty() ? unknown : managers).insert(manager.empty() ? shown : manager);
    };
    for (const std::string &listing : listings) {
        std::istringstream lines(listing);
        for (std::string line; std::getline(lines, line);) {
            const std::string name = line.rfind("-N ", 0) == 0 ? line.substr(3) : "";
            if (!name.empty() && name != FW::FW_CHAIN_INPUT && name != FW::FW_CHAIN_FORWARD) {
                see(name, "chain " + name);
            }
        }
    }
    bool hasFilter = false;
    std::istringstream lines(nftTables);
    for (std::string word, family, name; lines >> word >> family >> name;) {
        const bool isIptables = (family == "ip" || family == "ip6") &&
                                std::set<std::string>{"filter", "nat", "mangle", "raw", "security"}.count(name) > 0;
        hasFilter = hasFilter || (isIptables && name == "filter");
        if (!isIptables) {
            see(name, "nft table " + family + " " + name);
        }
    }
    std::vector<Diagnosis> findings;
    if (hasFilter && backend == "legacy") {
        findings.push_back({"other rules", Verdict::PROBLEM,
                            "iptables is of the legacy backend, but nft has rules of iptables too; both apply",
                            "look at \"nft list ruleset\", and reboot once all programs use one backend"});
    }
    for (const std::string &manager : managers) {
        const bool isWhole = WHOLE_FIREWALLS.count(manager) > 0;
        findings.push_back({"other rules", isWhole ? Verdict::PROBLEM : Verdict::NOTE,
                            manager + " has rules of its own",
                            isWhole ? "use one firewall: disable " + manager + ", or this one"
                                    : "what this firewall allows still has to pass them"});
    }
    if (!unknown.empty()) {
        findings.push_back({"other rules", Verdict::NOTE,
                            "somebody else has " + join({unknown.begin(), unknown.end()}, ", "),
                            "what this firewall allows still has to pass them"});
    }
    if (findings.empty()) {
        findings.push_back({"other rules", Verdict::OK, "none", ""});
    }
    return findings;
}

std::vector<std::string> modulesMissing(const std::vector<std::string> &wanted, const std::set<std::string> &loaded,
                                        const std::vector<std::string> &available) {
    std::set<std::string> known = loaded;
    for (const std::string &line : available) {
        known.insert(moduleName(line));
    }
    std::vector<std::string> missing;
    for (const std::string &module : wanted) {
        if (known.count(moduleName(module)) == 0) {
            missing.push_back(module);
        }
    }
    return missing;
}

}  // namespace veldfwctl
