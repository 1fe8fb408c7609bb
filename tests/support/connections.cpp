// SPDX-License-Identifier: Apache-2.0
// Connections that show what a firewall lets through.
#include "connections.h"

#include "sandbox.h"

#include <arpa/inet.h>
#include <netinet/in.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <csignal>
#include <cstring>
#include <functional>
#include <optional>
#include <stdexcept>
#include <system_error>

namespace veldtest {
namespace {

using std::chrono::milliseconds;
using std::chrono::steady_clock;

std::system_error systemError(const std::string &what) {
    return std::system_error(errno, std::generic_category(), what);
}

/// A socket that is closed at the end of its scope.
class Socket {
public:
    Socket(int family, int type) : m_handle(socket(family, type | SOCK_CLOEXEC | SOCK_NONBLOCK, 0)) {
        if (m_handle < 0)
            throw systemError("socket");
    }
    ~Socket() {
        if (m_handle >= 0)
            close(m_handle);
    }
    Socket(const Socket &) = delete;
    Socket &operator=(const Socket &) = delete;
    int handle() const { return m_handle; }
    int release() {
        const int handle = m_handle;
        m_handle = -1;
        return handle;
    }

private:
    int m_handle;
};

struct Address {
    sockaddr_storage storage = {};
    socklen_t size = 0;
    const sockaddr *get() const { return reinterpret_cast<const sockaddr *>(&storage); }
};

Address makeAddress(const std::string &text, uint16_t port) {
    Address address;
    auto *v4 = reinterpret_cast<sockaddr_in *>(&address.storage);
    auto *v6 = reinterpret_cast<sockaddr_in6 *>(&address.storage);
    if (inet_pton(AF_INET, text.c_str(), &v4->sin_addr) == 1) {
        v4->sin_family = AF_INET;
        v4->sin_port = htons(port);
        address.size = sizeof(*v4);
    } else if (inet_pton(AF_INET6, text.c_str(), &v6->sin6_addr) == 1) {
        v6->sin6_family = AF_INET6;
        v6->sin6_port = htons(port);
        address.size = sizeof(*v6);
    } else {
        throw std::runtime_error("not an address: " + text);
    }
    return address;
}

/// Waits until the socket has one of the events; false at the deadline.
bool waitUntil(int handle, short events, steady_clock::time_point deadline) {
    for (;;) {
        const auto left = std::chrono::duration_cast<milliseconds>(deadline - steady_clock::now()).count();
        if (left <= 0)
            return false;
        pollfd entry = {handle, events, 0};
        const int count = poll(&entry, 1, static_cast<int>(left));
        if (count > 0)
            return true;
        if (count < 0 && errno != EINTR)
            throw systemError("poll");
    }
}

std::optional<ProbeResult> answerOf(int error) {
    switch (error) {
    case ECONNREFUSED:
    case ECONNRESET:
        return ProbeResult::refused;
    case ETIMEDOUT:
        return ProbeResult::timedOut;
    case ENETUNREACH:
    case EHOSTUNREACH:
    case EPERM:
    case EACCES:
        return ProbeResult::unreachable;
    default:
        return std::nullopt;
    }
}

ProbeResult requireAnswer(int error, const std::string &what) {
    if (const auto result = answerOf(error))
        return *result;
    throw std::system_error(error, std::generic_category(), what);
}

void bindSource(int handle, const ProbeTarget &target) {
    if (target.source.empty())
        return;
    const Address source = makeAddress(target.source, 0);
    if (bind(handle, source.get(), source.size) != 0)
        throw systemError("bind to " + target.source);
}

/// Runs a function in the namespace, or here.
void runIn(const NetworkNamespace *space, const std::function<void()> &function) {
    if (space != nullptr)
        space->run(function);
    else
        function();
}

ProbeResult connectTcp(const Socket &socket, const ProbeTarget &target, milliseconds timeout) {
    const auto deadline = steady_clock::now() + timeout;
    bindSource(socket.handle(), target);
    const Address address = makeAddress(target.address, target.port);
    if (connect(socket.handle(), address.get(), address.size) == 0)
        return ProbeResult::connected;
    if (errno != EINPROGRESS)
        return requireAnswer(errno, "connect to " + target.address);
    if (!waitUntil(socket.handle(), POLLOUT, deadline))
        return ProbeResult::timedOut;
    int error = 0;
    socklen_t size = sizeof(error);
    getsockopt(socket.handle(), SOL_SOCKET, SO_ERROR, &error, &size);
    return error == 0 ? ProbeResult::connected : requireAnswer(error, "connect to " + target.address);
}

ProbeResult exchangeUdp(const Socket &socket, const ProbeTarget &target, milliseconds timeout) {
    bindSource(socket.handle(), target);
    const Address address = makeAddress(target.address, target.port);
    if (connect(socket.handle(), address.get(), address.size) != 0)
        return requireAnswer(errno, "connect to " + target.address);
    constexpr int attempts = 3;
    std::array<char, 64> buffer;
    for (int attempt = 0; attempt < attempts; ++attempt) {
        if (send(socket.handle(), "probe", 5, MSG_NOSIGNAL) < 0)
            return requireAnswer(errno, "send to " + target.address);
        if (!waitUntil(socket.handle(), POLLIN, steady_clock::now() + timeout / attempts))
            continue;
        if (recv(socket.handle(), buffer.data(), buffer.size(), 0) >= 0)
            return ProbeResult::connected;
        return requireAnswer(errno, "receive from " + target.address);
    }
    return ProbeResult::timedOut;
}

sa_family_t familyOf(const ProbeTarget &target) {
    return makeAddress(target.address, target.port).storage.ss_family;
}

/// Takes both families.
int openServerSocket(int type, uint16_t port) {
    Socket server(AF_INET6, type);
    const int off = 0;
    const int on = 1;
    setsockopt(server.handle(), IPPROTO_IPV6, IPV6_V6ONLY, &off, sizeof(off));
    setsockopt(server.handle(), SOL_SOCKET, SO_REUSEADDR, &on, sizeof(on));
    const Address any = makeAddress("::", port);
    if (bind(server.handle(), any.get(), any.size) != 0)
        throw systemError("bind to port " + std::to_string(port));
    if (type == SOCK_STREAM && listen(server.handle(), 64) != 0)
        throw systemError("listen on port " + std::to_string(port));
    return server.release();
}

void echoDatagram(int handle) {
    std::array<char, 2048> buffer;
    sockaddr_storage peer = {};
    socklen_t size = sizeof(peer);
    auto *address = reinterpret_cast<sockaddr *>(&peer);
    const ssize_t count = recvfrom(handle, buffer.data(), buffer.size(), 0, address, &size);
    if (count >= 0)
        sendto(handle, buffer.data(), static_cast<size_t>(count), MSG_NOSIGNAL, address, size);
}

/// False when the peer has gone.
bool echoStream(int handle) {
    std::array<char, 2048> buffer;
    const ssize_t count = recv(handle, buffer.data(), buffer.size(), 0);
    if (count < 0)
        return errno == EAGAIN || errno == EINTR;
    return count > 0 && send(handle, buffer.data(), static_cast<size_t>(count), MSG_NOSIGNAL) == count;
}

[[noreturn]] void serve(const std::vector<int> &listeners, const std::vector<int> &datagrams, bool talking) {
    constexpr int talkInterval = 50;  // milliseconds
    std::vector<pollfd> entries;
    entries.reserve(listeners.size() + datagrams.size());
    for (const int handle : listeners)
        entries.push_back({handle, POLLIN, 0});
    for (const int handle : datagrams)
        entries.push_back({handle, POLLIN, 0});
    const size_t fixed = entries.size();
    for (;;) {
        const int ready = poll(entries.data(), entries.size(), talking ? talkInterval : -1);
        if (ready < 0)
            continue;
        if (ready == 0) {
            for (size_t i = fixed; i < entries.size(); ++i)
                send(entries[i].fd, "news\n", 5, MSG_NOSIGNAL);
            continue;
        }
        std::vector<pollfd> accepted;
        for (size_t i = 0; i < entries.size(); ++i) {
            auto &entry = entries[i];
            if (entry.revents == 0)
                continue;
            if (i < listeners.size()) {
                const int peer = accept4(entry.fd, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
                if (peer >= 0)
                    accepted.push_back({peer, POLLIN, 0});
            } else if (i < fixed) {
                echoDatagram(entry.fd);
            } else if (!echoStream(entry.fd)) {
                close(entry.fd);
                entry.fd = -1;
            }
        }
        const auto isGone = [](const pollfd &entry) { return entry.fd < 0; };
        entries.erase(std::remove_if(entries.begin(), entries.end(), isGone), entries.end());
        entries.insert(entries.end(), accepted.begin(), accepted.end());
    }
}

}  // namespace

const char *toText(ProbeResult result) {
    switch (result) {
    case ProbeResult::connected:
        return "connected";
    case ProbeResult::refused:
        return "refused";
    case ProbeResult::timedOut:
        return "timed out";
    case ProbeResult::unreachable:
        return "unreachable";
    }
    return "unknown";
}

ProbeResult probeTcp(const ProbeTarget &target, const NetworkNamespace *space, milliseconds timeout) {
    requireSandbox("connect to " + target.address);
    ProbeResult result = ProbeResult::timedOut;
    runIn(space, [&] { result = connectTcp(Socket(familyOf(target), SOCK_STREAM), target, timeout); });
    return result;
}

ProbeResult probeUdp(const ProbeTarget &target, const NetworkNamespace *space, milliseconds timeout) {
    requireSandbox("send to " + target.address);
    ProbeResult result = ProbeResult::timedOut;
    runIn(space, [&] { result = exchangeUdp(Socket(familyOf(target), SOCK_DGRAM), target, timeout); });
    return result;
}

Connection::Connection(const ProbeTarget &target, const NetworkNamespace *space) {
    requireSandbox("connect to " + target.address);
    runIn(space, [&] {
        Socket socket(familyOf(target), SOCK_STREAM);
        const auto result = connectTcp(socket, target, std::chrono::seconds(5));
        if (result != ProbeResult::connected)
            throw std::runtime_error("connect to " + target.address + ": " + toText(result));
        m_socket = socket.release();
    });
}

Connection::~Connection() {
    close(m_socket);
}

ProbeResult Connection::exchange(milliseconds timeout) {
    const auto deadline = steady_clock::now() + timeout;
    const std::string line = "line " + std::to_string(++m_count) + "\n";
    if (send(m_socket, line.data(), line.size(), MSG_NOSIGNAL) < 0)
        return requireAnswer(errno, "send");
    // Echoes of earlier lines, sent again by TCP after a blocked time, may come first.
    std::string received;
    while (received.find(line) == std::string::npos) {
        if (!waitUntil(m_socket, POLLIN, deadline))
            return ProbeResult::timedOut;
        std::array<char, 2048> buffer;
        const ssize_t count = recv(m_socket, buffer.data(), buffer.size(), 0);
        if (count == 0)
            return ProbeResult::refused;
        if (count < 0 && errno != EAGAIN)
            return requireAnswer(errno, "receive");
        if (count > 0)
            received.append(buffer.data(), static_cast<size_t>(count));
    }
    return ProbeResult::connected;
}

EchoServer::EchoServer(const std::vector<uint16_t> &ports, const NetworkNamespace *space, bool talking) {
    requireSandbox("serve ports");
    std::vector<int> listeners;
    std::vector<int> datagrams;
    // Bound here, so that clients can come at once and failures are seen.
    runIn(space, [&] {
        for (const uint16_t port : ports) {
            listeners.push_back(openServerSocket(SOCK_STREAM, port));
            datagrams.push_back(openServerSocket(SOCK_DGRAM, port));
        }
    });
    m_process = startChild([&]() -> int { serve(listeners, datagrams, talking); });
    for (const int handle : listeners)
        close(handle);
    for (const int handle : datagrams)
        close(handle);
}

EchoServer::~EchoServer() {
    kill(m_process, SIGKILL);
    waitForChild(m_process);
}

}  // namespace veldtest
