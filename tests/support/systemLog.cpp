// SPDX-License-Identifier: Apache-2.0
// Receives what this process and its children send to the system log.
#include "systemLog.h"

#include "sandbox.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <syslog.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cstring>
#include <regex>

namespace veldtest {
namespace {

constexpr const char *socketPath = "/dev/log";

/// Splits a datagram as syslog() of the C library sends it: "<priority>Mmm dd hh:mm:ss ident[pid]: text".
LogMessage parseDatagram(const std::string &datagram) {
    const size_t colon = datagram.find(": ");
    if (datagram.empty() || datagram[0] != '<' || colon == std::string::npos)
        return {-1, datagram};
    return {LOG_PRI(std::stoi(datagram.substr(1))), datagram.substr(colon + 2)};
}

}  // namespace

SystemLog::SystemLog() {
    requireSandbox("replace /dev/log");
    unlink(socketPath);
    m_socket = {socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0), "socket"};
    sockaddr_un address = {};
    address.sun_family = AF_UNIX;
    std::strcpy(address.sun_path, socketPath);
    if (bind(m_socket.get(), reinterpret_cast<sockaddr *>(&address), sizeof(address)) != 0)
        throw systemError("listen on /dev/log");
    chmod(socketPath, 0666);
    m_reader = std::thread([this] {
        pollfd source{m_socket.get(), POLLIN, 0};
        while ((source.revents & POLLHUP) == 0) {
            poll(&source, 1, -1);
            const std::lock_guard lock(m_mutex);
            drain();
        }
    });
}

SystemLog::~SystemLog() {
    shutdown(m_socket.get(), SHUT_RDWR);  // the reader's POLLHUP
    m_reader.join();
    unlink(socketPath);
    closelog();  // or syslog() would go on with the socket that has no reader
}

void SystemLog::drain() {
    std::array<char, 65536> buffer;
    ssize_t count = 0;
    while ((count = recv(m_socket.get(), buffer.data(), buffer.size(), MSG_DONTWAIT)) > 0) {
        std::string datagram(buffer.data(), static_cast<size_t>(count));
        while (!datagram.empty() && (datagram.back() == '\0' || datagram.back() == '\n'))
            datagram.pop_back();
        m_messages.push_back(parseDatagram(datagram));
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

std::vector<std::string> SystemLog::errors(const std::string &files) {
    const std::regex form("((?:" + files + ")\\.cpp):[1-9][0-9]*( [^]*)");
    std::vector<std::string> texts;
    std::smatch parts;
    for (const auto &message : messages()) {
        if (message.priority == LOG_ERR && std::regex_match(message.text, parts, form))
            texts.push_back(parts.str(1) + parts.str(2));
    }
    return texts;
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
