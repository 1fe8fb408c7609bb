// SPDX-License-Identifier: Apache-2.0
// What clients notice of a firewall while its rules are replaced.
#include "windowProbe.h"

#include <arpa/inet.h>
#include <linux/tcp.h>
#include <netinet/in.h>
#include <poll.h>
#include <pthread.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <ctime>
#include <stdexcept>
#include <system_error>

namespace veldbench {

namespace {

constexpr int64_t TICK_NANOSECONDS = 500000;
constexpr size_t MAX_TICKS = 4000000;           // over half an hour
constexpr size_t SOURCE_PORTS = 64;             // per kind: connections that the host has not answered
constexpr int BUFFER_BYTES = 16 * 1024 * 1024;  // a receiver that gets no processor for a while loses nothing
constexpr const char *HOST_V4 = "10.77.0.1";
constexpr const char *HOST_V6 = "fd77::1";

int64_t now() {
    timespec time = {};
    clock_gettime(CLOCK_MONOTONIC, &time);
    return time.tv_sec * 1000000000LL + time.tv_nsec;
}

double milliseconds(int64_t nanoseconds) {
    return static_cast<double>(nanoseconds) / 1e6;
}

std::system_error systemError(const std::string &what) {
    return std::system_error(errno, std::generic_category(), what);
}

/// A late tick is a hole in what is seen, so these threads go before the firewalls' programs, where that is allowed.
void preferThisThread() {
    const sched_param priority = {10};
    pthread_setschedparam(pthread_self(), SCHED_FIFO, &priority);
}

struct Address {
    sockaddr_in6 v6 = {};
    sockaddr_in v4 = {};
    bool isV6;
    Address(const char *text, uint16_t port) : isV6(inet_pton(AF_INET6, text, &v6.sin6_addr) == 1) {
        v6.sin6_family = AF_INET6;
        v6.sin6_port = htons(port);
        v4.sin_family = AF_INET;
        v4.sin_port = htons(port);
        inet_pton(AF_INET, text, &v4.sin_addr);
    }
    int family() const { return isV6 ? AF_INET6 : AF_INET; }
    const sockaddr *get() const {
        return isV6 ? reinterpret_cast<const sockaddr *>(&v6) : reinterpret_cast<const sockaddr *>(&v4);
    }
    socklen_t size() const { return isV6 ? sizeof(v6) : sizeof(v4); }
};

}  // namespace

ProbedHost::ProbedHost(const std::string &name) : host(name), client(name + "-client") {
    veldtest::ip(
        {"link", "add", "eth0", "netns", host.name(), "type", "veth", "peer", "name", "eth0", "netns", client.name()});
    for (const auto &[space, last] : {std::pair(&host, "1"), std::pair(&client, "2")}) {
        veldtest::addAddress("eth0", std::string("10.77.0.") + last + "/24", space);
        veldtest::addAddress("eth0", std::string("fd77::") + last + "/64", space);
        veldtest::setUp("eth0", space);
    }
}

struct WindowProbe::Socket {
    explicit Socket(int number) : handle(number) {
        if (handle < 0) {
            throw systemError("socket");
        }
    }
    ~Socket() { close(handle); }
    Socket(const Socket &) = delete;
    Socket &operator=(const Socket &) = delete;
    int handle;
};

/// The datagrams to one port over one family.
struct WindowProbe::Kind {
    Kind(const ProbedHost &host, const char *address, uint16_t port) : target(address, port) {
        host.host.run([&] {
            in = open();
            if (bind(in->handle, target.get(), target.size()) != 0) {
                throw systemError(std::string("bind to ") + address);
            }
            setsockopt(in->handle, SOL_SOCKET, SO_RCVBUFFORCE, &BUFFER_BYTES, sizeof(BUFFER_BYTES));
        });
        host.client.run([&] {
            for (size_t i = 0; i < SOURCE_PORTS; ++i) {
                out.push_back(open());
            }
        });
        arrived.resize(MAX_TICKS);
    }

