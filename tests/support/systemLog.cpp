// SPDX-License-Identifier: Apache-2.0
// Receives what this process and its children send to the system log.
#include "systemLog.h"

#include "sandbox.h"

#include <poll.h>
#include <sys/eventfd.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <system_error>

namespace veldtest {
namespace {

constexpr const char *socketPath = "/dev/log";
constexpr size_t timestampLength = 16;  // "Mmm dd hh:mm:ss "

}  // namespace

LogMessage parseLogDatagram(const std::string &datagram) {
    LogMessage message{-1, "", datagram};
    const size_t head = datagram.find('>');
    if (datagram.empty() || datagram[0] != '<' || head == std::string::npos)
        return message;
    message.priority = LOG_PRI(static_cast<int>(std::strtol(datagram.c_str() + 1, nullptr, 10)));
    message.text = datagram.substr(std::min(head + 1 + timestampLength, datagram.size()));
    const size_t colon = message.text.find(": ");
    if (colon != std::string::npos) {
        message.ident = message.text.substr(0, message.text.find_first_of("[:"));
        message.text.erase(0, colon + 2);
    }
    return message;
}

SystemLog::SystemLog() {
    requireSandbox("replace /dev/log");
    unlink(socketPath);
    m_socket = socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, socketPath);
    if (m_socket < 0 || bind(m_socket, reinterpret_cast<sockaddr *>(&address), sizeof(address)) != 0)
        throw std::system_error(errno, std::generic_category(), "listen on /dev/log");
    chmod(socketPath, 0666);
    m_stop = eventfd(0, EFD_CLOEXEC);
    m_reader = std::thread([this] {
        std::array<pollfd, 2> sources = {pollfd{m_socket, POLLIN, 0}, pollfd{m_stop, POLLIN, 0}};
        for (;;) {
            if (poll(sources.data(), sources.size(), -1) < 0)
                continue;
            if (sources[1].revents != 0)
                return;
            const std::lock_guard lock(m_mutex);
            drain();
        }
    });
}

SystemLog::~SystemLog() {
    const uint64_t one = 1;
    [[maybe_unused]] const ssize_t written = write(m_stop, &one, sizeof(one));
    m_reader.join();
    close(m_stop);
    close(m_socket);
    unlink(socketPath);
    closelog();  // or syslog() would go on with the socket that has no reader
}

void SystemLog::drain() {
    std::array<char, 65536> buffer;
    ssize_t count = 0;
    while ((count = recv(m_socket, buffer.data(), buffer.size(), MSG_DONTWAIT)) >= 0) {
        std::string datagram(buffer.data(), static_cast<size_t>(count));
        while (!datagram.empty() && (datagram.back() == '\0' || datagram.back() == '\n'))
            datagram.pop_back();
        m_messages.push_back(parseLogDatagram(datagram));
    }
}

std::vector<LogMessage> SystemLog::messages() {
    const std::lock_guard lock(m_mutex);
    drain();
    return m_messages;
}

size_t SystemLog::count(const std::string &part) {
    const auto all = messages();
    return static_cast<size_t>(std::count_if(all.begin(), all.end(), [&](const LogMessage &message) {
        return message.text.find(part) != std::string::npos;
    }));
}

bool SystemLog::contains(const std::string &part) {
    return count(part) > 0;
}

std::string SystemLog::text() {
    std::string lines;
    for (const auto &message : messages())
        lines += "<" + std::to_string(message.priority) + "> " + message.text + "\n";
    return lines;
}

void SystemLog::clear() {
    const std::lock_guard lock(m_mutex);
    drain();
    m_messages.clear();
}

}  // namespace veldtest
