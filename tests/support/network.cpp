// SPDX-License-Identifier: Apache-2.0
// Network interfaces of the sandbox and further network namespaces.
#include "network.h"

#include "files.h"
#include "handle.h"
#include "processes.h"
#include "sandbox.h"

#include <fcntl.h>
#include <sched.h>
#include <sys/mount.h>
#include <unistd.h>

#include <exception>
#include <thread>

namespace veldtest {
namespace {

const std::string namedSpaces = "/run/netns/";  // where ip(8) looks for names

/// Runs a function on a thread of its own, because a namespace belongs to a thread, and passes its exception on.
void onOwnThread(const std::function<void()> &function) {
    std::exception_ptr failure;
    std::thread worker([&] {
        try {
            function();
        } catch (...) {
            failure = std::current_exception();
        }
    });
    worker.join();
    if (failure)
        std::rethrow_exception(failure);
}

}  // namespace

NetworkNamespace::NetworkNamespace(std::string name) : m_name(std::move(name)) {
    requireSandbox("make network namespace " + m_name);
    onOwnThread([this] {
        if (unshare(CLONE_NEWNET) != 0)
            throw systemError("unshare the network");
        m_handle = {open("/proc/thread-self/ns/net", O_RDONLY | O_CLOEXEC), "open /proc/thread-self/ns/net"};
    });
    const std::string file = namedSpaces + m_name;
    writeFile(file, "");
    const std::string source = "/proc/self/fd/" + std::to_string(m_handle.get());
    if (mount(source.c_str(), file.c_str(), nullptr, MS_BIND, nullptr) != 0)
        throw systemError("bind the network namespace to " + file);
    setUp("lo", this);
}

NetworkNamespace::~NetworkNamespace() {
    const std::string file = namedSpaces + m_name;
    umount2(file.c_str(), MNT_DETACH);
    unlink(file.c_str());
}

void NetworkNamespace::run(const std::function<void()> &function) const {
    onOwnThread([&] {
        if (setns(m_handle.get(), CLONE_NEWNET) != 0)
            throw systemError("enter network namespace " + m_name);
        function();
    });
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

void addVethPair(const std::string &name, const std::string &peer) {
    ip({"link", "add", name, "type", "veth", "peer", "name", peer});
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
