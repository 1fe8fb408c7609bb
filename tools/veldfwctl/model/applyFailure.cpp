// SPDX-License-Identifier: Apache-2.0
// Finds in the library's messages which command failed and what it said.
#include "model/applyFailure.h"

namespace veldfwctl {

namespace {

const std::string ATOMIC_START = "Failed to apply the rules, the old ones stay in force";

}  // namespace

FailedCommand failedCommandFind(const std::vector<std::string> &messages) {
    static const std::string start = "Failed to execute \"";
    FailedCommand failed;
    for (const std::string &message : messages) {
        if (message.compare(0, ATOMIC_START.size(), ATOMIC_START) == 0) {
            // "...: v4: "/sbin/iptables -A ...": what iptables-restore said"
            const size_t command = message.find(": \"/");
            const size_t end = command == std::string::npos ? command : message.find("\": ", command + 3);
            if (end == std::string::npos) {
                continue;
            }
            failed.command = message.substr(command + 3, end - command - 3);
            failed.said = message.substr(end + 3);
            return failed;
        }
        if (message.compare(0, start.size(), start) == 0 && message.back() == '"') {
            failed.command = message.substr(start.size(), message.size() - start.size() - 1);
            break;
        }
    }
    const std::string program = failed.command.substr(0, failed.command.find(' '));
    for (const std::string &message : messages) {
        if (!failed.command.empty() && message.compare(0, failed.command.size() + 2, failed.command + ": ") == 0) {
            failed.said += (failed.said.empty() ? "" : ", ") + message.substr(failed.command.size() + 2);
        } else if (message != start + failed.command + "\"" && message != "Failed to execute " + program) {
            failed.rest.push_back(message);
        }
    }
    return failed;
}

}  // namespace veldfwctl
