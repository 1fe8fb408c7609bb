// SPDX-License-Identifier: Apache-2.0
// What clients notice of a firewall while its rules are replaced.
#ifndef VELD_BENCH_WINDOW_PROBE_H
#define VELD_BENCH_WINDOW_PROBE_H

#include "network.h"

#include <atomic>
#include <cstdint>
#include <memory>
#include <string>
#include <thread>
#include <vector>

namespace veldbench {

inline constexpr uint16_t ALLOWED_PORT = 40000;   ///< udp; every firewall measured lets it in
inline constexpr uint16_t DENIED_PORT = 40001;    ///< udp; none lets it in
inline constexpr uint16_t TRANSFER_PORT = 40003;  ///< tcp; every one lets it in

/// A firewalled host and a client, connected by their interfaces "eth0". Lives in the sandbox.
struct ProbedHost {
    explicit ProbedHost(const std::string &name);
    veldtest::NetworkNamespace host;
    veldtest::NetworkNamespace client;
};

/// What a probe saw. Times in milliseconds.
struct WindowResult {
    uint64_t ticks = 0;            ///< probes of each kind and family
    double interval = 0;           ///< median time between two
    double longestInterval = 0;    ///< the window can be longer than seen by at most this
    uint64_t allowedLost = 0;      ///< packets to the allowed port that did not arrive
    double window = 0;             ///< longest time from a lost one to the next that arrived, of either family
    uint64_t deniedPassed = 0;     ///< packets to the denied port that arrived
    uint64_t retransmissions = 0;  ///< of lost packets of the established transfer
    double longestGap = 0;         ///< of the established transfer: between two arrivals
};

/// As long as it lives, and until stop(), the client sends every half millisecond over both families: a datagram to the
/// allowed and one to the denied port, never answered, so that each is a packet of a new connection; and a line of an
/// established transfer.
class WindowProbe {
public:
    explicit WindowProbe(const ProbedHost &host);
    ~WindowProbe();
    WindowProbe(const WindowProbe &) = delete;
    WindowProbe &operator=(const WindowProbe &) = delete;

    WindowResult stop();

private:
    struct Socket;
    struct Kind;
    void send();
    void receive();

    std::vector<std::unique_ptr<Kind>> m_kinds;
    std::unique_ptr<Socket> m_transferIn;
    std::unique_ptr<Socket> m_transferOut;
    std::vector<int64_t> m_sent;  ///< time of each tick, nanoseconds
    int64_t m_longestGap = 0;
    uint64_t m_retransmissions = 0;
    std::atomic<bool> m_sending{true};
    std::atomic<bool> m_receiving{true};
    std::thread m_sender;
    std::thread m_receiver;
};

}  // namespace veldbench

#endif
