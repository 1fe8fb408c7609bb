// SPDX-License-Identifier: Apache-2.0
// The firewalls that Debian offers, set up in namespaces with as many rules, for comparison.
#ifndef VELD_BENCH_OTHER_FIREWALLS_H
#define VELD_BENCH_OTHER_FIREWALLS_H

#include "network.h"

#include <string>

namespace veldbench {

/// Installs the Debian packages in `directory` into the sandbox. Throws std::runtime_error with what dpkg said.
void packagesInstall(const std::string &directory);

/// ufw, switched on, with that many rules of its own in the kernel, half of them of each family.
class Ufw {
public:
    /// Why it cannot be measured here; empty when it can.
    static std::string unavailable();
    Ufw(const veldtest::NetworkNamespace &space, size_t kernelRules);
    /// Throws std::runtime_error unless the kernel holds the rules.
    void check() const;

private:
    const veldtest::NetworkNamespace &m_space;
    size_t m_rules;
};

/// firewalld and its system bus, running in a namespace, with that many rules. One at a time.
class Firewalld {
public:
    static std::string unavailable();
    /// @param backend of iptables, "nft" or "legacy": firewalld uses nftables with the first, iptables with the second
    Firewalld(const veldtest::NetworkNamespace &space, size_t kernelRules, const std::string &backend);
    ~Firewalld();
    Firewalld(const Firewalld &) = delete;
    Firewalld &operator=(const Firewalld &) = delete;
    /// Throws std::runtime_error unless the kernel holds the rules.
    void check() const;
    /// Peak memory of the daemon.
    long peakKilobytes() const;

private:
    const veldtest::NetworkNamespace &m_space;
    size_t m_rules;
    bool m_nftables;
    pid_t m_bus = -1;
    pid_t m_daemon = -1;
};

}  // namespace veldbench

#endif
