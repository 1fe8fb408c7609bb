// SPDX-License-Identifier: Apache-2.0
// Receives what this process and its children send to the system log.
#ifndef VELD_TEST_SYSTEM_LOG_H
#define VELD_TEST_SYSTEM_LOG_H

#include "handle.h"

#include <mutex>
#include <string>
#include <thread>
#include <vector>

namespace veldtest {

/// One message. `text` is what the caller of syslog() wrote; `priority` is LOG_ERR etc. without the facility.
struct LogMessage {
    int priority;
    std::string text;
};

/// Listens on /dev/log of the sandbox as long as it lives. A thread of its own reads, because a sender waits when the
/// socket's queue is full.
class SystemLog {
public:
    SystemLog();
    ~SystemLog();
    SystemLog(const SystemLog &) = delete;
    SystemLog &operator=(const SystemLog &) = delete;

    /// All messages sent up to now, in order.
    std::vector<LogMessage> messages();
    /// Whether the text of a message holds `part`.
    bool contains(const std::string &part);
    /// How many messages have texts that hold `part`.
    size_t count(const std::string &part);
    /// The error messages of these source files of the library, without line numbers: "veldFW.cpp Failed to unlock".
    /// @param files a regular expression of their names without ".cpp"
    std::vector<std::string> errors(const std::string &files = "\\w+");
    /// All texts, a line each, for failure messages.
    std::string text();
    /// Forgets the messages sent up to now.
    void clear();

private:
    void drain();  // with m_mutex held

    Handle m_socket;
    std::mutex m_mutex;
    std::vector<LogMessage> m_messages;
    std::thread m_reader;
};

}  // namespace veldtest

#endif
