// SPDX-License-Identifier: Apache-2.0
// Many probes at once: which of them get an answer.
#ifndef VELD_TEST_PROBE_BATCH_H
#define VELD_TEST_PROBE_BATCH_H

#include "network.h"

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

namespace veldtest {

/// One packet's way: IPv4 or IPv6, numeric.
struct BatchProbe {
    bool udp = false;
    std::string source;
    uint16_t sourcePort = 0;  ///< 0: the kernel's choice
    std::string address;
    uint16_t port = 0;
};

/// Sends all probes from `space` in parallel (UDP ones several times) and waits up to `timeout`.
/// @return per probe whether anything came back: a connection, an echo, or the word that nothing listens there
std::vector<bool> probeAll(const std::vector<BatchProbe> &probes, const NetworkNamespace &space,
                           std::chrono::milliseconds timeout);

}  // namespace veldtest

#endif
