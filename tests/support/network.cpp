// SPDX-License-Identifier: Apache-2.0
// Network interfaces of the sandbox and further network namespaces.
#include "network.h"

#include "processes.h"
#include "sandbox.h"

#include <fcntl.h>
#include <sched.h>

#include <future>

namespace veldtest {
NetworkNamespace::NetworkNamespace(std::string name) : m_name(std::move(name)) {
    ip({"netns", "add", m_name});
    const std::string file = "/run/netns/" + m_name;
    m_handle = {open(file.c_str(), O_RDONLY | O_CLOEXEC), "open " + file};
    setUp("lo", this);
}

NetworkNamespace::~NetworkNamespace() {
    runProgram({"ip", "netns", "del", m_name});
}

void NetworkNamespace::run(const std::function<void()> &function) const {
    // On a thread of its own, because a namespace belongs to a thread.
    std::async(std::launch::async, [&] {
        if (setns(m_handle.get(), CLONE_NEWNET) != 0)
            throw systemError("enter network namespace " + m_name);
        function();
    }).get();
}

void ip(const std::vector<std::string> &arguments, const NetworkNamespace *space) {
    requireSandbox("change network interfaces");
    std::vector<std::string> command = {"ip"};
    if (space != nullptr)
        command = {"ip", "-n", space->name()};
    command.insert(command.end(), arguments.begin(), arguments.end());
    runChecked(command);
}

void addDummyInterface(const std::string &name) {
    requireSandbox("add interface " + name);
    if (!runProgram({"ip", "link", "add", name, "type", "dummy"}).succeeded())
        ip({"link", "add", name, "type", "bridge"});
}

void addVethPair(const std::string &name, const NetworkNamespace &other, const std::string &peer) {
    ip({"link", "add", name, "type", "veth", "peer", "name", peer, "netns", other.name()});
}

void removeInterface(const std::string &name) {
    ip({"link", "del", name});
}

void addAddress(const std::string &interface, const std::string &address, const NetworkNamespace *space) {
    std::vector<std::string> arguments = {"addr", "add", address, "dev", interface};
    // Without the search for duplicates, during which an IPv6 address cannot be used.
    if (address.find(':') != std::string::npos)
        arguments.emplace_back("nodad");
    ip(arguments, space);
}

void setUp(const std::string &interface, const NetworkNamespace *space) {
    ip({"link", "set", interface, "up"}, space);
}

}  // namespace veldtest
