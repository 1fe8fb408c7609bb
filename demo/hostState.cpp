// SPDX-License-Identifier: Apache-2.0
// What the demonstration must leave as it was: the machine's rules, files and namespaces.
#include "hostState.h"

#include "processes.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>
#include <set>
#include <sstream>
#include <system_error>

namespace fs = std::filesystem;

namespace demo {
namespace {

const std::string notReadable = ": not readable for this user";
const std::vector<std::string> namespaceKinds = {"net", "mnt", "pid", "ipc", "uts", "user"};

/// Everything that the demonstration writes to or replaces inside its sandbox.
const std::vector<std::string> touchedPaths = {"/usr/veld",
                                               "/etc.defaults",
                                               "/usr/share/xt_geoip",
                                               "/var/lock/firewall",
                                               "/run/netns",
                                               "/run/xtables.lock",
                                               "/dev/log",
                                               "/tmp/firewall_iptables_exec.lock",
                                               "/tmp/iptables_serv_mod_list",
                                               "/tmp/veldfirewall",
                                               "/sbin/iptables",
                                               "/sbin/ip6tables",
                                               "/etc/alternatives/iptables",
                                               "/etc/alternatives/ip6tables"};

size_t countLines(const std::string &text) {
    return static_cast<size_t>(std::count(text.begin(), text.end(), '\n'));
}

/// Drops the date comments and packet counters of iptables-save, which differ from one moment to the next.
std::string withoutCounters(const std::string &rules) {
    std::string result;
    std::istringstream lines(rules);
    for (std::string line; std::getline(lines, line);) {
        if (line.empty() || line[0] == '#')
            continue;
        if (line[0] == ':')
            line.erase(std::min(line.find(" ["), line.size()));
        result += line + "\n";
    }
    return result;
}

std::string saveRules(const std::string &program) {
    if (access(("/usr/sbin/" + program).c_str(), X_OK) != 0)
        return program + ": not installed\n";
    const auto saved = veldtest::runProgram({"/usr/sbin/" + program});
    if (!saved.succeeded())
        return program + notReadable + "\n";
    return program + ":\n" + withoutCounters(saved.output);
}

std::string contentHash(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::ostringstream text;
    text << in.rdbuf();
    return in ? std::to_string(std::hash<std::string>{}(text.str())) : "unreadable";
}

/// A line that changes when the file, or what it leads to, changes.
std::string describeFile(const fs::path &path) {
    struct stat status = {};
    if (lstat(path.c_str(), &status) != 0)
        return path.string() + ": none\n";
    std::ostringstream line;
    line << path.string() << ": mode " << std::oct << status.st_mode << std::dec << " inode " << status.st_ino
         << " size " << status.st_size << " changed " << status.st_ctim.tv_sec << "." << status.st_ctim.tv_nsec;
    std::error_code none;
    if (S_ISLNK(status.st_mode))
        line << " to " << fs::read_symlink(path, none).string();
    if (fs::is_regular_file(path, none))
        line << " content " << contentHash(path.string());
    line << "\n";
    return line.str();
}

std::string describeTree(const std::string &path) {
    std::string text = describeFile(path);
    std::error_code none;
    if (fs::is_symlink(path, none) || !fs::is_directory(path, none))
        return text;
    std::set<fs::path> entries;
    for (const auto &entry : fs::recursive_directory_iterator(path, none))
        entries.insert(entry.path());
    for (const auto &entry : entries)
        text += describeFile(entry);
    return text;
}

std::string readWhole(const std::string &path) {
    std::ifstream in(path);
    std::ostringstream text;
    text << in.rdbuf();
    return text.str();
}

std::string describeInterfaces() {
    std::string text;
    for (const std::string family : {"-4", "-6"}) {
        // Addresses without their remaining lifetimes, which count down.
        const auto addresses = veldtest::runProgram({"ip", family, "-o", "addr", "show"});
        std::istringstream lines(addresses.output);
        for (std::string line; std::getline(lines, line);)
            text += line.substr(0, line.find('\\')) + "\n";
    }
    const auto links = veldtest::runProgram({"ip", "-br", "link", "show"});
    return text + links.output;
}

Measurement measured(const std::string &text) {
    return {text, countLines(text)};
}

std::set<std::string> linesOf(const std::string &text) {
    std::set<std::string> lines;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);)
        lines.insert(line);
    return lines;
}

}  // namespace

std::vector<std::string> ownNamespaces() {
    std::vector<std::string> result;
    for (const auto &kind : namespaceKinds) {
        std::error_code none;
        result.push_back(fs::read_symlink("/proc/self/ns/" + kind, none).string());
    }
    return result;
}

std::vector<std::string> processesIn(const std::vector<std::string> &namespaces) {
    std::vector<std::string> found;
    std::error_code none;
    for (const auto &process : fs::directory_iterator("/proc", none)) {
        const std::string id = process.path().filename().string();
        if (!std::all_of(id.begin(), id.end(), [](unsigned char c) { return std::isdigit(c) != 0; }))
            continue;
        for (const auto &kind : namespaceKinds) {
            const auto space = fs::read_symlink(process.path() / "ns" / kind, none).string();
            if (!space.empty() && std::find(namespaces.begin(), namespaces.end(), space) != namespaces.end()) {
                found.push_back(id);
                break;
            }
        }
    }
    return found;
}

std::map<std::string, Measurement> measureHost() {
    std::string rules;
    for (const char *program :
         {"iptables-nft-save", "ip6tables-nft-save", "iptables-legacy-save", "ip6tables-legacy-save"})
        rules += saveRules(program);
    std::string files;
    for (const auto &path : touchedPaths)
        files += describeTree(path);
    std::string namespaces;
    for (const auto &space : ownNamespaces())
        namespaces += space + "\n";
    return {{"packet-filter rules", measured(rules)},
            {"files", measured(files)},
            {"mounts", measured(readWhole("/proc/self/mountinfo"))},
            {"network interfaces", measured(describeInterfaces())},
            {"namespaces of this process", measured(namespaces)}};
}

int compareHost(const std::map<std::string, Measurement> &before, const std::map<std::string, Measurement> &after) {
    int different = 0;
    for (const auto &[title, old] : before) {
        const auto &now = after.at(title);
        const bool same = old.text == now.text;
        std::printf("  %-28s %s (%zu lines compared%s)\n", title.c_str(), same ? "unchanged" : "CHANGED", old.items,
                    old.text.find(notReadable) == std::string::npos ? "" : "; rules are not readable for this user");
        if (same)
            continue;
        ++different;
        const auto oldLines = linesOf(old.text);
        const auto newLines = linesOf(now.text);
        for (const auto &line : oldLines) {
            if (newLines.count(line) == 0)
                std::printf("    before: %s\n", line.c_str());
        }
        for (const auto &line : newLines) {
            if (oldLines.count(line) == 0)
                std::printf("    after:  %s\n", line.c_str());
        }
    }
    return different;
}

}  // namespace demo
