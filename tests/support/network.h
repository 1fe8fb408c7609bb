// SPDX-License-Identifier: Apache-2.0
// Network interfaces of the sandbox and further network namespaces.
#ifndef VELD_TEST_NETWORK_H
#define VELD_TEST_NETWORK_H

#include "handle.h"
#include "processes.h"

#include <functional>
#include <string>
#include <vector>

namespace veldtest {

/// A network namespace beside the sandbox's own, with loopback up. Lives as long as the object. In the sandbox it is
/// also known to ip(8) under its name ("ip -n client addr").
class NetworkNamespace {
public:
    explicit NetworkNamespace(std::string name);
    ~NetworkNamespace();
    NetworkNamespace(const NetworkNamespace &) = delete;
    NetworkNamespace &operator=(const NetworkNamespace &) = delete;

    const std::string &name() const { return m_name; }
    /// Runs a function inside, on a thread of its own. Sockets that it opens belong to this namespace and stay usable
    /// afterwards. An exception is passed on.
    void run(const std::function<void()> &function) const;

private:
    std::string m_name;
    Handle m_handle;
};

/// Runs ip(8) with these arguments, in `space` or the sandbox's own; throws std::runtime_error with what it printed
/// when it fails.
void ip(const std::vector<std::string> &arguments, const NetworkNamespace *space = nullptr);

/// Adds an interface that leads nowhere: of type dummy, or a bridge without ports where the kernel has no dummy. Down
/// and without address.
void addDummyInterface(const std::string &name);
/// Adds a pair of connected interfaces, the peer in `other`, down.
void addVethPair(const std::string &name, const NetworkNamespace &other, const std::string &peer);
/// Removes an interface (of a pair: both).
void removeInterface(const std::string &name);
/// Adds an address with prefix length ("10.0.0.1/24", "fd00::1/64"), usable at once; in `space` or the sandbox's own.
void addAddress(const std::string &interface, const std::string &address, const NetworkNamespace *space = nullptr);
/// Switches an interface on.
void setUp(const std::string &interface, const NetworkNamespace *space = nullptr);

}  // namespace veldtest

#endif
