// SPDX-License-Identifier: Apache-2.0
// Many probes at once.
#include "probeBatch.h"

#include "sandbox.h"

#include <netdb.h>
#include <poll.h>
#include <sys/socket.h>

#include <memory>
#include <stdexcept>

namespace veldtest {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr int sendAgainMilliseconds = 50;

auto addressOf(const std::string &text, uint16_t port) {
    addrinfo hints = {};
    hints.ai_flags = AI_NUMERICHOST | AI_NUMERICSERV;
    addrinfo *found = nullptr;
    if (getaddrinfo(text.c_str(), std::to_string(port).c_str(), &hints, &found) != 0)
        throw std::runtime_error("not an address: " + text);
    return std::unique_ptr<addrinfo, void (*)(addrinfo *)>(found, freeaddrinfo);
}

Handle startProbe(const BatchProbe &probe) {
    const auto source = addressOf(probe.source, probe.sourcePort);
    const auto target = addressOf(probe.address, probe.port);
    const int type = (probe.udp ? SOCK_DGRAM : SOCK_STREAM) | SOCK_NONBLOCK | SOCK_CLOEXEC;
    Handle handle(socket(source->ai_family, type, 0), "socket");
    if (bind(handle.get(), source->ai_addr, source->ai_addrlen) != 0)
        throw systemError("bind to " + probe.source);
    if (connect(handle.get(), target->ai_addr, target->ai_addrlen) != 0 && errno != EINPROGRESS)
        throw systemError("connect to " + probe.address);
    return handle;
}

/// Whether the event on the socket is an answer; clears a pending error.
bool isAnswer(int handle) {
    int error = 0;
    socklen_t size = sizeof(error);
    getsockopt(handle, SOL_SOCKET, SO_ERROR, &error, &size);
    return error == 0 || error == ECONNREFUSED || error == ECONNRESET;
}

std::vector<bool> probeHere(const std::vector<BatchProbe> &probes, milliseconds timeout) {
    std::vector<Handle> sockets;
    std::vector<pollfd> entries;
    for (const BatchProbe &probe : probes) {
        sockets.push_back(startProbe(probe));
        entries.push_back({sockets.back().get(), static_cast<short>(probe.udp ? POLLIN : POLLOUT), 0});
    }
    std::vector<bool> answered(probes.size());
    const auto deadline = steady_clock::now() + timeout;
    auto sendAgain = steady_clock::now();
    while (steady_clock::now() < deadline) {
        const bool isSending = steady_clock::now() >= sendAgain;
        for (size_t i = 0; isSending && i < probes.size(); ++i) {
            if (probes[i].udp && !answered[i])
                send(entries[i].fd, "probe", 5, MSG_NOSIGNAL);
        }
        sendAgain += isSending ? milliseconds(sendAgainMilliseconds) : milliseconds(0);
        poll(entries.data(), entries.size(), sendAgainMilliseconds);
        for (size_t i = 0; i < probes.size(); ++i) {
            if (entries[i].revents != 0 && isAnswer(entries[i].fd)) {
                answered[i] = true;
                entries[i].fd = -1;  // poll() passes over it
            }
        }
    }
    return answered;
}

}  // namespace

std::vector<bool> probeAll(const std::vector<BatchProbe> &probes, const NetworkNamespace &space, milliseconds timeout) {
    requireSandbox("probe");
    std::vector<bool> answered;
    space.run([&] { answered = probeHere(probes, timeout); });
    return answered;
}

}  // namespace veldtest
