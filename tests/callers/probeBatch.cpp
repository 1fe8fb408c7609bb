// SPDX-License-Identifier: Apache-2.0
// Many probes at once.
#include "probeBatch.h"

#include "sandbox.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <stdexcept>
#include <system_error>

namespace veldtest {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

constexpr milliseconds sendAgainAfter{100};

/// Of the family that the text is of.
sockaddr_in6 addressOf(const std::string &text, uint16_t port) {
    sockaddr_in6 address = {};  // larger than sockaddr_in
    auto &v4 = reinterpret_cast<sockaddr_in &>(address);
    if (inet_pton(AF_INET, text.c_str(), &v4.sin_addr) == 1) {
        v4.sin_family = AF_INET;
        v4.sin_port = htons(port);
    } else if (inet_pton(AF_INET6, text.c_str(), &address.sin6_addr) == 1) {
        address.sin6_family = AF_INET6;
        address.sin6_port = htons(port);
    } else {
        throw std::runtime_error("not an address: " + text);
    }
    return address;
}

void require(bool succeeded, const std::string &what) {
    if (!succeeded)
        throw std::system_error(errno, std::generic_category(), what);
}

int startProbe(const BatchProbe &probe) {
    const sockaddr_in6 source = addressOf(probe.source, probe.sourcePort);
    const int handle =
        socket(source.sin6_family, (probe.udp ? SOCK_DGRAM : SOCK_STREAM) | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    require(handle >= 0, "socket");
    require(bind(handle, reinterpret_cast<const sockaddr *>(&source), sizeof(source)) == 0, "bind to " + probe.source);
    const sockaddr_in6 target = addressOf(probe.address, probe.port);
    const int result = connect(handle, reinterpret_cast<const sockaddr *>(&target), sizeof(target));
    require(result == 0 || errno == EINPROGRESS || errno == ECONNREFUSED, "connect to " + probe.address);
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
    std::vector<pollfd> entries;
    for (const BatchProbe &probe : probes)
        entries.push_back({startProbe(probe), static_cast<short>(probe.udp ? POLLIN : POLLOUT), 0});
    std::vector<bool> answered(probes.size());
    size_t waiting = probes.size();
    const auto deadline = steady_clock::now() + timeout;
    while (waiting > 0 && steady_clock::now() < deadline) {
        for (size_t i = 0; i < probes.size(); ++i) {
            if (probes[i].udp && !answered[i])
                send(entries[i].fd, "probe", 5, MSG_NOSIGNAL);
        }
        const auto sendAgain = std::min(deadline, steady_clock::now() + sendAgainAfter);
        for (auto now = steady_clock::now(); waiting > 0 && now < sendAgain; now = steady_clock::now()) {
            const auto left = std::chrono::duration_cast<milliseconds>(sendAgain - now).count() + 1;
            if (poll(entries.data(), entries.size(), static_cast<int>(left)) <= 0)
                continue;
            for (size_t i = 0; i < probes.size(); ++i) {
                if (entries[i].revents == 0 || !isAnswer(entries[i].fd))
                    continue;
                answered[i] = true;
                close(entries[i].fd);
                entries[i].fd = -1;  // poll() passes over it
                --waiting;
            }
        }
    }
    for (const pollfd &entry : entries) {
        if (entry.fd >= 0)
            close(entry.fd);
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
