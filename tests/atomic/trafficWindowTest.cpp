// SPDX-License-Identifier: Apache-2.0
// What a client notices while rules are replaced.
#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <netinet/tcp.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <deque>
#include <iostream>
#include <thread>

#include "connections.h"
#include "kernelTest.h"
#include "network.h"
#include "realIptables.h"

using namespace veldtest;

namespace {

constexpr uint16_t allowedPort = 80;
constexpr uint16_t deniedPort = 81;
constexpr uint16_t transferPort = 82;

sockaddr_in6 addressOf(bool v6, uint16_t port) {
    sockaddr_in6 address = {};
    address.sin6_family = AF_INET6;
    address.sin6_port = htons(port);
    inet_pton(AF_INET6, v6 ? "fd01::1" : "::ffff:10.1.0.1", &address.sin6_addr);
    return address;
}

int listenOn(uint16_t port) {
    const int listener = socket(AF_INET6, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    const int on = 1;
    setsockopt(listener, SOL_SOCKET, SO_REUSEADDR, &on, sizeof(on));
    sockaddr_in6 any = {};
    any.sin6_family = AF_INET6;
    any.sin6_port = htons(port);
    if (bind(listener, reinterpret_cast<sockaddr *>(&any), sizeof(any)) != 0 || listen(listener, 4096) != 0)
        throw std::runtime_error("cannot listen");
    return listener;
}

/// Closes with a reset, so that ports are free again at once.
void drop(int connection) {
    const linger now = {1, 0};
    setsockopt(connection, SOL_SOCKET, SO_LINGER, &now, sizeof(now));
    close(connection);
}

uint32_t retransmissions(int connection) {
    tcp_info info = {};
    socklen_t size = sizeof(info);
    getsockopt(connection, IPPROTO_TCP, TCP_INFO, &info, &size);
    return info.tcpi_total_retrans;
}

struct Counts {
    long allowed = 0;      ///< connections tried to the allowed port
    long lost = 0;         ///< of them, those whose packet was dropped at least once
    long denied = 0;       ///< connections tried to the denied port
    long passed = 0;       ///< of them, those that arrived
    long transferred = 0;  ///< bytes of the transfer that arrived
    bool transferFailed = false;
};

/// Tries connections from the client, and accepts them, while `work` runs.
class Traffic {
public:
    explicit Traffic(const NetworkNamespace &clientSpace) : client(clientSpace) {}

    Counts during(const std::function<void()> &work) {
        stop = false;
        std::thread accepting([this] { accept(); });
        std::thread trying([this] { client.run([this] { tryConnections(); }); });
        std::thread sending([this] { client.run([this] { transfer(); }); });
        work();
        stop = true;
        trying.join();
        sending.join();
        stopAccepting = true;
        accepting.join();
        return counts;
    }

private:
    using Clock = std::chrono::steady_clock;

    void accept() {
        const int allowed = listenOn(allowedPort);
        const int denied = listenOn(deniedPort);
        const int transfers = listenOn(transferPort);
        listening = true;
        int transferred = -1;
        std::array<char, 65536> buffer = {};
        while (!stopAccepting) {
            pollfd events[] = {
                {allowed, POLLIN, 0}, {denied, POLLIN, 0}, {transfers, POLLIN, 0}, {transferred, POLLIN, 0}};
            if (poll(events, 4, 20) < 0)
                continue;
            for (int accepted = accept4(allowed, nullptr, nullptr, SOCK_CLOEXEC); accepted >= 0;
                 accepted = accept4(allowed, nullptr, nullptr, SOCK_CLOEXEC))
                drop(accepted);
            for (int accepted = accept4(denied, nullptr, nullptr, SOCK_CLOEXEC); accepted >= 0;
                 accepted = accept4(denied, nullptr, nullptr, SOCK_CLOEXEC)) {
                ++counts.passed;
                drop(accepted);
            }
            if (transferred < 0)
                transferred = accept4(transfers, nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK);
            for (ssize_t size = 1; transferred >= 0 && size > 0;) {
                size = read(transferred, buffer.data(), buffer.size());
                counts.transferred += size > 0 ? size : 0;
            }
        }
        for (const int socket : {allowed, denied, transfers, transferred})
            close(socket);
    }

    int begin(bool v6, uint16_t port) const {
        const int connection = socket(AF_INET6, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
        const sockaddr_in6 address = addressOf(v6, port);
        connect(connection, reinterpret_cast<const sockaddr *>(&address), sizeof(address));
        return connection;
    }

    void tryConnections() {
        while (!listening)
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        std::deque<int> denied;
        std::deque<int> waiting;
        auto next = Clock::now();
        auto deadline = Clock::time_point::max();
        for (long round = 0; !waiting.empty() || !stop; ++round) {
            if (!stop) {
                waiting.push_back(begin(round % 2 != 0, allowedPort));
                denied.push_back(begin(round % 2 != 0, deniedPort));
                ++counts.allowed;
                ++counts.denied;
            } else if (deadline == Clock::time_point::max()) {
                deadline = Clock::now() + std::chrono::seconds(10);
            }
            for (size_t left = waiting.size(); left > 0; --left) {
                const int connection = waiting.front();
                waiting.pop_front();
                pollfd event = {connection, POLLOUT, 0};
                if (poll(&event, 1, 0) == 0 && Clock::now() < deadline) {
                    waiting.push_back(connection);
                    continue;
                }
                int error = 0;
                socklen_t size = sizeof(error);
                getsockopt(connection, SOL_SOCKET, SO_ERROR, &error, &size);
                // The listener closes with a reset; a connection that was never made has another error or none.
                const bool connected = (event.revents & POLLOUT) != 0 && (error == 0 || error == ECONNRESET);
                counts.lost += !connected || retransmissions(connection) > 0 ? 1 : 0;
                drop(connection);
            }
            if (denied.size() > 40) {
                drop(denied.front());
                denied.pop_front();
            }
            next = std::max(next + std::chrono::microseconds(500), Clock::now());
            std::this_thread::sleep_until(next);
        }
        for (const int connection : denied)
            drop(connection);
    }

    void transfer() {
        while (!listening)
            std::this_thread::sleep_for(std::chrono::milliseconds(1));
        const int connection = socket(AF_INET6, SOCK_STREAM | SOCK_CLOEXEC, 0);
        const sockaddr_in6 address = addressOf(false, transferPort);
        counts.transferFailed = connect(connection, reinterpret_cast<const sockaddr *>(&address), sizeof(address)) != 0;
        const std::string block(4096, 'x');
        long sent = 0;
        while (!stop && !counts.transferFailed) {
            const ssize_t size = send(connection, block.data(), block.size(), MSG_NOSIGNAL);
            counts.transferFailed = size < 0;
            sent += size > 0 ? size : 0;
            std::this_thread::sleep_for(std::chrono::microseconds(500));
        }
        for (int patience = 0; patience < 1000 && counts.transferred < sent; ++patience)
            std::this_thread::sleep_for(std::chrono::milliseconds(10));
        counts.transferFailed = counts.transferFailed || counts.transferred != sent;
        close(connection);
    }

    const NetworkNamespace &client;
    std::atomic<bool> stop{false};
    std::atomic<bool> stopAccepting{false};
    std::atomic<bool> listening{false};
    struct SharedCounts {
        std::atomic<long> allowed{0}, lost{0}, denied{0}, passed{0}, transferred{0};
        std::atomic<bool> transferFailed{false};
        operator Counts() const { return {allowed, lost, denied, passed, transferred, transferFailed}; }
    } counts;
};

class TrafficWindow : public KernelTest {
protected:
    void SetUp() override {
        std::string reason;
        if (!useIptablesBackend(GetParam()) || !realIptables(&reason))
            GTEST_SKIP() << "iptables-" << GetParam() << " does not work here: " << reason;
        addVethPair("eth0", client, "client0");
        for (const char *address : {"10.1.0.1/24", "fd01::1/64"})
            addAddress("eth0", address);
        for (const char *address : {"10.1.0.2/24", "fd01::2/64"})
            addAddress("client0", address, &client);
        setUp("eth0");
        setUp("client0", &client);
        // Neighbours are learnt now: a probe that waits for that would look like a lost one.
        for (const char *address : {"10.1.0.1", "fd01::1"})
            ASSERT_EQ(probeTcp({address, allowedPort}, &client, std::chrono::seconds(15)), ProbeResult::refused);
        createFirewallChains();
        setSwitch(true);
    }

    /// A hundred rules, the last of which allow ports 80 and 82.
    static FW::FWPROFILE hundredRules(const std::string &network) {
        std::vector<FW::FWRULE> rules;
        for (int i = 1; i < 99; ++i)
            rules.push_back(addressRule("", network + std::to_string(i)));
        for (const uint16_t port : {allowedPort, transferPort}) {
            rules.push_back(portRule(std::to_string(port), FW::FW_POLICY_ALLOW));
            rules.back().ipType = FW::FW_IP_TYPE_BOTH;
        }
        return profileOf(rules);
    }

    NetworkNamespace client{"client"};
};

TEST_P(TrafficWindow, IsNoneInTheAtomicWayAndIsSeenInTheSpecifiedOne) {
    const FW::FWPROFILE one = hundredRules("10.7.0.");
    const FW::FWPROFILE other = hundredRules("10.8.0.");
    store(one);
    ASSERT_TRUE(firewall.fwReloadAtomic(true)) << log.text();
    const int reloads = 20;
    const auto print = [](const char *way, const Counts &counts) {
        std::cout << way << ": " << counts.allowed << " connections to the allowed port, " << counts.lost << " lost; "
                  << counts.denied << " to the denied port, " << counts.passed << " passed; " << counts.transferred
                  << " bytes transferred\n";
    };
    const Counts atomically = Traffic(client).during([&] {
        for (int i = 0; i < reloads; ++i) {
            store(i % 2 == 0 ? other : one);
            EXPECT_TRUE(firewall.fwReloadAtomic(true)) << log.text();
        }
    });
    print("20 atomic reloads", atomically);
    EXPECT_GT(atomically.allowed, reloads);
    EXPECT_GT(atomically.transferred, 0);
    EXPECT_EQ(atomically.lost, 0);
    EXPECT_EQ(atomically.passed, 0);
    EXPECT_FALSE(atomically.transferFailed);
    // The other way shows that a loss would have been seen.
    const Counts specified = Traffic(client).during([&] { EXPECT_TRUE(firewall.fwReload(true)) << log.text(); });
    print("1 specified reload", specified);
    EXPECT_GT(specified.lost, 0);
}

INSTANTIATE_TEST_SUITE_P(Backend, TrafficWindow, testing::Values("nft", "legacy"),
                         [](const auto &entry) { return std::string(entry.param); });

}  // namespace
