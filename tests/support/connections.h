// SPDX-License-Identifier: Apache-2.0
// Connections that show what a firewall lets through: probes, a lasting connection, an echo server.
#ifndef VELD_TEST_CONNECTIONS_H
#define VELD_TEST_CONNECTIONS_H

#include "handle.h"
#include "network.h"

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

namespace veldtest {

/// What came back.
enum class ProbeResult {
    connected,    ///< TCP: connection made; UDP: the datagram came back
    refused,      ///< the other side answered that nothing listens there
    timedOut,     ///< no answer
    unreachable,  ///< no way to the address
};

/// "connected", "refused", "timed out", "unreachable".
const char *toText(ProbeResult result);

/// Where a probe goes and where it comes from.
struct ProbeTarget {
    std::string address;  ///< numeric, IPv4 or IPv6
    uint16_t port = 0;
    std::string source = {};  ///< numeric source address; empty: the kernel's choice
};

/// How long a probe waits when nothing else is said. Only packets that are dropped take that long.
constexpr std::chrono::milliseconds probeTimeout{700};

/// Opens and closes a TCP connection, from `space` or the sandbox's own namespace.
ProbeResult probeTcp(const ProbeTarget &target, const NetworkNamespace *space = nullptr,
                     std::chrono::milliseconds timeout = probeTimeout);
/// Sends a datagram (three times within the time) and waits for its echo.
ProbeResult probeUdp(const ProbeTarget &target, const NetworkNamespace *space = nullptr);

/// A TCP connection that lasts as long as the object. Throws std::runtime_error when it cannot be made.
class Connection {
public:
    explicit Connection(const ProbeTarget &target, const NetworkNamespace *space = nullptr);

    /// Sends a line and waits for its echo: connected when it came, timedOut when not.
    ProbeResult exchange(std::chrono::milliseconds timeout = probeTimeout);

private:
    Handle m_socket;
    unsigned m_count = 0;
};

/// A process that sends back what it receives on these ports, over TCP and UDP, IPv4 and IPv6, in `space` or the
/// sandbox's own namespace. Ready when the constructor returns; killed by the destructor.
class EchoServer {
public:
    /// @param talking sends a line to every TCP connection several times a second, as a server with news would
    explicit EchoServer(const std::vector<uint16_t> &ports, const NetworkNamespace *space = nullptr,
                        bool talking = false);
    ~EchoServer();
    EchoServer(const EchoServer &) = delete;
    EchoServer &operator=(const EchoServer &) = delete;

private:
    pid_t m_process = -1;
};

}  // namespace veldtest

#endif
