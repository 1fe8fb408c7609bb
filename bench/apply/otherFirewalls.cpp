// SPDX-License-Identifier: Apache-2.0
// The firewalls that Debian offers, set up in namespaces with as many rules, for comparison.
#include "otherFirewalls.h"

#include "files.h"
#include "processes.h"
#include "sandbox.h"
#include "windowProbe.h"

#include <unistd.h>

#include <chrono>
#include <csignal>
#include <fstream>
#include <stdexcept>
#include <thread>
#include <vector>

namespace veldbench {

namespace {

constexpr std::chrono::seconds DAEMON_START_TIME(180);
constexpr const char *DAEMON_LOG = "/run/firewalld.log";

struct PortRule {
    bool v6;
    std::string protocol;
    std::string port;
};

/// Half of them of each family, the probed ports last.
std::vector<PortRule> portRules(size_t count) {
    std::vector<PortRule> rules;
    for (const bool v6 : {false, true}) {
        const size_t ofFamily = count / 2;
        for (size_t n = 0; n + 2 < ofFamily; ++n) {
            rules.push_back({v6, n % 2 == 0 ? "tcp" : "udp", std::to_string(1000 + n)});
        }
        rules.push_back({v6, "udp", std::to_string(ALLOWED_PORT)});
        rules.push_back({v6, "tcp", std::to_string(TRANSFER_PORT)});
    }
    return rules;
}

veldtest::ProgramResult runIn(const veldtest::NetworkNamespace &space, const std::vector<std::string> &command) {
    veldtest::ProgramResult result;
    space.run([&] { result = veldtest::runProgram(command); });
    return result;
}

std::string runShell(const veldtest::NetworkNamespace &space, const std::string &command) {
    const veldtest::ProgramResult result = runIn(space, {"sh", "-c", command});
    if (!result.succeeded()) {
        throw std::runtime_error(command + ": " + result.errors + result.output);
    }
    return result.output;
}

/// Lines of a listing that name one of the ports of portRules().
void requireRules(const veldtest::NetworkNamespace &space, const std::string &listing, size_t rules) {
    const size_t found = std::stoul(runShell(space, "{ " + listing + "; } | grep -cE 'dport [0-9]+' || true"));
    if (found < rules) {
        throw std::runtime_error("\"" + listing + "\" lists " + std::to_string(found) + " rules for ports, not " +
                                 std::to_string(rules));
    }
}

void replaceInFile(const std::string &path, const std::string &expression) {
    veldtest::runChecked({"sed", "-i", "-E", expression, path});
}

std::string ufwRules(const std::vector<PortRule> &rules, bool v6) {
    const std::string chain = v6 ? "ufw6-user-input" : "ufw-user-input";
    const std::string any = v6 ? "::/0" : "0.0.0.0/0";
    std::string text = "*filter\n";
    for (const std::string name :
         {"user-input", "user-output", "user-forward", "before-logging-input", "before-logging-output",
          "before-logging-forward", "user-logging-input", "user-logging-output", "user-logging-forward",
          "after-logging-input", "after-logging-output", "after-logging-forward", "logging-deny", "logging-allow",
          "user-limit", "user-limit-accept"}) {
        text += std::string(v6 ? ":ufw6-" : ":ufw-") + name + " - [0:0]\n";
    }
    text += "### RULES ###\n";
    for (const PortRule &rule : rules) {
        if (rule.v6 == v6) {
            text += "\n### tuple ### allow " + rule.protocol + " " + rule.port + " " + any + " any " + any + " in\n";
            text += "-A " + chain + " -p " + rule.protocol + " --dport " + rule.port + " -j ACCEPT\n";
        }
    }
    return text + "\n### END RULES ###\nCOMMIT\n";
}

bool installed(const std::string &program) {
    return access(program.c_str(), X_OK) == 0;
}

/// Starts a program that stays, its output in a file. @return its process id
pid_t startDaemon(const veldtest::NetworkNamespace &space, const std::string &command, const std::string &log) {
    return std::stoi(runShell(space, command + " >" + log + " 2>&1 </dev/null & echo $!"));
}

}  // namespace

void packagesInstall(const std::string &directory) {
    veldtest::requireSandbox("install packages");
    const std::string command = "DEBIAN_FRONTEND=noninteractive dpkg --install " + directory + "/*.deb 2>&1";
    veldtest::runChecked({"sh", "-c", command + " >/run/dpkg.log || { cat /run/dpkg.log >&2; exit 1; }"});
}

std::string Ufw::unavailable() {
    return installed("/usr/sbin/ufw") ? "" : "the Debian package ufw is not installed";
}

Ufw::Ufw(const veldtest::NetworkNamespace &space, size_t kernelRules) : m_space(space), m_rules(kernelRules) {
    veldtest::writeFile("/etc/ufw/user.rules", ufwRules(portRules(kernelRules), false), 0640);
    veldtest::writeFile("/etc/ufw/user6.rules", ufwRules(portRules(kernelRules), true), 0640);
    replaceInFile("/etc/ufw/ufw.conf", "s/^(ENABLED)=.*/\\1=yes/;s/^(LOGLEVEL)=.*/\\1=off/");
    runShell(space, "ufw reload");
    check();
}

void Ufw::check() const {
    requireRules(m_space, "iptables -S ufw-user-input; ip6tables -S ufw6-user-input", m_rules);
}

std::string Firewalld::unavailable() {
    if (!installed("/usr/sbin/firewalld")) {
        return "the Debian package firewalld is not installed";
    }
    return installed("/usr/bin/dbus-daemon")
               ? ""
               : "it needs a system bus, and the Debian package dbus-daemon is not installed";
}

Firewalld::Firewalld(const veldtest::NetworkNamespace &space, size_t kernelRules, const std::string &backend)
    : m_space(space), m_rules(kernelRules), m_nftables(backend == "nft") {
    std::string zone = "<?xml version=\"1.0\" encoding=\"utf-8\"?>\n<zone target=\"DROP\">\n";
    for (const PortRule &rule : portRules(kernelRules)) {
        zone += std::string("<rule family=\"") + (rule.v6 ? "ipv6" : "ipv4") + "\"><port port=\"" + rule.port +
                "\" protocol=\"" + rule.protocol + "\"/><accept/></rule>\n";
    }
    veldtest::writeFile("/etc/firewalld/zones/public.xml", zone + "</zone>\n");
    replaceInFile("/etc/firewalld/firewalld.conf",
                  std::string("s/^(FirewallBackend)=.*/\\1=") + (m_nftables ? "nftables" : "iptables") + "/");
    veldtest::makeDirectories("/run/dbus");
    m_bus = startDaemon(space, "exec dbus-daemon --system --nofork --nopidfile", "/run/dbus.log");
    m_daemon = startDaemon(space, "exec firewalld --nofork --nopid", DAEMON_LOG);
    const auto deadline = std::chrono::steady_clock::now() + DAEMON_START_TIME;
    while (!runIn(space, {"firewall-cmd", "--state"}).succeeded()) {
        if (std::chrono::steady_clock::now() > deadline) {
            throw std::runtime_error(std::string("firewalld does not start: ") + veldtest::readFile(DAEMON_LOG));
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(200));
    }
    check();
}

Firewalld::~Firewalld() {
    for (const pid_t process : {m_daemon, m_bus}) {
        // No child of ours: the sandbox's first process collects it.
        for (int i = 0; i < 300 && process > 0 && kill(process, i < 200 ? SIGTERM : SIGKILL) == 0; ++i) {
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
    }
    veldtest::removeAll("/run/dbus");
}

void Firewalld::check() const {
    requireRules(m_space, m_nftables ? "nft list table inet firewalld" : "iptables-save; ip6tables-save", m_rules);
}

long Firewalld::peakKilobytes() const {
    std::ifstream in("/proc/" + std::to_string(m_daemon) + "/status");
    for (std::string line; std::getline(in, line);) {
        if (line.rfind("VmHWM:", 0) == 0) {
            return std::stol(line.substr(6));
        }
    }
    return 0;
}

}  // namespace veldbench
