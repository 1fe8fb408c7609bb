// SPDX-License-Identifier: Apache-2.0
// Connections that show what a firewall lets through.
#include "connections.h"

#include "processes.h"
#include "sandbox.h"

#include <netdb.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>

#include <array>
#include <csignal>
#include <functional>
#include <memory>
#include <stdexcept>

namespace veldtest {
namespace {

using std::chrono::milliseconds;

using Address = std::unique_ptr<addrinfo, void (*)(addrinfo *)>;

Address parseAddress(const std::string &text, uint16_t port) {
    addrinfo hints = {};
    hints.ai_flags = AI_NUMERICHOST | AI_NUMERICSERV;
    addrinfo *found = nullptr;
    if (getaddrinfo(text.c_str(), std::to_string(port).c_str(), &hints, &found) != 0)
        throw std::runtime_error("not an address: " + text);
    return {found, freeaddrinfo};
}

/// Lets a call on the socket wait that long and no longer.
void limitWaiting(const Handle &socket, milliseconds time) {
    const timeval limit = {time.count() / 1000, time.count() % 1000 * 1000};
    for (const int option : {SO_SNDTIMEO, SO_RCVTIMEO})
        setsockopt(socket.get(), SOL_SOCKET, option, &limit, sizeof(limit));
}

ProbeResult resultOf(int error) {
    switch (error) {
    case 0:
        return ProbeResult::connected;
    case ECONNREFUSED:
    case ECONNRESET:
        return ProbeResult::refused;
    case EINPROGRESS:  // of a connect() whose time is up
    case EAGAIN:
    case ETIMEDOUT:
        return ProbeResult::timedOut;
    default:
        return ProbeResult::unreachable;
    }
}

/// Runs a function in the namespace, or here.
void runIn(const NetworkNamespace *space, const std::function<void()> &function) {
    if (space != nullptr)
        space->run(function);
    else
        function();
}

/// Opens a socket and calls connect(). @param error of connect(), 0 when it succeeded
Handle startConnect(int type, const ProbeTarget &target, milliseconds timeout, int &error) {
    const auto address = parseAddress(target.address, target.port);
    Handle socket(::socket(address->ai_family, type | SOCK_CLOEXEC, 0), "socket");
    limitWaiting(socket, timeout);
    if (!target.source.empty()) {
        const auto source = parseAddress(target.source, 0);
        if (bind(socket.get(), source->ai_addr, source->ai_addrlen) != 0)
            throw systemError("bind to " + target.source);
    }
    error = connect(socket.get(), address->ai_addr, address->ai_addrlen) == 0 ? 0 : errno;
    return socket;
}

/// Takes both families.
Handle openServerSocket(int type, uint16_t port) {
    Handle server(socket(AF_INET6, type | SOCK_CLOEXEC | SOCK_NONBLOCK, 0), "socket");
    const int off = 0;
    const int on = 1;
    setsockopt(server.get(), IPPROTO_IPV6, IPV6_V6ONLY, &off, sizeof(off));
    setsockopt(server.get(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof(on));
    const auto any = parseAddress("::", port);
    if (bind(server.get(), any->ai_addr, any->ai_addrlen) != 0 ||
        (type == SOCK_STREAM && listen(server.get(), 64) != 0))
        throw systemError("serve port " + std::to_string(port));
    return server;
}

/// Sends back a datagram or a part of a stream; false when the peer of a stream has gone.
bool echo(int socket) {
    std::array<char, 2048> buffer;
    sockaddr_storage peer = {};  // stays empty, and is not looked at, for a stream
    socklen_t size = sizeof(peer);
    auto *address = reinterpret_cast<sockaddr *>(&peer);
    const ssize_t count = recvfrom(socket, buffer.data(), buffer.size(), 0, address, &size);
    if (count > 0)
        sendto(socket, buffer.data(), static_cast<size_t>(count), MSG_NOSIGNAL, address, size);
    return count > 0 || (count < 0 && errno == EAGAIN);
}

[[noreturn]] void serve(const std::vector<Handle> &servers, bool talking) {
    constexpr int talkInterval = 50;  // milliseconds
    std::vector<pollfd> sockets;
    for (const auto &server : servers)
        sockets.push_back({server.get(), POLLIN, 0});
    for (;;) {
        const int ready = poll(sockets.data(), sockets.size(), talking ? talkInterval : -1);
        for (size_t i = servers.size(); ready == 0 && i < sockets.size(); ++i)
            send(sockets[i].fd, "news\n", 5, MSG_NOSIGNAL);
        for (size_t i = 0, known = sockets.size(); ready > 0 && i < known; ++i) {
            if (sockets[i].revents == 0)
                continue;
            // Fails on anything but a listening socket.
            const int peer = accept4(sockets[i].fd, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
            if (peer >= 0) {
                sockets.push_back({peer, POLLIN, 0});
            } else if (!echo(sockets[i].fd) && i >= servers.size()) {
                close(sockets[i].fd);
                sockets[i].fd = -1;  // poll() passes over it
            }
        }
    }
}

}  // namespace

const char *toText(ProbeResult result) {
    constexpr std::array texts = {"connected", "refused", "timed out", "unreachable"};
    return texts.at(static_cast<size_t>(result));
}

ProbeResult probeTcp(const ProbeTarget &target, const NetworkNamespace *space, milliseconds timeout) {
    requireSandbox("connect to " + target.address);
    int error = 0;
    runIn(space, [&] { startConnect(SOCK_STREAM, target, timeout, error); });
    return resultOf(error);
}

ProbeResult probeUdp(const ProbeTarget &target, const NetworkNamespace *space) {
    requireSandbox("send to " + target.address);
    int error = 0;
    runIn(space, [&] {
        constexpr int attempts = 3;
        const Handle socket = startConnect(SOCK_DGRAM, target, probeTimeout / attempts, error);
        char answer = 0;
        for (int attempt = 0; error == 0 || (error == EAGAIN && attempt < attempts); ++attempt) {
            const bool answered = send(socket.get(), "?", 1, 0) == 1 && recv(socket.get(), &answer, 1, 0) == 1;
            error = answered ? 0 : errno;
            if (answered)
                break;
        }
    });
    return resultOf(error);
}

Connection::Connection(const ProbeTarget &target, const NetworkNamespace *space) {
    requireSandbox("connect to " + target.address);
    int error = 0;
    runIn(space, [&] { m_socket = startConnect(SOCK_STREAM, target, std::chrono::seconds(5), error); });
    if (error != 0)
        throw systemError("connect to " + target.address, error);
}

ProbeResult Connection::exchange(milliseconds timeout) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    const std::string line = "line " + std::to_string(++m_count) + "\n";
    limitWaiting(m_socket, timeout);
    if (send(m_socket.get(), line.data(), line.size(), MSG_NOSIGNAL) < 0)
        return resultOf(errno);
    // Echoes of earlier lines, sent again by TCP after a blocked time, may come first.
    std::string received;
    while (received.find(line) == std::string::npos) {
        std::array<char, 2048> buffer;
        const ssize_t count = recv(m_socket.get(), buffer.data(), buffer.size(), 0);
        if (count <= 0)
            return resultOf(count == 0 ? ECONNRESET : errno);
        received.append(buffer.data(), static_cast<size_t>(count));
        if (std::chrono::steady_clock::now() > deadline)
            return ProbeResult::timedOut;
    }
    return ProbeResult::connected;
}

EchoServer::EchoServer(const std::vector<uint16_t> &ports, const NetworkNamespace *space, bool talking) {
    requireSandbox("serve ports");
    std::vector<Handle> servers;
    // Bound here, so that clients can come at once and failures are seen.
    runIn(space, [&] {
        for (const uint16_t port : ports) {
            servers.push_back(openServerSocket(SOCK_STREAM, port));
            servers.push_back(openServerSocket(SOCK_DGRAM, port));
        }
    });
    m_process = startChild([&]() -> int { serve(servers, talking); });
}

EchoServer::~EchoServer() {
    kill(m_process, SIGKILL);
    waitForChild(m_process);
}

}  // namespace veldtest