    std::unique_ptr<Socket> open() const {
        return std::make_unique<Socket>(socket(target.family(), SOCK_DGRAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    }

    void send(uint64_t tick) const {
        // An error is the answer to an earlier datagram (a firewall that rejects); this one is to be sent all the same.
        for (int attempt = 0; attempt < 3; ++attempt) {
            if (sendto(out[tick % SOURCE_PORTS]->handle, &tick, sizeof(tick), 0, target.get(), target.size()) > 0) {
                return;
            }
        }
    }

    void receive() {
        uint64_t tick = 0;
        while (recv(in->handle, &tick, sizeof(tick), 0) == sizeof(tick)) {
            if (tick < MAX_TICKS) {
                arrived[tick] = 1;
            }
        }
    }

    Address target;
    std::unique_ptr<Socket> in;
    std::vector<std::unique_ptr<Socket>> out;
    std::vector<char> arrived;
};

WindowProbe::WindowProbe(const ProbedHost &host) {
    for (const uint16_t port : {ALLOWED_PORT, DENIED_PORT}) {
        for (const char *address : {HOST_V4, HOST_V6}) {
            m_kinds.push_back(std::make_unique<Kind>(host, address, port));
        }
    }
    const Address transfer(HOST_V4, TRANSFER_PORT);
    std::unique_ptr<Socket> listener;
    const int on = 1;
    host.host.run([&] {
        listener = std::make_unique<Socket>(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        setsockopt(listener->handle, SOL_SOCKET, SO_REUSEADDR, &on, sizeof(on));
        if (bind(listener->handle, transfer.get(), transfer.size()) != 0 || listen(listener->handle, 1) != 0) {
            throw systemError("serve the transfer");
        }
    });
    host.client.run([&] {
        m_transferOut = std::make_unique<Socket>(socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        setsockopt(m_transferOut->handle, IPPROTO_TCP, TCP_NODELAY, &on, sizeof(on));
        if (connect(m_transferOut->handle, transfer.get(), transfer.size()) != 0) {
            throw systemError("start the transfer");
        }
    });
    m_transferIn = std::make_unique<Socket>(accept4(listener->handle, nullptr, nullptr, SOCK_CLOEXEC));
    m_sent.reserve(MAX_TICKS);
    m_receiver = std::thread([this] { receive(); });
    m_sender = std::thread([this] { send(); });
}

void WindowProbe::send() {
    preferThisThread();
    int64_t next = now();
    while (m_sending && m_sent.size() < MAX_TICKS) {
        const uint64_t tick = m_sent.size();
        m_sent.push_back(now());
        for (const auto &kind : m_kinds) {
            kind->send(tick);
        }
        ::send(m_transferOut->handle, &tick, sizeof(tick), MSG_DONTWAIT | MSG_NOSIGNAL);
        next = std::max(next + TICK_NANOSECONDS, now());
        const timespec until = {next / 1000000000, next % 1000000000};
        clock_nanosleep(CLOCK_MONOTONIC, TIMER_ABSTIME, &until, nullptr);
    }
}

void WindowProbe::receive() {
    preferThisThread();
    std::vector<pollfd> polled;
    for (const auto &kind : m_kinds) {
        polled.push_back({kind->in->handle, POLLIN, 0});
    }
    polled.push_back({m_transferIn->handle, POLLIN, 0});
    int64_t arrival = now();
    while (m_receiving) {
        if (poll(polled.data(), polled.size(), 50) <= 0) {
            continue;
        }
        for (size_t i = 0; i < m_kinds.size(); ++i) {
            if (polled[i].revents != 0) {
                m_kinds[i]->receive();
            }
        }
        std::array<char, 65536> buffer;
        if (polled.back().revents != 0 && recv(m_transferIn->handle, buffer.data(), buffer.size(), MSG_DONTWAIT) > 0) {
            const int64_t time = now();
            m_longestGap = std::max(m_longestGap, time - arrival);
            arrival = time;
        }
    }
}

WindowProbe::~WindowProbe() {
    if (m_sender.joinable()) {
        stop();
    }
}

WindowResult WindowProbe::stop() {
    m_sending = false;
    m_sender.join();
    std::this_thread::sleep_for(std::chrono::milliseconds(300));  // for what is on its way
    m_receiving = false;
    m_receiver.join();

    WindowResult result;
    result.ticks = m_sent.size();
    result.longestGap = milliseconds(m_longestGap);
    tcp_info info = {};
    socklen_t size = sizeof(info);
    getsockopt(m_transferOut->handle, IPPROTO_TCP, TCP_INFO, &info, &size);
    // Without those that the receiver already had: sent again because an acknowledgement came late.
    result.retransmissions = info.tcpi_total_retrans - std::min(info.tcpi_total_retrans, info.tcpi_dsack_dups);

    std::vector<int64_t> intervals;
    for (size_t tick = 1; tick < m_sent.size(); ++tick) {
        intervals.push_back(m_sent[tick] - m_sent[tick - 1]);
    }
    std::sort(intervals.begin(), intervals.end());
    if (!intervals.empty()) {
        result.interval = milliseconds(intervals[intervals.size() / 2]);
        result.longestInterval = milliseconds(intervals.back());
    }
    for (const auto &kind : m_kinds) {
        const bool allowed = kind->target.v4.sin_port == htons(ALLOWED_PORT);
        int64_t lostSince = -1;
        for (size_t tick = 0; tick < m_sent.size(); ++tick) {
            const bool arrived = kind->arrived[tick] != 0;
            if (!allowed) {
                result.deniedPassed += arrived ? 1 : 0;
                continue;
            }
            result.allowedLost += arrived ? 0 : 1;
            if (!arrived && lostSince < 0) {
                lostSince = m_sent[tick];
            }
            if (lostSince >= 0 && (arrived || tick + 1 == m_sent.size())) {
                result.window = std::max(result.window, milliseconds(m_sent[tick] - lostSince));
                lostSince = -1;
            }
        }
    }
    return result;
}

}  // namespace veldbench
