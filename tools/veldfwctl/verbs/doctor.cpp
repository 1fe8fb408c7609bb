// SPDX-License-Identifier: Apache-2.0
// "doctor": whether this machine can run the firewall, item by item.
#include <sys/utsname.h>
#include <unistd.h>
#include <veldfirewall/veldIptablesModule.h>

#include <algorithm>
#include <filesystem>
#include <fstream>

#include "frame/libraryCall.h"
#include "frame/verb.h"
#include "model/chainSetup.h"
#include "model/diagnosis.h"
#include "model/numbers.h"
#include "system/lockHolders.h"
#include "system/program.h"
#include "system/store.h"
#include "system/trialPlace.h"

namespace veldfwctl {

namespace {

namespace fs = std::filesystem;

using Findings = std::vector<Diagnosis>;

constexpr const char *SETUP = "run \"veldfwctl setup\"";
constexpr const char *PROFILES = "/usr/veld/etc/firewall.d";
constexpr const char *COUNTRY_DATA = "/usr/share/xt_geoip";
constexpr const char *NFT = "/usr/sbin/nft";

std::vector<std::string> linesOf(const fs::path &path) {
    std::ifstream file(path);
    std::vector<std::string> lines;
    for (std::string line; std::getline(file, line);) {
        lines.push_back(line);
    }
    return lines;
}

std::set<std::string> modulesLoaded() {
    std::set<std::string> names;
    for (const std::string &line : linesOf("/proc/modules")) {
        names.insert(line.substr(0, line.find(' ')));
    }
    return names;
}

/// What the kernel has in files or built in; empty when its files are not here.
std::vector<std::string> modulesAvailable() {
    utsname kernel = {};
    uname(&kernel);
    const fs::path directory = fs::path("/lib/modules") / kernel.release;
    std::vector<std::string> lines = linesOf(directory / "modules.dep");
    for (const std::string &line : linesOf(directory / "modules.builtin")) {
        lines.push_back(line);
    }
    return lines;
}

/// @return the backend
std::string programsExamine(Findings &findings) {
    std::vector<ProgramVersion> versions;
    for (const std::string family : {IPTABLES, IP6TABLES}) {
        for (const std::string &program : {family, family + "-restore"}) {
            const ProgramOutput output = programRun({program, "--version"});
            versions.push_back({program, output.succeeded() ? "" : output.reason(), output.output});
        }
    }
    for (Diagnosis &finding : programsJudge(versions)) {
        findings.push_back(std::move(finding));
    }
    if (access("/usr/veld/sbin/veldnetdtool", X_OK) != 0) {
        findings.push_back({"programs", Verdict::NOTE, "/usr/veld/sbin/veldnetdtool is not here",
                            "only machines that are IPv6 routers need it"});
    }
    return backendOf(versions.front().version);
}

void chainsExamine(Findings &findings, const std::string &backend) {
    std::vector<std::string> listings;
    for (const auto &[family, program] : {std::pair("IPv4", IPTABLES), std::pair("IPv6", IP6TABLES)}) {
        const std::string item = std::string("chains ") + family;
        const ProgramOutput listing = programRun({program, "-w", "-S"});
        if (!listing.succeeded()) {
            findings.push_back({item, Verdict::PROBLEM, std::string(program) + " -S: " + listing.reason(),
                                geteuid() != 0 ? "run this as root" : "see whether the kernel has netfilter"});
            continue;
        }
        listings.push_back(listing.output);
        bool isWell = true;
        for (const ChainItem &lacking : chainPlanMake(listing.output).items) {
            if (!lacking.lack.empty()) {
                isWell = false;
                findings.push_back({item, Verdict::PROBLEM, lacking.name + ": " + lacking.lack, SETUP});
            }
        }
        if (isWell) {
            findings.push_back({item, Verdict::OK, "the chains are there, and reached first", ""});
        }
    }
    const bool hasNft = access(NFT, X_OK) == 0;
    const std::string tables = hasNft ? programRun({NFT, "list", "tables"}).output : "";
    for (Diagnosis &finding : othersJudge(listings, tables, backend)) {
        findings.push_back(std::move(finding));
    }
    if (backend == "nft" && !linesOf("/proc/net/ip_tables_names").empty()) {
        findings.push_back({"other rules", Verdict::NOTE,
                            "the legacy tables are loaded besides nft; rules there apply too",
                            "look at \"iptables-legacy-save\"; a reboot unloads them"});
    }
}

void kernelExamine(Findings &findings) {
    if (!fs::exists("/proc/sys/net/ipv6")) {
        findings.push_back({"IPv6", Verdict::PROBLEM, "the kernel has none, but every apply sets rules for it",
                            "boot without \"ipv6.disable=1\""});
    } else {
        const std::vector<std::string> off = linesOf("/proc/sys/net/ipv6/conf/all/disable_ipv6");
        const bool isOff = !off.empty() && off.front() == "1";
        findings.push_back({"IPv6", isOff ? Verdict::NOTE : Verdict::OK, isOff ? "switched off" : "there", ""});
    }
    std::vector<std::string> wanted;
    const CallResult list = libraryCall([&wanted] { return FW::VELD_IPTABLES_MODULES::coreCommonModuleLoad(wanted); });
    const std::vector<std::string> available = modulesAvailable();
    if (!list.succeeded) {
        findings.push_back({"module list", Verdict::PROBLEM, messagesJoin(list.messages),
                            "install veldfirewall-common; without the list nothing can be applied"});
    } else if (available.empty()) {
        findings.push_back({"module list", Verdict::NOTE,
                            std::to_string(wanted.size()) + " modules; whether the kernel has them cannot be seen here",
                            ""});
    } else {
        const std::vector<std::string> missing = modulesMissing(wanted, modulesLoaded(), available);
        findings.push_back({"module list", missing.empty() ? Verdict::OK : Verdict::NOTE,
                            missing.empty() ? std::to_string(wanted.size()) + " modules, all known to the kernel"
                                            : "the kernel has no " + join(missing, ", "),
                            missing.empty() ? "" : "rules that need them will be refused"});
    }
}

bool usesCountries(const FW::FWPROFILE &profile) {
    return std::any_of(profile.rules.begin(), profile.rules.end(), [](const auto &adapter) {
        return std::any_of(adapter.second.begin(), adapter.second.end(), [](const FW::FWRULE &rule) {
            return rule.enable && rule.ipGroup == FW::FW_IP_GROUP_COUNTRY;
        });
    });
}

/// @return whether a profile has rules for countries
bool storeExamine(Findings &findings) {
    bool hasCountries = false;
    if (access(PROFILES, W_OK) != 0) {
        findings.push_back({"profiles", Verdict::PROBLEM, std::string(PROFILES) + " is missing or cannot be written",
                            geteuid() != 0 ? "run this as root" : SETUP});
        return false;
    }
    try {
        const Settings settings = settingsRead();
        const std::vector<std::string> names = profileNames();
        for (const std::string &name : names) {
            hasCountries = usesCountries(profileRead(name)) || hasCountries;
        }
        const bool isActiveHere = std::find(names.begin(), names.end(), settings.profile) != names.end();
        findings.push_back({"profiles", isActiveHere ? Verdict::OK : Verdict::PROBLEM,
                            isActiveHere ? std::to_string(names.size()) + ", active: \"" + settings.profile + "\""
                                         : "the active profile \"" + settings.profile + "\" is missing",
                            isActiveHere ? "" : "make another one active with \"veldfwctl profile use NAME\""});
    } catch (const std::exception &failure) {
        findings.push_back({"profiles", Verdict::PROBLEM, failure.what(), SETUP});
    }
    return hasCountries;
}

void countriesExamine(Findings &findings, bool areUsed) {
    const Verdict lack = areUsed ? Verdict::PROBLEM : Verdict::NOTE;
    const std::string need = areUsed ? "" : "; only rules for countries need it";
    const ProgramOutput match = programRun({IPTABLES, "-m", "geoip", "--help"});
    const std::vector<std::string> available = modulesAvailable();
    const bool hasModule = modulesMissing({"xt_geoip.ko"}, modulesLoaded(), available).empty();
    if (!match.succeeded() || !hasModule) {
        findings.push_back(
            {"country match", lack,
             match.succeeded() ? "the kernel module xt_geoip is not here" : "iptables has no match geoip",
             "install xtables-addons-common and xtables-addons-dkms" + need});
    } else {
        findings.push_back({"country match", Verdict::OK, "there", ""});
    }
    std::error_code error;
    size_t countries = 0;
    for (fs::directory_iterator entry(COUNTRY_DATA, error), end; !error && entry != end; entry.increment(error)) {
        countries += entry->path().extension() == ".iv4" ? 1 : 0;
    }
    findings.push_back({"country data", countries > 0 ? Verdict::OK : lack,
                        std::to_string(countries) + " countries in " + COUNTRY_DATA,
                        countries > 0 ? "" : "fetch and build it as xtables-addons-common describes" + need});
}

void locksExamine(Findings &findings) {
    for (const LockHolder &holder :
         lockHoldersFind({"/tmp/", "/var/lock/firewall/", "/run/lock/firewall/", "/run/veld/"})) {
        findings.push_back(
            {"locks", Verdict::NOTE,
             holder.path + " is held by process " + std::to_string(holder.process) + " (" + holder.program + ")",
             "others wait up to 30 s for it; if it stays, see what that process waits for"});
    }
    const std::optional<TrialRecord> trial = trialRecordRead();
    if (trial && isOpen(trial->phase)) {
        const bool isWatched = trialSocketConnect().isOpen();
        findings.push_back(
            {"trial", isWatched ? Verdict::NOTE : Verdict::PROBLEM,
             "profile \"" + trial->profile + "\" is on trial" + (isWatched ? "" : ", and nobody watches"),
             isWatched ? "\"veldfwctl try --confirm\" or \"--revert\" ends it" : "run \"veldfwctl try --revert\""});
    }
}

int doctor(const Context &context) {
    Findings findings;
    const std::string backend = programsExamine(findings);
    chainsExamine(findings, backend);
    kernelExamine(findings);
    const bool hasCountries = storeExamine(findings);
    countriesExamine(findings, hasCountries);
    locksExamine(findings);
    const auto problems = std::count_if(findings.begin(), findings.end(),
                                        [](const Diagnosis &finding) { return finding.verdict == Verdict::PROBLEM; });
    Table table{{"ITEM", "", "FOUND", "WHAT TO DO"}, {}};
    Json::Value json;
    json["problems"] = static_cast<Json::Int64>(problems);
    json["findings"] = Json::arrayValue;
    for (const Diagnosis &finding : findings) {
        const bool isBad = finding.verdict == Verdict::PROBLEM;
        const char *verdict = isBad ? "problem" : finding.verdict == Verdict::NOTE ? "note" : "ok";
        const Shade shade = isBad ? Shade::BAD : finding.verdict == Verdict::NOTE ? Shade::FAINT : Shade::GOOD;
        table.rows.push_back({finding.item, {verdict, shade}, finding.text, finding.mend});
        Json::Value entry;
        entry["item"] = finding.item;
        entry["verdict"] = verdict;
        entry["text"] = finding.text;
        entry["mend"] = finding.mend;
        json["findings"].append(entry);
    }
    if (context.json) {
        context.printJson(json);
    } else {
        context.printTable(table);
    }
    return problems == 0 ? STATUS_DONE : STATUS_NO;
}

}  // namespace

void registerDoctor(CLI::App &app, Context &context) {
    verbAdd(app, context,
            {"doctor", "Tell whether this machine can run the firewall, and what to do", "veldfwctl doctor",
             [&context] { return doctor(context); }, false,
             "Changes nothing. Exit status 1 when there is a problem; notes are no problems."});
}

}  // namespace veldfwctl
